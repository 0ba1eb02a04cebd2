#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

#include "platform/base/Date.h"

/// Latencies as counts in buckets, which can be subtracted and sent over IPC. Pure functions; any thread.
namespace tavrin {

/// Four buckets for each doubling from a microsecond; the last one has all from 14 s.
inline constexpr std::size_t kLatencyBuckets = 96;
using LatencyCounts = std::array<std::uint64_t, kLatencyBuckets>;

/// Returns the bucket of a latency.
[[nodiscard]] std::size_t latencyBucket(platform::Duration latency);

/// Returns the latency in milliseconds that the share `quantile` (0 to 1) of the counts doesn't exceed, at most 19 %
/// too high up to 14 s; nothing without counts.
[[nodiscard]] std::optional<double> latencyQuantile(std::span<const std::uint64_t> counts, double quantile);

} // namespace tavrin
