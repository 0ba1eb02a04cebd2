#include "platform/run/Queue.h"

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <deque>
#include <ranges>
#include <utility>
#include <vector>

#include "platform/base/Mutex.h"
#include "platform/run/Clock.h"
#include "platform/run/WorkerPool.h"

namespace platform {

namespace {

/// Tasks that one drain job runs before it releases its worker.
constexpr unsigned kBatch = 32;
/// Limit of the drain jobs that one concurrent queue has pending on the executor.
constexpr std::size_t kMaximumJobs = 64;

/// The queues whose tasks this thread runs, innermost first.
struct Frame {
    explicit Frame(Queue* queue_) : queue(queue_), outer(top)
    {
        top = this;
        runningQueue = queue->label().c_str();
    }
    ~Frame()
    {
        top = outer;
        runningQueue = outer ? outer->queue->label().c_str() : "";
    }
    Queue* queue;
    Frame* outer;
    static thread_local Frame* top;
};
thread_local Frame* Frame::top = nullptr;

std::string currentWay()
{
    std::string way;
    for (const Frame* frame = Frame::top; frame; frame = frame->outer)
        way = frame->queue->label() + (way.empty() ? "" : " > ") + way;
    return way.empty() ? "no queue" : way;
}

[[noreturn]] void abortWith(const char* what, const std::string& label)
{
    std::fprintf(stderr, "queue %s: %s\n", label.c_str(), what);
    std::abort();
}

} // namespace

/// A suspended queue. The event or the timer resumes it, whichever comes first. The timer owns the suspension, so that
/// an event that is never signalled keeps nothing alive.
struct Suspension {
    std::shared_ptr<Queue> queue;
    Queue::Task continuation;
    std::atomic<bool> over = false;
    std::atomic<Clock::TimerId> timer = 0;
    void (*resumeQueue)(Suspension&);

    void resume()
    {
        if (!over.exchange(true)) resumeQueue(*this);
    }
};

struct Event::State {
    Mutex mutex;
    bool signalled GUARDED_BY(mutex) = false;
    std::vector<std::weak_ptr<Suspension>> waiters GUARDED_BY(mutex);
};

Event::Event() : _state(std::make_shared<State>()) {}
Event::~Event() = default;

void Event::signal()
{
    std::vector<std::weak_ptr<Suspension>> waiters;
    {
        MutexLock lock(_state->mutex);
        _state->signalled = true;
        waiters.swap(_state->waiters);
    }
    for (const auto& waiter : waiters)
        if (const auto suspension = waiter.lock()) suspension->resume();
}

bool Event::signalled() const
{
    MutexLock lock(_state->mutex);
    return _state->signalled;
}

/// A `sync` caller that waits for its turn. On the caller's stack; touched under the queue's mutex.
struct SyncWaiter {
    Condition wake;
    bool granted = false;  // its turn has come, and it counts as running
    bool mayDrain = false; // no other thread drains the tasks before it
};

/// One place in the queue: a task, or a caller that waits to run its own.
struct Entry {
    Queue::Task task;
    SyncWaiter* waiter = nullptr;
    bool barrier = false;
};

/// Drain jobs for the executor, submitted when this is destroyed at the latest: with the queue's mutex free, so that
/// the worker that wakes doesn't run into it. Declared ahead of the lock.
class Queue::Jobs {
public:
    explicit Jobs(Queue& queue) : _queue(queue) {}
    ~Jobs() { submit(); }
    Jobs(const Jobs&) = delete;
    Jobs& operator=(const Jobs&) = delete;
    void submit();
    unsigned count = 0;

private:
    Queue& _queue;
};

/// A serial queue is a concurrent one whose every task is a barrier. What runs is counted in `shared` and `exclusive`;
/// who ends a task calls `pump`, which gives the next place its turn: a waiting caller directly, a task through the
/// first caller that waits after it, or else through a job for the executor.
struct Queue::Core {
    QueueOrder::Place place;
    Kind kind;
    Executor& executor;
    Clock& clock;
    Priority priority;

