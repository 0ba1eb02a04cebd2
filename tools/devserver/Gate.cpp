#include "tools/devserver/Gate.h"

#include <algorithm>
#include <cerrno>
#include <poll.h>
#include <sys/eventfd.h>
#include <system_error>

namespace devserver {
namespace {

using Clock = std::chrono::steady_clock;

std::shared_ptr<platform::FileHandle> newEvent()
{
    const int fd = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
    if (fd < 0) throw std::system_error(errno, std::generic_category(), "eventfd");
    return std::make_shared<platform::FileHandle>(fd);
}

int millisecondsUntil(const std::optional<Clock::time_point>& end)
{
    if (!end) return -1;
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*end - Clock::now()).count();
    return static_cast<int>(std::clamp<std::int64_t>(left, 0, 3'600'000));
}

} // namespace

Gate::Gate() : _event(newEvent()) {}

Gate::Outcome Gate::wait(std::optional<std::chrono::milliseconds> time, int connection)
{
    std::shared_ptr<platform::FileHandle> event;
    {
        const platform::MutexLock lock(_mutex);
        if (_closed) return Outcome::Released;
        event = _event;
    }
    const auto end = time ? std::optional(Clock::now() + *time) : std::nullopt;
    for (;;) {
        pollfd watched[] = {{event->fd(), POLLIN, 0}, {connection, POLLRDHUP, 0}};
        const int ready = poll(watched, 2, millisecondsUntil(end));
        if (ready < 0 && errno != EINTR) throw std::system_error(errno, std::generic_category(), "poll");
        if (ready > 0) return watched[0].revents ? Outcome::Released : Outcome::PeerGone;
        if (end && Clock::now() >= *end) return Outcome::TimeOver;
    }
}

void Gate::release()
{
    const platform::MutexLock lock(_mutex);
    if (!_closed) eventfd_write(std::exchange(_event, newEvent())->fd(), 1);
}

void Gate::close()
{
    const platform::MutexLock lock(_mutex);
    _closed = true;
    eventfd_write(_event->fd(), 1);
}

} // namespace devserver
