#include "platform/run/WorkerPool.h"

#include <algorithm>
#include <atomic>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <optional>
#include <pthread.h>
#include <string>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/resource.h>
#include <thread>
#include <unistd.h>
#include <unordered_map>
#include <utility>
#include <vector>

#include "platform/base/FileHandle.h"
#include "platform/base/Log.h"
#include "platform/base/Mutex.h"
#include "platform/run/Queue.h"

namespace platform {

namespace {

/// Jobs that a thread runs before it looks at descriptors, and gives what it keeps to the others: so many that the road
/// of a call ends on one thread, and so few that nobody waits long.
constexpr unsigned kJobsPerLook = 16;

constexpr int kBackgroundNice = 10;

constexpr std::uint64_t kJobsKey = 0; // in epoll's data; sources have others

class QueueSource;

/// Threads that share their jobs and descriptors.
class Crew {
public:
    Crew(std::string name, unsigned limit, int nice);

    void add(Executor::Job job, bool isUrgent);
    /// Keeps the job on the calling thread if that belongs to this crew. Returns a job for `add`: the one that the
    /// thread kept before, or `job`; empty if there is none.
    Executor::Job keep(Executor::Job job, bool isUrgent);
    static void shareKept();
    /// Waits for the running jobs and joins the threads.
    void stop();
    /// Destroys the jobs that never run. Their owners may end sources.
    void drop();

    /// Returns the key of a new source.
    std::uint64_t enter(const std::shared_ptr<QueueSource>& source);
    void leave(std::uint64_t key);
    /// Calls epoll_ctl.
    [[nodiscard]] bool control(int operation, int fd, std::uint32_t events, std::uint64_t key) const;

private:
    struct Worker;

    void work(unsigned number);
    [[nodiscard]] std::optional<Executor::Job> next(Worker& self);
    void await(Worker& self, bool mayBlock);
    [[nodiscard]] bool hasJobs() const REQUIRES(_mutex) { return !_urgentJobs.empty() || !_jobs.empty(); }
    [[nodiscard]] bool mustWake() REQUIRES(_mutex);
    void wake() const;

    const std::string _name;
    const unsigned _limit;
    const int _nice;
    const FileHandle _epoll;
    const FileHandle _jobEvent; // edge-triggered: every write wakes a thread, and the counter needs no reading
    std::atomic<bool> _stopping = false;
    Mutex _mutex;
    std::deque<Executor::Job> _urgentJobs GUARDED_BY(_mutex);
    std::deque<Executor::Job> _jobs GUARDED_BY(_mutex);
    std::unordered_map<std::uint64_t, std::weak_ptr<QueueSource>> _sources GUARDED_BY(_mutex);
    std::uint64_t _lastKey GUARDED_BY(_mutex) = kJobsKey;
    unsigned _waiting GUARDED_BY(_mutex) = 0; ///< threads that wait for an event, or are about to
    unsigned _woken GUARDED_BY(_mutex) = 0;   ///< of these, those that a write to `_jobEvent` wakes
    std::vector<std::thread> _threads;        // grows under the mutex
};

/// A thread's own state, on its stack.
struct Crew::Worker {
    Crew& crew;
    Executor::Job urgent{}; // kept; runs before `job`
    Executor::Job job{};    // kept
    unsigned sinceLook = 0; // jobs run since the thread looked at descriptors
    [[nodiscard]] Executor::Job& kept(bool isUrgent) { return isUrgent ? urgent : job; }

    static constinit thread_local Worker* current;
};
constinit thread_local Crew::Worker* Crew::Worker::current = nullptr;

/// A source: what the crew's threads and the queue's tasks share.
class QueueSource : public std::enable_shared_from_this<QueueSource> {
public:
    QueueSource(Crew& crew, int fd, std::shared_ptr<Queue> queue, std::function<void(std::uint32_t)> ready)
        : _crew(crew), _fd(fd), _queue(std::move(queue)), _ready(std::move(ready))
    {}
    void enter() { _key = _crew.enter(shared_from_this()); }

    /// Called by the thread that the descriptor woke.
    void wake(std::uint32_t events)
    {
        if (_pending.fetch_or(events) != 0) return; // a task is queued already
        _queue->async([self = shared_from_this()] { self->run(); });
    }

