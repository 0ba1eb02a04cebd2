#pragma once

#include <cstddef>
#include <deque>
#include <memory>

#include "platform/base/Mutex.h"
#include "platform/ipc/Ipc.h"
#include "platform/run/Queue.h"

namespace platform::ipc {

/// Counts the replies that handlers gave and that are not encoded yet, and delays further handlers beyond a limit:
/// handlers can make large replies faster than they are encoded. Any thread.
class ReplyBacklog {
public:
    /// Handlers wait while the backlog has at least `limit` bytes.
    explicit ReplyBacklog(std::size_t limit) : _limit(limit) {}

    /// Runs `task` at once, or suspends the current queue until there is room. Call it from a task of a serial queue.
    /// The backlog must outlive the task.
    template <class Task> void runWithRoom(Task task)
    {
        auto room = awaitedRoom();
        if (!room) return task();
        runLater(*room, std::move(task));
    }
    void add(std::size_t bytes);
    void remove(std::size_t bytes);

private:
    /// Returns null if there is room.
    [[nodiscard]] std::shared_ptr<Event> awaitedRoom();
    void runLater(const Event& room, Queue::Task task);
    void wakeNext();

    const std::size_t _limit;
    Mutex _mutex;
    std::size_t _bytes GUARDED_BY(_mutex) = 0;
    std::deque<std::shared_ptr<Event>> _waiting GUARDED_BY(_mutex); // one for each waiting task, in order
};

/// Returns the estimated memory of a message in bytes. A file handle counts as 16 KiB: descriptors are scarcer than
/// memory.
[[nodiscard]] std::size_t memoryOf(const Message& message);

} // namespace platform::ipc
