#pragma once

#include <memory>

#include "platform/run/Executor.h"

namespace platform {

/// Threads that run jobs. A job that finds no idle thread starts one, up to the limit; threads are kept.
///
/// Default and high-priority jobs share `size` threads; high-priority jobs overtake waiting ones. Background jobs share
/// one thread of lower CPU priority.
class WorkerPool final : public Executor {
public:
    /// 0 selects the number of cores, but at least 2.
    explicit WorkerPool(unsigned size = 0);
    /// Waits for running jobs, destroys the others without running them, and joins the threads.
    ~WorkerPool() override;
    void execute(Priority priority, Job job) override;

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
