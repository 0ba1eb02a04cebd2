#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/net/UrlSession.h"
#include "platform/run/Reply.h"
#include "platform/values/Value.h"
#include "tavrind/ImageFetches.h"

namespace platform {
class JsonDocument;
class Queue;
} // namespace platform

namespace tavrin {

struct Assembly;
struct ZRFeedback;
class TAVBag;

/// Fetches images into the HTTP cache: prefetches those that answers of the service name, and fetches those that a
/// client waits for.
///
/// An image is fetched from its own URL and from the URL that the bag maps its identifier to. Its limits are 10 MiB and
/// five minutes. Cached images and images under way are not fetched again. `ImageFetches` decides which fetch is next.
///
/// `loadImages` must be called in a task of a serial queue (the connection's), which is suspended while it waits. All
/// other functions: any thread.
class ImageLoader : public std::enable_shared_from_this<ImageLoader> {
public:
    explicit ImageLoader(Assembly& assembly);

    /// Starts the prefetch of an answer's images, asynchronously. Does nothing without a bag. `source` is the answer's
    /// origin: its image URLs may lead only where a redirect from there may.
    void processImagesFromResponse(std::shared_ptr<const platform::JsonDocument> response,
                                   std::shared_ptr<const TAVBag> bag, platform::UrlSource source);
    /// Fetches images ({"url", "id"}), for `timeout` nanoseconds or a minute at most, and replies with the bytes of
    /// those that the cache then has, by "url" or else "id". A reply holds 16 MiB of images; further ones are left out.
    /// Clients name images of answers, so their URLs may lead only where a redirect from the last answer's origin may.
    /// Before the first answer, that is the origin of the bag's search URL.
    void loadImages(platform::Value::Array images, std::uint64_t timeout, platform::Reply<platform::Value> reply);
    /// Returns the first 1,000 hosts of images that clients requested or answers named. For diagnostics.
    [[nodiscard]] std::set<std::string> validImageHosts() const;

private:
    struct Load;

    void _addImageHosts(const std::set<std::string>& hosts);
    void _fetchImages(const std::vector<platform::Url>& urls, const TAVBag& bag, platform::UrlSource source,
                      const ImageGroup& group);
    /// Returns false if too many images wait.
    bool _fetchImageURL(const platform::Url& url, std::optional<platform::Duration> timeoutInterval,
                        platform::UrlSource source, const ImageGroup& group);
    void _startImageFetches();
    void _startImageFetch(const ImageFetch& fetch);
    void _endImageFetch(const Load& load, const std::optional<platform::UrlResponse>& response,
                        const std::optional<platform::Error>& error);
    void _keepImage(const Load& load, const platform::UrlResponse& response);
    [[nodiscard]] platform::Bytes _cachedImage(const std::optional<platform::Url>& url) const;
    [[nodiscard]] platform::Value _cachedImages(const platform::Value::Array& images, const TAVBag& bag) const;
    void _addImageFeedback(std::shared_ptr<ZRFeedback> record);

    Assembly& _assembly;
    std::shared_ptr<platform::Queue> _imageHostsQueue;
    std::set<std::string> _validImageHosts; // on _imageHostsQueue
    std::shared_ptr<platform::Queue> _imageQueue;
    ImageFetches _imageFetches;                 // on _imageQueue
    std::optional<platform::UrlSource> _source; // of the last answer; on _imageQueue
};

} // namespace tavrin
