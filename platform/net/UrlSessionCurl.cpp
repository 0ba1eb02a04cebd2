#include "platform/net/UrlSessionCurl.h"

#include <algorithm>
#include <atomic>
#include <future>
#include <map>
#include <mutex>
#include <sys/epoll.h>
#include <sys/timerfd.h>
#include <vector>

#include <curl/curl.h>

#include "platform/base/FileHandle.h"
#include "platform/base/Mutex.h"
#include "platform/net/CurlLoad.h"
#include "platform/net/HttpCache.h"
#include "platform/net/UrlSession.h"
#include "platform/net/UrlSessionCaching.h"
#include "platform/run/Queue.h"
#include "platform/run/WorkerPool.h"

namespace platform {

namespace {

/// Limit of idle connections to all hosts. Servers close them after seconds, and each takes a socket on both sides.
constexpr long kIdleConnections = 32;

/// Limit of the bytes of a loader's incomplete bodies in memory: three of the largest, hundreds of ordinary ones. The
/// bodies of loads that may not use HTTP/2 are in files.
constexpr std::size_t kMaximumInMemory = 24u << 20;

class CurlTask;

/// Runs loads of all sessions. libcurl's sockets and its timer are sources on a queue, which guards the multi
/// handle and everything else here: members are confined to it, except for `start`, `cancel` and `stop`.
class Loader : public std::enable_shared_from_this<Loader> {
public:
    Loader(WorkerPool& pool, Clock& clock);

    void start(std::shared_ptr<CurlTask> task);
    void cancel(std::shared_ptr<CurlTask> task);
    /// Cancels every task, and blocks until libcurl is cleaned up. Later tasks are cancelled.
    void stop();
    /// Bytes of incomplete bodies.
    std::size_t bodiesInMemory = 0;

private:
    using TimePoint = CurlLoad::TimePoint;

    void begin(const std::shared_ptr<CurlTask>& task);
    void send(const std::shared_ptr<CurlTask>& task);
    void end(CURL* easy, CURLcode code, bool cancelled);
    void act(curl_socket_t socket, int events);
    void settle();
    void relieve();
    void endLate(TimePoint now);
    void setTimer();
    void watch(curl_socket_t socket, int what);

    WorkerPool& _pool;
    const std::shared_ptr<Queue> _queue;
    CURLM* const _multi;
    CURLSH* const _tlsSessions; // of all handles; used on the queue only, so it needs no lock
    std::map<curl_socket_t, std::unique_ptr<WorkerPool::Source>> _sockets;
    const FileHandle _timerFd;
    std::unique_ptr<WorkerPool::Source> _timer; // from the first load
    std::optional<TimePoint> _curlDue;          // when libcurl wants to be called
    std::optional<TimePoint> _timerDue;         // when the timer fires
    std::map<CURL*, std::shared_ptr<CurlTask>> _active;
    bool _stopped = false;
};

/// One task; any thread.
class CurlTask final : public UrlTask, public std::enable_shared_from_this<CurlTask> {
public:
    CurlTask(std::shared_ptr<Loader> loader, std::uint64_t identifier, UrlRequest request,
             UrlSessionConfiguration configuration, UrlSession::DataCompletion completion,
             std::shared_ptr<Queue> delegateQueue, std::optional<TransferFiles> files)
        : _loader(std::move(loader)), _identifier(identifier), _request(std::move(request)),
          _configuration(std::move(configuration)), _completion(std::move(completion)),
          _delegateQueue(std::move(delegateQueue)), _files(std::move(files))
    {}

    void resume() override
    {
        if (!_started.exchange(true)) _loader->start(shared_from_this());
    }
    void cancel() override
    {
        _cancelled = true;
        if (_started.exchange(true))
            _loader->cancel(shared_from_this());
        else
            completeCancelled();
    }
    /// Returns true after `cancel`. The loader doesn't begin such a task.
    [[nodiscard]] bool cancelled() const { return _cancelled; }
    [[nodiscard]] std::uint64_t identifier() const override { return _identifier; }
    [[nodiscard]] const UrlRequest& originalRequest() const override { return _request; }
    [[nodiscard]] Value timingData() const override
    {
        MutexLock lock(_timingMutex);
        return _timing;
    }

