#include "tools/tavrinctl/Events.h"

#include <algorithm>
#include <span>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "platform/text/Text.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tools/shared/Inflate.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::size_t kLongestText = 60; // bytes
constexpr std::size_t kMostTypes = 24;   // runs of one type

/// Cuts the text to at most this many bytes, between two characters.
std::string shortened(const std::string& text)
{
    const std::string_view start = platform::cut(text, kLongestText);
    return printable(start) + (start.size() < text.size() ? "…" : "");
}

std::string textOr(const Value& value, std::string_view fallback)
{
    const std::string* text = value.asString();
    return text && !text->empty() ? shortened(*text) : std::string(fallback);
}

/// Returns "name=value", "name" for true, "name[3]" for an array; empty for null, false and empty values.
std::string fieldText(const std::string& name, const Value& value)
{
    switch (value.type()) {
    case Value::Type::Null: return {};
    case Value::Type::Bool: return *value.asBool() ? name : std::string();
    case Value::Type::String:
        return value.asString()->empty() ? "" : fmt::format("{}={}", name, shortened(*value.asString()));
    case Value::Type::Bytes: return fmt::format("{}[{} bytes]", name, value.asBytes()->size());
    case Value::Type::Array: return value.count() ? fmt::format("{}[{}]", name, value.count()) : "";
    case Value::Type::Dictionary:
        for (const char* key : {"id", "identifier", "reason"})
            if (value[key].asString()) return fieldText(fmt::format("{}.{}", name, key), value[key]);
        return value.count() ? fmt::format("{}{{{}}}", name, value.count()) : "";
    default: return fmt::format("{}={}", name, printableJson(platform::toJson(value)));
    }
}

/// Returns the first event types: "search_start, search_end ×3, error".
std::string typesInOrder(const Value::Array& events)
{
    std::vector<std::pair<std::string, std::size_t>> runs;
    for (const Value& event : events) {
        std::string type = textOr(event["type"], "no type");
        if (!runs.empty() && runs.back().first == type)
            ++runs.back().second;
        else
            runs.emplace_back(std::move(type), 1);
    }
    std::vector<std::string> texts;
    for (const auto& [type, times] : std::span(runs).first(std::min(runs.size(), kMostTypes)))
        texts.push_back(times == 1 ? type : fmt::format("{} ×{}", type, times));
    return fmt::format("{}{}", fmt::join(texts, ", "), runs.size() > kMostTypes ? ", …" : "");
}

} // namespace

std::string fieldsLine(const Dictionary& fields, std::initializer_list<std::string_view> leftOut)
{
    std::string line;
    for (const auto& [name, value] : fields) {
        if (std::ranges::find(leftOut, name) != leftOut.end()) continue;
        if (const std::string text = fieldText(printable(name), value); !text.empty())
            line += (line.empty() ? "" : " ") + text;
    }
    return line;
}

std::string queryText(const Value& queryId)
{
    return queryId.asInt().value_or(0) == 0 ? std::string() : "query " + platform::toJson(queryId);
}

std::string eventLine(const Value& event)
{
    if (!event.asDictionary()) return "no event: " + shortened(platform::toJson(event));
    return fmt::format("{:<24} {:<10} {}", textOr(event["type"], "no type"), queryText(event["query_id"]),
                       fieldsLine(*event.asDictionary(), {"type", "timestamp", "query_id"}));
}

FlushedBody flushedBody(const platform::Bytes& packed)
{
    FlushedBody body{.packedSize = packed.size()};
    auto text = tools::inflateRaw(packed.view(), tools::kMaximumUpload);
    if (!text) {
        body.problem = text.error();
        return body;
    }
    body.text = std::move(*text);
    auto json = platform::parseJson(body.text, tools::kMaximumUpload);
    if (json)
        body.json = std::move(*json);
    else
        body.problem = "not JSON: " + json.error().reason();
    return body;
}

std::string summary(const FlushedBody& body)
{
    const std::string sizes = fmt::format("{} bytes packed to {}", body.text.size(), body.packedSize);
    if (!body.problem.empty()) return fmt::format("A body that can't be read: {} ({})", printable(body.problem), sizes);
    if (const Value::Array* events = body.json["fb"].asArray()) {
        std::string line =
            fmt::format("{}  {} event{}  {}  user {}", bold(textOr(body.json["agent"], "no agent")), events->size(),
                        events->size() == 1 ? "" : "s", sizes, textOr(body.json["user_guid"], "none"));
        if (!events->empty()) line += "\n  " + typesInOrder(*events);
        return line;
    }
    std::vector<std::string> keys;
    if (const Dictionary* record = body.json.asDictionary())
        for (const auto& [key, value] : *record) keys.push_back(shortened(key));
    return fmt::format("{}  {}  {}", bold("a record of its own"), sizes, fmt::join(keys, ", "));
}

Value describe(const FlushedBody& body)
{
    if (!body.problem.empty()) return Value::dictionaryOf({{"packed_size", body.packedSize}, {"error", body.problem}});
    return Value::dictionaryOf({{"packed_size", body.packedSize}, {"size", body.text.size()}, {"body", body.json}});
}

} // namespace tavrin::ctl
