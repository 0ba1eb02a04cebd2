#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/values/Value.h"

/// The live figures of "tavrinctl top". Pure functions: TopCommand.cpp takes the samples.
namespace tavrin::ctl {

/// What the daemon and the kernel say about the daemon at one moment.
struct TopSample {
    double time = 0;           ///< seconds, of any clock that doesn't jump
    platform::Value status;    ///< the daemon's
    platform::Value figures;   ///< the daemon's
    std::uint64_t memory = 0;  ///< resident KiB
    std::uint64_t wakeUps = 0; ///< of all threads since their start
};

/// Returns {"requests": {kind: {"perSecond", "total", "failed", "p50_ms", "p99_ms"}}, "hitShare", "imageHitShare",
/// "eventsPerSecond", "memory_kib", "wakeUpsPerSecond", "books"} for the time between two samples; totals are since the
/// daemon's start. What can't be computed (no request, no time) is missing. If the daemon has started again in between,
/// everything since its start counts.
[[nodiscard]] platform::Value topFigures(const TopSample& before, const TopSample& now);

/// Returns these figures as lines for a screen.
[[nodiscard]] std::vector<std::string> topLines(const platform::Value& figures, const platform::Value& status);

} // namespace tavrin::ctl
