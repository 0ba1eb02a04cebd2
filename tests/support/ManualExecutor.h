#pragma once

#include <deque>
#include <mutex>

#include "platform/run/Queue.h"

namespace platform::test {

/// An executor without threads: jobs wait until a test drains them, in order, on its own thread.
class ManualExecutor final : public Executor {
public:
    void execute(Priority, Job job) override
    {
        std::lock_guard lock(_mutex);
        _jobs.push_back(std::move(job));
    }

    /// Runs jobs until there are none, those that they add included.
    void drain()
    {
        while (Job job = take()) job();
    }

private:
    Job take()
    {
        std::lock_guard lock(_mutex);
        if (_jobs.empty()) return {};
        Job job = std::move(_jobs.front());
        _jobs.pop_front();
        return job;
    }

    std::mutex _mutex;
    std::deque<Job> _jobs;
};

} // namespace platform::test
