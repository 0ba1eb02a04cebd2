#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/ipc/Ipc.h"

namespace platform::ipc {

/// The caller's end of a connection. Belongs to one thread; several calls may be under way at once.
class Client {
public:
    /// Connects to a D-Bus address ("unix:path=…"); calls go to the object at `objectPath`.
    [[nodiscard]] static Result<std::unique_ptr<Client>> connect(const std::string& address, std::string objectPath,
                                                                 Duration timeout);
    ~Client();

    using Answer = std::function<void(CallResult)>;
    /// Sends a call. `answer`, if any, gets the answer inside a later `wait`, or an error: one of the service, one if
    /// the call couldn't be sent, or one after `timeout`. A connection that ends drops the answers that are due.
    void call(std::string_view interface, const Member& member, Message arguments, Answer answer,
              std::optional<Duration> timeout = std::nullopt);
    /// Sets the handler of signals, which `wait` calls: interface, member, arguments.
    void onSignal(std::function<void(std::string_view, std::string_view, Message)> handler);
    /// Reads and dispatches until `done()` returns true; returns false if the connection ends or `timeout` passes
    /// before. `done` is called after whatever arrives, and whenever `descriptor` can be read, which it must read then.
    bool wait(const std::function<bool()>& done, Duration timeout, int descriptor = -1);
    [[nodiscard]] bool connected() const;

private:
    Client();
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform::ipc
