#pragma once

#include <filesystem>
#include <memory>

#include "platform/ipc/Ipc.h"

namespace platform {
class Clock;
class RunLoop;
} // namespace platform

namespace platform::ipc {

/// Listens in `directory`; sweeps endpoints left there by earlier processes when made. `label` of a listener names the
/// connections' queues. The run loop, executor and clock must outlive it and what it made. Destroying it, on the loop's
/// thread or once the loop has stopped, ends all connections.
[[nodiscard]] std::unique_ptr<Transport> makeBusTransport(RunLoop& runLoop, Executor& executor, Clock& clock,
                                                          std::filesystem::path directory, Limits limits = {});

} // namespace platform::ipc
