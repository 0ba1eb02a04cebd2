#include "platform/net/BackgroundSession.h"

#include <algorithm>
#include <atomic>
#include <map>
#include <random>
#include <set>

#include <fmt/format.h>

#include "platform/base/Log.h"
#include "platform/base/Mutex.h"
#include "platform/net/BackgroundAgenda.h"
#include "platform/net/BackgroundPolicy.h"
#include "platform/net/BackgroundStore.h"
#include "platform/net/NetworkStatus.h"
#include "platform/run/Clock.h"
#include "platform/run/LivedTime.h"
#include "platform/run/Queue.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

constexpr std::size_t kMaximumNote = 128u << 10; // any URL
/// Bytes of a request's URL, header fields and own body.
constexpr std::size_t kMaximumRequest = 256u << 10;
constexpr Duration kLongestHold = std::chrono::hours(24);
constexpr Duration kStoreRetryDelay = std::chrono::minutes(1);
constexpr Duration kLongestResourceTimeout = std::chrono::hours(24 * 366);

std::size_t sizeOf(const UrlRequest& request)
{
    std::size_t size = request.url.string().size() + request.method.size() + request.body.size();
    for (const auto& [name, value] : request.headers) size += name.size() + value.size();
    return size;
}

/// Returns the directory name of a session: its identifier, escaped for a file name.
std::string folderName(const std::string& identifier)
{
    std::string name = percentEncodePathSegment(identifier);
    if (name.starts_with('.')) name.replace(0, 1, "%2E");
    return name.empty() ? "%" : name;
}

class Session;

/// The owner's view of a task; the session has the rest.
class Task final : public BackgroundTask, public std::enable_shared_from_this<Task> {
public:
    Task(std::weak_ptr<Session> session, const StoredTask& stored)
        : _session(std::move(session)), _identifier(stored.identifier), _isUpload(stored.isUpload),
          _request(stored.request), _note(stored.note)
    {}
    ~Task() override;

    void resume() override;
    void cancel() override;
    void setNote(Value note) override;
    void setStartWindow(Duration window) override;
    [[nodiscard]] std::uint64_t identifier() const override { return _identifier; }
    [[nodiscard]] const UrlRequest& originalRequest() const override { return *_request; }
    [[nodiscard]] bool isUpload() const override { return _isUpload; }
    [[nodiscard]] Value note() const override
    {
        MutexLock lock(_mutex);
        return _note;
    }
    [[nodiscard]] Value timingData() const override
    {
        MutexLock lock(_mutex);
        return _timing;
    }
    void setTiming(Value timing)
    {
        MutexLock lock(_mutex);
        _timing = std::move(timing);
    }

private:
    const std::weak_ptr<Session> _session;
    const std::uint64_t _identifier;
    const bool _isUpload;
    const std::shared_ptr<const UrlRequest> _request;
    mutable Mutex _mutex;
    Value _note GUARDED_BY(_mutex);
    Value _timing GUARDED_BY(_mutex);
};

/// Reports an upload's progress to the delegate. Merges reports that arrive faster than the delegate's queue runs.
class Progress : public std::enable_shared_from_this<Progress> {
public:
    Progress(std::weak_ptr<BackgroundSessionDelegate> delegate, std::shared_ptr<Queue> queue,
             std::shared_ptr<Task> task)
        : _delegate(std::move(delegate)), _queue(std::move(queue)), _task(std::move(task))
    {}
    void report(std::uint64_t sent, std::uint64_t expected)
    {
        _sent = sent;
        if (_queued.exchange(true)) return;
        _queue->async([self = shared_from_this(), expected] {
            self->_queued = false;
            if (auto delegate = self->_delegate.lock())
                delegate->taskDidSendBodyData(self->_task, self->_sent, expected);
        });
    }

private:
    const std::weak_ptr<BackgroundSessionDelegate> _delegate;
    const std::shared_ptr<Queue> _queue;
    const std::shared_ptr<Task> _task;
    std::atomic<std::uint64_t> _sent = 0;
    std::atomic<bool> _queued = false;
};

