#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/base/Date.h"

namespace platform {

class Clock;

/// What the clocks of a device show at one moment.
struct ClockReading {
    Date wall;
    std::uint64_t bootTicks = 0; ///< nanoseconds since the device started, suspend included
    std::string boot;            ///< names that start; empty if unknown

    bool operator==(const ClockReading&) const = default;
};

/// Returns how much time has passed between two readings.
///
/// Within one start of the device that is what the boot ticks say, whatever the system clock does. Over a restart it is
/// the difference of the system clock, if that is at least the time since the restart and at most a year more; else the
/// clock was set, and the time since the restart is all that is known.
[[nodiscard]] Duration timePassed(const ClockReading& from, const ClockReading& to);

/// A count of time for deadlines and due times that are kept on disk: it goes on through suspend and while no process
/// runs, ignores leaps of the system clock, and never goes back. One thread at a time; the clock must outlive it.
class LivedTime {
public:
    /// What is kept on disk: a count, and the clocks at that moment.
    struct Mark {
        Duration lived{};
        ClockReading clock;

        bool operator==(const Mark&) const = default;
        /// "LIVED WALL BOOTTICKS BOOT": nanoseconds, since 1970 for the system clock.
        [[nodiscard]] std::string text() const;
        /// Returns nothing for anything that `text` didn't make.
        [[nodiscard]] static std::optional<Mark> parse(std::string_view text);
    };

    /// Continues from `saved`, or begins at 0.
    explicit LivedTime(Clock& clock, std::optional<Mark> saved = std::nullopt);

    /// Returns the count.
    [[nodiscard]] Duration now();
    /// Returns the count and the clocks, to be saved.
    [[nodiscard]] Mark mark();

private:
    Clock* _clock;
    Mark _mark;
};

} // namespace platform
