#pragma once

#include <chrono>
#include <memory>
#include <optional>

#include "platform/base/Mutex.h"
#include "platform/files/Files.h"

namespace devserver {

/// Delays requests for a time, or until they are released. Any thread.
class Gate {
public:
    Gate();

    enum class Outcome { TimeOver, Released, PeerGone };

    /// Blocks until `time` has passed (nullopt: no limit), `release` or `close` is called, or the peer of `connection`,
    /// a socket, has closed its end (-1: not watched). Returns at once if the gate is closed.
    Outcome wait(std::optional<std::chrono::milliseconds> time, int connection);

    /// Wakes all current waiters.
    void release();
    /// Wakes all waiters. From then on, `wait` returns at once.
    void close();

private:
    platform::Mutex _mutex;
    /// An eventfd, signalled once; later waiters get a new one.
    std::shared_ptr<platform::FileHandle> _event GUARDED_BY(_mutex);
    bool _closed GUARDED_BY(_mutex) = false;
};

} // namespace devserver
