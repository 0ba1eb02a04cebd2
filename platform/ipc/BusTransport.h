#pragma once

#include <filesystem>
#include <memory>

#include "platform/ipc/Ipc.h"

namespace platform {
class Clock;
class RunLoop;
} // namespace platform

namespace platform::ipc {

/// Returns a D-Bus transport whose sockets are in `directory`. First removes endpoints that dead processes left there.
///
/// A listener's `label` becomes the label of its connections' queues. The run loop, executor and clock must outlive the
/// transport and its listeners and connections. Destroy it on the loop's thread or after the loop has stopped; that
/// ends all connections.
[[nodiscard]] std::unique_ptr<Transport> makeBusTransport(RunLoop& runLoop, Executor& executor, Clock& clock,
                                                          std::filesystem::path directory, Limits limits = {});

} // namespace platform::ipc
