#include "tavrind/ImageLoader.h"

#include <algorithm>

#include <fmt/format.h>

#include "CoreTavrin/ResponseImages.h"
#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "platform/device/Device.h"
#include "platform/net/HttpCache.h"
#include "platform/net/UrlRedirect.h"
#include "platform/run/Clock.h"
#include "platform/run/Queue.h"
#include "platform/run/Transactions.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "searchrecords/ZRNetworkFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/FeedbackRecords.h"
#include "tavrind/mmap_file.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Dictionary;
using platform::Error;
using platform::JsonView;
using platform::Private;
using platform::Url;
using platform::UrlResponse;
using platform::Value;

namespace {

using namespace std::chrono_literals;

/// Maximum time of a client's wait.
constexpr platform::Duration kLongestLoad = 60s;
/// In bytes; the largest response that the HTTP cache stores.
constexpr std::size_t kMaximumImage = 10u << 20;
/// Bytes of images in one reply; less than the limit of unread bytes for all clients together
/// (`ipc::Limits::unreadBytes`).
constexpr std::size_t kMaximumAnswer = 16u << 20;
constexpr std::size_t kMaximumHosts = 1000;

/// Returns all URLs in the order of fetching.
std::vector<Url> inOrder(OrderedImages images)
{
    std::vector<Url> urls = std::move(images.primary);
    std::ranges::move(images.secondary, std::back_inserter(urls));
    return urls;
}

} // namespace

/// One fetch under way, owned by its task's completion.
struct ImageLoader::Load {
    Url url;
    platform::Transactions::Token transaction;
    std::shared_ptr<ZRStartNetworkSearchFeedback> start;
    platform::Result<platform::FileHandle> file;
    std::weak_ptr<platform::UrlTask> task; // owns this
};

ImageLoader::ImageLoader(Assembly& assembly)
    : _assembly(assembly),
      _imageHostsQueue(assembly.device.concurrentQueue("com.quorvane.tavrind.imageHostsQueue", rank::kStore)),
      _imageQueue(assembly.device.serialQueue("com.quorvane.tavrind.images", rank::kRoot))
{}

std::set<std::string> ImageLoader::validImageHosts() const
{
    return _imageHostsQueue->sync([this] { return _validImageHosts; });
}

void ImageLoader::_addImageHosts(const std::set<std::string>& hosts)
{
    for (const std::string& host : hosts) {
        if (_validImageHosts.size() == kMaximumHosts) return;
        _validImageHosts.insert(host);
    }
}

void ImageLoader::processImagesFromResponse(std::shared_ptr<const platform::JsonDocument> response,
                                            std::shared_ptr<const TAVBag> bag, platform::UrlSource source)
{
    if (!bag) return;
    _imageQueue->async([weak = weak_from_this(), response = std::move(response), bag = std::move(bag), source] {
        const auto self = weak.lock();
        if (!self) return;
        self->_source = source;
        OrderedImages images;
        std::set<std::string> seen;
        enumerateImagesInResponse(response->root(),
                                  [&](JsonView image) { collectOrderedImages(*bag, image.value(), &seen, images); });
        if (images.hosts.empty()) return;
        self->_imageHostsQueue->barrierAsync([weak, hosts = std::move(images.hosts)] {
            if (const auto loader = weak.lock()) loader->_addImageHosts(hosts);
        });
        self->_fetchImages(inOrder(std::move(images)), *bag, source, nullptr);
    });
}