/// All non-const members are confined to `_queue`.
class Session final : public BackgroundSession, public std::enable_shared_from_this<Session> {
public:
    Session(const BackgroundEnvironment& environment, BackgroundSessionConfiguration configuration,
            std::weak_ptr<BackgroundSessionDelegate> delegate, std::shared_ptr<Queue> delegateQueue)
        : _environment(environment), _configuration(std::move(configuration)), _delegate(std::move(delegate)),
          _delegateQueue(std::move(delegateQueue)),
          _queue(Queue::make(_configuration.identifier + ".transfers", Queue::Kind::Serial, environment.executor,
                             environment.clock, _configuration.rank)),
          _answers(Queue::make(_configuration.identifier + ".tasks", Queue::Kind::Concurrent, environment.executor,
                               environment.clock, Rank::Root)),
          _loads(environment.loader.makeSession({.requestTimeout = _configuration.requestTimeout,
                                                 .totalTimeout = _configuration.resourceTimeout,
                                                 .maximumResponseSize = _configuration.maximumResponseSize,
                                                 .caFile = _configuration.caFile},
                                                _queue)),
          _time(environment.clock), _agenda(_configuration.parallelTransfers)
    {}
    ~Session() override
    {
        _environment.clock.cancel(_timer);
        for (const auto& [identifier, entry] : _entries)
            if (entry.attempt) entry.attempt->cancel();
    }

    void start()
    {
        onQueue([](Session& self) { self._openStore(false); });
    }
    Result<std::shared_ptr<BackgroundTask>> uploadTask(UrlRequest request, const fs::path& body) override
    {
        const auto file = _environment.files.openForReading(body);
        if (!file) return std::unexpected(file.error());
        return _queue->sync([&] { return _add(std::move(request), &*file); });
    }
    Result<std::shared_ptr<BackgroundTask>> downloadTask(UrlRequest request) override
    {
        return _queue->sync([&] { return _add(std::move(request), nullptr); });
    }
    void getTasks(std::move_only_function<void(std::vector<std::shared_ptr<BackgroundTask>>)> callback) override
    {
        _queue->async([self = shared_from_this(), callback = std::move(callback)]() mutable {
            std::vector<std::shared_ptr<BackgroundTask>> tasks;
            for (const auto& [identifier, entry] : self->_entries)
                if (auto task = entry.handle.lock(); task && !entry.stored.outcome) tasks.push_back(std::move(task));
            self->_answers->async(
                [callback = std::move(callback), tasks = std::move(tasks)]() mutable { callback(std::move(tasks)); });
        });
    }

    void describe(std::move_only_function<void(Value::Array)> callback) override
    {
        _queue->async([self = shared_from_this(), callback = std::move(callback)]() mutable {
            Value::Array descriptions;
            for (const auto& [identifier, entry] : self->_entries)
                if (!entry.stored.outcome) descriptions.push_back(self->_description(entry));
            self->_answers->async([callback = std::move(callback), descriptions = std::move(descriptions)]() mutable {
                callback(std::move(descriptions));
            });
        });
    }

    // Called by tasks.
    void resume(const std::shared_ptr<Task>& task)
    {
        _queue->sync([&] { _resume(task); });
    }
    void cancel(const std::shared_ptr<Task>& task)
    {
        _queue->sync([&] { _cancel(task); });
    }
    void setNote(std::uint64_t identifier, const Value& note)
    {
        _queue->sync([&] {
            Entry* entry = _find(identifier);
            if (!entry) return;
            entry->stored.note = note;
            _save(*entry);
        });
    }
    void setStartWindow(std::uint64_t identifier, Duration window)
    {
        _queue->sync([&] {
            if (Entry* entry = _find(identifier)) entry->startWindow = window;
        });
    }
    /// Removes a task that was never resumed. Called by its destructor.
    void released(std::uint64_t identifier)
    {
        onQueue([identifier](Session& self) {
            if (Entry* entry = self._find(identifier); entry && entry->handle.expired()) self._drop(identifier);
        });
    }

private:
    struct Entry {
        StoredTask stored;
        std::weak_ptr<Task> handle;
        std::shared_ptr<Task> kept; ///< null before resume
        Duration startWindow{};
        std::shared_ptr<UrlTask> attempt;
        std::uint64_t attemptNumber = 0;
        std::string problem; ///< of the last failed attempt
    };

    /// Runs `work` on the queue, unless the session has been destroyed by then.
    template <class Work> void onQueue(Work work)
    {
        _queue->async([weak = weak_from_this(), work = std::move(work)]() mutable {
            if (auto self = weak.lock()) work(*self);
        });
    }
    /// Runs `call` with the delegate on its queue.
    template <class Call> void _tell(Call call)
    {
        _delegateQueue->async([delegate = _delegate, call = std::move(call)]() mutable {
            if (auto told = delegate.lock()) call(*told);
        });
    }
    Entry* _find(std::uint64_t identifier)
    {
        const auto found = _entries.find(identifier);
        return found == _entries.end() ? nullptr : &found->second;
    }

