#include "tools/devserver/Service.h"

#include <charconv>
#include <chrono>
#include <functional>
#include <string_view>

#include <fmt/format.h>

#include "platform/net/Url.h"
#include "tools/devserver/Console.h"
#include "tools/devserver/Control.h"
#include "tools/devserver/Images.h"
#include "tools/devserver/Resources.h"

namespace devserver {

using platform::Value;

namespace {

constexpr std::string_view kImages = "/images/";
constexpr std::string_view kResources = "/resources/";
constexpr std::size_t kMaximumQueryBytes = 2000;
constexpr std::size_t kMaximumImage = 16u << 20;
constexpr std::chrono::milliseconds kPace{50}; // between the blanks of an endless body

/// Applies the faults that delay a request. Returns false if the peer disconnects.
bool holdBack(Gate& gate, const std::vector<Fault>& faults, int connection)
{
    for (const Fault& fault : faults) {
        std::optional<std::chrono::milliseconds> time;
        if (fault.kind == Fault::Kind::Delay)
            time = std::chrono::milliseconds(fault.number);
        else if (fault.kind != Fault::Kind::Hang)
            continue;
        if (gate.wait(time, connection) == Gate::Outcome::PeerGone) return false;
    }
    return true;
}

/// Returns the number in the query item `name`; 0 if it is missing or invalid.
std::size_t numberIn(const Request& request, std::string_view name)
{
    const std::string text = request.item(name).value_or("0");
    std::size_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    return error == std::errc() ? number : 0;
}

bool isBelow(std::string_view path, std::string_view folder)
{
    return path.starts_with(folder) && (path.size() == folder.size() || path[folder.size()] == '/');
}

/// Makes an answer one that caches may keep and revalidate. Returns 304 if the request has its tag.
Answer cacheable(Answer answer, int seconds, const Request& request)
{
    const std::string tag = fmt::format("\"{:x}\"", std::hash<std::string_view>{}(answer.body));
    answer.headers = {{"ETag", tag}, {"Cache-Control", fmt::format("max-age={}", seconds)}};
    const std::string* atHand = findHeader(request.headers, "If-None-Match");
    if (atHand && *atHand == tag) answer.status = 304;
    return answer;
}

bool isSearch(std::string_view endpoint)
{
    return endpoint == "search" || endpoint == "zkw" || endpoint == "more" || endpoint == "lookup" ||
           endpoint == "card" || endpoint == "flight";
}

} // namespace

std::string_view endpointOf(const Request& request)
{
    const std::string_view path = request.path;
    if (path == "/search") {
        if (request.item("qtype") == "zkw") return "zkw";
        return request.item("ltype") ? "lookup" : "search";
    }
    if (path == "/bag") return "bag";
    if (path == "/more") return "more";
    if (path == "/card") return "card";
    if (path == "/flight") return "flight";
    if (path == "/warm") return "warm";
    if (path == "/feedback" || path == "/crowdsourcing") return "upload";
    if (path.starts_with(kImages)) return "image";
    if (path.starts_with(kResources)) return "resource";
    return "unknown";
}

Service::Service(const std::string& base_) : base(base_), bag(base_), _answers(catalogue, base_) {}

Answer Service::answer(const Request& request)
{
    if (isBelow(request.path, "/control")) return controlAnswer(*this, request);
    if (isBelow(request.path, "/console")) return consoleAnswer(request);

    const auto begin = std::chrono::steady_clock::now();
    const std::string_view endpoint = endpointOf(request);
    const std::uint64_t number = log.add(endpoint, request);
    const std::vector<Fault> wanted = faults.take(endpoint);
    Answer answer = answerLogged(endpoint, request, wanted);
    log.finish(number, answer, textOf(wanted), std::chrono::steady_clock::now() - begin);
    return answer;
}

Answer Service::answerLogged(std::string_view endpoint, const Request& request, const std::vector<Fault>& wanted)
{
    if (!holdBack(gate, wanted, request.connection)) return Answer{.status = 499, .cut = true}; // no peer reads it

    const bool isUpload = endpoint == "upload" && request.method == "POST";
    Upload upload = isUpload ? checkUpload(request) : Upload();
    Answer answer = isUpload ? upload.answer() : answerEndpoint(endpoint, request);
    for (const Fault& fault : wanted) {
        spoil(answer, fault, request);
        if (fault.kind == Fault::Kind::Endless)
            answer.more = [this, connection = request.connection]() -> std::optional<std::string> {
                if (gate.wait(kPace, connection) != Gate::Outcome::TimeOver) return std::nullopt;
                return " ";
            };
    }
    // These statuses have no body in HTTP: a client would read its bytes as the next answer on the connection.
    if (answer.status == 204 || answer.status == 304)
        answer = {.status = answer.status, .headers = std::move(answer.headers)};
    if (isUpload) {
        const std::string line = uploads.add(std::move(upload), answer);
        if (onUpload) onUpload(line);
    }
    return answer;
}

Answer Service::answerEndpoint(std::string_view endpoint, const Request& request)
{
    if (endpoint == "unknown")
        return errorAnswer(404,
                           "served here: /bag, /search, /more, /card, /flight, /images/ID, /resources/NAME, /warm, "
                           "/feedback, /crowdsourcing; and /control and /console over HTTP");
    const bool get = request.method == "GET" || request.method == "HEAD";
    if (endpoint == "upload") return errorAnswer(405, "feedback must be sent with POST");
    if (!get) return errorAnswer(405, "only GET and HEAD are allowed");
    if (isSearch(endpoint)) return answerSearch(endpoint, request);
    if (endpoint == "bag") return cacheable(jsonAnswer(bag.document()), 300, request);
    if (endpoint == "image") {
        const std::string identifier = platform::percentDecode(std::string_view(request.path).substr(kImages.size()));
        const std::size_t size = numberIn(request, "size");
        if (size > kMaximumImage) return errorAnswer(400, fmt::format("a size is {} bytes at most", kMaximumImage));
        return cacheable({.contentType = "image/png", .body = imageFor(identifier, size)}, 86400, request);
    }
    if (endpoint == "resource")
        return resourceAnswer(base, std::string_view(request.path).substr(kResources.size()), request);
    return Answer{.status = 204}; // warm
}

Answer Service::answerSearch(std::string_view endpoint, const Request& request)
{
    const auto begin = std::chrono::steady_clock::now();
    const std::string query = request.item("q").value_or("");
    if (query.size() > kMaximumQueryBytes) return errorAnswer(400, "the query is too long");
    if (query.empty() && endpoint != "zkw" && endpoint != "card") return errorAnswer(400, "no query item \"q\"");

    Value sets;
    if (endpoint == "zkw") {
        sets = _answers.zeroKeyword();
    } else if (endpoint == "lookup") {
        sets = _answers.lookup(query, request.item("ldomain").value_or(""));
    } else if (endpoint == "flight") {
        sets = _answers.flights(query);
    } else if (endpoint == "card") {
        auto card = _answers.card(request.item("id").value_or(""));
        if (!card) return errorAnswer(404, "no result has that \"id\"");
        sets = std::move(*card);
    } else if (endpoint == "more") {
        const Section* section = findSection(request.item("section").value_or(""));
        if (!section) return errorAnswer(400, "no section of that name");
        sets = _answers.moreResults(query, *section, numberIn(request, "offset"));
    } else {
        sets = _answers.search(query, request.item("qtype") != "suggested");
    }

    const std::chrono::duration<double, std::milli> duration = std::chrono::steady_clock::now() - begin;
    stamp(sets, {.fbq = fmt::format("{:06x}", ++_searches),
                 .partialClientIp = partialAddress(request.peer),
                 .duration = duration.count(),
                 .maxAge = maxAge});
    Answer answer = jsonAnswer(sets);
    answer.headers = {{"Cache-Control", "no-store"},
                      {"X-Quorvane-ForceFetch", fmt::format("{{\"bag\": {}}}", bag.version())}};
    return answer;
}

} // namespace devserver
