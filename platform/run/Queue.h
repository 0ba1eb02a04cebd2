#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <type_traits>

#include "platform/base/Date.h"
#include "platform/run/Executor.h"
#include "platform/run/QueueOrder.h"

namespace platform {

class Clock;

/// The label of the innermost queue whose task this thread runs; empty if it runs none. For debuggers:
/// `thread apply all print platform::runningQueue`.
inline constinit thread_local const char* runningQueue = "";

/// A condition that becomes true once, for which several queues may wait (`Queue::suspendUntil`). Any thread.
class Event {
public:
    Event();
    ~Event();
    Event(const Event&) = delete;
    Event& operator=(const Event&) = delete;

    /// Resumes all suspended queues; later waits end at once. Further calls do nothing.
    void signal();
    [[nodiscard]] bool signalled() const;

private:
    friend class Queue;
    struct State;
    std::shared_ptr<State> _state;
};

/// Guards state: data that only tasks of one queue use needs no lock.
///
/// A serial queue runs its tasks one at a time, in the order of the calls. A concurrent queue runs shared tasks
/// (`async`, `sync`) in parallel and barrier tasks (`barrierAsync`, `barrierSync`) alone, after all earlier and before
/// all later tasks. On a serial queue the barrier calls equal the plain ones.
///
/// `sync` on an idle queue runs inline on the caller's thread. If tasks are waiting and no thread drains them, the
/// caller drains up to its own turn and no further, so that it never depends on a free worker. `sync` on a queue that
/// the thread is already on could never return: it aborts with the label.
///
/// No task waits. A task that must wait for something calls `suspendUntil`, which holds back the queue's later tasks
/// but no thread. Asynchronous tasks run in batches on the executor, so that no busy queue holds a worker for ever.
///
/// `QueueOrder` says on which queues a task may call `sync`, and which queues may suspend.
///
/// Pending tasks keep their queue alive. Any thread.
class Queue : public std::enable_shared_from_this<Queue> {
public:
    using Task = std::move_only_function<void()>;
    enum class Kind { Serial, Concurrent };

    /// `executor` and `clock` must outlive the queue.
    static std::shared_ptr<Queue> make(std::string label, Kind kind, Executor& executor, Clock& clock,
                                       Rank rank = Rank::None, Priority priority = Priority::Default);
    ~Queue();
    Queue(const Queue&) = delete;
    Queue& operator=(const Queue&) = delete;

    [[nodiscard]] const std::string& label() const;

    void async(Task task);
    void barrierAsync(Task task);

    /// Blocks until `function` has run in its turn, and returns its result.
    template <class F> auto sync(F&& function) { return runNow(std::forward<F>(function), false); }
    template <class F> auto barrierSync(F&& function) { return runNow(std::forward<F>(function), true); }

    /// Appends the task after `delay`, which counts the clock's hostTicks(). The timer keeps the queue alive.
    void after(Duration delay, Task task);

    /// Suspends this serial queue after the current task, which must be the caller, until `event` is signalled or
    /// `timeout` has passed; then runs `continuation` before all later tasks. If the event is signalled already, the
    /// continuation runs right after the current task. The continuation may call suspendUntil again. If one task calls
    /// it several times, the queue resumes after all of them, and the continuations run in the order of the calls.
    void suspendUntil(const Event& event, Duration timeout, Task continuation);

    /// Returns the innermost queue of which this thread runs a task, or null.
    [[nodiscard]] static std::shared_ptr<Queue> current();
    /// Returns true if this thread runs a task of this queue.
    [[nodiscard]] bool isCurrent() const;
    /// Aborts with the label unless this thread runs a task of this queue.
    void assertOnQueue() const;

    /// A reference to a callable, which must outlive it.
    class TaskRef {
    public:
        template <class F>
        explicit TaskRef(F& f) : _object(&f), _call([](void* object) { (*static_cast<F*>(object))(); })
        {}
        void operator()() const { _call(_object); }

    private:
        void* _object;
        void (*_call)(void*);
    };

private:
    struct Core;
    class Jobs;
    explicit Queue(std::unique_ptr<Core> core);
    void runSync(TaskRef task, bool barrier);

    template <class F> auto runNow(F&& function, bool barrier)
    {
        using R = std::invoke_result_t<F&>;
        if constexpr (std::is_void_v<R>) {
            auto call = [&] { function(); };
            runSync(TaskRef(call), barrier);
        } else {
            std::optional<R> result;
            auto call = [&] { result.emplace(function()); };
            runSync(TaskRef(call), barrier);
            return std::move(*result);
        }
    }

    std::unique_ptr<Core> _core;
};

} // namespace platform
