#pragma once

#include <atomic>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <sys/types.h>
#include <vector>

#include "CoreTavrin/TAVProtocols.h"

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;
struct TavrinFeedback;
class ClientConnection;

/// Lets diagnostic tools watch and control the feedback pipeline, on its own endpoint. Each role belongs to the tool
/// that requested it last. Any thread.
class TavrinFlusherXPC : public std::enable_shared_from_this<TavrinFlusherXPC> {
public:
    using ClientConnections = std::vector<std::shared_ptr<ClientConnection>>;
    using GetClientConnections = std::function<ClientConnections()>;

    static std::shared_ptr<TavrinFlusherXPC> make(Assembly& assembly, GetClientConnections getClientConnections);
    TavrinFlusherXPC(Assembly& assembly, GetClientConnections getClientConnections);
    ~TavrinFlusherXPC();

    /// Returns the listener's address.
    [[nodiscard]] std::string endpoint() const;

    /// Handles a command of `tool`, which belongs to `process`: a `FlusherIntent`; any other number is logged and
    /// ignored.
    void initiateConnectionWithIntent(std::uint64_t intent, std::shared_ptr<TAVFlusherListener> tool, pid_t process);
    /// Returns the processes of the tools that watch: {"events", "flushes"}; without a tool, its key is missing.
    [[nodiscard]] platform::Value watchers() const;

    /// Sends a flushed body to the tool that watches bodies, if any.
    void sendDataToSendingStreamListener(const platform::Bytes& body);
    /// Sends a recorded event to the tool that watches events, if any, and logs it at debug level.
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
    Tool _remoteObject;                            ///< the tool that connected or sent a command last
    Tool _sendingStreamListener;
    Tool _receivingStreamListener;
    std::map<const TAVFlusherListener*, pid_t> _processes; ///< of the two listeners
    std::atomic<bool> _eventsAreWatched = false;           ///< there is a `_receivingStreamListener`; any thread
};

} // namespace tavrin
