#include "platform/device/MemoryPressurePsi.h"

#include <atomic>
#include <cerrno>
#include <fcntl.h>
#include <string_view>
#include <sys/epoll.h>
#include <unistd.h>

#include "platform/base/Log.h"
#include "platform/device/MemoryPressure.h"
#include "platform/run/NotificationCenter.h"
#include "platform/run/RunLoop.h"

namespace platform {

namespace {

constexpr std::string_view kCritical = "critical";

class PressureTrigger final : public MemoryPressure, public std::enable_shared_from_this<PressureTrigger> {
public:
    PressureTrigger(RunLoop& runLoop, std::function<Result<FileHandle>()> open)
        : _runLoop(runLoop), _open(std::move(open))
    {}

    std::unique_ptr<Watch> watch(std::function<void()> critical) override
    {
        return std::make_unique<Registration>(shared_from_this(), std::move(critical));
    }

private:
    struct Registration final : Watch {
        Registration(std::shared_ptr<PressureTrigger> owner_, std::function<void()> critical)
            : owner(std::move(owner_)),
              token(owner->_watchers.observe(kCritical, [critical = std::move(critical)](auto&) { critical(); }))
        {
            if (++owner->_watcherCount == 1) owner->follow();
        }
        ~Registration() override
        {
            if (--owner->_watcherCount == 0) owner->follow();
        }
        std::shared_ptr<PressureTrigger> owner;
        NotificationCenter::Token token;
    };

    /// Posts to the loop: arms the trigger if there are watchers, disarms it otherwise.
    void follow()
    {
        _runLoop.execute(Priority::Default, [weak = weak_from_this()] {
            auto self = weak.lock();
            if (!self) return;
            if (self->_watcherCount == 0)
                self->disarm();
            else if (!self->_watch)
                self->arm();
        });
    }

    void arm()
    {
        auto trigger = _open();
        if (!trigger) return defaultLog().info("memory pressure can't be observed: {}", trigger.error().description());
        _trigger = std::move(*trigger);
        _watch = _runLoop.watch(_trigger.fd(), EPOLLPRI, [this](std::uint32_t events) {
            const auto self = shared_from_this(); // a callback may destroy the last watcher
            if (events & (EPOLLERR | EPOLLHUP)) return disarm();
            _watchers.post({.name = std::string(kCritical)});
        });
    }

    void disarm()
    {
        _watch.reset();
        _trigger = {};
    }

    RunLoop& _runLoop;
    const std::function<Result<FileHandle>()> _open;
    NotificationCenter _watchers;
    std::atomic<int> _watcherCount = 0;
    FileHandle _trigger; // run loop, like the next
    std::unique_ptr<RunLoop::Watch> _watch;
};

/// The owner's end; watches may outlive it.
class SystemMemoryPressure final : public MemoryPressure {
public:
    explicit SystemMemoryPressure(std::shared_ptr<PressureTrigger> trigger) : _trigger(std::move(trigger)) {}
    std::unique_ptr<Watch> watch(std::function<void()> critical) override
    {
        return _trigger->watch(std::move(critical));
    }

private:
    std::shared_ptr<PressureTrigger> _trigger;
};

} // namespace

Result<FileHandle> openPressureTrigger(const std::filesystem::path& path)
{
    constexpr std::string_view kWanted{"full 200000 2000000\0", 20}; // µs of stall, µs of the window
    FileHandle file(open(path.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC));
    if (!file || write(file.fd(), kWanted.data(), kWanted.size()) < 0)
        return std::unexpected(Error::posix(errno, path.string()));
    return file;
}

std::unique_ptr<MemoryPressure> makeMemoryPressure(RunLoop& runLoop, std::function<Result<FileHandle>()> openTrigger)
{
    return std::make_unique<SystemMemoryPressure>(std::make_shared<PressureTrigger>(runLoop, std::move(openTrigger)));
}

} // namespace platform
