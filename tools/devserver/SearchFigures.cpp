#include "tools/devserver/SearchFigures.h"

#include <cstdint>
#include <optional>

#include "platform/values/Dictionary.h"

namespace devserver {

using platform::Value;

namespace {

constexpr std::size_t kMaximumLatencies = 200;

/// Returns the time of the mark "ResponseEnd", which counts from the first mark.
std::optional<double> latency(const Value& timingData)
{
    const Value::Array* marks = timingData.asArray();
    if (!marks) return std::nullopt;
    for (const Value& mark : *marks)
        if (mark[0] == Value("ResponseEnd")) return mark[1].asDouble();
    return std::nullopt;
}

} // namespace

Value searchFigures(const Value& session)
{
    std::uint64_t sent = 0, fromMemory = 0;
    Value::Array latencies;
    const Value events = session["fb"];
    for (const Value& event : events.asArray() ? *events.asArray() : Value::Array()) {
        // Images, cards and the bag have the same events.
        const bool started = event["type"] == Value("network_search_start");
        if (started && event["endpoint_type"] == Value("tavrin_search")) ++sent;
        // A cache hit has no type of its own, but it names the search whose answer was reused.
        if (event["type"] == Value("unknown") && event["uuid"].asString()) ++fromMemory;
        const platform::Dictionary* fields = event.asDictionary();
        const bool answered = fields && event["type"] == Value("network_search_end") && fields->contains("fbq");
        if (!answered || latencies.size() == kMaximumLatencies) continue;
        if (const auto milliseconds = latency(event["network_timing_data"])) latencies.push_back(*milliseconds);
    }
    return Value::dictionaryOf({{"sent", sent}, {"from_memory", fromMemory}, {"latencies", std::move(latencies)}});
}

} // namespace devserver
