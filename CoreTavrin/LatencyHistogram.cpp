#include "CoreTavrin/LatencyHistogram.h"

#include <algorithm>
#include <cmath>
#include <numeric>

namespace tavrin {

namespace {
constexpr double kPerDoubling = 4;
}

std::size_t latencyBucket(platform::Duration latency)
{
    const double microseconds = std::max(platform::toSeconds(latency) * 1e6, 1.0);
    return std::min(static_cast<std::size_t>(kPerDoubling * std::log2(microseconds)), kLatencyBuckets - 1);
}

std::optional<double> latencyQuantile(std::span<const std::uint64_t> counts, double quantile)
{
    const auto total = std::accumulate(counts.begin(), counts.end(), std::uint64_t{0});
    if (total == 0) return std::nullopt;
    const auto rank = static_cast<std::uint64_t>(std::ceil(quantile * static_cast<double>(total)));
    std::uint64_t seen = 0;
    std::size_t bucket = 0;
    for (; bucket + 1 < counts.size(); ++bucket)
        if ((seen += counts[bucket]) >= std::max<std::uint64_t>(rank, 1)) break;
    return std::exp2(static_cast<double>(bucket + 1) / kPerDoubling) / 1000;
}

} // namespace tavrin
