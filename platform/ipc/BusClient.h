#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/ipc/Ipc.h"

namespace platform::ipc {

/// The caller's end: a blocking client for one thread, with calls that may be outstanding side by side.
class Client {
public:
    /// Connects to a D-Bus address ("unix:path=…"); calls go to the object at `objectPath`.
    [[nodiscard]] static Result<std::unique_ptr<Client>> connect(const std::string& address, std::string objectPath,
                                                                 Duration timeout);
    ~Client();

    using Answer = std::function<void(CallResult)>;
    /// Sends a call; `answer` runs inside a later `wait`. With a `timeout` it gets a time-out error after that.
    void call(std::string_view interface, const Member& member, Message arguments, Answer answer,
              std::optional<Duration> timeout = std::nullopt);
    /// Handles signals inside `wait`: interface, member, arguments.
    void onSignal(std::function<void(std::string_view, std::string_view, Message)> handler);
    /// Reads and dispatches until `done()` is true, the connection ends (false) or `timeout` passes (false). `done` is
    /// asked again after whatever arrives, and whenever `descriptor` can be read: it reads it then.
    bool wait(const std::function<bool()>& done, Duration timeout, int descriptor = -1);
    [[nodiscard]] bool connected() const;

private:
    Client();
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform::ipc
