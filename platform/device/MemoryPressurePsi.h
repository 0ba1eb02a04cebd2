#pragma once

#include <filesystem>
#include <functional>
#include <memory>

#include "platform/base/FileHandle.h"
#include "platform/device/MemoryPressure.h"
#include "platform/values/Error.h"

namespace platform {

class RunLoop;

/// Opens a trigger of the kernel's pressure stall information (PSI): poll(2) reports POLLPRI on it after all runnable
/// tasks have waited for memory during 200 ms of two seconds, the shortest window that an unprivileged user may
/// request.
[[nodiscard]] Result<FileHandle> openPressureTrigger(const std::filesystem::path& path = "/proc/pressure/memory");

/// Returns a MemoryPressure that uses PSI. Calls `openTrigger` on the run loop's thread when the first watch is
/// created; if that fails, logs the error and reports no pressure. The run loop must outlive it.
[[nodiscard]] std::unique_ptr<MemoryPressure> makeMemoryPressure(
    RunLoop& runLoop, std::function<Result<FileHandle>()> openTrigger = [] { return openPressureTrigger(); });

} // namespace platform
