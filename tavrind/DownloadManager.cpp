#include "tavrind/DownloadManager.h"

#include <cerrno>
#include <vector>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "platform/device/Device.h"
#include "platform/files/UserDefaults.h"
#include "platform/values/Dictionary.h"
#include "tavrind/Assembly.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Url;
using platform::UrlRequest;
using platform::UrlResponse;
using platform::Value;

namespace fs = std::filesystem;

namespace {

constexpr const char* kTableKey = "download_resources";
constexpr const char* kIdentifierHeader = "X-Quorvane-Download-Identifier";
constexpr const char* kDirectory = "com.quorvane.tavrind";
constexpr const char* kDelayKey = "TAVDownloadDelay"; // for development
constexpr std::int64_t kLongestDelay = 24 * 60 * 60;
/// Time limit for the list of downloads that a bag cancels.
constexpr std::chrono::seconds kLongestWait(60);

std::string identifierOf(const UrlRequest& request)
{
    const std::string* identifier = request.headers.find(kIdentifierHeader);
    return identifier ? *identifier : std::string();
}

std::string textOf(const platform::HttpHeaders& headers)
{
    std::string text;
    for (const auto& [name, value] : headers) text += fmt::format("{}{}: {}", text.empty() ? "" : "; ", name, value);
    return text;
}

void logTaskError(const std::string& reason)
{
    log(kLogDownloadManager)
        .error("download task error {}", makeTAVError(TAVErrorInvalidResponse, reason).description());
}

void logUnknown(const std::string& identifier, const UrlRequest& request)
{
    log(kLogDownloadManager)
        .error("could not find resource for download identifier: {} url: {}", identifier, request.url.string());
    logTaskError(fmt::format("can't find {}", identifier));
}

} // namespace

std::shared_ptr<DownloadManager> DownloadManager::make(Assembly& assembly)
{
    auto manager = std::make_shared<DownloadManager>(assembly);
    const std::weak_ptr weak = manager;
    manager->_bagObserver = assembly.notificationCenter.observe(
        TAVBagChangeNotification, [weak](const platform::Notification& notification) {
            const auto bag = notification.get<std::shared_ptr<const TAVBag>>("bag");
            const auto self = weak.lock();
            if (self && bag) self->bagChangeNotification(bag);
        });
    manager->_locationObserver =
        assembly.notificationCenter.observe(TAVSignificantLocationChange, [weak](const platform::Notification&) {
            if (const auto self = weak.lock()) self->_handleSignificantLocationChange();
        });
    return manager;
}

DownloadManager::DownloadManager(Assembly& assembly)
    : _assembly(assembly), _queue(assembly.device.serialQueue("com.quorvane.tavrin.DownloadManager", rank::kRoot,
                                                              platform::Priority::Background))
{
    _loadResources(); // for readers before `_start`
}

DownloadManager::~DownloadManager() = default;

void DownloadManager::setLookupResources(std::weak_ptr<LookupResources> lookupResources)
{
    _queue->async([weak = weak_from_this(), lookupResources = std::move(lookupResources)] {
        const auto self = weak.lock();
        if (!self) return;
        self->_lookupResources = lookupResources;
    });
}

std::optional<DownloadResource> DownloadManager::resourceForKey(const std::string& identifier) const
{
    const auto published = _lastPublished();
    const auto found = published->resources.find(identifier);
    return found == published->resources.end() ? std::nullopt : std::optional(found->second);
}

platform::Dictionary DownloadManager::resourceVersions() const
{
    return _lastPublished()->versions;
}

platform::Result<DownloadManager::Resource> DownloadManager::fileHandleForResource(const std::string& identifier) const
{
    const auto path = _pathToResource(identifier);
    if (!path) return std::unexpected(path.error());
    auto file = _assembly.fileManager.openForReading(*path);
    if (!file && file.error().code == ENOENT)
        return std::unexpected(makeTAVError(TAVErrorNotFound, "no resource " + identifier));
    if (!file) return std::unexpected(makeTAVError(TAVErrorInvalidResponse, file.error().description()));
    const auto info = platform::fileInfo(*file);
    if (!info) return std::unexpected(makeTAVError(TAVErrorInvalidResponse, info.error().description()));
    return Resource{
        std::move(*file),
        Value::dictionaryOf({{"size", info->size}, {"modified", info->modified}, {"created", info->created}})};
}

