#pragma once

#include <map>
#include <memory>
#include <set>
#include <string>

#include "CoreTavrin/TAVProtocols.h"

namespace platform {
class Queue;
}

namespace platform {
struct UrlSource;
} // namespace platform

namespace tavrin {

struct Assembly;
class ClientState;
class ImageLoader;

/// The registry of client states, and the object served on the endpoint that clients get when they configure.
///
/// One identifier always has the same state, made when it is first asked for and kept for the life of the process. With
/// the user default "TAVPersistSessions" the registry is written after a client's first bag and restored at start.
///
/// `loadImages` must be called from a task of a serial queue; see `ImageLoader`. Everything else: any thread.
class ClientStateManager : public TAVEndpointXPC, public std::enable_shared_from_this<ClientStateManager> {
public:
    static std::shared_ptr<ClientStateManager> make(Assembly& assembly);
    explicit ClientStateManager(Assembly& assembly);
    ~ClientStateManager() override;

    /// Creates the state on first use. Null for a missing or empty identifier.
    [[nodiscard]] std::shared_ptr<ClientState> stateForClientIdentifier(const std::optional<std::string>& identifier);
    /// The address of the endpoint's listener.
    [[nodiscard]] std::string endpoint() const;
    /// {"identifier", "agent"} of each state that has a user agent, sorted by identifier.
    [[nodiscard]] platform::Value::Array sessions() const;
    void saveState();

    // Images: passed on to the image loader.
    void processImagesFromResponse(const platform::Value& response, const std::shared_ptr<const TAVBag>& bag,
                                   platform::UrlSource source);
    [[nodiscard]] std::set<std::string> validImageHosts() const;
    void loadImages(platform::Value::Array images, std::uint64_t timeout,
                    platform::Reply<platform::Value> reply) override;

    void request(std::shared_ptr<TAVRequest> request, std::shared_ptr<TAVSessionConfiguration> configuration,
                 RequestReply reply) override;

private:
    void loadState();
    void _accept(std::shared_ptr<platform::ipc::Connection> connection);
    [[nodiscard]] platform::Value::Array _sessions() const;

    Assembly& _assembly;
    const bool _persistSessions;
    std::shared_ptr<platform::Queue> stateCacheQueue;
    std::map<std::string, std::shared_ptr<ClientState>> stateCache; // on stateCacheQueue
    const std::shared_ptr<ImageLoader> _imageLoader;
    std::unique_ptr<platform::ipc::Listener> _listener;
};

} // namespace tavrin