    void _openStore(bool make);
    void _takeUp(BackgroundStore::Contents contents);
    Result<std::shared_ptr<BackgroundTask>> _add(UrlRequest request, const FileHandle* body);
    void _save(const Entry& entry);
    void _resume(const std::shared_ptr<Task>& task);
    void _cancel(const std::shared_ptr<Task>& task);
    void _drop(std::uint64_t identifier);

    void _followNetwork();
    void _networkChanged();
    [[nodiscard]] bool _mayTransfer() const
    {
        return _network && _network->online && (!_network->metered || _configuration.allowsMetered);
    }
    void _retryNow(std::optional<std::string_view> host);
    void _hold(const UrlRequest& request, const UrlResponse& response);
    [[nodiscard]] double _jitter() { return std::uniform_real_distribution<double>()(_random); }

    void _schedule(const Entry& entry);
    void _pump();
    void _setTimer(Duration now);
    void _begin(Entry& entry);
    void _ended(std::uint64_t identifier, std::uint64_t attempt, std::optional<UrlResponse> response,
                std::optional<Error> error);
    void _retry(Entry& entry, const Error& error);
    void _stopAttempt(Entry& entry);
    void _finish(Entry& entry, std::optional<UrlResponse> response, std::optional<Error> error);
    void _report(const Entry& entry);
    [[nodiscard]] Value _description(const Entry& entry);
    void _reported(std::uint64_t identifier);

    const BackgroundEnvironment _environment;
    const BackgroundSessionConfiguration _configuration;
    const std::weak_ptr<BackgroundSessionDelegate> _delegate;
    const std::shared_ptr<Queue> _delegateQueue;
    const std::shared_ptr<Queue> _queue;
    const std::shared_ptr<Queue> _answers;
    const std::shared_ptr<UrlSession> _loads;

    std::unique_ptr<BackgroundStore> _store;
    std::optional<Error> _storeError; // why the store is missing, or a temporary one
    Duration _storeRetry{};           // earliest time of the next attempt to replace a temporary one
    LivedTime _time;
    std::map<std::uint64_t, Entry> _entries;
    std::vector<std::uint64_t> _leftOver; ///< ended tasks that are still in the store
    std::uint64_t _bodyBytes = 0;
    BackgroundAgenda _agenda; // resumed tasks that have not ended
    std::uint64_t _lastAttempt = 0;
    Clock::TimerId _timer = 0;
    std::optional<Duration> _timerDue;

    NetworkStatus::Token _networkToken;
    std::optional<NetworkState> _network;
    std::minstd_rand _random{std::random_device()()};
};

Task::~Task()
{
    if (const auto session = _session.lock()) session->released(_identifier);
}

void Task::resume()
{
    if (const auto session = _session.lock()) session->resume(shared_from_this());
}

void Task::cancel()
{
    if (const auto session = _session.lock()) session->cancel(shared_from_this());
}

void Task::setNote(Value note)
{
    if (const std::size_t size = jsonSize(note); size > kMaximumNote)
        return defaultLog().error("a note of {} bytes is too large for background task {}", size, _identifier);
    {
        MutexLock lock(_mutex);
        _note = note;
    }
    if (const auto session = _session.lock()) session->setNote(_identifier, note);
}

void Task::setStartWindow(Duration window)
{
    if (const auto session = _session.lock()) session->setStartWindow(_identifier, window);
}

// ---- the store ----

void Session::_openStore(bool make)
{
    const fs::path directory = _environment.directory / folderName(_configuration.identifier);
    const bool isTemporary = _store && _storeError;
    if (_store && !(isTemporary && _entries.empty())) return;
    if (!make && !BackgroundStore::exists(_environment.files, directory)) return;
    if (isTemporary && _time.now() < _storeRetry) return;
    auto store = BackgroundStore::open(_environment.files, directory);
    _storeError = store ? std::nullopt : std::optional(store.error());
    if (!store) {
        _storeRetry = _time.now() + kStoreRetryDelay;
        defaultLog().error("background transfers can't be stored in {}: {}", directory.string(),
                           _storeError->description());
        if (isTemporary) return;
        store = BackgroundStore::openTemporary(_environment.files, _environment.temporary);
        _tell([error = *_storeError](BackgroundSessionDelegate& delegate) { delegate.sessionDidBecomeInvalid(error); });
    }
    if (!store) return;
    _leftOver.clear(); // of a temporary store
    _store = std::move(*store);
    _takeUp(_store->takeContents());
}

