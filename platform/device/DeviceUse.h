#pragma once

#include <functional>

namespace platform {

/// How the device is used at the moment, as far as work that can wait depends on it.
struct DeviceUse {
    bool onBattery = false;
    bool screenInUse = false; ///< the session is active, neither locked nor idle
    bool unlocked = true;     ///< the user has logged in since the device started
    friend bool operator==(const DeviceUse&, const DeviceUse&) = default;
};

/// Finds out the use on request, and follows nothing in between. Any thread.
class DeviceUseSource {
public:
    using Answer = std::move_only_function<void(const DeviceUse&)>;
    virtual ~DeviceUseSource() = default;
    /// Calls `answer` once, within half a minute, on any thread but never inside this call. It must only hand work on.
    virtual void ask(Answer answer) = 0;
    /// Returns the last answer; before the first one mains, no one at the screen, unlocked.
    [[nodiscard]] virtual DeviceUse last() = 0;
};

} // namespace platform
