#include "tools/devserver/Faults.h"

#include <algorithm>
#include <charconv>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tools/devserver/Compression.h"

namespace devserver {

using platform::Value;
using Kind = Fault::Kind;

namespace {

struct KindEntry {
    std::string_view name;
    Kind kind;
    std::string_view unit; // of the number; empty if the kind has none
    std::uint64_t least = 0;
    std::uint64_t most = 0;
};

constexpr KindEntry kKinds[] = {
    {"delay", Kind::Delay, "MS", 0, 600'000},
    {"hang", Kind::Hang, ""},
    {"status", Kind::Status, "CODE", 200, 599},
    {"cut", Kind::Cut, ""},
    {"half", Kind::Half, ""},
    {"endless", Kind::Endless, ""},
    {"empty", Kind::Empty, ""},
    {"notjson", Kind::NotJson, ""},
    {"wrongtype", Kind::WrongType, ""},
    {"wrongvalues", Kind::WrongValues, ""},
    {"huge", Kind::Huge, "BYTES", 1, 1u << 30},
    {"deep", Kind::Deep, "DEPTH", 1, 1'000'000},
    {"redirect", Kind::Redirect, ""},
    {"elsewhere", Kind::Elsewhere, ""},
    {"gzipbomb", Kind::GzipBomb, "BYTES", 1, 256u << 20},
    {"retryafter", Kind::RetryAfter, "SECONDS", 0, 31'536'000},
};

std::string kindsHelp()
{
    std::vector<std::string> names;
    for (const KindEntry& kind : kKinds)
        names.push_back(kind.unit.empty() ? std::string(kind.name) : fmt::format("{}:{}", kind.name, kind.unit));
    return fmt::format("give one or several of {}, joined by commas", fmt::join(names, ", "));
}

std::expected<Fault, std::string> parseFault(std::string_view text)
{
    const std::size_t colon = text.find(':');
    const std::string_view name = text.substr(0, colon);
    const auto* kind = std::ranges::find(kKinds, name, &KindEntry::name);
    if (kind == std::end(kKinds)) return std::unexpected(fmt::format("no fault \"{}\": {}", name, kindsHelp()));
    if (kind->unit.empty()) {
        if (colon != text.npos) return std::unexpected(fmt::format("{} takes no number", name));
        return Fault{kind->kind, 0};
    }
    const std::string_view digits = colon == text.npos ? "" : text.substr(colon + 1);
    Fault fault{kind->kind, 0};
    const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), fault.number);
    if (digits.empty() || error != std::errc() || end != digits.data() + digits.size() || fault.number < kind->least ||
        fault.number > kind->most)
        return std::unexpected(
            fmt::format("{0}:{1} needs {1} from {2} to {3}", name, kind->unit, kind->least, kind->most));
    return fault;
}

/// Returns the value with every leaf replaced by one of another type. Keys and lengths stay.
Value wrongValue(const Value& value)
{
    switch (value.type()) {
    case Value::Type::Array: {
        Value::Array elements;
        for (const Value& element : *value.asArray()) elements.push_back(wrongValue(element));
        return elements;
    }
    case Value::Type::Dictionary: {
        platform::Dictionary entries;
        for (const auto& [key, entry] : *value.asDictionary()) entries.set(key, wrongValue(entry));
        return entries;
    }
    case Value::Type::String: return 7;
    case Value::Type::Null: return false;
    default: return "seven";
    }
}

/// Returns the service's address under its other host name: "https://localhost:8443" for a request to 127.0.0.1.
std::string otherHost(const Request& request)
{
    const std::string* host = findHeader(request.headers, "Host");
    const std::size_t colon = host ? host->rfind(':') : std::string::npos;
    const bool byName = host && host->starts_with("localhost");
    return fmt::format("{}://{}{}", request.secure ? "https" : "http", byName ? "127.0.0.1" : "localhost",
                       colon == std::string::npos ? "" : host->substr(colon));
}

std::string spoiltJson(const std::string& body, Kind kind)
{
    const auto value = platform::parseJson(body);
    if (kind == Kind::WrongValues && value) return platform::toJson(wrongValue(*value));
    // An array becomes an object, and anything else an array.
    if (value && value->asArray()) return platform::toJson(Value::dictionaryOf({{"results", *value}}));
    return platform::toJson(Value::Array{value ? *value : Value("no JSON")});
}

} // namespace

const std::vector<std::string_view>& endpointNames()
{
    static const std::vector<std::string_view> names{"bag",    "search", "zkw",      "more",   "card", "lookup",
                                                     "flight", "image",  "resource", "upload", "warm"};
    return names;
}

