#pragma once

#include <memory>

#include "platform/run/Executor.h"

namespace platform {

/// Threads that run jobs; made when there is work for them, up to the limit, and kept.
///
/// Default and high-priority jobs share `size` threads, high priority first; background jobs have one thread of
/// lower CPU priority. A thread carries the last word of the queue's label while it runs the queue's tasks.
class WorkerPool final : public Executor {
public:
    /// `size` threads at most; 0 is the number of cores, at least 2.
    explicit WorkerPool(unsigned size = 0);
    /// Lets running jobs end, drops the others and joins the threads.
    ~WorkerPool() override;
    void execute(Priority priority, Job job) override;

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
