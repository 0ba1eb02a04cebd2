#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/base/Date.h"

namespace platform {

class Clock;

/// The values of a device's clocks at one moment.
struct ClockReading {
    Date wall;
    std::uint64_t bootTicks = 0; ///< nanoseconds since the device was booted, with suspend
    std::string boot;            ///< identifier of that boot; empty if unknown

    bool operator==(const ClockReading&) const = default;
};

/// Returns the time that passed between two readings; never negative. Any thread.
///
/// Within one boot that is the difference of the boot ticks, whatever the system clock does. Across a reboot it is the
/// difference of the system clock, if that is at least the time since the reboot and at most a year more. Otherwise the
/// clock was set, and the result is the time since the reboot.
[[nodiscard]] Duration timePassed(const ClockReading& from, const ClockReading& to);

/// A count of time for deadlines and due times on disk. It continues in suspend and while no process runs, ignores
/// changes of the system clock, and never decreases. One thread at a time; the clock must outlive it.
class LivedTime {
public:
    /// The stored form: a count, and the clocks at that moment.
    struct Mark {
        Duration lived{};
        ClockReading clock;

        bool operator==(const Mark&) const = default;
        /// Returns "LIVED WALL BOOTTICKS BOOT": three counts of nanoseconds (WALL since 1970) and the boot identifier.
        [[nodiscard]] std::string text() const;
        /// Parses what `text` returned; returns nothing for other texts.
        [[nodiscard]] static std::optional<Mark> parse(std::string_view text);
    };

    /// Continues from `saved`, or starts at 0.
    explicit LivedTime(Clock& clock, std::optional<Mark> saved = std::nullopt);

    /// Returns the count.
    [[nodiscard]] Duration now();
    /// Returns the count and the clocks, for saving.
    [[nodiscard]] Mark mark();

private:
    Clock* _clock;
    Mark _mark;
};

} // namespace platform
