#pragma once

#include <cstdint>
#include <functional>
#include <string>

#include "platform/base/Date.h"

namespace platform {

/// The time source of every service. Any thread.
///
/// wallNow() is the system clock and jumps with it. hostTicks() counts nanoseconds while the device is awake: it stops
/// in suspend, and clock changes don't move it. after() counts hostTicks().
///
/// Use `LivedTime` for time that must continue across a suspend or restart.
class Clock {
public:
    virtual ~Clock() = default;

    [[nodiscard]] virtual Date wallNow() const = 0;
    [[nodiscard]] virtual std::uint64_t hostTicks() const = 0;
    /// Returns the nanoseconds since the device was booted, with suspend. Clock changes don't move it.
    [[nodiscard]] virtual std::uint64_t bootTicks() const = 0;
    /// Returns a unique identifier of this boot; empty if unknown.
    [[nodiscard]] virtual std::string bootId() const = 0;

    /// Identifies a pending timer; never 0.
    using TimerId = std::uint64_t;

    /// Calls `fire` once after `delay`; as soon as possible if `delay` is not positive, but never inside this call.
    /// `fire` runs on the clock's thread and must not block: services use `Queue::after`.
    virtual TimerId after(Duration delay, std::move_only_function<void()> fire) = 0;

    /// Cancels a pending timer and destroys its callback. Returns false if it has fired or is firing.
    virtual bool cancel(TimerId timer) = 0;
};

} // namespace platform