    /// Exists while the loader runs the task. Loader's queue.
    std::unique_ptr<CurlLoad> load;

    void beginLoad()
    {
        load =
            std::make_unique<CurlLoad>(_request, _configuration, _files ? &*_files : nullptr, _loader->bodiesInMemory);
    }
    void complete(CURLcode code)
    {
        CurlLoad::Outcome outcome = load->finish(code);
        load.reset();
        complete(std::move(outcome));
    }
    void completeCancelled()
    {
        load.reset();
        CurlLoad::Outcome outcome;
        outcome.error = urlError(kUrlCancelled, "cancelled");
        complete(std::move(outcome));
    }

private:
    void complete(CurlLoad::Outcome outcome)
    {
        {
            MutexLock lock(_timingMutex);
            _timing = std::move(outcome.timing);
        }
        _delegateQueue->async([self = shared_from_this(), data = std::move(outcome.data),
                               response = std::move(outcome.response), error = std::move(outcome.error)]() mutable {
            // Moved out first: the completion may own the owner of this task.
            auto completion = std::exchange(self->_completion, {});
            completion(std::move(data), std::move(response), std::move(error));
        });
    }

    std::shared_ptr<Loader> _loader;
    const std::uint64_t _identifier;
    const UrlRequest _request;
    const UrlSessionConfiguration _configuration;
    UrlSession::DataCompletion _completion;
    std::shared_ptr<Queue> _delegateQueue;
    const std::optional<TransferFiles> _files;
    std::atomic<bool> _started = false; // passed to the loader, or cancelled before
    std::atomic<bool> _cancelled = false;

