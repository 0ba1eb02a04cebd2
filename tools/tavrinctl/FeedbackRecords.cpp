#include "tools/tavrinctl/FeedbackRecords.h"

#include <algorithm>
#include <map>
#include <set>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "CoreTavrin/TAVRecordClasses.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Record.h"
#include "platform/values/ValueCoder.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::string_view kQueryId = "queryId";

/// Compares a record with the JSON that it was read from and finds unknown keys, which the decoder skips: they are
/// probably misspelt.
class StrayKeys final : public platform::Encoder {
public:
    StrayKeys(const Value& json, std::vector<std::string>& strays) : _json(json), _strays(strays) {}

    void beginRecord(std::string_view, std::size_t) override { _open.push_back({next(), place(), {}, {}, 0}); }
    void key(std::string_view name) override
    {
        _open.back().key = name;
        _open.back().fields.push_back(name);
    }
    void endRecord() override
    {
        const Open record = std::move(_open.back());
        _open.pop_back();
        if (!record.json.asDictionary()) return;
        for (const auto& [key, value] : *record.json.asDictionary()) {
            const bool isField = std::ranges::find(record.fields, key) != record.fields.end();
            const bool isOurs = key == "class" || (_open.empty() && key == kQueryId);
            if (!isField && !isOurs) _strays.push_back(record.place + (record.place.empty() ? "" : ".") + key);
        }
    }
    void beginArray(std::size_t) override { _open.push_back({next(), place(), {}, {}, 0}); }
    void endArray() override { _open.pop_back(); }
    void null() override { next(); }
    void boolean(bool) override { next(); }
    void integer(std::int64_t) override { next(); }
    void unsignedInteger(std::uint64_t) override { next(); }
    void real(double) override { next(); }
    void string(std::string_view) override { next(); }
    void bytes(const platform::Bytes&) override { next(); }
    void date(platform::Date) override { next(); }
    void value(const Value&) override { next(); }

private:
    /// The record or array of one level.
    struct Open {
        Value json;
        std::string place;
        std::string_view key; ///< of a record: the current field
        std::vector<std::string_view> fields;
        std::size_t index; ///< of an array: after the current element
    };

    /// Returns the JSON of the current value, and moves to the next array element.
    Value next()
    {
        if (_open.empty()) return _json;
        Open& open = _open.back();
        return open.json.asArray() ? open.json[open.index++] : open.json[open.key];
    }
    /// Returns the path of the current value; valid after `next`.
    [[nodiscard]] std::string place() const
    {
        if (_open.empty()) return {};
        const Open& open = _open.back();
        if (open.json.asArray()) return fmt::format("{}[{}]", open.place, open.index - 1);
        return open.place + (open.place.empty() ? "" : ".") + std::string(open.key);
    }

    const Value _json;
    std::vector<std::string>& _strays;
    std::vector<Open> _open;
};

/// Returns a field's type in words: "text", "array of ZRSearchResult". For a record, names every class that fits.
std::string typeText(const platform::FieldShape& shape)
{
    using Kind = platform::FieldShape::Kind;
    switch (shape.kind) {
    case Kind::Bool: return "boolean";
    case Kind::Integer:
    case Kind::Unsigned: return "integer";
    case Kind::Real: return "number";
    case Kind::Text: return "text";
    case Kind::Bytes: return "bytes";
    case Kind::Date: return "date";
    case Kind::Value: return "any value";
    case Kind::Error: return "error";
    case Kind::Array: return "array of " + typeText(*shape.element);
    case Kind::Record: break;
    }
    std::set<std::string_view> fitting;
    bool all = true;
    for (const auto& [name, record] : feedbackRecordClasses()) {
        const bool fits = shape.isA(record.prototype.get());
        if (fits) fitting.insert(name);
        all = all && fits;
    }
    return all ? "any record" : fmt::format("{}", fmt::join(fitting, " or "));
}

/// Parses one record. The error lists its problems.
std::expected<ReportedEvent, std::vector<std::string>> eventIn(const Value& json)
{
    const auto wrong = [](std::string problem) { return std::unexpected(std::vector{std::move(problem)}); };
    if (!json.asDictionary()) return wrong("a record is an object");
    const Value& queryId = json[kQueryId];
    if (!queryId.isNull() && (queryId.type() == Value::Type::Double || !queryId.asInt()))
        return wrong(fmt::format("{}: expected a whole number", kQueryId));
    auto record = platform::recordFromValue(json, coreRecordClasses());
    if (!record) return wrong(record.error().reason());
    auto feedback = std::dynamic_pointer_cast<ZRFeedback>(*record);
    if (!feedback) return wrong(fmt::format("{} is no event", (*record)->className()));

    std::vector<std::string> strays;
    StrayKeys finder(json, strays);
    platform::encodeRecord(finder, *feedback);
    if (strays.empty()) return ReportedEvent{queryId.asInt().value_or(0), std::move(feedback)};
    for (std::string& stray : strays) stray += ": no such field";
    return std::unexpected(std::move(strays));
}

} // namespace

std::expected<std::vector<ReportedEvent>, std::vector<std::string>> eventsIn(const Value& json)
{
    const bool isList = json.asArray() != nullptr;
    const Value::Array records = isList ? *json.asArray() : Value::Array{json};
    std::vector<ReportedEvent> events;
    std::vector<std::string> problems;
    for (std::size_t i = 0; i < records.size(); ++i) {
        auto event = eventIn(records[i]);
        if (event) {
            events.push_back(std::move(*event));
            continue;
        }
        const std::string* className = records[i]["class"].asString();
        for (const std::string& problem : event.error())
            problems.push_back(fmt::format("{}{}: {}", isList ? fmt::format("record {}", i + 1) : "the record",
                                           className ? fmt::format(" ({})", *className) : "", problem));
    }
    if (!problems.empty()) return std::unexpected(std::move(problems));
    return events;
}

ReportableRecords reportableRecords()
{
    std::map<std::string_view, const platform::RecordClass*> classes;
    for (const auto& [name, record] : feedbackRecordClasses()) classes.emplace(name, &record);
    ReportableRecords records;
    for (const auto& [name, record] : classes) {
        Dictionary fields;
        for (const auto& field : record->fields) fields.set(std::string(field.name), typeText(*field.shape));
        const bool isEvent = dynamic_cast<const ZRFeedback*>(record->prototype.get());
        (isEvent ? records.events : records.parts).set(std::string(name), std::move(fields));
    }
    return records;
}

} // namespace tavrin::ctl
