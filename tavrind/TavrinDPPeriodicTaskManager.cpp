#include "tavrind/TavrinDPPeriodicTaskManager.h"

#include "platform/device/Device.h"
#include "platform/run/Queue.h"
#include "platform/run/Transactions.h"
#include "tavrind/Assembly.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TavrinDPPeriodicTask.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinXPCActivity.h"

namespace tavrin {

using platform::ActivityState;

namespace {

void run(const std::shared_ptr<const TavrinDPPeriodicTask>& task, const std::shared_ptr<platform::Activity>& activity,
         platform::Transactions& transactions)
{
    const bool extended = TavrinXPCActivity::setState(ActivityState::Continue, *activity);
    log(kLogGeneral).log("Running activity {}, extended={:d}", task->name(), extended);
    task->queue()->async([task, activity, &transactions, extended] {
        {
            const auto transaction = transactions.begin(task->name());
            task->handler()();
        }
        if (!extended) return;
        (void)TavrinXPCActivity::setState(ActivityState::Done, *activity);
        log(kLogGeneral).log("Done running activity {}, extended={:d}", task->name(), extended);
    });
}

} // namespace

TavrinDPPeriodicTaskManager::TavrinDPPeriodicTaskManager(Assembly& assembly)
    : _assembly(assembly), _queue(assembly.device.serialQueue("com.quorvane.tavrind.periodicTasks", rank::kStore))
{}

void TavrinDPPeriodicTaskManager::registerTask(std::shared_ptr<const TavrinDPPeriodicTask> task)
{
    _queue->sync([&] { _allTasks[task->name()] = task; });
    log(kLogGeneral).log("Registered CTS task {}", task->name());
    TavrinXPCActivity::registerActivity(_assembly, task->name(), TavrinXPCCriteria::createCriteria(),
                                        [weak = std::weak_ptr(task), &transactions = _assembly.device.transactions](
                                            const std::shared_ptr<platform::Activity>& activity) {
                                            const auto self = weak.lock();
                                            if (!self) return;
                                            const auto state = TavrinXPCActivity::getStateForActivity(*activity);
                                            if (state == ActivityState::CheckIn) {
                                                log(kLogGeneral).log("Checking-in activity {}", self->name());
                                                activity->setCriteria(self->executionCriteria());
                                            } else if (state == ActivityState::Run) {
                                                run(self, activity, transactions);
                                            }
                                        });
}

void TavrinDPPeriodicTaskManager::unregisterTask(const TavrinDPPeriodicTask& task)
{
    const std::string name = task.name(); // the next line may destroy the task
    _queue->sync([&] { _allTasks.erase(name); });
    TavrinXPCActivity::unregister(_assembly, name);
}

TavrinDPPeriodicTaskManager::Tasks TavrinDPPeriodicTaskManager::allTasks() const
{
    return _queue->sync([this] { return _allTasks; });
}

} // namespace tavrin
