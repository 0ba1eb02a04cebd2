#include "tavrind/BackgroundActivitiesManager.h"

#include "CoreTavrin/Traces.h"
#include "platform/device/Device.h"
#include "platform/files/Counters.h"
#include "platform/files/Files.h"
#include "platform/run/Clock.h"
#include "platform/run/Queue.h"
#include "platform/run/Transactions.h"
#include "platform/values/Dictionary.h"
#include "tavrind/Assembly.h"
#include "tavrind/FeedbackBooks.h"
#include "tavrind/FileContainer.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/StoredSession.h"
#include "tavrind/TavrinFeedbackFlusher.h"
#include "tavrind/TavrinFlusherXPC.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinPersistentStorage.h"
#include "tavrind/TavrinXPCActivity.h"

namespace tavrin {

using namespace std::chrono_literals;
using platform::ActivityState;
using platform::Value;

namespace {

constexpr const char* kActivity = "com.quorvane.tavrind.flusher.background";
constexpr std::chrono::seconds kEarliestStart = 300s;
constexpr std::chrono::seconds kInterval = 600s;
constexpr std::chrono::seconds kGracePeriod = 300s;
constexpr std::size_t kMaximumPreview = 8u << 20; // bytes of compressed bodies in one answer
/// Age at which an unfinished file counts as abandoned: none takes that long to write.
constexpr std::chrono::hours kAbandoned(1);

/// Returns whether `FileSystem` makes such names for files that will replace another: "NAME.0123ABCD.tmp".
bool isReplacement(std::string_view name)
{
    constexpr std::string_view kSuffix = ".tmp";
    constexpr std::size_t kDigits = 8;
    if (!name.ends_with(kSuffix)) return false;
    name.remove_suffix(kSuffix.size());
    const std::size_t dot = name.rfind('.');
    return dot != std::string_view::npos && name.size() - dot - 1 == kDigits &&
           name.find_first_not_of("0123456789ABCDEF", dot + 1) == std::string_view::npos;
}

/// Sets the activity's state, and logs a refusal.
void setState(ActivityState state, platform::Activity& activity)
{
    const ActivityState current = TavrinXPCActivity::getStateForActivity(activity);
    if (!TavrinXPCActivity::setState(state, activity))
        log(kLogFlusher)
            .fault("State transition from {} to {} invalid", static_cast<int>(current), static_cast<int>(state));
}

} // namespace

platform::ActivityCriteria BackgroundActivitiesManager::criteria()
{
    platform::ActivityCriteria criteria = TavrinXPCCriteria::createCriteria();
    TavrinXPCCriteria::setDelay(kEarliestStart, criteria);
    TavrinXPCCriteria::setInterval(kInterval, criteria);
    TavrinXPCCriteria::setGracePeriod(kGracePeriod, criteria);
    TavrinXPCCriteria::setRepeating(true, criteria);
    TavrinXPCCriteria::setAllowBatteryUsage(true, criteria);
    return criteria;
}

std::shared_ptr<BackgroundActivitiesManager> BackgroundActivitiesManager::make(Assembly& assembly)
{
    auto manager = std::make_shared<BackgroundActivitiesManager>(assembly);
    TavrinXPCActivity::registerActivity(
        assembly, kActivity, criteria(),
        [weak = manager->weak_from_this()](const std::shared_ptr<platform::Activity>& activity) {
            if (auto self = weak.lock()) self->_runActivity(activity);
        });
    log(kLogFlusher)
        .log("started flush to wire in the background {} with interval {:f} seconds", kActivity,
             static_cast<double>(kInterval.count()));
    return manager;
}

BackgroundActivitiesManager::BackgroundActivitiesManager(Assembly& assembly)
    : _assembly(assembly),
      _queueFlusher(assembly.device.serialQueue("com.quorvane.tavrind.backgrondActivitiesManagerQueue", rank::kRoot,
                                                platform::Priority::Background)),
      _feedbackFlusher(TavrinFeedbackFlusher::make(assembly, FlusherIdentity::Feedbacks))
{}

BackgroundActivitiesManager::~BackgroundActivitiesManager()
{
    TavrinXPCActivity::unregister(_assembly, kActivity);
}

void BackgroundActivitiesManager::_runActivity(const std::shared_ptr<platform::Activity>& activity)
{
    if (TavrinXPCActivity::getStateForActivity(*activity) != ActivityState::Run)
        return; // a check-in keeps the criteria of the registration
    if (_stopFlushing) {
        log(kLogFlusher).log("flushing has been stopped, will start again with dump command");
        setState(ActivityState::Done, *activity);
        return;
    }
    log(kLogFlusher).log("scheduled flush feedbacks to wire {}", kActivity);
    setState(ActivityState::Continue, *activity);
    auto transaction = _assembly.device.transactions.begin(kActivity);
    _queueFlusher->async([self = shared_from_this(), activity, transaction = std::move(transaction)] {
        self->_flusherActivity();
        setState(ActivityState::Done, *activity);
    });
}

void BackgroundActivitiesManager::insertFlushActivity(std::move_only_function<void()> callback)
{
    _queueFlusher->async([self = shared_from_this(), callback = std::move(callback)]() mutable {
        self->_flusherActivity();
        if (callback) callback();
    });
}

void BackgroundActivitiesManager::_flusherActivity()
{
    _queueFlusher->assertOnQueue();
    _sweepUnfinished();
    for (const auto& container : _assembly.persistentStorage->getAvailableSessionHandles()) {
        const auto [session, lost, fate] = container->read();
        // If its file stays, the session must wait: uploaded now, it would be uploaded again after a restart.
        if (!_assembly.persistentStorage->deleteSessionWithFileContainer(container)) continue;
        _assembly.feedbackBooks.move(FeedbackFate::Closed, fate, lost);
        if (!session) continue;
        // From here on, a kill loses this session but never sends it twice.
        _assembly.persistentStorage->syncDeletions();
        // The events are in memory until they are part of an upload.
        _assembly.feedbackBooks.move(FeedbackFate::Closed, FeedbackFate::Open, session->recordedEvents());
        _feedbackFlusher->flushSyncFromArray({session});
        _flushToWire(*_feedbackFlusher);
    }
    _flushToWire(*_assembly.crowdsourcingFeedbackFlusher);
    _assembly.feedbackBooks.save();
}

void BackgroundActivitiesManager::previewUploads(platform::Reply<Value::Array> reply)
{
    _queueFlusher->async([self = shared_from_this(), reply = std::move(reply)]() mutable {
        Value::Array uploads;
        std::size_t left = kMaximumPreview;
        const auto add = [&](Value upload, bool open) {
            const platform::Bytes* body = upload["body"].asBytes();
            if (!body) return;
            const std::size_t size = body->size();
            platform::Dictionary& description = upload.mutableDictionary();
            if (open) description.set("open", true);
            if (size > left) {
                description.remove("body");
                description.set("bytes", size);
            } else {
                left -= size;
            }
            uploads.push_back(std::move(upload));
        };
        TavrinPersistentStorage& storage = *self->_assembly.persistentStorage;
        for (const bool open : {false, true})
            for (const auto& container : open ? storage.getOpenSessionHandles() : storage.getAvailableSessionHandles())
                if (const auto session = container->read().session)
                    add(self->_feedbackFlusher->preview(*session), open);
        TavrinFeedbackFlusher& records = *self->_assembly.crowdsourcingFeedbackFlusher;
        for (const auto& record : records.sessionBuffer()) add(records.preview(*record), false);
        reply(std::move(uploads));
    });
}

/// Removes the files of processes that were killed while they wrote them: they hold users' events and settings. A
/// recent file stays: it may still be in use.
void BackgroundActivitiesManager::_sweepUnfinished()
{
    constexpr const char* kDirectory = "com.quorvane.tavrind";
    const platform::Directories& directories = _assembly.device.directories;
    const platform::Date oldest = _assembly.device.clock.wallNow() - kAbandoned;
    const std::pair<std::filesystem::path, bool (*)(std::string_view)> kinds[]{
        {directories.temporary, isUploadBody},
        {directories.caches / kDirectory, isReplacement},
        {directories.state / kDirectory, isReplacement},
        {directories.state / kDirectory / "privacy", isReplacement},
        {directories.data / kDirectory / "data-detectors", isReplacement},
        {directories.config,
         [](std::string_view name) { return name.starts_with("com.quorvane.") && isReplacement(name); }}};
    for (const auto& [directory, isOurs] : kinds)
        for (const std::string& name : _assembly.fileManager.list(directory).value_or(std::vector<std::string>())) {
            if (!isOurs(name)) continue;
            const auto info = _assembly.fileManager.info(directory / name);
            if (!info || info->kind != platform::FileInfo::Kind::File || info->modified > oldest) continue;
            if (_assembly.fileManager.remove(directory / name))
                log(kLogFlusher).log("removed the unfinished file {}", name);
        }
}

void BackgroundActivitiesManager::_flushToWire(TavrinFeedbackFlusher& flusher)
{
    for (const platform::Bytes& body : flusher.flushToWireSync())
        if (_assembly.flusherXPCListener) _assembly.flusherXPCListener->sendDataToSendingStreamListener(body);
}

void BackgroundActivitiesManager::findUploads()
{
    _queueFlusher->async([self = shared_from_this()] { self->_sweepUnfinished(); });
    _assembly.uploadURLSession->getTasks(
        [weak = weak_from_this()](const std::vector<std::shared_ptr<platform::BackgroundTask>>& tasks) {
            const auto self = weak.lock();
            if (!self) return;
            for (const auto& task : tasks) self->_findUpload(*task);
        });
}

void BackgroundActivitiesManager::_findUpload(const platform::BackgroundTask& task)
{
    const UploadNote note = UploadNote::from(task.note());
    if (note.process == _assembly.feedbackBooks.process()) return;
    const platform::MutexLock lock(_foundMutex);
    if (_found.insert(task.identifier()).second) _assembly.feedbackBooks.find(FeedbackFate::Uploading, note.events);
}

void BackgroundActivitiesManager::taskDidSendBodyData(const std::shared_ptr<platform::BackgroundTask>&,
                                                      std::uint64_t sent, std::uint64_t expected)
{
    const float percent = expected == 0 ? 100.0F : 100.0F * static_cast<float>(sent) / static_cast<float>(expected);
    log(kLogFlusher).debug("data transfer {:f} of {:f}", percent, static_cast<float>(expected));
}

void BackgroundActivitiesManager::taskDidComplete(const std::shared_ptr<platform::BackgroundTask>& task,
                                                  const std::optional<platform::UrlResponse>& response,
                                                  const std::optional<platform::Error>& error)
{
    log(kLogFlusher)
        .log("URLSession:task:didCompleteWithError: id={}, error={}", task->identifier(),
             error ? error->description() : "none");
    const UploadNote note = UploadNote::from(task->note());
    const std::string upload = note.process + '/' + std::to_string(task->identifier());
    if (_assembly.feedbackBooks.isSettled(upload)) return;

    const bool sent = response && response->statusCode == 200;
    _findUpload(*task);
    // The upload session forgets the task when this function returns, so all must be on disk before that. The books
    // come first: after a kill in between, the statistics lack the upload, but they never count it twice.
    _assembly.feedbackBooks.settle(upload, sent ? FeedbackFate::Sent : FeedbackFate::NotSent, note.events);
    const std::int64_t count = _feedbackFlusher->getFeedbackCountForTask(*task);
    _feedbackFlusher->removeFeedbacksForTask(*task);
    _assembly.crowdsourcingFeedbackFlusher->removeFeedbacksForTask(*task);
    if (error && error->domain == platform::kUrlErrorDomain && error->code == platform::kUrlTimedOut)
        _assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.fbrequesttimedout");
    if (sent) {
        _assembly.diagnosticData.addValue(count, "com.quorvane.tavrind.feedbacksent");
    } else {
        log(kLogFlusher).fault("response error {}", response ? std::to_string(response->statusCode) : "none");
        _assembly.diagnosticData.addValue(count, "com.quorvane.tavrind.feedbacknotsent");
    }
    _assembly.device.counters.synchronize();
}

void BackgroundActivitiesManager::sessionDidFinishEvents()
{
    log(kLogFlusher).log("URLSessionDidFinishEventsForBackgroundURLSession called");
}

void BackgroundActivitiesManager::sessionDidBecomeInvalid(const platform::Error& error)
{
    log(kLogFlusher).error("Session became invalid with error {}", error.description());
}

} // namespace tavrin
