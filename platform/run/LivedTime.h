#pragma once

#include <cstdint>
#include <optional>

#include "platform/base/Date.h"

namespace platform {

class Clock;

/// How much time has passed between two looks at the clock, by what the system clock says and by what the host ticks
/// say.
///
/// The ticks are the least: a system clock that was set back counts for nothing. What the system clock says beyond them
/// is time in which the device was suspended or the process wasn't there, up to a year; more is a clock that was set.
[[nodiscard]] Duration timePassed(Duration bySystemClock, Duration byHostTicks);

/// A count of time that goes on through suspend and while no process runs, and that leaps of the system clock don't
/// touch: for deadlines and due times that are kept on disk. It never goes back. One thread at a time.
class LivedTime {
public:
    /// What is kept on disk: the count, and the system clock when it stood there.
    struct Mark {
        Duration lived{};
        Date wall;
    };

    /// Goes on from `saved`, or begins at 0.
    explicit LivedTime(Clock& clock, std::optional<Mark> saved = std::nullopt);

    [[nodiscard]] Duration now();
    /// Where the count stands.
    [[nodiscard]] Mark mark();

private:
    Clock* _clock;
    Mark _mark;
    std::uint64_t _ticks;
};

} // namespace platform
