#pragma once

#include <filesystem>
#include <functional>
#include <memory>

#include "platform/base/FileHandle.h"
#include "platform/device/MemoryPressure.h"
#include "platform/values/Error.h"

namespace platform {

class RunLoop;

/// Opens a trigger of the kernel's pressure stall information: poll(2) reports POLLPRI on it if all runnable tasks
/// waited for memory during 200 ms of two seconds, the shortest window that any user may ask for.
[[nodiscard]] Result<FileHandle> openPressureTrigger(const std::filesystem::path& path = "/proc/pressure/memory");

/// Makes the device's memory pressure. Without a trigger, which is logged, no pressure is ever reported. `openTrigger`
/// is called on the run loop's thread whenever watching begins. The run loop must outlive it.
[[nodiscard]] std::unique_ptr<MemoryPressure> makeMemoryPressure(
    RunLoop& runLoop, std::function<Result<FileHandle>()> openTrigger = [] { return openPressureTrigger(); });

} // namespace platform