void Session::_takeUp(BackgroundStore::Contents contents)
{
    _time = LivedTime(_environment.clock, contents.time);
    const Duration now = _time.now();
    // Clamped: a manipulated time would hold the host for ever.
    for (const auto& [host, until] : contents.holds) _agenda.hold(host, std::min(until, now + kLongestHold));
    for (StoredTask& stored : contents.tasks) {
        if (!stored.resumed && !stored.outcome) {
            (void)_store->forget(stored.identifier);
            continue;
        }
        stored.deadline = std::min(stored.deadline, now + kLongestResourceTimeout);
        stored.notBefore = std::min(stored.notBefore, now + kLongestHold);
        // The delegate moved the file, and the process was killed before the task was removed: download it again.
        if (!stored.isUpload && stored.outcome && !stored.outcome->error && !_store->hasDownload(stored.identifier))
            stored.outcome.reset();

        Entry& entry = _entries[stored.identifier];
        entry.kept = std::make_shared<Task>(weak_from_this(), stored);
        entry.handle = entry.kept;
        entry.stored = std::move(stored);
        _bodyBytes += entry.stored.bodySize;
        if (entry.stored.outcome)
            _report(entry);
        else
            _schedule(entry);
    }
    if (!_entries.empty()) _followNetwork();
    _pump();
}

Result<std::shared_ptr<BackgroundTask>> Session::_add(UrlRequest request, const FileHandle* body)
{
    _openStore(true);
    if (!_store) return std::unexpected(*_storeError);
    if (request.url.empty()) return std::unexpected(urlError(kUrlBadUrl, "no URL"));
    if (sizeOf(request) > kMaximumRequest)
        return std::unexpected(urlError(kUrlTooLarge, fmt::format("a request of more than {} bytes", kMaximumRequest)));
    if (_entries.size() >= _configuration.maximumTasks)
        return std::unexpected(urlError(kUrlTooLarge, fmt::format("{} tasks are waiting", _entries.size())));
    StoredTask stored{.isUpload = body != nullptr, .request = std::make_shared<const UrlRequest>(std::move(request))};
    const std::uint64_t room = _configuration.maximumBodyBytes - std::min(_configuration.maximumBodyBytes, _bodyBytes);
    if (auto added = _store->add(stored, body, room); !added) return std::unexpected(std::move(added.error()));

    _bodyBytes += stored.bodySize;
    auto task = std::make_shared<Task>(weak_from_this(), stored);
    Entry& entry = _entries[stored.identifier];
    entry.handle = task;
    entry.stored = std::move(stored);
    return task;
}

void Session::_save(const Entry& entry)
{
    if (auto saved = _store->save(entry.stored, _time.mark()); !saved)
        defaultLog().error("background task {} can't be saved: {}", entry.stored.identifier,
                           saved.error().description());
}

void Session::_resume(const std::shared_ptr<Task>& task)
{
    Entry* entry = _find(task->identifier());
    if (!entry || entry->stored.resumed || entry->stored.outcome) return;
    entry->kept = task;
    entry->stored.resumed = true;
    const Duration now = _time.now();
    entry->stored.deadline = now + std::min<Duration>(_configuration.resourceTimeout, kLongestResourceTimeout);
    if (entry->startWindow > Duration::zero())
        entry->stored.notBefore = now + startDelay(entry->startWindow, _jitter());
    _save(*entry);
    _followNetwork();
    _schedule(*entry);
    _pump();
}

void Session::_cancel(const std::shared_ptr<Task>& task)
{
    Entry* entry = _find(task->identifier());
    if (!entry || entry->stored.outcome) return;
    entry->kept = task;
    _finish(*entry, std::nullopt, urlError(kUrlCancelled, "cancelled"));
    _pump();
}

void Session::_drop(std::uint64_t identifier)
{
    const auto found = _entries.find(identifier);
    _bodyBytes -= found->second.stored.bodySize;
    _entries.erase(found);
    _leftOver.push_back(identifier);
    std::erase_if(_leftOver, [this](std::uint64_t left) {
        const auto forgotten = _store->forget(left);
        if (!forgotten)
            defaultLog().error("background task {} can't be removed: {}", left, forgotten.error().description());
        return forgotten.has_value();
    });
}

// ---- what tasks wait for ----

