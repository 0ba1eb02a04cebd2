#pragma once

#include <functional>
#include <memory>

namespace platform {

/// Reports when the device is so short of memory that everything that can be made again should be freed. Any thread.
class MemoryPressure {
public:
    virtual ~MemoryPressure() = default;

    /// Once its destructor has returned, `critical` is neither running on another thread nor called again. A watch may
    /// be destroyed inside its own callback, and may outlive the MemoryPressure.
    class Watch {
    public:
        virtual ~Watch() = default;
    };
    /// Calls `critical` on the run loop's thread whenever the shortage is noticed. The device is watched only while a
    /// watch exists.
    [[nodiscard]] virtual std::unique_ptr<Watch> watch(std::function<void()> critical) = 0;
};

} // namespace platform
