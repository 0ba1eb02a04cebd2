#pragma once

#include <map>
#include <memory>
#include <set>
#include <string>

#include "CoreTavrin/TAVProtocols.h"

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;
class ClientState;

/// The registry of client states, and the object served on the endpoint that clients get from their configuration.
///
/// One identifier always has the same state, made when it is first asked for and kept as long as the process. With the
/// user default "TAVPersistSessions" the registry is written after a client's first bag and restored at start. Any
/// thread.
class ClientStateManager : public TAVEndpointXPC, public std::enable_shared_from_this<ClientStateManager> {
public:
    static std::shared_ptr<ClientStateManager> make(Assembly& assembly);
    explicit ClientStateManager(Assembly& assembly);
    ~ClientStateManager() override;

    /// Null for a missing or empty identifier.
    [[nodiscard]] std::shared_ptr<ClientState> stateForClientIdentifier(const std::optional<std::string>& identifier);
    /// The address of the endpoint listener.
    [[nodiscard]] std::string endpoint() const;
    /// One {"identifier", "agent"} for each state that has a user agent, in the order of the identifiers.
    [[nodiscard]] platform::Value::Array sessions() const;
    void saveState();

    /// Fetches the images of an answer ahead. None are fetched yet.
    void processImagesFromResponse(const platform::Value& response, const std::shared_ptr<const TAVBag>& bag);
    /// Hosts that images may come from, as seen in answers. For diagnostics.
    [[nodiscard]] std::set<std::string> validImageHosts() const;

    void request(std::shared_ptr<TAVRequest> request, std::shared_ptr<TAVSessionConfiguration> configuration,
                 RequestReply reply) override;
    void loadImages(platform::Value::Array images, std::uint64_t timeout,
                    platform::Reply<platform::Value> reply) override;

private:
    void loadState();
    void _accept(std::shared_ptr<platform::ipc::Connection> connection);
    [[nodiscard]] platform::Value::Array _sessions() const;

    Assembly& _assembly;
    const bool _persistSessions;
    std::shared_ptr<platform::Queue> stateCacheQueue;
    std::map<std::string, std::shared_ptr<ClientState>> stateCache; // on stateCacheQueue
    std::shared_ptr<platform::Queue> _imageHostsQueue;
    std::set<std::string> _validImageHosts; // on _imageHostsQueue
    std::unique_ptr<platform::ipc::Listener> _listener;
};

} // namespace tavrin
