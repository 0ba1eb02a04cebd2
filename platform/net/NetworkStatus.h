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
    bool metered = false; ///< what is sent costs, or is counted
    friend bool operator==(const NetworkState&, const NetworkState&) = default;
};

/// Knows the state of the network, and tells whoever observes it. Any thread.
///
/// Whatever follows the network calls `set`; tests do so by hand.
class NetworkStatus {
public:
    using Handler = std::function<void(const NetworkState&)>;
    /// Ends the observation when it is destroyed; a call that is under way may end after that. May outlive the status.
    using Token = std::shared_ptr<const Handler>;

    /// `begin` sets following the network in motion; it is called when someone asks for the first time.
    explicit NetworkStatus(std::function<void()> begin = {}) : _begin(std::move(begin)) {}
    virtual ~NetworkStatus() = default;

    /// Nothing until the source has answered, which takes it half a minute at most.
    [[nodiscard]] std::optional<NetworkState> current();
    /// Calls `handler` for every change from now on, on the thread that sets it: it must only hand work on.
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
