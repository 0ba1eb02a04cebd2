#pragma once

#include <functional>

namespace platform {

/// Importance of the work on a queue. Background work runs on threads of lower CPU priority.
enum class Priority { Background, Default, High };

/// Runs jobs, some time soon, in no promised order: the worker pool, a run loop, or a test that drains by hand.
class Executor {
public:
    using Job = std::move_only_function<void()>;
    virtual ~Executor() = default;
    virtual void execute(Priority priority, Job job) = 0;
};

} // namespace platform
