#include "tavrind/NetworkTiming.h"

#include <algorithm>
#include <arpa/inet.h>
#include <array>
#include <cmath>
#include <cstdint>
#include <vector>

#include <fmt/format.h>

#include "platform/values/Dictionary.h"

namespace tavrin {

namespace {

using platform::Dictionary;
using platform::Value;

constexpr std::string_view kStatisticPrefix = "_kCFNTimingData";
constexpr std::string_view kStatisticsPrefix = "_kCFNTimingDataNStat";
constexpr std::string_view kFastOpenStatistics = "_kCFNTimingDataTCPFastOpenStats";

std::string without(std::string_view prefix, std::string_view key)
{
    return std::string(key.starts_with(prefix) ? key.substr(prefix.size()) : key);
}

bool isCounts(std::string_view key)
{
    return key == "_kCFNTimingDataConnectionStartTimeCounts" || key == "_kCFNTimingDataConnectionStopTimeCounts";
}

/// Returns the entries whose values are finite numbers of at least 1 in magnitude, by name without the prefix.
Dictionary counts(const Dictionary& all)
{
    Dictionary counts;
    for (const auto& [key, value] : all) {
        const double number = value.asDouble().value_or(0);
        if (std::trunc(number) != 0 && std::isfinite(number)) counts.set(without(kStatisticsPrefix, key), value);
    }
    return counts;
}

std::int64_t wholeMilliseconds(double seconds)
{
    constexpr double kLimit = 9.0e18; // clients report timing data too: any number must fit into the integer
    return static_cast<std::int64_t>(std::clamp(std::round(seconds * 1000), -kLimit, kLimit));
}

} // namespace

Value formatNetworkTimingData(const Value& timingData)
{
    const Dictionary* data = timingData.asDictionary();
    if (!data) return nullptr;

    std::vector<TavrinNetEventTimingFeedback> moments;
    std::vector<TavrinNetEventStatsFeedback> statistics;
    for (const auto& [key, value] : *data) {
        const Dictionary* entries = value.asDictionary();
        if (isCounts(key)) {
            if (entries) statistics.push_back({{without(kStatisticPrefix, key)}, counts(*entries)});
        } else if (key.contains(kFastOpenStatistics)) {
            if (entries) statistics.push_back({{without(kStatisticPrefix, key)}, *entries});
        } else if (key.contains("Start") || key.contains("End")) {
            const double seconds = value.asDouble().value_or(0);
            if (seconds != 0 && std::isfinite(seconds)) moments.push_back({{without(kStatisticPrefix, key)}, seconds});
        }
    }
    std::ranges::stable_sort(moments, {}, &TavrinNetEventTimingFeedback::value);

    Value::Array rows;
    rows.reserve(moments.size() + statistics.size());
    for (const auto& moment : moments)
        rows.push_back(Value::Array{moment.name, wholeMilliseconds(moment.value - moments.front().value)});
    for (const auto& connection : statistics) rows.push_back(Value::Array{connection.name, connection.stats});
    return rows;
}

std::optional<std::string> peerAddress(const Value& timingData)
{
    constexpr std::uint8_t kIPv4 = 2;
    constexpr std::uint8_t kIPv6 = 30;
    constexpr std::size_t kIPv6End = 24;
    const platform::Bytes* bytes = timingData["_kCFNTimingDataConnectionPeerAddress"].asBytes();
    if (!bytes || bytes->view().size() < 16) return std::nullopt;

    const auto* address = reinterpret_cast<const std::uint8_t*>(bytes->view().data());
    const int port = address[2] << 8 | address[3];
    std::array<char, INET6_ADDRSTRLEN> text{};
    if (address[1] == kIPv4) {
        inet_ntop(AF_INET, address + 4, text.data(), text.size());
        return fmt::format("{}:{}", text.data(), port);
    }
    if (address[1] == kIPv6 && bytes->view().size() >= kIPv6End) {
        inet_ntop(AF_INET6, address + 8, text.data(), text.size());
        return fmt::format("[{}]:{}", text.data(), port);
    }
    return std::nullopt;
}

} // namespace tavrin
