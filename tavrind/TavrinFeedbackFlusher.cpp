#include "tavrind/TavrinFeedbackFlusher.h"

#include <cerrno>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/Traces.h"
#include "platform/base/Log.h"
#include "platform/base/Uuid.h"
#include "platform/device/Device.h"
#include "platform/files/Files.h"
#include "platform/net/BackgroundSession.h"
#include "platform/run/Queue.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "searchrecords/ZRViewFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/CompressedOutputStream.h"
#include "tavrind/FeedbackBooks.h"
#include "tavrind/mmap_file.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using namespace std::chrono_literals;
using platform::Value;

namespace {

constexpr platform::Duration kUploadTimeout = 300s;
constexpr std::size_t kMaximumPath = 1024;
constexpr int kMaximumBodyFileAttempts = 16;

// Limits of records that are sent on their own: they are in memory until the next pass, for ten minutes or longer.
constexpr std::size_t kMaximumRecords = 1000;
constexpr std::size_t kMaximumRecordBytes = 8u << 20; // of JSON text

/// A record that is sent on its own: JSON made by its client.
class CustomFeedbackToSend final : public Flushable {
public:
    explicit CustomFeedbackToSend(std::shared_ptr<ZRCustomFeedback> record) : _record(std::move(record)) {}
    [[nodiscard]] std::optional<std::size_t> getFeedbacksToSend(OutputStream& stream) override
    {
        if (!_record->jsonFeedback.asDictionary() || stream.write(description()) < 0) return std::nullopt;
        return _record->jsonFeedback.count();
    }
    [[nodiscard]] std::size_t recordedEvents() const override { return 1; }
    [[nodiscard]] std::string description() const override { return platform::toJson(_record->jsonFeedback); }

private:
    std::shared_ptr<ZRCustomFeedback> _record;
};

/// Creates a file with an unpredictable name and stores its path in `path`.
platform::Result<std::unique_ptr<platform::AppendFile>>
makeTemporaryFile(platform::FileSystem& files, const std::filesystem::path& directory, std::filesystem::path& path)
{
    for (int attempt = 0;; ++attempt) {
        path = directory /
               (std::string(kUploadBodyPrefix) + platform::Uuid::random().string().substr(0, kUploadBodyDigits));
        if (path.native().size() >= kMaximumPath) return std::unexpected(platform::Error::posix(ENAMETOOLONG));
        auto file = files.createForAppending(path);
        if (file || file.error().code != EEXIST || attempt == kMaximumBodyFileAttempts) return file;
    }
}

} // namespace

std::string_view convertIdentifierToString(FlusherIdentity identifier)
{
    return enumToString(identifier).value_or("");
}

Value UploadNote::value() const
{
    return Value::dictionaryOf({{"flusher", static_cast<std::int64_t>(flusher)},
                                {"feedbacks", feedbacks},
                                {"events", events},
                                {"process", process}});
}

UploadNote UploadNote::from(const Value& value)
{
    return {.flusher = static_cast<FlusherIdentity>(value["flusher"].asInt().value_or(-1)),
            .feedbacks = value["feedbacks"].asInt().value_or(0),
            .events = value["events"].asUInt().value_or(0),
            .process = value["process"].asString() ? *value["process"].asString() : ""};
}

std::shared_ptr<TavrinFeedbackFlusher> TavrinFeedbackFlusher::make(Assembly& assembly, FlusherIdentity identifier)
{
    auto flusher = std::make_shared<TavrinFeedbackFlusher>(assembly, identifier);
    flusher->_bagObserver = assembly.notificationCenter.observe(
        TAVBagChangeNotification, [weak = flusher->weak_from_this()](const platform::Notification& notification) {
            if (auto self = weak.lock())
                self->bagChangeNotification(notification.get<std::shared_ptr<const TAVBag>>("bag"));
        });
    return flusher;
}

TavrinFeedbackFlusher::TavrinFeedbackFlusher(Assembly& assembly, FlusherIdentity identifier)
    : _assembly(assembly), _identifier(identifier),
      _queueBuffer(assembly.device.serialQueue("com.quorvane.tavrind.tavrinDataBufferQueue", rank::kShared,
                                               platform::Priority::Background)),
      _feedbackCountQueue(assembly.device.serialQueue("com.quorvane.tavrind.feedbackCountQueue", rank::kContext))
{
    log(kLogFlusher).log("Initialize flusher for {}", convertIdentifierToString(identifier));
}

TavrinFeedbackFlusher::~TavrinFeedbackFlusher() = default;

void TavrinFeedbackFlusher::flush(std::shared_ptr<Flushable> object, std::move_only_function<void()> callback)
{
    _queueBuffer->async(
        [self = shared_from_this(), object = std::move(object), callback = std::move(callback)]() mutable {
            self->_sessionBuffer.push_back(std::move(object));
            if (callback) callback();
        });
}

