#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <type_traits>

#include "platform/base/Date.h"
#include "platform/run/Executor.h"

namespace platform {

class Clock;

/// A happening that several may wait for; see `Queue::suspendUntil`. It fires once, and from then on has happened.
/// Any thread.
class Event {
public:
    Event();
    ~Event();
    Event(const Event&) = delete;
    Event& operator=(const Event&) = delete;

    /// Wakes everyone who waits now and lets everyone who comes later through. Further calls do nothing.
    void signal();
    [[nodiscard]] bool signalled() const;

private:
    friend class Queue;
    struct State;
    std::shared_ptr<State> _state;
};

/// The one way to guard state: tasks of a serial queue run one at a time, in order.
///
/// A serial queue runs its tasks in the order in which they came. A concurrent queue runs shared tasks (`async`,
/// `sync`) side by side and barrier tasks (`barrierAsync`, `barrierSync`) alone, in order with what came before
/// and after; on a serial queue barrier and plain calls are the same.
///
/// `sync` on an idle queue runs inline on the caller. A caller that finds tasks waiting but nobody draining
/// drains up to its own turn and no further, so it never depends on a free worker. `sync` on a queue that the
/// thread is already on can never return: it aborts with the label.
///
/// No task waits: a task that must wait for something calls `suspendUntil`, which holds back the queue's later
/// tasks and no thread. `async` work is drained in batches, so one busy queue cannot hold a worker for ever.
///
/// Queues are shared: pending tasks keep theirs alive. Any thread.
class Queue : public std::enable_shared_from_this<Queue> {
public:
    using Task = std::move_only_function<void()>;
    enum class Kind { Serial, Concurrent };

    /// `executor` and `clock` must outlive the queue.
    static std::shared_ptr<Queue> make(std::string label, Kind kind, Executor& executor, Clock& clock,
                                       Priority priority = Priority::Default);
    ~Queue();
    Queue(const Queue&) = delete;
    Queue& operator=(const Queue&) = delete;

    [[nodiscard]] const std::string& label() const;

    void async(Task task);
    void barrierAsync(Task task);

    /// Runs `function` in turn and answers its result.
    template <class F> auto sync(F&& function) { return runNow(std::forward<F>(function), false); }
    template <class F> auto barrierSync(F&& function) { return runNow(std::forward<F>(function), true); }

    /// Queues the task once `delay` has passed on the clock's hostTicks().
    void after(Duration delay, Task task);

    /// From a task of this (serial) queue: once that task has returned, holds back everything queued behind it
    /// until `event` has happened or `timeout` has passed, then runs `continuation` ahead of what was held back.
    /// The continuation may call suspendUntil again. Where the event has happened already, the continuation is
    /// next in turn. A task that calls it more than once has its continuations run in that order, when all may.
    void suspendUntil(const Event& event, Duration timeout, Task continuation);

    /// The innermost queue whose task this thread runs; null outside any.
    [[nodiscard]] static std::shared_ptr<Queue> current();
    /// True while this thread runs a task of this queue.
    [[nodiscard]] bool isCurrent() const;
    /// Aborts with the label unless this thread runs a task of this queue.
    void assertOnQueue() const;

    /// A non-owning reference to a callable, alive for the call only.
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
