#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/ipc/Ipc.h"

namespace platform::ipc {

/// The client's end of a connection. One thread; several calls may be pending at once.
class Client {
public:
    /// Connects to a D-Bus address ("unix:path=…"); calls go to the object at `objectPath`. Blocks until the connection
    /// is authenticated. Fails with ECONNREFUSED if the peer closes it, and with ETIMEDOUT after `timeout`.
    [[nodiscard]] static Result<std::unique_ptr<Client>> connect(const std::string& address, std::string objectPath,
                                                                 Duration timeout);
    ~Client();

    using Answer = std::function<void(CallResult)>;
    /// Sends a call. A later `wait` passes the reply to `answer`, or an error: the service's, or one if the call
    /// couldn't be sent. Without `answer` no reply is requested. If the connection ends, pending answers
    /// are dropped.
    void call(std::string_view interface, const Member& member, Message arguments, Answer answer);
    /// Sets the handler of signals (interface, member, arguments), which runs inside `wait`.
    void onSignal(std::function<void(std::string_view, std::string_view, Message)> handler);
    /// Reads and dispatches until `done()` returns true; returns false if the connection ends or `timeout` passes
    /// first. Calls `done` after each message, and when `descriptor` becomes readable; `done` must then read from it.
    bool wait(const std::function<bool()>& done, Duration timeout, int descriptor = -1);
    [[nodiscard]] bool connected() const;

private:
    Client();
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform::ipc