void TavrinFeedbackFlusher::flush(std::shared_ptr<ZRCustomFeedback> record, std::move_only_function<void()> callback)
{
    _queueBuffer->async(
        [self = shared_from_this(), record = std::move(record), callback = std::move(callback)]() mutable {
            const std::size_t size = platform::jsonSize(record->jsonFeedback);
            const bool full =
                self->_recordsBuffered == kMaximumRecords || size > kMaximumRecordBytes - self->_recordBytesBuffered;
            if (full) {
                log(kLogFlusher)
                    .error("{} records of {} bytes are waiting, dropping one of {} bytes", self->_recordsBuffered,
                           self->_recordBytesBuffered, size);
            } else {
                ++self->_recordsBuffered;
                self->_recordBytesBuffered += size;
                self->_sessionBuffer.push_back(std::make_shared<CustomFeedbackToSend>(std::move(record)));
            }
            self->_assembly.feedbackBooks.record(full ? FeedbackFate::BufferFull : FeedbackFate::Open);
            if (callback) callback();
        });
}

void TavrinFeedbackFlusher::flushSyncFromArray(std::vector<std::shared_ptr<Flushable>> objects)
{
    _queueBuffer->async([self = shared_from_this(), objects = std::move(objects)] {
        self->_sessionBuffer.insert(self->_sessionBuffer.end(), objects.begin(), objects.end());
    });
}

void TavrinFeedbackFlusher::dropFeedbacks()
{
    _queueBuffer->async([self = shared_from_this()] {
        for (const auto& object : self->_sessionBuffer)
            self->_assembly.feedbackBooks.move(FeedbackFate::Open, FeedbackFate::NotSent, object->recordedEvents());
        self->_sessionBuffer.clear();
        self->_recordsBuffered = self->_recordBytesBuffered = 0;
    });
}

void TavrinFeedbackFlusher::flushToWireAsync(std::move_only_function<void(Bodies)> callback)
{
    _queueBuffer->async([self = shared_from_this(), callback = std::move(callback)]() mutable {
        Bodies bodies = self->flushToWireWithObjectsReturned(static_cast<bool>(callback));
        // This is also the counter of accepted connections.
        self->_assembly.diagnosticData.addValue(static_cast<std::int64_t>(bodies.size()),
                                                "com.quorvane.tavrind.clientconnection");
        if (callback) callback(std::move(bodies));
    });
}

TavrinFeedbackFlusher::Bodies TavrinFeedbackFlusher::flushToWireSync()
{
    return _queueBuffer->sync([this] { return flushToWireWithObjectsReturned(true); });
}

TavrinFeedbackFlusher::Bodies TavrinFeedbackFlusher::flushToWireWithObjectsReturned(bool returned)
{
    _queueBuffer->assertOnQueue();
    log(kLogFlusher).info("Sessions Flushed {}", _sessionBuffer.size());
    if (!_serverEndpoint) log(kLogFlusher).error("Server endpoint not set, data can't be sent to server");
    Bodies bodies;
    _recordsBuffered = _recordBytesBuffered = 0;
    for (const auto& object : std::exchange(_sessionBuffer, {})) _flushObject(*object, returned ? &bodies : nullptr);
    return bodies;
}

void TavrinFeedbackFlusher::_flushObject(Flushable& object, Bodies* bodies)
{
    const std::size_t events = object.recordedEvents();
    const auto drop = [&](FeedbackFate why) { _assembly.feedbackBooks.move(FeedbackFate::Open, why, events); };

    std::filesystem::path fpath;
    auto file = makeTemporaryFile(_assembly.fileManager, _assembly.device.directories.temporary, fpath);
    log(kLogFlusher).debug("flushing to {}", fpath.string());
    if (!file) {
        log(kLogFlusher).error("Error creating file to write feedbacks to disk");
        return drop(FeedbackFate::NoBody);
    }
    CompressedOutputStream stream(std::make_unique<FileOutputStream>(std::move(*file)));
    stream.open();
    const auto count = object.getFeedbacksToSend(stream);
    stream.close();
    const auto error = stream.streamError();
    if (!count || error) { // the background activity removes the file later
        log(kLogFlusher)
            .error("Invalid JSON Object {} error {}", platform::Private{object.description()},
                   error ? error->description() : "not a dictionary");
        return drop(error ? FeedbackFate::NoBody : FeedbackFate::NotJson);
    }

    const std::string digest = stream.dataDigestForStream();
    if (bodies) _saveFile(fpath, *bodies);
    if (_serverEndpoint)
        _upload(fpath, digest, *count, events);
    else
        drop(FeedbackFate::EndpointUnset);
    if (const auto removed = _assembly.fileManager.remove(fpath); removed)
        log(kLogFlusher).debug("File removed {}", fpath.string());
    else
        log(kLogFlusher).error("File Remove Error fpath {} error {}", fpath.string(), removed.error().description());
}

void TavrinFeedbackFlusher::_saveFile(const std::filesystem::path& fpath, Bodies& bodies)
{
    const auto file = _assembly.fileManager.openForReading(fpath);
    if (!file) return log(kLogFlusher).error("open failed {}", file.error().description());
    auto body = mmapFileHandle(*file);
    if (!body) return log(kLogFlusher).error("mmap failed {}", body.error().description());
    bodies.push_back(std::move(*body));
}

