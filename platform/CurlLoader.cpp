#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <map>
#include <mutex>
#include <span>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/timerfd.h>
#include <thread>
#include <unistd.h>
#include <vector>

#include <curl/curl.h>

#include "platform/CurlTask.h"
#include "platform/Files.h"
#include "platform/ThreadName.h"

namespace platform {

namespace {

/// The transfers: one libcurl multi handle, and the URL-loading thread, which waits for their sockets and timers.
/// Nothing is handed over where it needn't be: a thread that starts a load sends the request itself while the multi
/// handle is free, and the loading thread runs a completion itself when nothing else is under way.
class Loader final : public CurlTaskRunner {
public:
    Loader();
    ~Loader() override;

    void start(std::shared_ptr<CurlTask> task) override { giveCommand(std::move(task), false); }
    void cancel(std::shared_ptr<CurlTask> task) override { giveCommand(std::move(task), true); }
    /// Ends every task and the thread.
    void stop();

private:
    struct Command {
        std::shared_ptr<CurlTask> task;
        bool cancel;
    };
    using Time = std::chrono::steady_clock::time_point;

    void run();
    void wake();
    void giveCommand(std::shared_ptr<CurlTask> task, bool cancel);
    // With the multi handle held.
    void work(std::span<const epoll_event> events);
    void takeCommands();
    void begin(const std::shared_ptr<CurlTask>& task);
    void end(CURL* easy, CURLcode code, bool cancelled);
    void endLate();
    void endFinished();
    void setTimer();
    [[nodiscard]] long curlTimeout() const;
    void watchSocket(curl_socket_t socket, int what);
    [[nodiscard]] CURL* takeEasy();

    const FileHandle _epoll;
    const FileHandle _timer; // for the earliest of what curl and the tasks wait for
    const FileHandle _wake;  // for commands that found the multi handle held, and for the end

    std::mutex _multiMutex; // held by whoever works on what follows
    CURLM* _multi;
    std::map<CURL*, std::shared_ptr<CurlTask>> _active;
    std::vector<CURL*> _spare;
    std::vector<std::pair<std::shared_ptr<CurlTask>, Queue::Task>> _ended; // and the call that hands each on
    std::optional<Time> _timerSetTo;

    std::mutex _mutex;
    std::vector<Command> _commands; // under the mutex, like the rest
    bool _stopping = false;
    std::thread _thread; // made with the first task
};

Loader::Loader()
    : _epoll(epoll_create1(EPOLL_CLOEXEC)), _timer(timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK)),
      _wake(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)), _multi(curl_multi_init())
{
    // Edge-triggered: the counters need no reading.
    for (const int fd : {_timer.fd(), _wake.fd()}) {
        epoll_event event{.events = EPOLLIN | EPOLLET, .data = {.fd = fd}};
        if (epoll_ctl(_epoll.fd(), EPOLL_CTL_ADD, fd, &event) != 0)
            std::abort(); // no descriptors: nothing can be loaded
    }
    curl_multi_setopt(_multi, CURLMOPT_SOCKETDATA, this);
    curl_multi_setopt(
        _multi, CURLMOPT_SOCKETFUNCTION, +[](CURL*, curl_socket_t socket, int what, void* self, void*) {
            static_cast<Loader*>(self)->watchSocket(socket, what);
            return 0;
        });
}

Loader::~Loader()
{
    stop();
    curl_multi_cleanup(_multi);
}

void Loader::wake()
{
    const std::uint64_t one = 1;
    if (write(_wake.fd(), &one, sizeof one) < 0) std::abort(); // only a counter at its limit fails
}

void Loader::giveCommand(std::shared_ptr<CurlTask> task, bool cancel)
{
    {
        std::unique_lock lock(_mutex);
        if (_stopping) {
            lock.unlock();
            if (!cancel) task->deliver(task->completion(CURLE_OK, true));
            return;
        }
        _commands.push_back({std::move(task), cancel});
        if (!_thread.joinable()) _thread = std::thread([this] { run(); });
    }
    std::unique_lock multi(_multiMutex, std::try_to_lock);
    if (!multi) return wake();
    work({});
    auto ended = std::exchange(_ended, {});
    multi.unlock();
    for (auto& [which, completion] : ended) which->deliver(std::move(completion));
}

void Loader::stop()
{
    {
        std::lock_guard lock(_mutex);
        _stopping = true;
        if (!_thread.joinable()) return;
    }
    wake();
    _thread.join();
}

CURL* Loader::takeEasy()
{
    if (_spare.empty()) return curl_easy_init();
    CURL* easy = _spare.back();
    _spare.pop_back();
    return easy;
}

void Loader::takeCommands()
{
    std::vector<Command> commands;
    {
        std::lock_guard lock(_mutex);
        commands.swap(_commands);
    }
    for (Command& command : commands) {
        if (!command.cancel)
            begin(command.task);
        else if (command.task->easy())
            end(command.task->easy(), CURLE_OK, true);
    }
}

void Loader::begin(const std::shared_ptr<CurlTask>& task)
{
    if (task->cancelled()) return _ended.push_back({task, task->completion(CURLE_OK, true)}), void();
    CURL* easy = takeEasy();
    if (!easy || !task->configure(easy) || curl_multi_add_handle(_multi, easy) != CURLM_OK) {
        _ended.push_back({task, task->completion(CURLE_FAILED_INIT, false)});
        if (easy) curl_easy_cleanup(easy);
        return;
    }
    _active.emplace(easy, task);
}

