#include "platform/net/UrlSessionCurl.h"

#include <algorithm>
#include <atomic>
#include <limits>
#include <map>
#include <mutex>
#include <pthread.h>
#include <thread>
#include <vector>

#include <curl/curl.h>

#include "platform/base/Mutex.h"
#include "platform/net/CurlLoad.h"
#include "platform/net/HttpCache.h"
#include "platform/net/UrlSession.h"
#include "platform/net/UrlSessionCaching.h"
#include "platform/run/Queue.h"

namespace platform {

namespace {

/// Limit of idle connections to all hosts. Servers close them after seconds, and each takes a socket on both sides.
constexpr long kIdleConnections = 32;

/// Limit of the bytes of all incomplete bodies in memory: three of the largest, hundreds of ordinary ones.
constexpr std::size_t kMaximumInMemory = 24u << 20;

class CurlTask;

/// The URL-loading thread. Members marked "loader thread" are confined to it.
class Loader : public std::enable_shared_from_this<Loader> {
public:
    Loader();
    ~Loader();

    void start(std::shared_ptr<CurlTask> task);
    void cancel(std::shared_ptr<CurlTask> task);
    /// Cancels every task and joins the thread.
    void stop();
    /// Bytes of incomplete bodies; loader thread.
    std::size_t bodiesInMemory = 0;

private:
    struct Command {
        std::shared_ptr<CurlTask> task;
        bool cancel;
    };
    void run();
    void takeCommands();
    void begin(const std::shared_ptr<CurlTask>& task);
    void end(CURL* easy, CURLcode code, bool cancelled);
    [[nodiscard]] CURL* takeEasy();
    void giveBack(CURL* easy);
    void relieve();
    [[nodiscard]] int nextTimeout();
    [[nodiscard]] bool readOn();

    CURLM* _multi;
    Mutex _mutex;
    std::vector<Command> _commands GUARDED_BY(_mutex);
    bool _stopping GUARDED_BY(_mutex) = false;
    std::thread _thread;                                // started under the mutex, joined once
    std::map<CURL*, std::shared_ptr<CurlTask>> _active; // loader thread
    std::vector<CURL*> _spare;                          // loader thread
};

/// One task; any thread.
class CurlTask final : public UrlTask, public std::enable_shared_from_this<CurlTask> {
public:
    CurlTask(std::shared_ptr<Loader> loader, std::uint64_t identifier, UrlRequest request,
             UrlSessionConfiguration configuration, UrlSession::DataCompletion completion,
             std::shared_ptr<Queue> delegateQueue, std::optional<TransferFiles> files = std::nullopt)
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

