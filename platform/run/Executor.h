#pragma once

#include <functional>

namespace platform {

/// Importance of work. Background work runs on a thread of lower CPU priority.
enum class Priority { Background, Default, High };

/// Runs jobs soon, in no promised order: a worker pool, a run loop, or a test that drains by hand.
class Executor {
public:
    using Job = std::move_only_function<void()>;
    virtual ~Executor() = default;
    /// Hands the job over and returns; the job may run before or after that. Any thread.
    virtual void execute(Priority priority, Job job) = 0;
};

} // namespace platform