    mutable Mutex _timingMutex;
    Value _timing GUARDED_BY(_timingMutex);
};

Loader::Loader(WorkerPool& pool, Clock& clock)
    : _pool(pool),
      // Of high priority: a request is sent before the work that its client's call left behind.
      _queue(Queue::make("url-loader", Queue::Kind::Serial, pool, clock, Rank::Root, Priority::High)),
      _multi(curl_multi_init()), _tlsSessions(curl_share_init()),
      _timerFd(timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK))
{
    curl_share_setopt(_tlsSessions, CURLSHOPT_SHARE, CURL_LOCK_DATA_SSL_SESSION);
    curl_multi_setopt(_multi, CURLMOPT_MAXCONNECTS, kIdleConnections);
    curl_multi_setopt(_multi, CURLMOPT_SOCKETDATA, this);
    curl_multi_setopt(
        _multi, CURLMOPT_SOCKETFUNCTION, +[](CURL*, curl_socket_t socket, int what, void* self, void*) {
            static_cast<Loader*>(self)->watch(socket, what);
            return 0;
        });
    curl_multi_setopt(_multi, CURLMOPT_TIMERDATA, this);
    curl_multi_setopt(
        _multi, CURLMOPT_TIMERFUNCTION, +[](CURLM*, long milliseconds, void* self) {
            auto& due = static_cast<Loader*>(self)->_curlDue;
            due = milliseconds < 0
                      ? std::nullopt
                      : std::optional(std::chrono::steady_clock::now() + std::chrono::milliseconds(milliseconds));
            return 0;
        });
}

void Loader::start(std::shared_ptr<CurlTask> task)
{
    _queue->async([self = shared_from_this(), task = std::move(task)] {
        self->begin(task);
        self->settle();
    });
}

void Loader::cancel(std::shared_ptr<CurlTask> task)
{
    _queue->async([self = shared_from_this(), task = std::move(task)] {
        if (task->load) self->end(task->load->easy(), CURLE_OK, true);
        self->settle();
    });
}

void Loader::stop()
{
    std::promise<void> stopped;
    _queue->async([&] {
        _stopped = true;
        while (!_active.empty()) end(_active.begin()->first, CURLE_OK, true);
        curl_multi_cleanup(_multi); // ends the watch of each socket
        curl_share_cleanup(_tlsSessions);
        _timer.reset();
        stopped.set_value();
    });
    WorkerPool::shareKeptJobs();
    stopped.get_future().wait();
}

void Loader::begin(const std::shared_ptr<CurlTask>& task)
{
    if (task->cancelled() || _stopped) return task->completeCancelled();
    task->beginLoad();
    send(task);
}

/// Sends a hop of the task's load. Each has a handle of its own: if a response begins with a folded line, libcurl 7.88
/// appends it to the last header field of the handle's transfer before, whose memory it has freed.
void Loader::send(const std::shared_ptr<CurlTask>& task)
{
    CURL* easy = curl_easy_init();
    if (easy && curl_easy_setopt(easy, CURLOPT_SHARE, _tlsSessions) == CURLE_OK && task->load->prepare(easy) &&
        curl_multi_add_handle(_multi, easy) == CURLM_OK) {
        _active.emplace(easy, task);
        return;
    }
    task->complete(CURLE_FAILED_INIT);
    if (easy) curl_easy_cleanup(easy);
}

void Loader::end(CURL* easy, CURLcode code, bool cancelled)
{
    const auto found = _active.find(easy);
    if (found == _active.end()) return;
    const std::shared_ptr<CurlTask> task = found->second;
    const bool goesOn = !cancelled && task->load->goesOn(code);
    curl_multi_remove_handle(_multi, easy);
    _active.erase(found);
    if (cancelled)
        task->completeCancelled();
    else if (goesOn)
        send(task);
    else
        task->complete(code);
    curl_easy_cleanup(easy);
}

/// While all bodies together take too much memory, fails the largest: ordinary responses are not the cause.
void Loader::relieve()
{
    while (bodiesInMemory > kMaximumInMemory) {
        const auto inMemory = [](const auto& entry) { return entry.second->load->inMemory(); };
        CURL* largest = std::ranges::max_element(_active, {}, inMemory)->first;
        _active.at(largest)->load->giveWay();
        end(largest, CURLE_WRITE_ERROR, false);
    }
}

/// Passes a socket's events (CURL_CSELECT_…) to libcurl; for CURL_SOCKET_TIMEOUT, that its time has come.
void Loader::act(curl_socket_t socket, int events)
{
    int running = 0;
    curl_multi_socket_action(_multi, socket, events, &running);
}

/// After libcurl has returned: ends the loads that are done or late, lets libcurl do what is due, and sets the timer.
void Loader::settle()
{
    constexpr int kTurns = 16; // then other tasks have theirs
    if (_stopped) return;
    for (int turn = 0; turn < kTurns; ++turn) {
        int left = 0;
        while (const CURLMsg* message = curl_multi_info_read(_multi, &left))
            if (message->msg == CURLMSG_DONE) end(message->easy_handle, message->data.result, false);
        relieve();
        const auto now = std::chrono::steady_clock::now();
        endLate(now);
        if (!_curlDue || *_curlDue > now) return setTimer();
        _curlDue.reset();
        act(CURL_SOCKET_TIMEOUT, 0);
    }
    _queue->async([self = shared_from_this()] { self->settle(); });
}

/// Ends the loads that have timed out.
void Loader::endLate(TimePoint now)
{
    std::vector<CURL*> late;
    for (const auto& [easy, task] : _active)
        if (task->load->deadline() <= now) late.push_back(easy);
    for (CURL* easy : late) {
        _active.at(easy)->load->timeOut(now);
        end(easy, CURLE_OPERATION_TIMEDOUT, false);
    }
}

/// Sets the timer to the next deadline. A timer that fires earlier stays as it is, because deadlines mostly move until
/// then. Stops the timer if there is no load, so that an idle process isn't woken.
void Loader::setTimer()
{
    const bool isIdle = _active.empty();
    TimePoint next = _curlDue.value_or(TimePoint::max());
    for (const auto& [easy, task] : _active) next = std::min(next, task->load->deadline());
    if (isIdle ? !_timerDue : _timerDue && *_timerDue <= next) return;
    if (!_timer) {
        _timer = _pool.watch(_timerFd.fd(), _queue, [weak = weak_from_this()](std::uint32_t) {
            const auto self = weak.lock();
            if (!self) return;
            self->_timerDue.reset();
            self->settle();
        });
        _timer->setEvents(EPOLLIN | EPOLLET);
    }
    _timerDue = isIdle ? std::nullopt : std::optional(next);
    const std::int64_t due = isIdle ? 0 : std::chrono::nanoseconds(next.time_since_epoch()).count(); // 0 stops it
    const itimerspec when{.it_interval = {},
                          .it_value = {.tv_sec = due / 1'000'000'000, .tv_nsec = due % 1'000'000'000}};
    timerfd_settime(_timerFd.fd(), TFD_TIMER_ABSTIME, &when, nullptr);
}

/// Watches a socket for what libcurl wants to know (CURL_POLL_…).
void Loader::watch(curl_socket_t socket, int what)
{
    if (what == CURL_POLL_REMOVE) {
        _sockets.erase(socket);
        return;
    }
    auto& source = _sockets[socket];
    if (!source)
        source = _pool.watch(socket, _queue, [weak = weak_from_this(), socket](std::uint32_t events) {
            const auto self = weak.lock();
            if (!self) return;
            // As libcurl itself understands errors of poll.
            const bool reads = (events & (EPOLLIN | EPOLLHUP | EPOLLERR)) != 0;
            const bool writes = (events & (EPOLLOUT | EPOLLERR)) != 0;
            self->act(socket, (reads ? CURL_CSELECT_IN : 0) | (writes ? CURL_CSELECT_OUT : 0));
            self->settle();
        });
    source->setEvents(((what & CURL_POLL_IN) != 0 ? EPOLLIN : 0u) | ((what & CURL_POLL_OUT) != 0 ? EPOLLOUT : 0u));
}

/// One loader runs the loads that may use HTTP/2 (`CurlLoad::mayUseHttp2`), the other one all others.
struct Loaders {
    std::shared_ptr<Loader> http2;
    std::shared_ptr<Loader> http1;
};

class CurlSession final : public UrlSession {
public:
    CurlSession(Loaders loaders, UrlSessionConfiguration configuration, std::shared_ptr<Queue> queue)
        : _loaders(std::move(loaders)), _configuration(std::move(configuration)), _queue(std::move(queue))
    {}
    std::shared_ptr<UrlTask> dataTask(UrlRequest request, DataCompletion completion) override
    {
        return task(std::move(request), std::nullopt, std::move(completion));
    }
    std::shared_ptr<UrlTask> transferTask(UrlRequest request, TransferFiles files, DataCompletion completion) override
    {
        return task(std::move(request), std::move(files), std::move(completion));
    }

private:
    std::shared_ptr<UrlTask> task(UrlRequest request, std::optional<TransferFiles> files, DataCompletion completion)
    {
        const bool http2 = CurlLoad::mayUseHttp2(request, _configuration, files ? &*files : nullptr);
        return std::make_shared<CurlTask>(http2 ? _loaders.http2 : _loaders.http1, ++_lastIdentifier,
                                          std::move(request), _configuration, std::move(completion), _queue,
                                          std::move(files));
    }