    // on the queue
    void setEvents(std::uint32_t events)
    {
        _events = events;
        arm();
    }
    void end()
    {
        _ended = true;
        _crew.leave(_key);
        if (std::exchange(_added, false)) (void)_crew.control(EPOLL_CTL_DEL, _fd, 0, _key);
    }

private:
    void run()
    {
        const std::uint32_t events = _pending.exchange(0);
        if (_ended || _events == 0) return;
        _armed = (_events & EPOLLET) != 0;
        _ready(events);
        if (!_ended && !_armed && _events != 0) arm();
    }

    /// Without EPOLLET the descriptor reports one event, and is armed again after the handler. Without events it
    /// reports the end of its peer, likewise once.
    void arm()
    {
        const std::uint32_t events = (_events & EPOLLET) != 0 ? _events : _events | EPOLLONESHOT;
        const int operation = std::exchange(_added, true) ? EPOLL_CTL_MOD : EPOLL_CTL_ADD;
        _armed = true;
        if (!_crew.control(operation, _fd, events, _key))
            defaultLog().fault("descriptor {} can't be watched: {}", _fd, std::strerror(errno));
    }

    Crew& _crew;
    const int _fd;
    const std::shared_ptr<Queue> _queue;
    const std::function<void(std::uint32_t)> _ready;
    std::uint64_t _key = 0;
    std::atomic<std::uint32_t> _pending = 0; // events that the next task of the queue reports
    std::atomic<bool> _ended = false;
    std::uint32_t _events = 0; // this and the next two: on the queue
    bool _added = false;
    bool _armed = false;
};

Crew::Crew(std::string name, unsigned limit, int nice)
    : _name(std::move(name)), _limit(limit), _nice(nice), _epoll(epoll_create1(EPOLL_CLOEXEC)),
      _jobEvent(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK))
{
    if (!control(EPOLL_CTL_ADD, _jobEvent.fd(), EPOLLIN | EPOLLET, kJobsKey)) std::abort(); // nothing can run
}

void Crew::stop()
{
    {
        MutexLock lock(_mutex);
        _stopping = true;
    }
    wake();
    for (std::thread& thread : _threads) thread.join();
}

void Crew::drop()
{
    std::deque<Executor::Job> jobs; // destroyed after the lock
    std::deque<Executor::Job> urgentJobs;
    MutexLock lock(_mutex);
    jobs.swap(_jobs);
    urgentJobs.swap(_urgentJobs);
}

void Crew::add(Executor::Job job, bool isUrgent)
{
    bool wakes = false;
    {
        MutexLock lock(_mutex);
        if (_stopping) return;
        (isUrgent ? _urgentJobs : _jobs).push_back(std::move(job));
        wakes = mustWake();
    }
    if (wakes) wake(); // outside the mutex, which the woken thread needs
}

Executor::Job Crew::keep(Executor::Job job, bool isUrgent)
{
    Worker* self = Worker::current;
    if (self && &self->crew == this) std::swap(self->kept(isUrgent), job);
    return job;
}

void Crew::shareKept()
{
    Worker* self = Worker::current;
    if (!self) return;
    for (const bool isUrgent : {true, false})
        if (auto job = std::exchange(self->kept(isUrgent), {})) self->crew.add(std::move(job), isUrgent);
}

std::uint64_t Crew::enter(const std::shared_ptr<QueueSource>& source)
{
    MutexLock lock(_mutex);
    _sources.emplace(++_lastKey, source);
    if (_threads.empty()) (void)mustWake(); // somebody must wait for it
    return _lastKey;
}

void Crew::leave(std::uint64_t key)
{
    MutexLock lock(_mutex);
    _sources.erase(key);
}

bool Crew::control(int operation, int fd, std::uint32_t events, std::uint64_t key) const
{
    epoll_event event{.events = events, .data = {.u64 = key}};
    return epoll_ctl(_epoll.fd(), operation, fd, &event) == 0;
}

/// Counts a waiting thread as woken and returns true, or starts another thread if the limit allows it.
bool Crew::mustWake()
{
    if (_waiting > _woken) {
        ++_woken;
        return true;
    }
    if (_threads.size() < _limit && !_stopping)
        _threads.emplace_back([this, number = _threads.size() + 1] { work(static_cast<unsigned>(number)); });
    return false;
}

void Crew::wake() const
{
    const std::uint64_t one = 1;
    if (write(_jobEvent.fd(), &one, sizeof one) < 0) std::abort(); // only a counter at its limit fails
}

void Crew::work(unsigned number)
{
    pthread_setname_np(pthread_self(), (_limit > 1 ? _name + "-" + std::to_string(number) : _name).c_str());
    if (_nice > 0) setpriority(PRIO_PROCESS, 0, _nice); // 0: this thread
    Worker self{*this};
    Worker::current = &self;
    while (auto job = next(self)) (*job)();
    Worker::current = nullptr;
    wake(); // one thread after the other stops
}

/// Returns the next job of a thread, or nothing once the crew stops.
std::optional<Executor::Job> Crew::next(Worker& self)
{
    while (!_stopping) {
        const bool looks = self.sinceLook >= kJobsPerLook;
        if (looks) shareKept();
        for (const bool isUrgent : {true, false}) {
            if (!self.kept(isUrgent)) continue;
            ++self.sinceLook;
            return std::exchange(self.kept(isUrgent), {});
        }
        std::optional<Executor::Job> job;
        bool wakes = false;
        bool mayBlock = false;
        {
            MutexLock lock(_mutex);
            mayBlock = !hasJobs();
            if (mayBlock) {
                ++_waiting;
            } else if (!looks) {
                auto& jobs = _urgentJobs.empty() ? _jobs : _urgentJobs;
                job = std::move(jobs.front());
                jobs.pop_front();
                // Somebody should take the next job, or wait for descriptors.
                wakes = (hasJobs() || (_waiting == 0 && !_sources.empty())) && mustWake();
            }
        }
        if (wakes) wake();
        if (job) {
            ++self.sinceLook;
            return job;
        }
        await(self, mayBlock);
    }
    return std::nullopt;
}

/// Waits for a descriptor or for jobs, or only looks at descriptors. A source's task is kept if its queue is idle.
void Crew::await(Worker& self, bool mayBlock)
{
    epoll_event event{};
    const bool found = epoll_wait(_epoll.fd(), &event, 1, mayBlock ? -1 : 0) == 1; // else interrupted, or none
    const std::uint64_t key = event.data.u64;                                      // the structure is packed
    self.sinceLook = 0;
    std::shared_ptr<QueueSource> source;
    {
        MutexLock lock(_mutex);
        if (mayBlock) --_waiting;
        if (found && key == kJobsKey) {
            _woken = 0; // one event stands for all writes before it
        } else if (found) {
            if (const auto entry = _sources.find(key); entry != _sources.end()) source = entry->second.lock();
            if (_waiting == 0) (void)mustWake(); // somebody should wait for the others
        }
    }
    if (source) source->wake(event.events);
}

/// The owner's end of a source.
class OwnedSource final : public WorkerPool::Source {
public:
    explicit OwnedSource(std::shared_ptr<QueueSource> source) : _source(std::move(source)) {}
    ~OwnedSource() override { _source->end(); }
    void setEvents(std::uint32_t events) override { _source->setEvents(events); }

private:
    const std::shared_ptr<QueueSource> _source;
};

} // namespace

