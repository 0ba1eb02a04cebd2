#include <condition_variable>
#include <deque>
#include <mutex>
#include <pthread.h>
#include <string>
#include <sys/resource.h>
#include <thread>
#include <vector>

#include "platform/Queue.h"
#include "platform/ThreadName.h"

namespace platform {

void setThreadNameForLabel(std::string_view label)
{
    static thread_local std::string name;
    label.remove_prefix(label.find_last_of('.') + 1);
    label = label.substr(0, 15);
    if (name == label) return;
    name = label;
    pthread_setname_np(pthread_self(), name.c_str());
}

namespace {

/// Threads that share one line of jobs.
class Crew {
public:
    Crew(unsigned limit, int nice) : _limit(limit), _nice(nice) {}

    ~Crew()
    {
        std::deque<Executor::Job> dropped;
        {
            std::lock_guard lock(_mutex);
            _stopping = true;
            dropped.swap(_jobs);
        }
        _wake.notify_all();
        for (std::thread& thread : _threads) thread.join();
    }

    void add(Executor::Job job, bool urgent)
    {
        bool someoneIdles = false;
        {
            std::lock_guard lock(_mutex);
            if (_stopping) return;
            if (urgent) _jobs.push_front(std::move(job));
            else _jobs.push_back(std::move(job));
            someoneIdles = _idle > 0;
            if (!someoneIdles && _threads.size() < _limit) _threads.emplace_back([this] { work(); });
        }
        // Without the mutex, which the worker that wakes needs.
        if (someoneIdles) _wake.notify_one();
    }

private:
    void work()
    {
        if (_nice > 0) setpriority(PRIO_PROCESS, 0, _nice); // 0: this thread
        std::unique_lock lock(_mutex);
        while (true) {
            ++_idle;
            _wake.wait(lock, [this] { return _stopping || !_jobs.empty(); });
            --_idle;
            if (_stopping) return;
            {
                Executor::Job job = std::move(_jobs.front());
                _jobs.pop_front();
                lock.unlock();
                job();
            }
            lock.lock();
        }
    }

    const unsigned _limit;
    const int _nice;
    std::mutex _mutex;
    std::condition_variable _wake;
    std::deque<Executor::Job> _jobs;
    unsigned _idle = 0;
    bool _stopping = false;
    std::vector<std::thread> _threads;
};

constexpr int kBackgroundNice = 10;

} // namespace

struct WorkerPool::Impl {
    explicit Impl(unsigned size) : normal(size, 0), background(1, kBackgroundNice) {}
    Crew normal;
    Crew background;
};

WorkerPool::WorkerPool(unsigned size)
    : _impl(std::make_unique<Impl>(size > 0 ? size : std::max(2u, std::thread::hardware_concurrency())))
{
}

WorkerPool::~WorkerPool() = default;

void WorkerPool::execute(Priority priority, Job job)
{
    if (priority == Priority::Background) _impl->background.add(std::move(job), false);
    else _impl->normal.add(std::move(job), priority == Priority::High);
}

} // namespace platform