void Session::_followNetwork()
{
    if (_networkToken) return;
    _networkToken = _environment.network.observe([weak = weak_from_this(), queue = _queue](const NetworkState&) {
        queue->async([weak] {
            if (auto self = weak.lock()) self->_networkChanged();
        });
    });
    _network = _environment.network.current();
}

void Session::_networkChanged()
{
    const bool wasOffline = _network && !_network->online;
    _network = _environment.network.current();
    for (auto& [identifier, entry] : _entries) {
        if (!entry.attempt || !_network->online || _mayTransfer()) continue;
        _stopAttempt(entry);
        _schedule(entry);
    }
    if (wasOffline && _network->online) _retryNow({}); // the failures came from the missing network
    _pump();
}

/// Ends the delays after failures of the tasks to a host, or of all. The next failure has the shortest delay again.
void Session::_retryNow(std::optional<std::string_view> host)
{
    for (auto& [identifier, entry] : _entries) {
        StoredTask& task = entry.stored;
        if (entry.attempt || task.failures == 0 || task.notBefore == Duration::zero()) continue;
        if (host && task.request->url.host() != *host) continue;
        task.notBefore = Duration::zero();
        task.failures = 0;
        _schedule(entry);
    }
}

void Session::_hold(const UrlRequest& request, const UrlResponse& response)
{
    const std::string* field = response.headers.find("Retry-After");
    if (!field) return;
    const auto wait = retryAfter(*field, _environment.clock.wallNow(), _jitter());
    if (!wait || *wait <= Duration::zero()) return;
    const Duration until = _time.now() + *wait;
    // After a redirect both hosts belong to the service that sent Retry-After.
    for (const std::string& host : std::set<std::string>{request.url.host(), response.url.host()}) {
        _agenda.hold(host, until);
        if (auto saved = _store->saveHold(host, until, _time.mark()); !saved)
            defaultLog().error("the Retry-After of {} can't be saved: {}", host, saved.error().description());
    }
}

// ---- transfers ----

void Session::_schedule(const Entry& entry)
{
    const StoredTask& task = entry.stored;
    if (!task.resumed || task.outcome) return;
    _agenda.put(task.identifier,
                {.host = task.request->url.host(),
                 .notBefore = task.notBefore,
                 .deadline = task.deadline,
                 .underWay = entry.attempt != nullptr},
                _time.now());
}

void Session::_pump()
{
    const Duration now = _time.now();
    for (const std::uint64_t task : _agenda.takeExpired(now))
        _finish(_entries.at(task), std::nullopt, urlError(kUrlTimedOut, "not complete within the resource time-out"));
    while (_mayTransfer()) {
        const auto task = _agenda.next(now);
        if (!task) break;
        _begin(_entries.at(*task));
    }
    _setTimer(now);
}

void Session::_setTimer(Duration now)
{
    const auto due = _agenda.nextDue();
    if (due == _timerDue) return;
    _environment.clock.cancel(std::exchange(_timer, 0));
    _timerDue = due;
    if (!due) return;
    _timer = _environment.clock.after(*due - now, [weak = weak_from_this(), queue = _queue] {
        queue->async([weak] {
            const auto self = weak.lock();
            if (!self) return;
            self->_timerDue.reset();
            self->_pump();
        });
    });
}

void Session::_begin(Entry& entry)
{
    const StoredTask& stored = entry.stored;
    auto file = stored.isUpload ? _store->openBody(stored) : _store->createDownload(stored.identifier);
    if (!file) {
        if (isTransient(file.error())) return _retry(entry, file.error());
        return _finish(entry, std::nullopt, std::move(file.error()));
    }
    TransferFiles files;
    if (stored.isUpload) {
        files.upload = std::move(*file);
        files.progress = [progress = std::make_shared<Progress>(_delegate, _delegateQueue, entry.kept)](
                             std::uint64_t sent, std::uint64_t expected) { progress->report(sent, expected); };
    } else {
        files.download = std::move(*file);
    }
    entry.attemptNumber = ++_lastAttempt;
    entry.attempt = _loads->transferTask(
        *stored.request, std::move(files),
        [weak = weak_from_this(), identifier = stored.identifier, attempt = _lastAttempt](
            const std::optional<Bytes>&, std::optional<UrlResponse> response, std::optional<Error> error) {
            if (auto self = weak.lock()) self->_ended(identifier, attempt, std::move(response), std::move(error));
        });
    _schedule(entry);
    entry.attempt->resume();
}

