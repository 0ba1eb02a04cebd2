#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <vector>

#include "platform/base/Mutex.h"

namespace platform {

/// How the device reaches the network.
struct NetworkState {
    bool online = true;
    bool metered = false; ///< traffic costs money or counts towards a limit
    friend bool operator==(const NetworkState&, const NetworkState&) = default;
};

/// Reports the state of the network and its changes. Any thread.
///
/// The subclass for a real network calls `set`; so do tests.
class NetworkStatus {
public:
    using Handler = std::function<void(const NetworkState&)>;
    /// Ends the observation when destroyed; a call that is running may end later. May outlive the status.
    using Token = std::shared_ptr<const Handler>;

    /// The first `current` or `observe` calls `begin`, which starts to observe the network.
    explicit NetworkStatus(std::function<void()> begin = {}) : _begin(std::move(begin)) {}
    virtual ~NetworkStatus() = default;

    /// Returns nothing until the source has reported its first state, which takes at most 25 s (the time-out of D-Bus).
    [[nodiscard]] std::optional<NetworkState> current();
    /// Calls `handler` with every later change, on the thread that calls `set`. `handler` must not block: it should
    /// post to a queue.
    [[nodiscard]] Token observe(Handler handler);
    /// Sets the state and notifies observers of a change.
    void set(const NetworkState& state);

private:
    void ask();

    std::once_flag _asked;
    std::function<void()> _begin;
    Mutex _mutex;
    std::optional<NetworkState> _state GUARDED_BY(_mutex);
    std::vector<std::weak_ptr<const Handler>> _observers GUARDED_BY(_mutex);
};

} // namespace platform
