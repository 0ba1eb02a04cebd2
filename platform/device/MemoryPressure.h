#pragma once

#include <functional>
#include <memory>

namespace platform {

/// Reports when the device is so short of memory that caches should be freed. Any thread.
class MemoryPressure {
public:
    virtual ~MemoryPressure() = default;

    /// After its destructor has returned, `critical` neither runs on another thread nor is called again. A watch may be
    /// destroyed inside its own callback, and may outlive the MemoryPressure.
    class Watch {
    public:
        virtual ~Watch() = default;
    };
    /// Calls `critical` on the run loop's thread at every shortage. Observes the device only while a watch exists.
    [[nodiscard]] virtual std::unique_ptr<Watch> watch(std::function<void()> critical) = 0;
};

} // namespace platform
