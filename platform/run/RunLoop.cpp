#include "platform/run/RunLoop.h"

#include <csignal>
#include <cstdlib>
#include <pthread.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <unistd.h>
#include <vector>

#include <systemd/sd-event.h>

#include "platform/base/FileHandle.h"
#include "platform/base/Mutex.h"
#include "platform/run/QueueOrder.h"

namespace platform {

namespace {

class EventWatch final : public RunLoop::Watch {
public:
    EventWatch(sd_event* event, int fd, std::uint32_t events, std::function<void(std::uint32_t)> ready)
        : _ready(std::move(ready))
    {
        const auto callback = [](sd_event_source*, int, std::uint32_t seen, void* self) {
            static_cast<EventWatch*>(self)->_ready(seen);
            return 0;
        };
        sd_event_add_io(event, &_source, fd, events, callback, this);
    }
    ~EventWatch() override { sd_event_source_disable_unref(_source); }
    void setEvents(std::uint32_t events) override
    {
        sd_event_source_set_io_events(_source, events);
        sd_event_source_set_enabled(_source, events ? SD_EVENT_ON : SD_EVENT_OFF);
    }

private:
    std::function<void(std::uint32_t)> _ready;
    sd_event_source* _source = nullptr;
};

} // namespace

struct RunLoop::Impl {
    sd_event* event = nullptr;
    FileHandle wakeFd;
    std::unique_ptr<Watch> wakeWatch;
    Mutex mutex;
    std::vector<Job> jobs GUARDED_BY(mutex);
    struct Signal {
        std::move_only_function<void()> handler;
        sd_event_source* source = nullptr;
    };
    std::vector<std::unique_ptr<Signal>> signals;

    void runJobs()
    {
        std::vector<Job> ready;
        {
            MutexLock lock(mutex);
            ready.swap(jobs);
        }
        for (Job& job : ready) job();
    }
};

RunLoop::RunLoop() : _impl(std::make_unique<Impl>())
{
    if (sd_event_new(&_impl->event) < 0) std::abort(); // no epoll: nothing can run
    _impl->wakeFd = FileHandle(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    // Edge-triggered: every write wakes the loop, and the counter needs no reading.
    _impl->wakeWatch = watch(_impl->wakeFd.fd(), EPOLLIN | EPOLLET, [this](std::uint32_t) { _impl->runJobs(); });
}

RunLoop::~RunLoop()
{
    for (const auto& signal : _impl->signals) sd_event_source_disable_unref(signal->source);
    _impl->wakeWatch.reset();
    _impl->jobs.clear();
    sd_event_unref(_impl->event);
}

void RunLoop::run()
{
    const QueueOrder::ForbidSync thread;
    sd_event_loop(_impl->event);
}

void RunLoop::runOnce(Duration timeout)
{
    const QueueOrder::ForbidSync thread;
    const auto microseconds = std::chrono::duration_cast<std::chrono::microseconds>(timeout).count();
    sd_event_run(_impl->event, static_cast<std::uint64_t>(microseconds));
}

void RunLoop::stop()
{
    execute(Priority::Default, [this] { sd_event_exit(_impl->event, 0); });
}

void RunLoop::execute(Priority, Job job)
{
    bool first = false;
    {
        MutexLock lock(_impl->mutex);
        first = _impl->jobs.empty();
        _impl->jobs.push_back(std::move(job));
    }
    const std::uint64_t one = 1;
    if (first && write(_impl->wakeFd.fd(), &one, sizeof one) < 0) std::abort(); // only a counter at its limit fails
}

void RunLoop::onSignal(int signal, std::move_only_function<void()> handler)
{
    auto entry = std::make_unique<Impl::Signal>();
    entry->handler = std::move(handler);
    const auto callback = [](sd_event_source*, const signalfd_siginfo*, void* self) {
        static_cast<Impl::Signal*>(self)->handler();
        return 0;
    };
    sd_event_add_signal(_impl->event, &entry->source, signal, callback, entry.get());
    _impl->signals.push_back(std::move(entry));
}

std::unique_ptr<RunLoop::Watch> RunLoop::watch(int fd, std::uint32_t events, std::function<void(std::uint32_t)> ready)
{
    return std::make_unique<EventWatch>(_impl->event, fd, events, std::move(ready));
}

sd_event* RunLoop::handle() const
{
    return _impl->event;
}

void RunLoop::blockSignals()
{
    sigset_t set;
    sigemptyset(&set);
    sigaddset(&set, SIGINT);
    sigaddset(&set, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &set, nullptr);
    std::signal(SIGPIPE, SIG_IGN);
}

} // namespace platform
