#pragma once

#include <map>
#include <memory>
#include <string>

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;
class TavrinDPPeriodicTask;

/// Keeps the periodic tasks and has the device run them. Any thread.
class TavrinDPPeriodicTaskManager {
public:
    using Tasks = std::map<std::string, std::shared_ptr<const TavrinDPPeriodicTask>>;

    explicit TavrinDPPeriodicTaskManager(Assembly& assembly);

    /// Has the task run from now on, in place of one of that name. A run under way when its task goes ends on its own.
    void registerTask(std::shared_ptr<const TavrinDPPeriodicTask> task);
    void unregisterTask(const TavrinDPPeriodicTask& task);
    /// By name.
    [[nodiscard]] Tasks allTasks() const;

private:
    Assembly& _assembly;
    const std::shared_ptr<platform::Queue> _queue; // guards the tasks
    Tasks _allTasks;
};

} // namespace tavrin
