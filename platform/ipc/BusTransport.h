#pragma once

#include <filesystem>
#include <memory>

#include "platform/ipc/Ipc.h"

namespace platform {
class Clock;
class RunLoop;
} // namespace platform

namespace platform::ipc {

/// A transport on D-Bus that listens in `directory`, and first removes the endpoints that earlier processes left there.
/// The `label` of a listener names its connections' queues. The run loop, executor and clock must outlive the transport
/// and what it makes. Destroying it, on the loop's thread or after the loop has stopped, ends all connections.
[[nodiscard]] std::unique_ptr<Transport> makeBusTransport(RunLoop& runLoop, Executor& executor, Clock& clock,
                                                          std::filesystem::path directory, Limits limits = {});

} // namespace platform::ipc
