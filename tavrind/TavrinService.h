#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "CoreTavrin/TAVProtocols.h"
#include "tavrind/Restart.h"

namespace platform {
class ProcessIdentity;
class Queue;
} // namespace platform

namespace tavrin {

struct Assembly;
class ClientConnection;

/// Accepts the clients' connections and owns one `ClientConnection` for each, from its acceptance until its session has
/// been flushed after its invalidation. Reports the daemon's state to diagnostic tools. Any thread, unless marked.
class TavrinService : public TAVDiagnosticsXPC, public std::enable_shared_from_this<TavrinService> {
public:
    /// Also creates the assembly's GUID controller, session manager and flusher bridge.
    static std::shared_ptr<TavrinService> make(Assembly& assembly, StartOptions options);
    TavrinService(Assembly& assembly, StartOptions options);
    ~TavrinService() override;

    /// Accepts the connection, on the connection's queue; refuses none. Run loop's thread.
    void listenerShouldAcceptNewConnection(std::shared_ptr<platform::ipc::Connection> connection);

    /// Returns a snapshot of the connections, in the order of their acceptance.
    [[nodiscard]] std::vector<std::shared_ptr<ClientConnection>> getClientConnections() const;

    /// Returns the peer's application id, else the last component of its executable's path; nothing if the process has
    /// ended.
    [[nodiscard]] static std::optional<std::string> clientIDForConnection(platform::ProcessIdentity& processes,
                                                                          pid_t pid);

    platform::Value status() override;
    std::string statistics() override;
    platform::Value figures() override;
    void waiting(platform::Reply<platform::Value> reply) override;
    void previewUploads(platform::Reply<platform::Value::Array> reply) override;
    void previewRequest(std::shared_ptr<TAVRequest> request,
                        platform::Reply<platform::Value, OptionalError> reply) override;
    void wipe(bool settings, platform::Reply<> reply) override;

private:
    void _accept(const std::shared_ptr<platform::ipc::Connection>& connection);
    void _connectionInvalidated(const std::shared_ptr<ClientConnection>& connection, const std::string& clientId,
                                pid_t pid);

    Assembly& _assembly;
    const StartOptions _options;
    platform::Date _started;
    std::shared_ptr<platform::Queue> _queue;
    std::vector<std::shared_ptr<ClientConnection>> _connections; // on _queue
};

} // namespace tavrin