void Loader::end(CURL* easy, CURLcode code, bool cancelled)
{
    const auto found = _active.find(easy);
    if (found == _active.end()) return;
    const std::shared_ptr<CurlTask> task = std::move(found->second);
    _active.erase(found);
    _ended.push_back({task, task->completion(code, cancelled)});
    curl_multi_remove_handle(_multi, easy);
    constexpr std::size_t kSpareHandles = 8;
    if (_spare.size() < kSpareHandles) {
        curl_easy_reset(easy);
        _spare.push_back(easy);
    } else {
        curl_easy_cleanup(easy);
    }
}

/// Ends what has received nothing for too long.
void Loader::endLate()
{
    const auto now = std::chrono::steady_clock::now();
    std::vector<CURL*> late;
    for (const auto& [easy, task] : _active)
        if (task->deadline() <= now) late.push_back(easy);
    for (CURL* easy : late) {
        _active.at(easy)->timedOut = true;
        end(easy, CURLE_OPERATION_TIMEDOUT, false);
    }
}

void Loader::endFinished()
{
    int left = 0;
    while (const CURLMsg* message = curl_multi_info_read(_multi, &left))
        if (message->msg == CURLMSG_DONE) end(message->easy_handle, message->data.result, false);
}

void Loader::watchSocket(curl_socket_t socket, int what)
{
    if (what == CURL_POLL_REMOVE) {
        epoll_ctl(_epoll.fd(), EPOLL_CTL_DEL, socket, nullptr);
        return;
    }
    epoll_event event{.events = 0, .data = {.fd = socket}};
    if (what & CURL_POLL_IN) event.events |= EPOLLIN;
    if (what & CURL_POLL_OUT) event.events |= EPOLLOUT;
    if (epoll_ctl(_epoll.fd(), EPOLL_CTL_MOD, socket, &event) != 0 && errno == ENOENT)
        epoll_ctl(_epoll.fd(), EPOLL_CTL_ADD, socket, &event);
}

/// Milliseconds until curl has something to do by time; negative for never.
long Loader::curlTimeout() const
{
    long milliseconds = -1;
    curl_multi_timeout(_multi, &milliseconds);
    return milliseconds;
}

/// The timer may be early, which costs a turn; it must not be late, nor run while nothing is under way.
void Loader::setTimer()
{
    std::optional<Time> wanted;
    if (const long left = curlTimeout(); left >= 0)
        wanted = std::chrono::steady_clock::now() + std::chrono::milliseconds(left);
    for (const auto& [easy, task] : _active) wanted = std::min(wanted.value_or(Time::max()), task->deadline());
    if (wanted ? _timerSetTo && *_timerSetTo <= *wanted : !_timerSetTo) return;
    _timerSetTo = wanted;
    itimerspec setting{}; // zero is "off"
    if (wanted) {
        using namespace std::chrono;
        const nanoseconds at = std::max(wanted->time_since_epoch(), nanoseconds(1));
        setting.it_value = {.tv_sec = duration_cast<std::chrono::seconds>(at).count(), .tv_nsec = (at % 1s).count()};
    }
    timerfd_settime(_timer.fd(), TFD_TIMER_ABSTIME, &setting, nullptr);
}

/// Everything that can be done without waiting.
void Loader::work(std::span<const epoll_event> events)
{
    int running = 0;
    for (const epoll_event& event : events) {
        if (event.data.fd == _timer.fd()) {
            _timerSetTo.reset();
        } else if (event.data.fd != _wake.fd()) {
            int seen = 0;
            if (event.events & EPOLLIN) seen |= CURL_CSELECT_IN;
            if (event.events & EPOLLOUT) seen |= CURL_CSELECT_OUT;
            if (event.events & (EPOLLERR | EPOLLHUP)) seen |= CURL_CSELECT_ERR;
            curl_multi_socket_action(_multi, event.data.fd, seen, &running);
        }
    }
    takeCommands();
    while (curlTimeout() == 0) curl_multi_socket_action(_multi, CURL_SOCKET_TIMEOUT, 0, &running);
    endFinished();
    endLate();
    setTimer();
}

void Loader::run()
{
    setThreadNameForLabel("url-loader");
    std::array<epoll_event, 32> events;
    while (true) {
        const int count = epoll_wait(_epoll.fd(), events.data(), static_cast<int>(events.size()), -1);
        {
            std::lock_guard lock(_mutex);
            if (_stopping) break;
        }
        std::unique_lock multi(_multiMutex);
        work(std::span(events).first(static_cast<std::size_t>(std::max(count, 0))));
        auto ended = std::exchange(_ended, {});
        const bool idle = _active.empty();
        multi.unlock();
        for (auto& [task, completion] : ended) {
            if (idle && ended.size() == 1)
                task->deliverHere(std::move(completion));
            else
                task->deliver(std::move(completion));
        }
    }
    std::lock_guard multi(_multiMutex);
    takeCommands();
    while (!_active.empty()) end(_active.begin()->first, CURLE_OK, true);
    for (auto& [task, completion] : std::exchange(_ended, {})) task->deliver(std::move(completion));
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
        return std::make_shared<CurlSession>(_loader, std::move(configuration), std::move(delegateQueue));
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