    Mutex mutex;
    std::deque<Entry> entries GUARDED_BY(mutex);
    std::size_t waiters GUARDED_BY(mutex) = 0; ///< entries that are waiting callers
    std::size_t jobs GUARDED_BY(mutex) = 0;    ///< drain jobs handed to the executor and not begun
    unsigned shared GUARDED_BY(mutex) = 0;     ///< shared tasks running
    bool exclusive GUARDED_BY(mutex) = false;  ///< a barrier task running
    /// In the order of their continuations.
    std::vector<std::shared_ptr<Suspension>> suspensions GUARDED_BY(mutex){};

    [[nodiscard]] bool mayStart(bool barrier) const REQUIRES(mutex)
    {
        return suspensions.empty() && !exclusive && (!barrier || shared == 0);
    }
    [[nodiscard]] bool headMayStart() const REQUIRES(mutex)
    {
        return !entries.empty() && mayStart(entries.front().barrier);
    }

    void begin(bool barrier) REQUIRES(mutex)
    {
        if (barrier)
            exclusive = true;
        else
            ++shared;
    }
    void end(bool barrier) REQUIRES(mutex)
    {
        if (barrier)
            exclusive = false;
        else
            --shared;
        resume();
    }
    /// Puts the continuations first, in the order of the calls, once the suspending task and all its suspensions have
    /// ended.
    void resume() REQUIRES(mutex)
    {
        if (exclusive || !std::ranges::all_of(suspensions, [](const auto& each) { return each->over.load(); })) return;
        for (const auto& ended : std::exchange(suspensions, {}) | std::views::reverse)
            entries.push_front({.task = std::move(ended->continuation), .barrier = true});
    }

    Entry take() REQUIRES(mutex)
    {
        Entry entry = std::move(entries.front());
        entries.pop_front();
        if (entry.waiter) --waiters;
        begin(entry.barrier);
        return entry;
    }

    void pump(Jobs& handedOver) REQUIRES(mutex)
    {
        while (headMayStart() && entries.front().waiter) {
            SyncWaiter* waiter = take().waiter;
            waiter->granted = true;
            waiter->wake.notifyOne();
        }
        if (!headMayStart()) return;
        if (waiters > 0) {
            const auto first = std::ranges::find_if(entries, [](const Entry& entry) { return entry.waiter; });
            first->waiter->mayDrain = true;
            first->waiter->wake.notifyOne();
            if (kind == Kind::Serial) return;
        }
        const std::size_t wanted = kind == Kind::Serial ? 1 : std::min(entries.size() - waiters, kMaximumJobs);
        for (; jobs < wanted; ++jobs) ++handedOver.count;
    }

    /// Runs a task with the mutex released; the task is destroyed before it is taken again.
    void run(Queue& queue, Entry entry) REQUIRES(mutex)
    {
        mutex.unlock();
        {
            Frame frame(&queue);
            Task task = std::move(entry.task);
            task();
        }
        mutex.lock();
        end(entry.barrier);
    }

    /// Called before the thread waits or goes on to another task.
    void shareKeptJobs() REQUIRES(mutex)
    {
        mutex.unlock();
        WorkerPool::shareKeptJobs();
        mutex.lock();
    }

    /// Returns when a caller of `sync` may run its task, which then counts as running.
    void awaitTurn(Queue& queue, bool barrier, Jobs& handedOver)
    {
        MutexLock lock(mutex);
        if (entries.empty() && mayStart(barrier)) return begin(barrier);
        SyncWaiter self;
        entries.push_back({.waiter = &self, .barrier = barrier});
        ++waiters;
        shareKeptJobs();
        while (!self.granted) {
            if (!headMayStart()) {
                while (!self.granted && !self.mayDrain) self.wake.wait(mutex);
                self.mayDrain = false;
            } else if (entries.front().waiter) {
                pump(handedOver);
                mutex.unlock();
                handedOver.submit();
                mutex.lock();
            } else {
                run(queue, take());
            }
        }
    }

