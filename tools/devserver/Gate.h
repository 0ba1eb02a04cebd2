#pragma once

#include <chrono>
#include <memory>
#include <mutex>
#include <optional>

#include "platform/files/Files.h"

namespace devserver {

/// Holds requests back: for a time, or until they are let go. Any thread.
class Gate {
public:
    Gate();

    enum class Outcome { TimeOver, Released, PeerGone };

    /// Waits until the time is over (none: for as long as it takes), `release` or `close` is called, or the peer of
    /// `connection` (-1: not watched) has closed its end. Returns at once when the gate is closed.
    Outcome wait(std::optional<std::chrono::milliseconds> time, int connection);

    /// Lets everyone go who waits now.
    void release();
    /// Lets everyone go, and holds nobody from now on.
    void close();

private:
    std::mutex _mutex;
    std::shared_ptr<platform::FileHandle> _event; // an eventfd, signalled once for those who wait on it
    bool _closed = false;
};

} // namespace devserver