std::expected<std::vector<Fault>, std::string> parseFaults(std::string_view text)
{
    constexpr std::size_t kMost = 8;
    std::vector<Fault> faults;
    for (std::size_t begin = 0; begin <= text.size();) {
        const std::size_t comma = std::min(text.find(',', begin), text.size());
        const auto fault = parseFault(text.substr(begin, comma - begin));
        if (!fault) return std::unexpected(fault.error());
        if (faults.size() == kMost) return std::unexpected(fmt::format("more than {} faults in one", kMost));
        faults.push_back(*fault);
        begin = comma + 1;
    }
    return faults;
}

std::string textOf(const std::vector<Fault>& faults)
{
    std::vector<std::string> texts;
    for (const Fault& fault : faults) {
        const KindEntry& kind = *std::ranges::find(kKinds, fault.kind, &KindEntry::kind);
        texts.push_back(kind.unit.empty() ? std::string(kind.name) : fmt::format("{}:{}", kind.name, fault.number));
    }
    return fmt::format("{}", fmt::join(texts, ","));
}

void spoil(Answer& answer, const Fault& fault, const Request& request)
{
    switch (fault.kind) {
    case Kind::Delay:
    case Kind::Hang:
    case Kind::Endless: return;
    case Kind::Status:
        if (fault.number >= 300) answer = errorAnswer(0, fmt::format("status {} on demand", fault.number));
        if (fault.number == 204 || fault.number == 304) answer.body.clear(); // HTTP allows them no body
        answer.status = static_cast<int>(fault.number);
        return;
    case Kind::Cut: answer.cut = true; return;
    case Kind::Half: answer.body.resize(answer.body.size() / 2); return;
    case Kind::Empty: answer.body.clear(); return;
    case Kind::NotJson: answer.body = "<html><body>Something else answered here.</body></html>\n"; return;
    case Kind::WrongType:
    case Kind::WrongValues: answer.body = spoiltJson(answer.body, fault.kind); return;
    case Kind::Huge: answer.paddedTo = fault.number; return;
    case Kind::Deep: answer.body = std::string(fault.number, '[') + std::string(fault.number, ']'); return;
    case Kind::Redirect:
    case Kind::Elsewhere:
        answer = {.status = 302};
        answer.headers.emplace_back("Location", (fault.kind == Kind::Elsewhere ? otherHost(request) : "") +
                                                    request.path + (request.query.empty() ? "" : "?" + request.query));
        return;
    case Kind::GzipBomb:
        answer.body = gzipOfBlanks(fault.number);
        answer.headers.emplace_back("Content-Encoding", "gzip");
        return;
    case Kind::RetryAfter: answer.headers.emplace_back("Retry-After", std::to_string(fault.number)); return;
    }
}

std::expected<void, std::string> Faults::add(std::string_view endpoint, std::string_view fault, std::uint64_t count)
{
    if (endpoint != "*" && std::ranges::find(endpointNames(), endpoint) == endpointNames().end())
        return std::unexpected(
            fmt::format("no endpoint \"{}\": give one of {}, or *", endpoint, fmt::join(endpointNames(), ", ")));
    auto faults = parseFaults(fault);
    if (!faults) return std::unexpected(faults.error());
    const platform::MutexLock lock(_mutex);
    if (_rules.size() == kMaximumCount)
        return std::unexpected(fmt::format("{} faults wait already: POST /control/faults/clear", kMaximumCount));
    _rules.push_back({std::string(endpoint), std::string(fault), std::move(*faults), count});
    return {};
}

std::vector<Fault> Faults::take(std::string_view endpoint)
{
    const platform::MutexLock lock(_mutex);
    const auto rule =
        std::ranges::find_if(_rules, [&](const Rule& r) { return r.endpoint == endpoint || r.endpoint == "*"; });
    if (rule == _rules.end()) return {};
    if (rule->left == 0) return rule->faults;
    auto faults = rule->faults;
    if (--rule->left == 0) _rules.erase(rule);
    return faults;
}

void Faults::clear()
{
    const platform::MutexLock lock(_mutex);
    _rules.clear();
}

Value Faults::list() const
{
    const platform::MutexLock lock(_mutex);
    Value::Array rules;
    for (const Rule& rule : _rules)
        rules.push_back(Value::dictionaryOf({{"endpoint", rule.endpoint}, {"fault", rule.text}, {"left", rule.left}}));
    return rules;
}

std::size_t Faults::count() const
{
    const platform::MutexLock lock(_mutex);
    return _rules.size();
}

} // namespace devserver