struct WorkerPool::Impl {
    explicit Impl(unsigned size) : workers("worker", size, 0), background("background", 1, kBackgroundNice) {}
    Crew workers;
    Crew background;
};

WorkerPool::WorkerPool(unsigned size)
    : _impl(std::make_unique<Impl>(size > 0 ? size : std::max(2u, std::thread::hardware_concurrency())))
{}

WorkerPool::~WorkerPool()
{
    Crew* const crews[] = {&_impl->workers, &_impl->background};
    for (Crew* crew : crews) crew->stop();
    for (Crew* crew : crews) crew->drop();
}

void WorkerPool::execute(Priority priority, Job job)
{
    Crew& crew = priority == Priority::Background ? _impl->background : _impl->workers;
    const bool isUrgent = priority == Priority::High;
    if (auto given = crew.keep(std::move(job), isUrgent)) crew.add(std::move(given), isUrgent);
}

void WorkerPool::shareKeptJobs()
{
    Crew::shareKept();
}

std::unique_ptr<WorkerPool::Source> WorkerPool::watch(int fd, std::shared_ptr<Queue> queue,
                                                      std::function<void(std::uint32_t)> ready)
{
    auto source = std::make_shared<QueueSource>(_impl->workers, fd, std::move(queue), std::move(ready));
    source->enter();
    return std::make_unique<OwnedSource>(std::move(source));
}

} // namespace platform
