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

/// Owns the periodic tasks and registers them with the device's scheduler. Any thread.
class TavrinDPPeriodicTaskManager {
public:
    using Tasks = std::map<std::string, std::shared_ptr<const TavrinDPPeriodicTask>>;

    explicit TavrinDPPeriodicTaskManager(Assembly& assembly);

    /// Registers the task, in place of one with the same name. A run of a removed or replaced task continues to its
    /// end.
    void registerTask(std::shared_ptr<const TavrinDPPeriodicTask> task);
    /// Removes the task of this name, if any.
    void unregisterTask(const TavrinDPPeriodicTask& task);
    /// Returns the tasks by name.
    [[nodiscard]] Tasks allTasks() const;

private:
    Assembly& _assembly;
    const std::shared_ptr<platform::Queue> _queue; // guards the tasks
    Tasks _allTasks;
};

} // namespace tavrin
