#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "CoreTavrin/TAVProtocols.h"

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;
struct TavrinFeedback;
class ClientConnection;

/// Lets a diagnostic tool watch and steer the feedback pipeline, on an endpoint of its own. Several tools may be
/// connected: each role belongs to the last one that asked for it. Any thread.
class TavrinFlusherXPC : public std::enable_shared_from_this<TavrinFlusherXPC> {
public:
    using GetClientConnections = std::function<std::vector<std::shared_ptr<ClientConnection>>()>;

    static std::shared_ptr<TavrinFlusherXPC> make(Assembly& assembly, GetClientConnections getClientConnections);
    TavrinFlusherXPC(Assembly& assembly, GetClientConnections getClientConnections);
    ~TavrinFlusherXPC();

    /// The listener's address.
    [[nodiscard]] std::string endpoint() const;

    /// A command of `tool`: 0 watch upload bodies, 1 watch events, 2 stop the background uploads, 3 end all sessions,
    /// upload them and let background uploads go on.
    void initiateConnectionWithIntent(std::uint64_t intent, std::shared_ptr<TAVFlusherListener> tool);

    /// One flushed body, to whoever watches bodies.
    void sendDataToSendingStreamListener(const platform::Bytes& body);
    /// One event that was recorded, to whoever watches events. Nothing is made of it if nobody does, nor logs it.
    void sendDataToReceivingStreamListener(const TavrinFeedback& feedback);

private:
    using Tool = std::shared_ptr<TAVFlusherListener>;

    void _accept(const std::shared_ptr<platform::ipc::Connection>& connection);
    void _removeDelegate(const Tool& tool);
    void _dump(const Tool& tool);
    [[nodiscard]] Tool _holderOf(Tool TavrinFlusherXPC::* role) const;

    Assembly& _assembly;
    GetClientConnections _getClientConnections;
    std::unique_ptr<platform::ipc::Listener> _ipcListener;
    const std::shared_ptr<platform::Queue> _queue; // guards all below
    Tool _remoteObject;                            ///< connected last, or sent the last command
    Tool _sendingStreamListener;
    Tool _receivingStreamListener;
};

} // namespace tavrin
