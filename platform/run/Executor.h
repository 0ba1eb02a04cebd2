#pragma once

#include <functional>

namespace platform {

/// Importance of work. Background work runs on a thread of lower CPU priority; high-priority work overtakes other work
/// and should be short.
enum class Priority { Background, Default, High };

/// Runs jobs asynchronously, in unspecified order: a worker pool, a run loop, or a test that runs them by hand.
class Executor {
public:
    using Job = std::move_only_function<void()>;
    virtual ~Executor() = default;
    /// Posts the job and returns; the job may start before or after the return. Any thread.
    virtual void execute(Priority priority, Job job) = 0;
};

} // namespace platform
