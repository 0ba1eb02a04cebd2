#include "platform/run/WorkerPool.h"

#include <deque>
#include <pthread.h>
#include <semaphore.h>
#include <string>
#include <sys/resource.h>
#include <thread>
#include <vector>

#include "platform/base/Mutex.h"
#include "platform/base/ThreadName.h"
#include "platform/run/Queue.h"

namespace platform {

namespace {

/// A counting semaphore. Unlike a condition variable it needs no second system call to wake a thread, and unlike the
/// standard library's semaphore it never spins.
class Tokens {
public:
    Tokens() { sem_init(&_semaphore, 0, 0); }
    ~Tokens() { sem_destroy(&_semaphore); }
    Tokens(const Tokens&) = delete;
    Tokens& operator=(const Tokens&) = delete;
    void give() { sem_post(&_semaphore); }
    void take()
    {
        while (sem_wait(&_semaphore) != 0) {} // interrupted by a signal
    }

private:
    sem_t _semaphore;
};

/// Threads that share one queue of jobs.
class Crew {
public:
    Crew(unsigned limit, int nice) : _limit(limit), _nice(nice) {}

    ~Crew()
    {
        std::deque<Executor::Job> dropped;
        {
            MutexLock lock(_mutex);
            _stopping = true;
            dropped.swap(_jobs);
        }
        for (std::size_t i = 0; i < _threads.size(); ++i) _tokens.give();
        for (std::thread& thread : _threads) thread.join();
    }

    void add(Executor::Job job, bool urgent)
    {
        {
            MutexLock lock(_mutex);
            if (_stopping) return;
            if (urgent)
                _jobs.push_front(std::move(job));
            else
                _jobs.push_back(std::move(job));
            if (_jobs.size() > _idle && _threads.size() < _limit) {
                ++_idle;
                _threads.emplace_back([this] { work(); });
            }
        }
        _tokens.give(); // outside the mutex, which the woken worker needs
    }

private:
    void work()
    {
        if (_nice > 0) setpriority(PRIO_PROCESS, 0, _nice); // 0: this thread
        while (true) {
            _tokens.take();
            Executor::Job job;
            {
                MutexLock lock(_mutex);
                if (_stopping) return;
                --_idle;
                job = std::move(_jobs.front());
                _jobs.pop_front();
            }
            job();
            job = {};
            MutexLock lock(_mutex);
            ++_idle;
        }
    }

    const unsigned _limit;
    const int _nice;
    Tokens _tokens; // one per job
    Mutex _mutex;
    std::deque<Executor::Job> _jobs GUARDED_BY(_mutex);
    std::size_t _idle GUARDED_BY(_mutex) = 0; ///< threads without a job
    bool _stopping GUARDED_BY(_mutex) = false;
    std::vector<std::thread> _threads; // grows under the mutex
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
{}

WorkerPool::~WorkerPool() = default;

void WorkerPool::execute(Priority priority, Job job)
{
    if (priority == Priority::Background)
        _impl->background.add(std::move(job), false);
    else
        _impl->normal.add(std::move(job), priority == Priority::High);
}

} // namespace platform
