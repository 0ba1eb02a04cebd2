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

/// Work to be done now and then, when nobody uses the device. Constant once made: any thread.
class TavrinDPPeriodicTask {
public:
    using Handler = std::function<void()>;

    /// A task that is due every `period` seconds, five at least. Null without a name or a handler.
    [[nodiscard]] static std::shared_ptr<const TavrinDPPeriodicTask>
    taskWithName(Assembly& assembly, std::string name, std::uint64_t period, Handler handler);

    /// Its activity's identifier too.
    [[nodiscard]] const std::string& name() const { return _name; }
    [[nodiscard]] std::uint64_t periodSeconds() const { return _periodSeconds; }
    [[nodiscard]] const Handler& handler() const { return _handler; }
    /// What the handler runs on.
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
