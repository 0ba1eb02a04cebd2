#include "platform/ipc/BusContext.h"

#include <algorithm>
#include <utility>

#include "platform/ipc/BusConnection.h"

namespace platform::ipc {

BusContext::BusContext(RunLoop& loop_, WorkerPool& pool_, Clock& clock_, const Limits& limits_)
    : loop(loop_), pool(pool_), clock(clock_), limits(limits_), backlog(limits.unsentBytes)
{}

BusContext::~BusContext() = default;

BusContext::Admission BusContext::admit(pid_t process)
{
    MutexLock lock(_mutex);
    Process& counted = _processes[process];
    if (counted.connections >= limits.connectionsPerProcess)
        return std::exchange(counted.refused, true) ? Admission::RefusedAgain : Admission::Refused;
    ++counted.connections;
    return Admission::Admitted;
}

void BusContext::release(pid_t process)
{
    MutexLock lock(_mutex);
    const auto counted = _processes.find(process);
    counted->second.refused = false;
    if (--counted->second.connections == 0) _processes.erase(counted);
}

void BusContext::insert(std::shared_ptr<BusConnection> connection)
{
    MutexLock lock(_mutex);
    const BusConnection* key = connection.get();
    _connections.emplace(key, Entry{.connection = std::move(connection)});
}

void BusContext::erase(const BusConnection& connection)
{
    std::shared_ptr<BusConnection> erased; // destroyed after the lock
    MutexLock lock(_mutex);
    if (auto entry = _connections.extract(&connection)) erased = std::move(entry.mapped().connection);
}

std::vector<std::shared_ptr<BusConnection>> BusContext::takeConnections()
{
    MutexLock lock(_mutex);
    std::vector<std::shared_ptr<BusConnection>> taken;
    for (auto& [key, entry] : std::exchange(_connections, {})) taken.push_back(std::move(entry.connection));
    return taken;
}

void BusContext::hold(pid_t process, std::size_t before, std::size_t now)
{
    if (before == now) return;
    std::vector<std::shared_ptr<BusConnection>> waiting;
    {
        MutexLock lock(_mutex);
        _held += now - before;
        _processes[process].bytes += now - before;
        if (now >= before || !std::exchange(_starved, false)) return;
        for (const auto& [key, entry] : _connections) waiting.push_back(entry.connection);
    }
    for (const auto& connection : waiting) connection->driveAgain();
}

bool BusContext::reserve(pid_t process, std::size_t bytes)
{
    MutexLock lock(_mutex);
    Process& counted = _processes[process];
    const bool fits = _held + bytes <= limits.bytes && counted.bytes + bytes <= limits.bytesPerProcess;
    _starved |= !fits;
    if (!fits) return false;
    _held += bytes;
    counted.bytes += bytes;
    return true;
}

bool BusContext::full(pid_t process)
{
    MutexLock lock(_mutex);
    const bool isFull = _held >= limits.bytes || _processes[process].bytes >= limits.bytesPerProcess;
    _starved |= isFull;
    return isFull;
}

void BusContext::setUnread(const BusConnection& connection, std::size_t bytes)
{
    std::vector<std::shared_ptr<BusConnection>> dropped;
    {
        MutexLock lock(_mutex);
        const auto own = _connections.find(&connection);
        if (own == _connections.end() || own->second.dropped) return;
        _unread += bytes - own->second.unread;
        own->second.unread = bytes;
        while (_unread > limits.unreadBytes) {
            Entry& worst = std::ranges::max_element(_connections, {}, [](const auto& entry) {
                               return entry.second.unread;
                           })->second;
            _unread -= std::exchange(worst.unread, 0);
            worst.dropped = true;
            dropped.push_back(worst.connection);
        }
    }
    for (const auto& each : dropped) each->drop();
}

} // namespace platform::ipc