void ImageLoader::loadImages(Value::Array images, std::uint64_t timeout, platform::Reply<Value> reply)
{
    const auto bag = _assembly.bagController->currentBag();
    if (!bag) return reply(Dictionary());

    OrderedImages found;
    for (const Value& image : images) collectOrderedImages(*bag, image, nullptr, found);
    if (found.hosts.empty()) return reply(Dictionary());
    _imageHostsQueue->barrierSync([&] { _addImageHosts(found.hosts); });

    const auto done = std::make_shared<platform::Event>();
    _imageQueue->async([weak = weak_from_this(), urls = inOrder(std::move(found)), bag,
                        group = ImageGroup(done.get(), [done](void*) { done->signal(); })] {
        const auto self = weak.lock();
        if (!self) return;
        const auto presumed = platform::sourceOf(bag->searchURL().value_or(Url()));
        self->_fetchImages(urls, *bag, self->_source.value_or(presumed), group);
    });
    const platform::Duration limit(
        static_cast<std::int64_t>(std::min(timeout, static_cast<std::uint64_t>(kLongestLoad.count()))));
    platform::Queue::current()->suspendUntil(
        *done, limit, [weak = weak_from_this(), images = std::move(images), bag, reply = std::move(reply)]() mutable {
            const auto self = weak.lock();
            reply(self ? self->_cachedImages(images, *bag) : Value(Dictionary()));
        });
}

platform::Bytes ImageLoader::_cachedImage(const std::optional<Url>& url) const
{
    const auto cache = _assembly.urlSession->cache();
    const auto kept = url && cache ? cache->find(*url) : std::nullopt;
    return kept ? kept->body : platform::Bytes();
}

Value ImageLoader::_cachedImages(const Value::Array& images, const TAVBag& bag) const
{
    Dictionary loaded;
    std::size_t size = 0;
    const auto map = [&](const std::string& name, platform::Bytes image) {
        if (size + image.size() > kMaximumAnswer)
            return log(kLogImages)
                .error("the reply is full, leaving out {} bytes of image {}", image.size(), Private{name});
        size += image.size();
        loaded.set(name, std::move(image));
    };
    for (const Value& image : images) {
        const std::string* url = image["url"].asString();
        const std::string* identifier = image["id"].asString();
        if ((url && loaded.contains(*url)) || (!url && identifier && loaded.contains(*identifier))) continue;
        if (const auto data = _cachedImage(url ? Url::parse(*url) : std::nullopt); !data.empty()) {
            log(kLogImages).log("mapping image url {} to {} bytes of data", Private{*url}, data.size());
            map(*url, data);
        } else if (identifier && !loaded.contains(*identifier)) {
            const auto other = _cachedImage(bag.urlForIdentifier(*identifier));
            if (other.empty()) continue;
            log(kLogImages).log("mapping image id {} to {} bytes of data", Private{*identifier}, other.size());
            map(*identifier, other);
        }
    }
    return loaded;
}

void ImageLoader::_fetchImages(const std::vector<Url>& urls, const TAVBag& bag, platform::UrlSource source,
                               const ImageGroup& group)
{
    const auto seconds = bag.timeoutIntervalForRequest();
    const auto timeout = seconds ? std::optional(requestTimeout(*seconds)) : std::nullopt;
    std::size_t left = 0;
    for (const Url& url : urls)
        if (!_fetchImageURL(url, timeout, source, group)) ++left;
    if (left > 0)
        log(kLogImages).error("{} images wait already, not fetching {} further ones", ImageFetches::kWaiting, left);
}

bool ImageLoader::_fetchImageURL(const Url& url, std::optional<platform::Duration> timeoutInterval,
                                 platform::UrlSource source, const ImageGroup& group)
{
    _imageQueue->assertOnQueue();
    const auto cache = _assembly.urlSession->cache();
    if (!url.scheme().starts_with("http")) {
        log(kLogImages).fault("invalid url scheme: {}", Private{url.string()});
    } else if (_imageFetches.join(url, group)) {
        _startImageFetches(); // the fetch may have moved to a lane with a free slot
    } else if (cache && cache->find(url)) {
        _assembly.requestFigures.record("cached image", {}, false);
        log(kLogImages).log("found {} in cache", Private{url.string()});
    } else if (_imageFetches.add({url, timeoutInterval, source}, group)) {
        _startImageFetches();
    } else {
        return false;
    }
    return true;
}

