#include "platform/device/Device.h"

namespace platform {

std::shared_ptr<Queue> Device::serialQueue(std::string label, Rank rank, Priority priority) const
{
    return Queue::make(std::move(label), Queue::Kind::Serial, executor, clock, rank, priority);
}

std::shared_ptr<Queue> Device::concurrentQueue(std::string label, Rank rank, Priority priority) const
{
    return Queue::make(std::move(label), Queue::Kind::Concurrent, executor, clock, rank, priority);
}

std::shared_ptr<Queue> Device::globalQueue(Priority priority) const
{
    return globalQueues[static_cast<std::size_t>(priority)];
}

std::shared_ptr<Queue> Device::mainQueue() const
{
    return main;
}

void Device::makeQueues()
{
    globalQueues = {concurrentQueue("global.background", Rank::Root, Priority::Background),
                    concurrentQueue("global.default", Rank::Root),
                    concurrentQueue("global.high", Rank::Root, Priority::High)};
    main = Queue::make("main", Queue::Kind::Serial, mainExecutor, clock, Rank::Root);
}

} // namespace platform
