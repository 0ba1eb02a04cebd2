#pragma once

#include <map>
#include <memory>
#include <set>
#include <string>

#include "CoreTavrin/TAVProtocols.h"

namespace platform {
class JsonDocument;
class Queue;
struct UrlSource;
} // namespace platform

namespace tavrin {

struct Assembly;
class ClientState;
class ImageLoader;

/// The registry of client states, and the object served on the endpoint that clients get when they configure.
///
/// An identifier always has the same state, which is created on first use and kept for the life of the process. With
/// the user default "TAVPersistSessions", the registry is saved after a client's first bag and restored at start-up.
///
/// `loadImages` must be called from a task of a serial queue; see `ImageLoader`. All other functions: any thread.
class ClientStateManager : public TAVEndpointXPC, public std::enable_shared_from_this<ClientStateManager> {
public:
    static std::shared_ptr<ClientStateManager> make(Assembly& assembly);
    explicit ClientStateManager(Assembly& assembly);
    ~ClientStateManager() override;

    /// Returns the client's state, and creates it on first use. Returns null if the identifier is missing or empty, or
    /// if 1,024 other clients are known.
    [[nodiscard]] std::shared_ptr<ClientState> stateForClientIdentifier(const std::optional<std::string>& identifier);
    /// Returns the address of the endpoint's listener.
    [[nodiscard]] std::string endpoint() const;
    /// Returns {"identifier", "agent"} of each state that has a user agent, sorted by identifier.
    [[nodiscard]] platform::Value::Array sessions() const;
    /// Saves the registry asynchronously if "TAVPersistSessions" is set.
    void saveState();

    // Forwarded to the image loader.
    void processImagesFromResponse(std::shared_ptr<const platform::JsonDocument> response,
                                   std::shared_ptr<const TAVBag> bag, platform::UrlSource source);
    [[nodiscard]] std::set<std::string> validImageHosts() const;
    void loadImages(platform::Value::Array images, std::uint64_t timeout,
                    platform::Reply<platform::Value> reply) override;

    /// Performs the request for the configuration's client. Without a valid identifier, replies with error 500.
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
