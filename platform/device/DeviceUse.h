#pragma once

#include <functional>

namespace platform {

/// How the device is used just now, as far as it matters to work that can wait.
struct DeviceUse {
    bool onBattery = false;
    bool screenInUse = false; ///< someone is at the screen: it is neither locked nor left idle
    bool unlocked = true;     ///< the user has been in a session since the device started
    friend bool operator==(const DeviceUse&, const DeviceUse&) = default;
};

/// Tells it when it is asked; nothing is followed in between. Any thread.
class DeviceUseSource {
public:
    using Answer = std::move_only_function<void(const DeviceUse&)>;
    virtual ~DeviceUseSource() = default;
    /// Finds out. `answer` is called once, within half a minute, on any thread and never inside the call: it must only
    /// hand work on.
    virtual void ask(Answer answer) = 0;
    /// What was found out last; mains, nobody at the screen and unlocked before that.
    [[nodiscard]] virtual DeviceUse last() = 0;
};

} // namespace platform