void ImageLoader::_startImageFetches()
{
    while (const auto fetch = _imageFetches.next()) _startImageFetch(*fetch);
}

void ImageLoader::_startImageFetch(const ImageFetch& fetch)
{
    log(kLogImages).log("fetching image {}", Private{fetch.url.string()});
    platform::Device& device = _assembly.device;
    platform::UrlRequest request{.url = fetch.url,
                                 .timeout = fetch.timeoutInterval,
                                 .maximumResponseSize = kMaximumImage,
                                 .source = fetch.source};
    const auto load = std::make_shared<Load>(
        Load{.url = fetch.url,
             .transaction = device.transactions.begin("imageFetch"),
             .start = startNetworkSearchFeedback("", request, StartSearchTrigger::ImageLoad, EndpointType::TavrinImage),
             .file = device.files.createTemporary(),
             .task = {}});
    _addImageFeedback(load->start);

    platform::TransferFiles files;
    if (load->file) files.download = load->file->duplicate();
    const auto task = _assembly.urlSession->transferTask(
        std::move(request), std::move(files),
        [weak = weak_from_this(), load](auto, const std::optional<UrlResponse>& response,
                                        const std::optional<Error>& error) {
            if (const auto self = weak.lock()) self->_endImageFetch(*load, response, error);
        });
    load->task = task;
    task->resume();
}

void ImageLoader::_endImageFetch(const Load& load, const std::optional<UrlResponse>& response,
                                 const std::optional<Error>& error)
{
    const std::string& url = load.url.string();
    const int statusCode = response ? response->statusCode : 0;
    const std::uint64_t taken = _assembly.device.clock.hostTicks() - load.start->timestamp;
    _assembly.requestFigures.record("image", platform::Duration(static_cast<std::int64_t>(taken)),
                                    error || statusCode != 200);
    if (error) {
        log(kLogImages).error("Error fetching image {}: {}", Private{url}, error->description());
        ClientSessionManager::reportErrorAsTavrindFeedback(
            makeTAVError(TAVErrorInvalidResponse, fmt::format("image fetch error {}", error->description())),
            _assembly);
    } else if (statusCode != 200) {
        log(kLogImages).error("Bad status code {} for image {}", statusCode, Private{url});
    } else {
        log(kLogImages).log("Fetched image {}", Private{url});
        _keepImage(load, *response);
    }
    _imageQueue->async([weak = weak_from_this(), ended = load.url] {
        const auto self = weak.lock();
        if (!self) return;
        self->_imageFetches.end(ended);
        self->_startImageFetches();
    });
}

void ImageLoader::_keepImage(const Load& load, const UrlResponse& response)
{
    if (!load.file) {
        log(kLogImages).error("opening file failed {}", load.file.error().description());
        return ClientSessionManager::reportErrorAsTavrindFeedback(
            makeTAVError(TAVErrorInvalidResponse, "file open failed"), _assembly);
    }
    const auto image = mmapFileHandle(*load.file);
    if (!image) {
        log(kLogImages).error("mmap failed {}", image.error().description());
        return ClientSessionManager::reportErrorAsTavrindFeedback(image.error(), _assembly);
    }
    log(kLogImages).log("caching {} bytes for {}", image->size(), Private{load.url.string()});
    if (const auto cache = _assembly.urlSession->cache()) cache->store(load.url, response, *image);
    const auto task = load.task.lock();
    _addImageFeedback(std::make_shared<ZREndNetworkSearchFeedback>(load.start, image->size(), response.statusCode,
                                                                   task ? task->timingData() : Value()));
}

void ImageLoader::_addImageFeedback(std::shared_ptr<ZRFeedback> record)
{
    const auto& manager = _assembly.clientSessionManager;
    if (!manager) return;
    record->timestamp = _assembly.device.clock.hostTicks();
    manager->addTavrinFeedback(
        std::make_shared<TavrinFeedback>(std::move(record), 0, "", ClientSessionManager::tavrindUserAgent()));
}

} // namespace tavrin