void DownloadManager::bagChangeNotification(const std::shared_ptr<const TAVBag>& bag)
{
    log(kLogDownloadManager).log("bag change: {}", bag->version());
    _start();
    _queue->async([weak = weak_from_this(), bag] {
        if (const auto self = weak.lock()) self->_downloadBagResources(bag);
    });
}

void DownloadManager::_handleSignificantLocationChange()
{
    _start();
    _queue->async([weak = weak_from_this()] {
        const auto self = weak.lock();
        if (!self) return;
        for (const std::string_view identifier : {kTAVLookupHintsWeekly, kTAVLookupHintsMonthly})
            self->_deleteResource(std::string(identifier), File::Keep);
        self->_saveResources();
    });
}

void DownloadManager::_start()
{
    // A concurrent caller returns after the loading is queued, so its own tasks run later.
    std::call_once(_started, [this] {
        log(kLogDownloadManager).log("started");
        _queue->async([weak = weak_from_this()] {
            if (const auto self = weak.lock()) self->_loadResources();
        });
    });
}

void DownloadManager::_loadResources()
{
    _resources = resourcesIn(_assembly.userDefaults.value(kTableKey));
    _publish();
}

void DownloadManager::_saveResources()
{
    _publish();
    Value table = valueOf(_resources);
    if (_assembly.userDefaults.value(kTableKey) != table) _assembly.userDefaults.set(kTableKey, std::move(table));
}

void DownloadManager::_publish()
{
    platform::Dictionary versions;
    for (const auto& [identifier, resource] : _resources)
        if (std::string version = _resourceVersion(resource); !version.empty())
            versions.set(identifier, std::move(version));
    auto published = std::make_shared<const Published>(_resources, std::move(versions));
    const platform::MutexLock lock(_publishedMutex);
    _published.swap(published);
}

std::shared_ptr<const DownloadManager::Published> DownloadManager::_lastPublished() const
{
    const platform::MutexLock lock(_publishedMutex);
    return _published;
}

void DownloadManager::_downloadBagResources(const std::shared_ptr<const TAVBag>& bag)
{
    _queue->assertOnQueue();
    struct List {
        platform::Event arrived;
        std::vector<std::shared_ptr<platform::BackgroundTask>> tasks;
    };
    const auto list = std::make_shared<List>();
    _assembly.downloadURLSession->getTasks([list](auto tasks) {
        list->tasks = std::move(tasks);
        list->arrived.signal();
    });
    _queue->suspendUntil(list->arrived, kLongestWait, [weak = weak_from_this(), list, bag] {
        const auto self = weak.lock();
        if (!self) return;
        const bool arrived = list->arrived.signalled();
        if (!arrived) log(kLogDownloadManager).error("the list of downloads did not arrive in time, cancelling none");
        self->_replaceDownloads(arrived ? std::move(list->tasks) : decltype(list->tasks)(), *bag);
    });
}

void DownloadManager::_replaceDownloads(const std::vector<std::shared_ptr<platform::BackgroundTask>>& tasks,
                                        const TAVBag& bag)
{
    for (const auto& task : tasks) {
        log(kLogDownloadManager).log("canceling {}", task->originalRequest().url.string());
        task->cancel();
    }
    for (const std::string_view key : kTAVResourceIdentifiers) {
        const std::string identifier(key);
        if (_isAllowed(identifier))
            _addResource(identifier, bag.resourceURL(identifier));
        else
            log(kLogDownloadManager).log("{} is disabled, not downloading", identifier);
    }
    _saveResources();
}

