#pragma once

#include <map>
#include <memory>
#include <set>
#include <string>

#include "CoreTavrin/TAVProtocols.h"
#include "platform/base/Bytes.h"
#include "platform/net/UrlSession.h"
#include "tavrind/ImageFetches.h"

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;
struct ZRFeedback;
class ClientState;

/// The registry of client states, and the object served on the endpoint that clients get from their configuration; and
/// what fetches images into the HTTP cache, for both.
///
/// One identifier always has the same state, made when it is first asked for and kept as long as the process. With the
/// user default "TAVPersistSessions" the registry is written after a client's first bag and restored at start.
///
/// Images are fetched from where they say themselves and from where the bag says by their identifiers, 24 at once, each
/// of 10 MiB at most (ClientStateManagerImages.cpp). Those of an answer are fetched ahead, and nobody waits for them;
/// those that a client asks for go before them. What the cache holds isn't fetched, and what is on its way isn't
/// fetched twice.
///
/// `loadImages` must be called from a task of a serial queue (the connection's), which is held back while it waits.
/// Everything else: any thread.
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

    /// Fetches the images of an answer into the HTTP cache, soon. Nothing without a bag.
    void processImagesFromResponse(const platform::Value& response, const std::shared_ptr<const TAVBag>& bag);
    /// Hosts of the images that were asked for or named in answers, the first 1000. For diagnostics.
    [[nodiscard]] std::set<std::string> validImageHosts() const;

    void request(std::shared_ptr<TAVRequest> request, std::shared_ptr<TAVSessionConfiguration> configuration,
                 RequestReply reply) override;
    /// A minute at most, whatever the client says. One answer holds 32 MiB of images; further ones are left out.
    void loadImages(platform::Value::Array images, std::uint64_t timeout,
                    platform::Reply<platform::Value> reply) override;

private:
    struct ImageLoad;

    // Images (ClientStateManagerImages.cpp).
    void _addImageHosts(const std::set<std::string>& hosts);
    void _fetchImages(const std::vector<platform::Url>& urls, const TAVBag& bag, const ImageGroup& group);
    void _fetchImageURL(const platform::Url& url, std::optional<platform::Duration> timeoutInterval,
                        const ImageGroup& group);
    void _startImageFetches();
    void _startImageFetch(const ImageFetch& fetch);
    void _endImageFetch(const ImageLoad& load, const std::optional<platform::UrlResponse>& response,
                        const std::optional<platform::Error>& error);
    void _keepImage(const ImageLoad& load, const platform::UrlResponse& response);
    [[nodiscard]] platform::Bytes _cachedImage(const std::optional<platform::Url>& url) const;
    [[nodiscard]] platform::Value _cachedImages(const platform::Value::Array& images, const TAVBag& bag) const;
    void _addImageFeedback(std::shared_ptr<ZRFeedback> record);

    void loadState();
    void _accept(std::shared_ptr<platform::ipc::Connection> connection);
    [[nodiscard]] platform::Value::Array _sessions() const;

    Assembly& _assembly;
    const bool _persistSessions;
    std::shared_ptr<platform::Queue> stateCacheQueue;
    std::map<std::string, std::shared_ptr<ClientState>> stateCache; // on stateCacheQueue
    std::shared_ptr<platform::Queue> _imageHostsQueue;
    std::set<std::string> _validImageHosts; // on _imageHostsQueue
    std::shared_ptr<platform::Queue> _imageQueue;
    ImageFetches _imageFetches; // on _imageQueue
    std::unique_ptr<platform::ipc::Listener> _listener;
};

} // namespace tavrin