void Session::_ended(std::uint64_t identifier, std::uint64_t attempt, std::optional<UrlResponse> response,
                     std::optional<Error> error)
{
    Entry* entry = _find(identifier);
    if (!entry || !entry->attempt || entry->attemptNumber != attempt) return; // the attempt was stopped
    entry->kept->setTiming(entry->attempt->timingData());
    entry->attempt.reset();
    if (!error && response) {
        _hold(*entry->stored.request, *response);
        if (response->statusCode >= 200 && response->statusCode < 400) _retryNow(entry->stored.request->url.host());
        if (!entry->stored.isUpload)
            if (auto synced = _store->syncDownload(identifier); !synced) error = std::move(synced.error());
    }
    if (error && isTransient(*error))
        _retry(*entry, *error);
    else
        _finish(*entry, std::move(response), std::move(error));
    _pump();
}

void Session::_retry(Entry& entry, const Error& error)
{
    ++entry.stored.failures;
    const Duration delay = retryDelay(entry.stored.failures, _jitter());
    defaultLog().info("background task {} will be retried in {:.0f} s: {}", entry.stored.identifier, toSeconds(delay),
                      error.description());
    entry.problem = error.reason().empty() ? error.description() : error.reason();
    entry.stored.notBefore = _time.now() + delay;
    _save(entry);
    _schedule(entry);
}

void Session::_stopAttempt(Entry& entry)
{
    if (entry.attempt) std::exchange(entry.attempt, nullptr)->cancel();
}

void Session::_finish(Entry& entry, std::optional<UrlResponse> response, std::optional<Error> error)
{
    _stopAttempt(entry);
    _agenda.remove(entry.stored.identifier);
    entry.stored.outcome = {std::move(response), std::move(error)};
    _save(entry);
    _report(entry);
}

void Session::_report(const Entry& entry)
{
    const auto& [response, error] = *entry.stored.outcome;
    const std::uint64_t identifier = entry.stored.identifier;
    _tell([weak = weak_from_this(), task = entry.kept, response, error, &files = _environment.files,
           file = _store->downloadPath(identifier)](BackgroundSessionDelegate& delegate) {
        if (!task->isUpload() && response && !error) {
            delegate.taskDidFinishDownloading(task, file, *response);
            (void)files.remove(file);
        }
        delegate.taskDidComplete(task, response, error);
        if (auto self = weak.lock())
            self->onQueue([identifier = task->identifier()](Session& session) { session._reported(identifier); });
    });
}

Value Session::_description(const Entry& entry)
{
    const StoredTask& task = entry.stored;
    const Duration start = std::max(task.notBefore, _agenda.holdOf(task.request->url.host(), _time.now()));
    const double inSeconds = toSeconds(start - _time.now());
    Dictionary description{{"identifier", task.identifier},
                           {"url", task.request->url.string()},
                           {"note", task.note},
                           {"bytes", task.bodySize},
                           {"failures", task.failures}};
    if (!entry.problem.empty()) description.set("problem", entry.problem);
    if (inSeconds > 0) description.set("inSeconds", inSeconds);
    description.set("waitsFor", !task.resumed                    ? "resume"
                                : entry.attempt                  ? "transfer"
                                : !_network || !_network->online ? "network"
                                : !_mayTransfer()                ? "unmetered network"
                                : inSeconds > 0                  ? "time"
                                                                 : "turn");
    return description;
}

void Session::_reported(std::uint64_t identifier)
{
    if (!_find(identifier)) return;
    _drop(identifier);
    if (_entries.empty()) _tell([](BackgroundSessionDelegate& delegate) { delegate.sessionDidFinishEvents(); });
}

class Sessions final : public BackgroundSessions {
public:
    explicit Sessions(BackgroundEnvironment environment) : _environment(std::move(environment)) {}
    std::shared_ptr<BackgroundSession> make(BackgroundSessionConfiguration configuration,
                                            std::weak_ptr<BackgroundSessionDelegate> delegate,
                                            std::shared_ptr<Queue> delegateQueue) override
    {
        auto session = std::make_shared<Session>(_environment, std::move(configuration), std::move(delegate),
                                                 std::move(delegateQueue));
        session->start();
        return session;
    }

private:
    const BackgroundEnvironment _environment;
};

} // namespace

std::unique_ptr<BackgroundSessions> makeBackgroundSessions(BackgroundEnvironment environment)
{
    return std::make_unique<Sessions>(std::move(environment));
}

} // namespace platform