    const Loaders _loaders;
    const UrlSessionConfiguration _configuration;
    std::shared_ptr<Queue> _queue;
    std::atomic<std::uint64_t> _lastIdentifier = 0;
};

class CurlLoader final : public UrlLoader {
public:
    CurlLoader(WorkerPool& pool, Clock& clock)
        : _loaders{std::make_shared<Loader>(pool, clock), std::make_shared<Loader>(pool, clock)}
    {}
    ~CurlLoader() override
    {
        _loaders.http2->stop();
        _loaders.http1->stop();
    }
    std::shared_ptr<UrlSession> makeSession(UrlSessionConfiguration configuration,
                                            std::shared_ptr<Queue> delegateQueue) override
    {
        const auto cache = std::exchange(configuration.cache, std::nullopt);
        auto session = std::make_shared<CurlSession>(_loaders, std::move(configuration), delegateQueue);
        if (!cache) return session;
        return makeCachingSession(std::move(session), HttpCache::make(*cache), std::move(delegateQueue));
    }

private:
    const Loaders _loaders;
};

} // namespace

std::unique_ptr<UrlLoader> makeCurlLoader(WorkerPool& pool, Clock& clock)
{
    static std::once_flag once;
    std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
    return std::make_unique<CurlLoader>(pool, clock);
}

} // namespace platform
