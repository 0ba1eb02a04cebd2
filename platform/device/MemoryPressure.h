#pragma once

#include <functional>
#include <memory>

namespace platform {

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

} // namespace platform
