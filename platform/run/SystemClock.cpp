#include "platform/run/SystemClock.h"

#include <cerrno>
#include <ctime>
#include <fstream>
#include <map>
#include <sys/epoll.h>
#include <sys/timerfd.h>
#include <unistd.h>
#include <vector>

#include "platform/base/FileHandle.h"
#include "platform/base/Mutex.h"
#include "platform/run/Clock.h"
#include "platform/run/RunLoop.h"

namespace platform {

namespace {

class SystemClock final : public Clock {
public:
    explicit SystemClock(RunLoop& runLoop)
        : _timerFd(timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK)),
          _watch(runLoop.watch(_timerFd.fd(), EPOLLIN, [this](std::uint32_t) { fireDue(); }))
    {}

    Date wallNow() const override
    {
        timespec now{};
        clock_gettime(CLOCK_REALTIME, &now);
        return dateFromSystemTime(now.tv_sec, now.tv_nsec);
    }

    std::uint64_t hostTicks() const override { return ticksOf(CLOCK_MONOTONIC); }
    std::uint64_t bootTicks() const override { return ticksOf(CLOCK_BOOTTIME); }
    std::string bootId() const override { return _bootId; }

    TimerId after(Duration delay, std::move_only_function<void()> fire) override
    {
        const std::uint64_t due = hostTicks() + static_cast<std::uint64_t>(std::max(delay, Duration::zero()).count());
        MutexLock lock(_mutex);
        const TimerId id = ++_lastId;
        _timers.emplace(Key{due, id}, std::move(fire));
        _dueById.emplace(id, due);
        if (_timers.begin()->first.id == id) arm();
        return id;
    }

    bool cancel(TimerId timer) override
    {
        std::move_only_function<void()> dropped; // destroyed outside the lock
        MutexLock lock(_mutex);
        const auto found = _dueById.find(timer);
        if (found == _dueById.end()) return false;
        const auto entry = _timers.find(Key{found->second, timer});
        const bool first = entry == _timers.begin();
        dropped = std::move(entry->second);
        _timers.erase(entry);
        _dueById.erase(found);
        if (first) arm();
        return true;
    }

private:
    static std::uint64_t ticksOf(clockid_t clock)
    {
        timespec now{};
        clock_gettime(clock, &now);
        return static_cast<std::uint64_t>(now.tv_sec) * 1'000'000'000 + static_cast<std::uint64_t>(now.tv_nsec);
    }
    static std::string readBootId()
    {
        std::string id;
        std::ifstream("/proc/sys/kernel/random/boot_id") >> id;
        return id;
    }

    const std::string _bootId = readBootId();
    struct Key {
        std::uint64_t due;
        TimerId id;
        auto operator<=>(const Key&) const = default;
    };

    /// Sets the descriptor to the first timer, or to none.
    void arm() REQUIRES(_mutex)
    {
        itimerspec when{};
        if (!_timers.empty()) {
            const std::uint64_t due = std::max<std::uint64_t>(_timers.begin()->first.due, 1); // 0 would disarm
            when.it_value.tv_sec = static_cast<time_t>(due / 1'000'000'000);
            when.it_value.tv_nsec = static_cast<long>(due % 1'000'000'000);
        }
        timerfd_settime(_timerFd.fd(), TFD_TIMER_ABSTIME, &when, nullptr);
    }

    void fireDue()
    {
        std::uint64_t expirations = 0;
        if (read(_timerFd.fd(), &expirations, sizeof expirations) < 0 && errno != EAGAIN) return;
        std::vector<std::move_only_function<void()>> due;
        {
            MutexLock lock(_mutex);
            const std::uint64_t now = hostTicks();
            while (!_timers.empty() && _timers.begin()->first.due <= now) {
                due.push_back(std::move(_timers.begin()->second));
                _dueById.erase(_timers.begin()->first.id);
                _timers.erase(_timers.begin());
            }
            arm();
        }
        for (auto& fire : due) fire();
    }

    FileHandle _timerFd;
    Mutex _mutex;
    std::map<Key, std::move_only_function<void()>> _timers GUARDED_BY(_mutex);
    std::map<TimerId, std::uint64_t> _dueById GUARDED_BY(_mutex);
    TimerId _lastId GUARDED_BY(_mutex) = 0;
    std::unique_ptr<RunLoop::Watch> _watch;
};

} // namespace

std::unique_ptr<Clock> makeSystemClock(RunLoop& runLoop)
{
    return std::make_unique<SystemClock>(runLoop);
}

} // namespace platform
