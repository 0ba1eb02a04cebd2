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
class Queue;
} // namespace platform

namespace tavrin {

struct Assembly;
struct ZRFeedback;
class TAVBag;

/// Fetches images into the HTTP cache: ahead, those that an answer of the service names, and on demand, those that a
/// client waits for.
///
/// An image is fetched from its own URL and from the URL that the bag makes of its identifier, 10 MiB at most, within
/// five minutes. What the cache holds isn't fetched, and what is under way isn't fetched twice; `ImageFetches` decides
/// which fetch is next.
///
/// `loadImages` must be called from a task of a serial queue (the connection's), which is held back while it waits.
/// Everything else: any thread.
class ImageLoader : public std::enable_shared_from_this<ImageLoader> {
public:
    explicit ImageLoader(Assembly& assembly);

    /// Starts to fetch the images of an answer, and returns. Without a bag it does nothing. `source` says where the
    /// answer came from: its image URLs lead no further than a redirect from there.
    void processImagesFromResponse(const platform::Value& response, const std::shared_ptr<const TAVBag>& bag,
                                   platform::UrlSource source);
    /// Fetches images ({"url", "id"}) and replies with the bytes of those that the cache has after `timeout`
    /// nanoseconds (a minute at most), by "url" or else "id". One reply holds 32 MiB of images; further ones are left
    /// out. Clients name images of answers, so that the source of the last answer holds for them; before the first
    /// one, that of the bag's search URL.
    void loadImages(platform::Value::Array images, std::uint64_t timeout, platform::Reply<platform::Value> reply);
    /// Hosts of the images that were asked for or named in answers, the first 1000. For diagnostics.
    [[nodiscard]] std::set<std::string> validImageHosts() const;

private:
    struct Load;

    void _addImageHosts(const std::set<std::string>& hosts);
    void _fetchImages(const std::vector<platform::Url>& urls, const TAVBag& bag, platform::UrlSource source,
                      const ImageGroup& group);
    void _fetchImageURL(const platform::Url& url, std::optional<platform::Duration> timeoutInterval,
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
