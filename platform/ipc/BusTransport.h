#pragma once

#include <filesystem>
#include <memory>

#include "platform/ipc/Ipc.h"

namespace platform {
class Clock;
class RunLoop;
class WorkerPool;
} // namespace platform

namespace platform::ipc {

/// Returns a D-Bus transport whose sockets are in `directory`. First removes endpoints that dead processes left there.
///
/// The run loop accepts connections; the pool reads, handles and writes. A listener's `label` becomes the label of its
/// connections' queues. The run loop, pool and clock must outlive the transport and its listeners and connections.
/// Destroying the transport ends all connections.
[[nodiscard]] std::unique_ptr<Transport> makeBusTransport(RunLoop& runLoop, WorkerPool& pool, Clock& clock,
                                                          std::filesystem::path directory, Limits limits = {});

} // namespace platform::ipc