void DownloadManager::_addResource(const std::string& identifier, const std::optional<Url>& url)
{
    if (!url) return _deleteResource(identifier, File::Remove);
    DownloadResource& resource = _resources.try_emplace(identifier, DownloadResource{identifier}).first->second;
    if (!downloadReason(resource, *url, _fileExists(identifier))) {
        _pending.erase(identifier);
        return;
    }
    if (const auto pending = _pending.find(identifier); pending != _pending.end()) {
        pending->second.url = *url;
        return;
    }
    const std::uint64_t timer = ++_lastTimer;
    _pending.emplace(identifier, Pending{*url, timer});
    _queue->after(_configuredDelay().value_or(kDownloadDelay), [weak = weak_from_this(), identifier, timer] {
        if (const auto self = weak.lock()) self->_startPending(identifier, timer);
    });
}

void DownloadManager::_startPending(const std::string& identifier, std::uint64_t timer)
{
    const auto pending = _pending.find(identifier);
    if (pending == _pending.end() || pending->second.timer != timer) return; // cancelled
    const Url url = std::move(pending->second.url);
    _pending.erase(pending);
    const auto found = _resources.find(identifier);
    if (found == _resources.end()) return;
    if (!_isAllowed(identifier)) return log(kLogDownloadManager).log("{} is disabled, not downloading", identifier);
    if (const auto reason = downloadReason(found->second, url, _fileExists(identifier)))
        _downloadResource(found->second, url, *reason);
}

void DownloadManager::_downloadResource(const DownloadResource& resource, const Url& url, std::string_view reason)
{
    UrlRequest request = _createDownloadRequest(resource, url);
    log(kLogDownloadManager)
        .log("starting download of {} reason: {} delay: {:f} headers: {}", url.string(), reason,
             platform::toSeconds(_configuredDelay().value_or(kDownloadDelay)),
             platform::Private{textOf(request.headers)}); // may reveal the location
    const auto task = _assembly.downloadURLSession->downloadTask(std::move(request));
    if (!task) return log(kLogDownloadManager).error("download task error {}", task.error().description());
    (*task)->setNote(url.string()); // the request's URL has more query items
    if (!_configuredDelay()) (*task)->setStartWindow(kDownloadWindow);
    (*task)->resume();
}

UrlRequest DownloadManager::_createDownloadRequest(const DownloadResource& resource, const Url& url) const
{
    // Without the file, a 304 would leave the resource missing.
    const std::string version = _fileExists(resource.identifier) ? _resourceVersion(resource) : "";
    UrlRequest request =
        _assembly.requestFactory->fileDownloadRequest(url, version, isLookupResource(resource.identifier));
    request.headers.set(kIdentifierHeader, resource.identifier);
    return request;
}

std::string DownloadManager::_resourceVersion(const DownloadResource& resource) const
{
    if (isLookupResource(resource.identifier) && resource.redirectUrl)
        return signatureFromURL(*resource.redirectUrl).value_or("");
    return resource.url ? resource.url->queryValue("version").value_or("") : "";
}

/// Returns the delay of the user default; nothing if that is missing or invalid.
std::optional<platform::Duration> DownloadManager::_configuredDelay() const
{
    const auto seconds = _assembly.userDefaults.integer(kDelayKey);
    if (!seconds || *seconds < 0 || *seconds > kLongestDelay) return std::nullopt;
    return std::chrono::seconds(*seconds);
}

bool DownloadManager::_isAllowed(const std::string& identifier) const
{
    const auto lookup = _lookupResources.lock();
    return !isLookupResource(identifier) || !lookup || lookup->lookupEnabled();
}

bool DownloadManager::_fileExists(const std::string& identifier) const
{
    const auto path = _pathToResource(identifier);
    const auto info = path ? _assembly.fileManager.info(*path) : std::unexpected(path.error());
    return info && info->kind == platform::FileInfo::Kind::File;
}

platform::Result<fs::path> DownloadManager::_pathToResource(const std::string& identifier) const
{
    if (identifier.empty())
        return std::unexpected(makeTAVError(TAVErrorInvalidResponse, "error resource bag key is nil"));
    if (!isResource(identifier)) return std::unexpected(makeTAVError(TAVErrorNotFound, "no resource " + identifier));
    return _assembly.device.directories.caches / kDirectory / identifier;
}

