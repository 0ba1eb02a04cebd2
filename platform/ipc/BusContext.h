#pragma once

#include <cstddef>
#include <map>
#include <memory>
#include <sys/types.h>
#include <vector>

#include "platform/base/Mutex.h"
#include "platform/ipc/Ipc.h"
#include "platform/ipc/ReplyBacklog.h"

namespace platform {
class Clock;
class RunLoop;
class WorkerPool;
} // namespace platform

namespace platform::ipc {

class BusConnection;

/// What the connections of one transport share: what they run on, and the counts of what peers make them hold
/// (`Limits`). Any thread.
class BusContext {
public:
    BusContext(RunLoop& loop, WorkerPool& pool, Clock& clock, const Limits& limits);
    ~BusContext();

    RunLoop& loop;
    WorkerPool& pool;
    Clock& clock;
    const Limits limits;
    ReplyBacklog backlog;

    enum class Admission { Admitted, Refused, RefusedAgain };
    /// Counts a connection of `process`, unless that has as many as it may have. RefusedAgain: no connection of the
    /// process was released since it was refused before.
    [[nodiscard]] Admission admit(pid_t process);
    /// Takes back an `admit`.
    void release(pid_t process);

    /// Owns an open connection, until `erase` or `takeConnections`.
    void insert(std::shared_ptr<BusConnection> connection);
    void erase(const BusConnection& connection);
    [[nodiscard]] std::vector<std::shared_ptr<BusConnection>> takeConnections();

    /// Counts a change: a part of the bytes of `process` was `before` bytes and is `now` bytes.
    void hold(pid_t process, std::size_t before, std::size_t now);
    /// Counts `bytes` of `process` and returns true if they fit; otherwise counts nothing. After false, all connections
    /// are driven again once bytes are freed.
    [[nodiscard]] bool reserve(pid_t process, std::size_t bytes);
    /// Returns true if `process`, or all together, reached a limit: its further calls must wait. After true, all
    /// connections are driven again once bytes are freed.
    [[nodiscard]] bool full(pid_t process);

    /// Sets the number of bytes that the connection's peer has not read. While all together have too many, drops the
    /// connection with the most.
    void setUnread(const BusConnection& connection, std::size_t bytes);

private:
    struct Process {
        unsigned connections = 0;
        std::size_t bytes = 0;
        bool refused = false; ///< a connection was refused since the last one closed
    };
    struct Entry {
        std::shared_ptr<BusConnection> connection;
        std::size_t unread = 0;
        bool dropped = false; ///< its unread bytes don't count any more
    };

    Mutex _mutex;
    std::map<const BusConnection*, Entry> _connections GUARDED_BY(_mutex);
    std::map<pid_t, Process> _processes GUARDED_BY(_mutex); ///< those with connections
    std::size_t _held GUARDED_BY(_mutex) = 0;               ///< bytes of all processes
    std::size_t _unread GUARDED_BY(_mutex) = 0;             ///< the part of `_held` that peers have not read
    bool _starved GUARDED_BY(_mutex) = false;               ///< a connection waits for bytes to be freed
};

} // namespace platform::ipc
