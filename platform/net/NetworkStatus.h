#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <vector>

namespace platform {

/// How the device reaches the network.
struct NetworkState {
    bool online = true;
    bool metered = false; ///< traffic costs or counts
    friend bool operator==(const NetworkState&, const NetworkState&) = default;
};

/// Reports the state of the network and its changes. Any thread.
///
/// A subclass that follows the network calls `set`; tests call it by hand.
class NetworkStatus {
public:
    using Handler = std::function<void(const NetworkState&)>;
    /// Ends the observation when destroyed; a running call may end later. May outlive the status.
    using Token = std::shared_ptr<const Handler>;

    /// `begin` starts following the network; it is called by the first `current` or `observe`.
    explicit NetworkStatus(std::function<void()> begin = {}) : _begin(std::move(begin)) {}
    virtual ~NetworkStatus() = default;

    /// Returns nothing until the source has answered, within half a minute.
    [[nodiscard]] std::optional<NetworkState> current();
    /// Calls `handler` with every change from now on, on the thread that calls `set`. It must only hand work on.
    [[nodiscard]] Token observe(Handler handler);
    void set(const NetworkState& state);

private:
    void ask();

    std::once_flag _asked;
    std::function<void()> _begin;
    std::mutex _mutex;
    std::optional<NetworkState> _state;                   // under the mutex
    std::vector<std::weak_ptr<const Handler>> _observers; // under the mutex
};

} // namespace platform