void DownloadManager::_deleteResource(const std::string& identifier, File file)
{
    log(kLogDownloadManager).info("deleting resource: {}", identifier);
    _pending.erase(identifier);
    if (_resources.erase(identifier) > 0) _publish();
    if (file == File::Remove) _removeFile(identifier);
    _assembly.notificationCenter.post({.name = TAVFileDeletedNotification, .userInfo = {{"identifier", identifier}}});
}

void DownloadManager::_removeFile(const std::string& identifier) const
{
    const auto path = _pathToResource(identifier);
    if (!path)
        return log(kLogDownloadManager)
            .error("error trying to get path to file for deletion {}", path.error().description());
    const auto removed = _assembly.fileManager.remove(*path);
    if (!removed && removed.error().code != ENOENT)
        log(kLogDownloadManager).error("error deleting resource {}: {}", identifier, removed.error().description());
}

void DownloadManager::taskDidFinishDownloading(const std::shared_ptr<platform::BackgroundTask>& task,
                                               const fs::path& file, const UrlResponse& response)
{
    const UrlRequest& request = task->originalRequest();
    const std::string identifier = identifierOf(request);
    if (!isResource(identifier)) {
        log(kLogDownloadManager)
            .error("failed to find download for identifier: {} url: {}", identifier, request.url.string());
        return logUnknown(identifier, request);
    }
    const auto path = _pathToResource(identifier);
    if (!path) return log(kLogDownloadManager).error("failed getting destination URL for {}", identifier);

    if (response.statusCode == 200) {
        log(kLogDownloadManager).log("download of {} finished {}", identifier, response.url.string());
        const auto made = _assembly.fileManager.createDirectories(path->parent_path());
        if (!made)
            return log(kLogDownloadManager).error("error getting cache directory {}", made.error().description());
        const auto replaced = _assembly.fileManager.replace(*path, file);
        if (!replaced)
            return log(kLogDownloadManager).error("error copying download {}", replaced.error().description());
    } else {
        log(kLogDownloadManager).log("download of {} got a {} response", identifier, response.statusCode);
        if (response.statusCode != 304) return;
    }
    _start(); // a task of an earlier process may report before the first bag
    _queue->async([weak = weak_from_this(), identifier, where = *path, note = task->note(), request, response] {
        const auto self = weak.lock();
        if (!self) return;
        self->_noteReceived(identifier, note, request, response);
        if (response.statusCode == 200)
            self->_assembly.notificationCenter.post({.name = TAVFileDownloadCompletedNotification,
                                                     .userInfo = {{"identifier", identifier}, {"url", where}}});
    });
}

void DownloadManager::_noteReceived(const std::string& identifier, const Value& note, const UrlRequest& request,
                                    const UrlResponse& response)
{
    _queue->assertOnQueue();
    const auto found = _resources.find(identifier);
    if (found == _resources.end()) return logUnknown(identifier, request); // not in the bag, or deleted after a move
    DownloadResource& resource = found->second;
    resource.url = note.asString() ? Url::parse(*note.asString()) : std::nullopt;
    if (response.url != request.url)
        resource.redirectUrl = response.url;
    else if (response.statusCode == 200)
        resource.redirectUrl.reset(); // a 304 keeps the old copy and its origin
    log(kLogDownloadManager).log("{} url: {}", identifier, response.url.string());
    _assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.resourcefilesfetched");
    _saveResources();
}

void DownloadManager::taskDidComplete(const std::shared_ptr<platform::BackgroundTask>& task,
                                      const std::optional<UrlResponse>& response,
                                      const std::optional<platform::Error>& error)
{
    if (error && error->code == platform::kUrlCancelled) return;
    if (error)
        return logTaskError(fmt::format("download error {} of {} {}", error->description(),
                                        task->originalRequest().url.string(), error->code));
    if (!response || response->url.empty())
        return log(kLogDownloadManager).error("task completed with nil url and error: none");
    if (response->statusCode != 200 && response->statusCode != 304)
        logTaskError(fmt::format("status code {}", response->statusCode));
}

} // namespace tavrin
