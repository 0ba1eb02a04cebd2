#pragma once

#include <functional>

namespace platform {

/// The current use of the device, on which deferrable work depends.
struct DeviceUse {
    bool onBattery = false;
    bool screenInUse = false; ///< the session is active, neither locked nor idle
    bool unlocked = true;     ///< the user has logged in since the device started
    friend bool operator==(const DeviceUse&, const DeviceUse&) = default;
};

/// Reports the use on request; observes nothing in between. Any thread.
class DeviceUseSource {
public:
    using Answer = std::move_only_function<void(const DeviceUse&)>;
    virtual ~DeviceUseSource() = default;
    /// Calls `answer` once, within 25 s (the time-out of D-Bus), on any thread, never inside this call. `answer` must
    /// not block: it should post to a queue.
    virtual void ask(Answer answer) = 0;
    /// Returns the last known use; before the first answer: on mains, screen not in use, unlocked.
    [[nodiscard]] virtual DeviceUse last() = 0;
};

} // namespace platform