    /// Exists while the loader runs the task. Loader thread.
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

Loader::Loader() : _multi(curl_multi_init())
{
    curl_multi_setopt(_multi, CURLMOPT_MAXCONNECTS, kIdleConnections);
}

Loader::~Loader()
{
    stop();
    curl_multi_cleanup(_multi);
}

void Loader::start(std::shared_ptr<CurlTask> task)
{
    bool taken = false;
    {
        MutexLock lock(_mutex);
        if (!_stopping) {
            _commands.push_back({task, false});
            if (!_thread.joinable()) _thread = std::thread([this] { run(); });
            taken = true;
        }
    }
    if (!taken) return task->completeCancelled();
    curl_multi_wakeup(_multi);
}

void Loader::cancel(std::shared_ptr<CurlTask> task)
{
    {
        MutexLock lock(_mutex);
        if (_stopping) return;
        _commands.push_back({std::move(task), true});
    }
    curl_multi_wakeup(_multi);
}

void Loader::stop()
{
    {
        MutexLock lock(_mutex);
        _stopping = true;
        if (!_thread.joinable()) return;
    }
    curl_multi_wakeup(_multi);
    _thread.join();
}

CURL* Loader::takeEasy()
{
    if (_spare.empty()) return curl_easy_init();
    CURL* easy = _spare.back();
    _spare.pop_back();
    return easy;
}

void Loader::giveBack(CURL* easy)
{
    constexpr std::size_t kSpareHandles = 8;
    curl_easy_reset(easy); // it refers to the load
    if (_spare.size() == kSpareHandles) return curl_easy_cleanup(easy);
    _spare.push_back(easy);
}

void Loader::takeCommands()
{
    std::vector<Command> commands;
    {
        MutexLock lock(_mutex);
        commands.swap(_commands);
    }
    for (Command& command : commands) {
        if (!command.cancel)
            begin(command.task);
        else if (command.task->load)
            end(command.task->load->easy(), CURLE_OK, true);
    }
}

void Loader::begin(const std::shared_ptr<CurlTask>& task)
{
    if (task->cancelled()) return task->completeCancelled();
    CURL* easy = takeEasy();
    task->beginLoad();
    if (easy && task->load->prepare(easy) && curl_multi_add_handle(_multi, easy) == CURLM_OK) {
        _active.emplace(easy, task);
        return;
    }
    task->complete(CURLE_FAILED_INIT);
    if (easy) giveBack(easy);
}

void Loader::end(CURL* easy, CURLcode code, bool cancelled)
{
    const auto found = _active.find(easy);
    if (found == _active.end()) return;
    const std::shared_ptr<CurlTask> task = found->second;
    const bool goesOn = !cancelled && task->load->goesOn(code);
    curl_multi_remove_handle(_multi, easy);
    if (goesOn) {
        curl_easy_reset(easy);
        if (task->load->prepare(easy) && curl_multi_add_handle(_multi, easy) == CURLM_OK) return;
        code = CURLE_FAILED_INIT;
    }
    _active.erase(found);
    if (cancelled)
        task->completeCancelled();
    else
        task->complete(code);
    giveBack(easy);
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

/// Ends the loads that have timed out, and returns the milliseconds until the next time-out.
int Loader::nextTimeout()
{
    const auto now = std::chrono::steady_clock::now();
    std::vector<CURL*> late;
    auto next = now + std::chrono::hours(1);
    for (const auto& [easy, task] : _active) {
        const auto deadline = task->load->deadline();
        if (deadline <= now)
            late.push_back(easy);
        else
            next = std::min(next, deadline);
    }
    for (CURL* easy : late) {
        _active.at(easy)->load->timeOut(now);
        end(easy, CURLE_OPERATION_TIMEDOUT, false);
    }
    // Without a task there is no time-out. `start` and `cancel` interrupt the wait.
    if (_active.empty()) return std::numeric_limits<int>::max();
    return static_cast<int>(std::chrono::ceil<std::chrono::milliseconds>(next - now).count());
}

/// Makes every transfer process its buffered input; returns true if any received something. With HTTP/2, libcurl 7.88
/// reads for all streams of a connection at once and may leave the end of one unprocessed until the connection has more
/// data: without this, 7 of 40 lists of 24 images hung. Pausing and resuming a transfer makes libcurl process its
/// input.
bool Loader::readOn()
{
    const auto received = [this] {
        curl_off_t all = 0;
        for (const auto& [easy, task] : _active) {
            curl_off_t size = 0;
            long headers = 0;
            curl_easy_getinfo(easy, CURLINFO_SIZE_DOWNLOAD_T, &size);
            curl_easy_getinfo(easy, CURLINFO_HEADER_SIZE, &headers);
            all += size + headers;
        }
        return all;
    };
    const curl_off_t before = received();
    int running = 0;
    for (const auto& [easy, task] : _active) {
        curl_easy_pause(easy, CURLPAUSE_RECV);
        curl_easy_pause(easy, CURLPAUSE_CONT);
        curl_multi_perform(_multi, &running);
    }
    return received() != before;
}

void Loader::run()
{
    constexpr int kQuiet = 2; // milliseconds
    bool isQuiet = false;
    bool mayBeUnread = false; // a transfer may have unprocessed data
    pthread_setname_np(pthread_self(), "url-loader");
    while (true) {
        {
            MutexLock lock(_mutex);
            if (_stopping) break;
        }
        takeCommands();
        mayBeUnread = mayBeUnread || (!isQuiet && _active.size() > 1);
        int running = 0;
        curl_multi_perform(_multi, &running);
        int left = 0;
        while (const CURLMsg* message = curl_multi_info_read(_multi, &left))
            if (message->msg == CURLMSG_DONE) end(message->easy_handle, message->data.result, false);
        relieve();
        const int timeout = nextTimeout();
        int ready = 0;
        curl_multi_poll(_multi, nullptr, 0, mayBeUnread ? std::min(timeout, kQuiet) : timeout, &ready);
        isQuiet = mayBeUnread && ready == 0;
        if (isQuiet) mayBeUnread = readOn();
    }
    takeCommands();
    while (!_active.empty()) end(_active.begin()->first, CURLE_OK, true);
    for (CURL* easy : _spare) curl_easy_cleanup(easy);
    _spare.clear();
}

class CurlSession final : public UrlSession {
public:
    CurlSession(std::shared_ptr<Loader> loader, UrlSessionConfiguration configuration, std::shared_ptr<Queue> queue)
        : _loader(std::move(loader)), _configuration(std::move(configuration)), _queue(std::move(queue))
    {}
    std::shared_ptr<UrlTask> dataTask(UrlRequest request, DataCompletion completion) override
    {
        return std::make_shared<CurlTask>(_loader, ++_lastIdentifier, std::move(request), _configuration,
                                          std::move(completion), _queue);
    }
    std::shared_ptr<UrlTask> transferTask(UrlRequest request, TransferFiles files, DataCompletion completion) override
    {
        return std::make_shared<CurlTask>(_loader, ++_lastIdentifier, std::move(request), _configuration,
                                          std::move(completion), _queue, std::move(files));
    }

private:
    std::shared_ptr<Loader> _loader;
    const UrlSessionConfiguration _configuration;
    std::shared_ptr<Queue> _queue;
    std::atomic<std::uint64_t> _lastIdentifier = 0;
};

class CurlLoader final : public UrlLoader {
public:
    ~CurlLoader() override { _loader->stop(); }
    std::shared_ptr<UrlSession> makeSession(UrlSessionConfiguration configuration,
                                            std::shared_ptr<Queue> delegateQueue) override
    {
        const auto cache = std::exchange(configuration.cache, std::nullopt);
        auto session = std::make_shared<CurlSession>(_loader, std::move(configuration), delegateQueue);
        if (!cache) return session;
        return makeCachingSession(std::move(session), HttpCache::make(*cache), std::move(delegateQueue));
    }

private:
    std::shared_ptr<Loader> _loader = std::make_shared<Loader>();
};

} // namespace

std::unique_ptr<UrlLoader> makeCurlLoader()
{
    static std::once_flag once;
    std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
    return std::make_unique<CurlLoader>();
}

} // namespace platform
