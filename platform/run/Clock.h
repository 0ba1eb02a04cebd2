#pragma once

#include <cstdint>
#include <functional>
#include <string>

#include "platform/base/Date.h"

namespace platform {

/// Where every service takes the time from.
///
/// wallNow() follows the system clock and jumps with it. hostTicks() counts nanoseconds of being awake: it stops
/// in suspend and no clock change moves it. after() counts on hostTicks(). Any thread.
///
/// What must outlast a restart or a suspend counts in `LivedTime`.
class Clock {
public:
    virtual ~Clock() = default;

    [[nodiscard]] virtual Date wallNow() const = 0;
    [[nodiscard]] virtual std::uint64_t hostTicks() const = 0;
    /// Nanoseconds since the device started, suspend included; no clock change moves it.
    [[nodiscard]] virtual std::uint64_t bootTicks() const = 0;
    /// Names that start of the device, unlike any other; empty if unknown.
    [[nodiscard]] virtual std::string bootId() const = 0;

    /// Identifies a pending timer; never 0.
    using TimerId = std::uint64_t;

    /// Calls `fire` once, `delay` from now; as soon as possible if that is zero or less, but not inside this call.
    /// `fire` runs on the clock's own thread and must only hand work on: services use `Queue::after`.
    virtual TimerId after(Duration delay, std::move_only_function<void()> fire) = 0;

    /// Forgets a pending timer and destroys its callback. Returns false if it has fired or is firing.
    virtual bool cancel(TimerId timer) = 0;
};

} // namespace platform