    /// A drain job, on a worker.
    void drain(Queue& queue)
    {
        Jobs handedOver(queue);
        MutexLock lock(mutex);
        --jobs;
        for (unsigned i = 0; i < kBatch && headMayStart() && !entries.front().waiter; ++i) {
            run(queue, take());
            if (headMayStart()) shareKeptJobs();
        }
        pump(handedOver);
    }
};

std::shared_ptr<Queue> Queue::make(std::string label, Kind kind, Executor& executor, Clock& clock, Rank rank,
                                   Priority priority)
{
    auto core = std::unique_ptr<Core>(new Core{
        .place = {std::move(label), rank}, .kind = kind, .executor = executor, .clock = clock, .priority = priority});
    return std::shared_ptr<Queue>(new Queue(std::move(core)));
}

void Queue::Jobs::submit()
{
    for (; count > 0; --count)
        _queue._core->executor.execute(_queue._core->priority,
                                       [self = _queue.shared_from_this()] { self->_core->drain(*self); });
}

Queue::Queue(std::unique_ptr<Core> core) : _core(std::move(core)) {}
Queue::~Queue() = default;

const std::string& Queue::label() const
{
    return _core->place.label;
}

void Queue::async(Task task)
{
    Jobs handedOver(*this);
    MutexLock lock(_core->mutex);
    _core->entries.push_back({.task = std::move(task), .barrier = _core->kind == Kind::Serial});
    _core->pump(handedOver);
}

void Queue::barrierAsync(Task task)
{
    Jobs handedOver(*this);
    MutexLock lock(_core->mutex);
    _core->entries.push_back({.task = std::move(task), .barrier = true});
    _core->pump(handedOver);
}

void Queue::runSync(TaskRef task, bool barrier)
{
    if (isCurrent()) abortWith("sync from a task of its own", label());
    Core& core = *_core;
    if (core.place.isChecked())
        QueueOrder::checkSync(Frame::top ? &Frame::top->queue->_core->place : nullptr, core.place, currentWay);
    barrier = barrier || core.kind == Kind::Serial;

    Jobs handedOver(*this);
    core.awaitTurn(*this, barrier, handedOver);
    {
        Frame frame(this);
        task();
    }
    MutexLock lock(core.mutex);
    core.end(barrier);
    core.pump(handedOver);
}

void Queue::after(Duration delay, Task task)
{
    _core->clock.after(delay,
                       [self = shared_from_this(), task = std::move(task)]() mutable { self->async(std::move(task)); });
}

void Queue::suspendUntil(const Event& event, Duration timeout, Task continuation)
{
    if (_core->kind != Kind::Serial) abortWith("suspendUntil needs a serial queue", label());
    assertOnQueue();
    QueueOrder::checkSuspension(_core->place, Frame::top->outer != nullptr, currentWay);

    auto suspension = std::make_shared<Suspension>();
    suspension->queue = shared_from_this();
    suspension->continuation = std::move(continuation);
    suspension->resumeQueue = [](Suspension& over) {
        Core& core = *over.queue->_core;
        core.clock.cancel(over.timer);
        Jobs handedOver(*over.queue);
        MutexLock lock(core.mutex);
        core.resume();
        core.pump(handedOver);
    };
    {
        MutexLock lock(_core->mutex);
        _core->suspensions.push_back(suspension);
    }
    suspension->timer = _core->clock.after(timeout, [suspension] { suspension->resume(); });
    {
        MutexLock lock(event._state->mutex);
        if (!event._state->signalled) {
            std::erase_if(event._state->waiters, [](const auto& waiter) { return waiter.expired(); });
            event._state->waiters.push_back(suspension);
            return;
        }
    }
    suspension->resume();
}

std::shared_ptr<Queue> Queue::current()
{
    return Frame::top ? Frame::top->queue->shared_from_this() : nullptr;
}

bool Queue::isCurrent() const
{
    for (const Frame* frame = Frame::top; frame; frame = frame->outer)
        if (frame->queue == this) return true;
    return false;
}

void Queue::assertOnQueue() const
{
    if (!isCurrent()) abortWith("not on the queue", label());
}

} // namespace platform
