#pragma once

#include <map>
#include <mutex>

#include "platform/run/Clock.h"

namespace platform::test {

/// A clock that a test moves by hand. It starts on 2026-01-01 00:00 UTC, one hour after the device woke.
class ManualClock final : public Clock {
public:
    bool hasBootId = true;

    [[nodiscard]] Date wallNow() const override
    {
        std::lock_guard lock(_mutex);
        return _wall;
    }
    [[nodiscard]] std::uint64_t hostTicks() const override
    {
        std::lock_guard lock(_mutex);
        return _ticks;
    }
    [[nodiscard]] std::uint64_t bootTicks() const override
    {
        std::lock_guard lock(_mutex);
        return _ticks + _suspended - _started;
    }
    [[nodiscard]] std::string bootId() const override
    {
        std::lock_guard lock(_mutex);
        return hasBootId ? "boot " + std::to_string(_boots) : "";
    }
    TimerId after(Duration delay, std::move_only_function<void()> fire) override
    {
        std::lock_guard lock(_mutex);
        _timers.emplace(
            std::pair(_ticks + static_cast<std::uint64_t>(std::max(delay, Duration::zero()).count()), ++_lastId),
            std::move(fire));
        return _lastId;
    }
    bool cancel(TimerId timer) override
    {
        std::lock_guard lock(_mutex);
        return std::erase_if(_timers, [timer](const auto& entry) { return entry.first.second == timer; }) > 0;
    }

    /// Moves both clocks on, firing what falls due in order of time; `drain` is called before the first and after each.
    void advance(Duration by, const std::function<void()>& drain)
    {
        const std::uint64_t end = hostTicks() + static_cast<std::uint64_t>(by.count());
        drain();
        while (auto fire = takeDueBy(end)) {
            fire();
            drain();
        }
        moveTo(end);
    }
    /// Sets the system clock, as a user or NTP does; timers don't notice.
    void setWall(Date wall)
    {
        std::lock_guard lock(_mutex);
        _wall = wall;
    }
    /// The device sleeps, or runs without the process under test: timers don't notice either.
    void suspend(Duration time)
    {
        std::lock_guard lock(_mutex);
        _wall += time;
        _suspended += static_cast<std::uint64_t>(time.count());
    }
    /// The device is switched off for a time, and starts again.
    void restartDevice(Duration off)
    {
        std::lock_guard lock(_mutex);
        _wall += off;
        _started = _ticks + _suspended;
        ++_boots;
    }
    [[nodiscard]] std::size_t pendingTimers() const
    {
        std::lock_guard lock(_mutex);
        return _timers.size();
    }

private:
    std::move_only_function<void()> takeDueBy(std::uint64_t end)
    {
        std::unique_lock lock(_mutex);
        if (_timers.empty() || _timers.begin()->first.first > end) return {};
        auto first = _timers.extract(_timers.begin());
        lock.unlock();
        moveTo(first.key().first);
        return std::move(first.mapped());
    }
    void moveTo(std::uint64_t ticks)
    {
        std::lock_guard lock(_mutex);
        if (ticks <= _ticks) return;
        _wall += Duration(ticks - _ticks);
        _ticks = ticks;
    }

    mutable std::mutex _mutex;
    Date _wall = dateFromSecondsSince1970(1767225600);
    std::uint64_t _ticks = 3'600'000'000'000;
    std::uint64_t _suspended = 0;
    std::uint64_t _started = 0; // of `_ticks + _suspended`, when the device started
    int _boots = 1;
    std::map<std::pair<std::uint64_t, TimerId>, std::move_only_function<void()>> _timers;
    TimerId _lastId = 0;
};

} // namespace platform::test
