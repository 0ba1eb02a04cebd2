#pragma once

#include <chrono>
#include <condition_variable>
#include <deque>
#include <mutex>

#include "platform/run/Queue.h"

namespace platform::test {

/// An executor without threads: jobs wait until a test drains them, in order, on its own thread.
class ManualExecutor final : public Executor {
public:
    void execute(Priority, Job job) override
    {
        {
            std::lock_guard lock(_mutex);
            _jobs.push_back(std::move(job));
        }
        _added.notify_all();
    }

    /// Runs jobs until there are none, those that they add included.
    void drain()
    {
        while (Job job = take()) job();
    }
    /// Runs jobs, those that come from other threads meanwhile included, until `done()`. False after 30 s.
    template <class Done> [[nodiscard]] bool drainUntil(Done done)
    {
        const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(30);
        while (true) {
            drain();
            if (done()) return true;
            std::unique_lock lock(_mutex);
            if (!_added.wait_until(lock, end, [this] { return !_jobs.empty(); })) return false;
        }
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
    std::condition_variable _added;
    std::deque<Job> _jobs;
};

} // namespace platform::test
