#pragma once

#include <filesystem>
#include <functional>
#include <memory>

#include "platform/base/FileHandle.h"
#include "platform/device/MemoryPressure.h"
#include "platform/values/Error.h"

namespace platform {

class RunLoop;

/// A descriptor on which poll(2) shows POLLPRI when for 200 ms of two seconds every task that could have run waited for
/// memory (the kernel's pressure stall information, which lets any user ask for windows of two seconds).
[[nodiscard]] Result<FileHandle> openPressureTrigger(const std::filesystem::path& path = "/proc/pressure/memory");

/// The device's memory pressure. Where the trigger can't be had, which is logged, or ends, no pressure is ever seen.
/// `openTrigger` is called on the run loop, for each time that watching begins.
[[nodiscard]] std::unique_ptr<MemoryPressure> makeMemoryPressure(
    RunLoop& runLoop, std::function<Result<FileHandle>()> openTrigger = [] { return openPressureTrigger(); });

} // namespace platform
