#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "platform/run/Executor.h"

namespace platform {

class Queue;

/// Threads that run jobs and, while they have none, wait for descriptors.
///
/// Default and high-priority jobs share `size` threads; high-priority jobs overtake waiting ones. Background jobs have
/// one thread of lower CPU priority. A thread is started when work finds none that waits, up to the limit; threads are
/// kept, and named "worker-1" … and "background".
///
/// Work stays on its thread. The last job that a running job hands over is not given to another thread: this one runs
/// it next, after a high-priority job that was handed over. Other threads are woken only if more jobs wait, or if the
/// running job goes on (`shareKeptJobs`). Jobs for threads of another priority are given to these at once.
class WorkerPool final : public Executor {
public:
    /// 0 selects the number of cores, but at least 2.
    explicit WorkerPool(unsigned size = 0);
    /// Waits for running jobs, destroys the others without running them, and joins the threads.
    ~WorkerPool() override;
    void execute(Priority priority, Job job) override;

    /// Gives the jobs that this thread keeps for itself to the others. Call it before the thread waits for another
    /// thread or for a disk. Does nothing on a thread that is no worker.
    static void shareKeptJobs();

    /// A watched descriptor. The owner of the descriptor closes it after this object.
    ///
    /// Confined to its queue. Destroyed there, it calls its handler no more; destroyed elsewhere, a running call may
    /// still end.
    class Source {
    public:
        virtual ~Source() = default;
        /// Sets the events (EPOLLIN, EPOLLOUT …) to wait for; 0 pauses the source. With EPOLLET, only changes are
        /// reported: the handler must read or write all that it can.
        virtual void setEvents(std::uint32_t events) = 0;
    };
    /// Returns a paused source, which calls `ready` with the events of `fd`, as a task of `queue`. The thread that the
    /// descriptor wakes runs the task if the queue is idle; otherwise whoever drains the queue does. The pool must
    /// outlive the source.
    [[nodiscard]] std::unique_ptr<Source> watch(int fd, std::shared_ptr<Queue> queue,
                                                std::function<void(std::uint32_t)> ready);

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
