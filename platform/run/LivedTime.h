#pragma once

#include <cstdint>
#include <optional>

#include "platform/base/Date.h"

namespace platform {

class Clock;

/// Returns how much time has passed between two readings of the clock, given the differences of its two counts.
///
/// At least the host ticks have passed: a system clock that was set back is ignored. What the system clock shows beyond
/// them counts as suspend or as absence of the process if it is up to a year; more means that the clock was set.
[[nodiscard]] Duration timePassed(Duration bySystemClock, Duration byHostTicks);

/// A count of time for deadlines and due times that are kept on disk: it goes on through suspend and while no process
/// runs, ignores leaps of the system clock, and never goes back. One thread at a time; the clock must outlive it.
class LivedTime {
public:
    /// What is kept on disk: a count, and the system clock at that moment.
    struct Mark {
        Duration lived{};
        Date wall;
    };

    /// Continues from `saved`, which may come from a damaged file, or begins at 0.
    explicit LivedTime(Clock& clock, std::optional<Mark> saved = std::nullopt);

    /// Returns the count.
    [[nodiscard]] Duration now();
    /// Returns the count and the system clock, to be saved.
    [[nodiscard]] Mark mark();

private:
    Clock* _clock;
    Mark _mark;
    std::uint64_t _ticks;
};

} // namespace platform
