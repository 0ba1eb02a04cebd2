#pragma once

#include <cstdint>
#include <string>

namespace platform {

/// A queue's place in the order of queues: a task calls `sync` only on queues of a higher rank.
///
/// Nobody calls `sync` on a root: what enters the process, and whatever suspends. A program numbers its other queues
/// from 1 up. A queue without a rank is held to the order in which queues were nested before.
enum class Rank : std::uint8_t { Root = 0, None = 255 };

/// Finds deadlocks of queues before they happen, in tests and behind a flag of the program.
///
/// Once enforced, each of these aborts with a message that shows how every thread involved came there: a `sync` up or
/// along the ranks, on a root, under a Mutex, or on a thread that may not wait; a `sync` after which labels could wait
/// for each other in a circle; a `suspendUntil` inside a `sync`, or on a queue that is no root. Any thread.
class QueueOrder {
public:
    /// Checks all queues that are created after this call.
    static void enforce();

    /// While this lives, its thread may not wait for a queue.
    class ForbidSync {
    public:
        ForbidSync();
        ~ForbidSync();
        ForbidSync(const ForbidSync&) = delete;
        ForbidSync& operator=(const ForbidSync&) = delete;

    private:
        const bool _outer;
    };

    /// What the order knows of a queue.
    struct Place {
        /// Learns the label, if the order is enforced.
        Place(std::string label, Rank rank);
        [[nodiscard]] bool isChecked() const { return index >= 0; }

        const std::string label;
        const Rank rank;
        const int index; ///< of the label; negative: not checked
    };
    /// Returns the labels of the queues whose tasks the thread is in, the outermost first.
    using Way = std::string (*)();

    /// Called before a task of `from` (null: no task) waits for its turn on `to`.
    static void checkSync(const Place* from, const Place& to, Way way);
    /// Called before a task of `place` suspends the queue; `isNested` if the thread is in a task of another queue, too.
    static void checkSuspension(const Place& place, bool isNested, Way way);
};

} // namespace platform
