#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "platform/device/ActivityScheduler.h"

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;

/// Periodic work that runs while the device is not in use. Immutable: any thread.
class TavrinDPPeriodicTask {
public:
    using Handler = std::function<void()>;

    /// Creates a task that is due every `period` seconds, at least 5. Returns null without a name or a handler.
    [[nodiscard]] static std::shared_ptr<const TavrinDPPeriodicTask>
    taskWithName(Assembly& assembly, std::string name, std::uint64_t period, Handler handler);

    /// Returns the name, which is also the identifier of the activity.
    [[nodiscard]] const std::string& name() const { return _name; }
    [[nodiscard]] std::uint64_t periodSeconds() const { return _periodSeconds; }
    [[nodiscard]] const Handler& handler() const { return _handler; }
    /// Returns the queue on which the handler runs.
    [[nodiscard]] const std::shared_ptr<platform::Queue>& queue() const { return _queue; }
    [[nodiscard]] const platform::ActivityCriteria& executionCriteria() const { return _executionCriteria; }

private:
    TavrinDPPeriodicTask(Assembly& assembly, std::string name, std::uint64_t period, Handler handler);

    const std::string _name;
    const std::uint64_t _periodSeconds;
    const Handler _handler;
    const std::shared_ptr<platform::Queue> _queue;
    const platform::ActivityCriteria _executionCriteria;
};

} // namespace tavrin