void TavrinFeedbackFlusher::_upload(const std::filesystem::path& fpath, const std::string& digest, std::size_t count,
                                    std::size_t events)
{
    auto task = _assembly.uploadURLSession->uploadTask(
        _assembly.requestFactory->flusherUploadRequest(*_serverEndpoint, kUploadTimeout, digest), fpath);
    if (!task) {
        log(kLogFlusher)
            .error("Error creating Upload Task for fpath {}. Exception {} occurred for reason {}", fpath.string(),
                   task.error().domain, task.error().reason());
        return _assembly.feedbackBooks.move(FeedbackFate::Open, FeedbackFate::NoTask, events);
    }
    const auto feedbacks = static_cast<std::int64_t>(count);
    (*task)->setNote(UploadNote{
        .flusher = _identifier, .feedbacks = feedbacks, .events = events, .process = _assembly.feedbackBooks.process()}
                         .value());
    setFeedbacksPerTask(**task, feedbacks);
    _assembly.feedbackBooks.move(FeedbackFate::Open, FeedbackFate::Uploading, events);
    (*task)->resume();
}

Value TavrinFeedbackFlusher::preview(Flushable& object)
{
    const std::size_t events = object.recordedEvents();
    CompressedOutputStream stream;
    stream.open();
    const auto count = object.getFeedbacksToSend(stream);
    stream.close();
    if (!count || stream.streamError()) return {};
    const std::string& body = static_cast<const MemoryOutputStream&>(stream.outputStream()).contents();
    platform::Dictionary preview{
        {"flusher", convertIdentifierToString(_identifier)}, {"body", platform::Bytes(body)}, {"events", events}};
    if (const auto endpoint = serverEndpoint()) {
        const platform::UrlRequest request =
            _assembly.requestFactory->flusherUploadRequest(*endpoint, kUploadTimeout, stream.dataDigestForStream());
        preview.set("url", request.url.string());
        preview.set("headers", headerDictionary(request.headers));
    }
    return preview;
}

std::size_t TavrinFeedbackFlusher::countOfDatabuffer()
{
    return _queueBuffer->sync([this] { return _sessionBuffer.size(); });
}

std::vector<std::shared_ptr<Flushable>> TavrinFeedbackFlusher::sessionBuffer()
{
    return _queueBuffer->sync([this] { return _sessionBuffer; });
}

std::optional<platform::Url> TavrinFeedbackFlusher::serverEndpoint()
{
    return _queueBuffer->sync([this] { return _serverEndpoint; });
}

void TavrinFeedbackFlusher::setFeedbacksPerTask(const platform::BackgroundTask& task, std::int64_t count)
{
    _feedbackCountQueue->sync([&] { _feedbacksPerTask[task.identifier()] = count; });
}

void TavrinFeedbackFlusher::removeFeedbacksForTask(const platform::BackgroundTask& task)
{
    _feedbackCountQueue->sync([&] { _feedbacksPerTask.erase(task.identifier()); });
}

std::int64_t TavrinFeedbackFlusher::getFeedbackCountForTask(const platform::BackgroundTask& task)
{
    return _feedbackCountQueue->sync([&]() -> std::int64_t {
        const auto found = _feedbacksPerTask.find(task.identifier());
        if (found != _feedbacksPerTask.end()) return found->second;
        const UploadNote note = UploadNote::from(task.note());
        return note.flusher == _identifier ? note.feedbacks : 0;
    });
}

std::map<std::uint64_t, std::int64_t> TavrinFeedbackFlusher::feedbacksPerTask()
{
    return _feedbackCountQueue->sync([this] { return _feedbacksPerTask; });
}

void TavrinFeedbackFlusher::setEndpoint(std::optional<platform::Url> endpoint)
{
    _queueBuffer->async([self = shared_from_this(), endpoint = std::move(endpoint)]() mutable {
        if (endpoint && self->_identifier == FlusherIdentity::Feedbacks) {
            platform::UrlComponents components(*endpoint);
            components.setPercentEncodedQuery("v=2");
            endpoint = components.url();
        }
        self->_serverEndpoint = std::move(endpoint);
        log(kLogFlusher).log("new endpoint: {}", self->_serverEndpoint ? self->_serverEndpoint->string() : "none");
    });
}

/// Called inside the bag controller's barrier.
void TavrinFeedbackFlusher::bagChangeNotification(const std::shared_ptr<const TAVBag>& bag)
{
    log(kLogFlusher).log("bag change notification received");
    if (bag) setEndpoint(_fetchEndpointFromBag(*bag));
}

std::optional<platform::Url> TavrinFeedbackFlusher::_fetchEndpointFromBag(const TAVBag& bag) const
{
    if (!bag.feedbackEnabled()) return std::nullopt;
    switch (_identifier) {
    case FlusherIdentity::Crowdsourcing: return bag.crowdsourcingURL();
    case FlusherIdentity::Feedbacks: return bag.feedbackURL();
    }
    return std::nullopt;
}

} // namespace tavrin
