#pragma once

#include <functional>
#include <memory>

#include "platform/Files.h"

namespace platform {

class RunLoop;

/// Says when the device is so short of memory that whatever can be had again should be given up. Any thread.
class MemoryPressure {
public:
    virtual ~MemoryPressure() = default;

    /// Ends when destroyed: by then `critical` is neither running on another thread nor called again. It may be
    /// destroyed inside its own callback.
    class Watch {
    public:
        virtual ~Watch() = default;
    };
    /// Calls `critical` each time the shortage is noticed, on the run loop's thread. The device is only watched while
    /// someone has such a watch.
    [[nodiscard]] virtual std::unique_ptr<Watch> watch(std::function<void()> critical) = 0;
};

/// A descriptor on which poll(2) shows POLLPRI when for 200 ms of two seconds every task that could have run waited for
/// memory (the kernel's pressure stall information, which lets any user ask for windows of two seconds).
[[nodiscard]] Result<FileHandle> openPressureTrigger(const std::filesystem::path& path = "/proc/pressure/memory");

/// The device's memory pressure. Where the trigger can't be had, which is logged, or ends, no pressure is ever seen.
/// `openTrigger` is called on the run loop, for each time that watching begins.
[[nodiscard]] std::unique_ptr<MemoryPressure> makeMemoryPressure(
    RunLoop& runLoop, std::function<Result<FileHandle>()> openTrigger = [] { return openPressureTrigger(); });

} // namespace platform
