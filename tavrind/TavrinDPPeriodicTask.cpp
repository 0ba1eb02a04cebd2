#include "tavrind/TavrinDPPeriodicTask.h"

#include <algorithm>

#include "platform/device/Device.h"
#include "platform/run/Queue.h"
#include "tavrind/Assembly.h"
#include "tavrind/QueueRanks.h"

namespace tavrin {

namespace {

constexpr std::uint64_t kShortestPeriod = 5;                   // seconds
constexpr std::uint64_t kLongestInterval = 366 * 24 * 60 * 60; // seconds; the scheduler's

platform::ActivityCriteria criteriaFor(std::uint64_t periodSeconds)
{
    return {.repeating = true,
            .interval = std::chrono::seconds(std::min(periodSeconds, kLongestInterval)),
            .maintenance = true,
            .requireScreenSleep = true,
            .requireFirstUnlock = true};
}

} // namespace

std::shared_ptr<const TavrinDPPeriodicTask> TavrinDPPeriodicTask::taskWithName(Assembly& assembly, std::string name,
                                                                               std::uint64_t period, Handler handler)
{
    if (name.empty() || !handler) return nullptr;
    return std::shared_ptr<const TavrinDPPeriodicTask>(
        new TavrinDPPeriodicTask(assembly, std::move(name), period, std::move(handler)));
}

TavrinDPPeriodicTask::TavrinDPPeriodicTask(Assembly& assembly, std::string name, std::uint64_t period, Handler handler)
    : _name(std::move(name)), _periodSeconds(std::max(period, kShortestPeriod)), _handler(std::move(handler)),
      _queue(assembly.device.serialQueue("com.quorvane._DPPeriodicTasks.defaultQueue", rank::kRoot,
                                         platform::Priority::Background)),
      _executionCriteria(criteriaFor(_periodSeconds))
{}

} // namespace tavrin
