#include "tools/devserver/Control.h"

#include <algorithm>
#include <arpa/inet.h>
#include <charconv>
#include <optional>
#include <vector>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "CoreTavrin/TAVBag.h"
#include "platform/net/HttpHeaders.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tools/devserver/EventStream.h"
#include "tools/devserver/Service.h"

namespace devserver {

using platform::Value;

namespace {

constexpr std::size_t kMaximumBody = 256 * 1024;

Answer done()
{
    return jsonAnswer(Value::dictionaryOf({{"done", true}}));
}

/// Returns an error text about the first key of the body that isn't allowed; nullopt if all are allowed.
std::optional<std::string> unknownKey(const Value& body, const std::vector<std::string_view>& allowed)
{
    for (const auto& [key, value] : *body.asDictionary())
        if (std::ranges::find(allowed, key) == allowed.end())
            return allowed.empty() ? fmt::format("no key \"{}\": none is allowed", key)
                                   : fmt::format("no key \"{}\": allowed are {}", key, fmt::join(allowed, ", "));
    return std::nullopt;
}

std::optional<std::uint64_t> numberItem(const Request& request, std::string_view name, std::uint64_t fallback)
{
    const auto text = request.item(name);
    if (!text) return fallback;
    std::uint64_t number = 0;
    const auto [end, error] = std::from_chars(text->data(), text->data() + text->size(), number);
    if (text->empty() || error != std::errc() || end != text->data() + text->size()) return std::nullopt;
    return number;
}

// The calls. `body` is an object.

Answer addFault(Service& service, const Value& body, const Request&)
{
    const std::string* endpoint = body["endpoint"].asString();
    const std::string* fault = body["fault"].asString();
    const auto count = body["count"].isNull() ? 0 : body["count"].asUInt();
    if (!endpoint || !fault || !count)
        return errorAnswer(400,
                           "give {\"endpoint\": \"search\", \"fault\": \"delay:400\", \"count\": 1}; with count 0, or "
                           "without it, the fault lasts until cleared");
    const auto added = service.faults.add(*endpoint, *fault, *count);
    if (!added) return errorAnswer(400, added.error());
    return jsonAnswer(service.faults.list());
}

Answer clearFaults(Service& service, const Value&, const Request&)
{
    service.faults.clear();
    return done();
}

Answer listFaults(Service& service, const Value&, const Request&)
{
    return jsonAnswer(service.faults.list());
}

Answer release(Service& service, const Value&, const Request&)
{
    service.gate.release();
    return done();
}

Answer reset(Service& service, const Value&, const Request&)
{
    service.faults.clear();
    service.bag.reset();
    service.log.clear();
    service.uploads.clear();
    service.maxAge = Service::kDefaultMaxAge;
    service.gate.release();
    return done();
}

Answer mergeBag(Service& service, const Value& body, const Request&)
{
    const auto merged = service.bag.merge(body);
    return merged ? jsonAnswer(service.bag.document()) : errorAnswer(400, merged.error());
}

Value problemsIn(const Value& bag)
{
    Value::Array problems;
    for (std::string& problem : tavrin::TAVBag(bag, "").problems()) problems.push_back(std::move(problem));
    return problems;
}

Answer showBag(Service& service, const Value&, const Request&)
{
    const Value document = service.bag.document();
    return jsonAnswer(Value::dictionaryOf({{"bag", document}, {"problems", problemsIn(document)}}));
}

Answer checkBag(Service&, const Value& body, const Request&)
{
    return jsonAnswer(Value::dictionaryOf({{"problems", problemsIn(body)}}));
}

Answer bumpBag(Service& service, const Value&, const Request&)
{
    return jsonAnswer(Value::dictionaryOf({{"version", service.bag.bump()}}));
}

Answer bumpResources(Service& service, const Value& body, const Request&)
{
    const std::string* name = body["name"].asString();
    if (!name && !body["name"].isNull())
        return errorAnswer(400, "\"name\" is a resource's name; without it, all versions are raised");
    const auto version = service.bag.bumpResources(name ? *name : "");
    if (!version) return errorAnswer(400, version.error());
    return jsonAnswer(Value::dictionaryOf({{"resource_version", *version}}));
}

Answer setSearch(Service& service, const Value& body, const Request&)
{
    constexpr std::uint64_t kMost = 31'536'000;
    const auto maxAge = body["max_age"].asUInt();
    if (!maxAge || *maxAge > kMost)
        return errorAnswer(400, fmt::format("give {{\"max_age\": seconds}}, 0 (no limit) to {}", kMost));
    service.maxAge = *maxAge;
    return done();
}

Answer showLog(Service& service, const Value&, const Request& request)
{
    const std::string endpoint = request.item("endpoint").value_or("");
    if (!endpoint.empty() && endpoint != "unknown" &&
        std::ranges::find(endpointNames(), endpoint) == endpointNames().end())
        return errorAnswer(
            400, fmt::format("no endpoint \"{}\": give one of {}", endpoint, fmt::join(endpointNames(), ", ")));
    const auto since = numberItem(request, "since", 0);
    const auto count = numberItem(request, "count", RequestLog::kKept);
    if (!since || !count) return errorAnswer(400, "since and count are whole numbers");
    return jsonAnswer(service.log.list(endpoint, *since, *count));
}

Answer showStatus(Service& service, const Value&, const Request&)
{
    return jsonAnswer(statusOf(service));
}

Answer showUploads(Service& service, const Value&, const Request& request)
{
    const auto number = numberItem(request, "number", 0);
    if (!number) return errorAnswer(400, "number is a whole number");
    if (*number == 0)
        return jsonAnswer(request.item("json") == "0" ? service.uploads.summaries() : service.uploads.list());
    const Value upload = service.uploads.find(*number);
    return upload.isNull() ? errorAnswer(404, "no such upload is kept") : jsonAnswer(upload);
}

Answer showEvents(Service& service, const Value&, const Request& request)
{
    return eventStream(service, request.connection);
}

struct Call {
    std::string_view method;
    std::string_view path; // after /control/
    Answer (*run)(Service&, const Value& body, const Request&);
    std::vector<std::string_view> keys; // allowed in the body
    bool anyKey = false;
};

const std::vector<Call>& calls()
{
    static const std::vector<Call> all{
        {"GET", "status", showStatus, {}},
        {"GET", "log", showLog, {}},
        {"GET", "uploads", showUploads, {}},
        {"GET", "events", showEvents, {}},
        {"GET", "faults", listFaults, {}},
        {"POST", "faults", addFault, {"endpoint", "fault", "count"}},
        {"POST", "faults/clear", clearFaults, {}},
        {"POST", "release", release, {}},
        {"GET", "bag", showBag, {}},
        {"POST", "bag", mergeBag, {}, true},
        {"POST", "bag/check", checkBag, {}, true},
        {"POST", "bag/bump", bumpBag, {}},
        {"POST", "resources/bump", bumpResources, {"name"}},
        {"POST", "search", setSearch, {"max_age"}},
        {"POST", "reset", reset, {}},
    };
    return all;
}

bool isLoopback(std::string_view address)
{
    return address.starts_with("127.") || address == "::1" || address.starts_with("::ffff:127.");
}

/// Returns whether a "Host" names this machine, with or without a port. A name that looks like an address is a name:
/// "127.example" may resolve to anything.
bool isThisMachine(std::string_view host)
{
    if (host.starts_with('[')) return host.substr(0, host.find(']') + 1) == "[::1]";
    const std::string name(host.substr(0, host.find(':')));
    in_addr address{};
    return platform::equalIgnoringCase(name, "localhost") ||
           (inet_pton(AF_INET, name.c_str(), &address) == 1 && isLoopback(name));
}

/// Returns whether a web page of another origin sent the request. Browsers set both fields, and pages can't.
bool isForeign(const Request& request)
{
    const std::string* origin = findHeader(request.headers, "Origin");
    const std::string* host = findHeader(request.headers, "Host");
    if (origin && (!host || *origin != "http://" + *host)) return true;
    const std::string* site = findHeader(request.headers, "Sec-Fetch-Site");
    return site && *site != "same-origin" && *site != "none";
}

} // namespace

std::optional<Answer> refusedAsStrange(const Request& request)
{
    if (request.secure) return errorAnswer(404, "this is served over HTTP, not over HTTPS");
    if (!isLoopback(request.peer)) return errorAnswer(403, "this is for this machine only");
    const std::string* host = findHeader(request.headers, "Host");
    if (host && !isThisMachine(*host)) return errorAnswer(403, "give the host as localhost or 127.0.0.1");
    return std::nullopt;
}

Answer controlAnswer(Service& service, const Request& request)
{
    if (auto refused = refusedAsStrange(request)) return std::move(*refused);
    if (isForeign(request)) return errorAnswer(403, "other web pages can't control this service");
    const std::string_view name = std::string_view(request.path).substr(std::min<std::size_t>(request.path.size(), 9));
    const auto call =
        std::ranges::find_if(calls(), [&](const Call& c) { return c.path == name && c.method == request.method; });
    if (call == calls().end()) {
        std::vector<std::string> known;
        for (const Call& c : calls()) known.push_back(fmt::format("{} /control/{}", c.method, c.path));
        return errorAnswer(404, fmt::format("no such call: there are {}", fmt::join(known, ", ")));
    }
    Value body = platform::Dictionary();
    if (!request.body.empty()) {
        auto parsed = platform::parseJson(request.body, kMaximumBody);
        if (!parsed) return errorAnswer(400, "the body is not JSON: " + parsed.error().reason());
        if (!parsed->asDictionary()) return errorAnswer(400, "the body is not a JSON object");
        body = std::move(*parsed);
    }
    if (!call->anyKey)
        if (const auto problem = unknownKey(body, call->keys)) return errorAnswer(400, *problem);
    return call->run(service, body, request);
}

} // namespace devserver
