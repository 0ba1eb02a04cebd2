#pragma once

#include <memory>
#include <string>

#include "platform/base/Log.h"
#include "platform/run/Queue.h"
#include "tests/support/ManualClock.h"
#include "tests/support/ManualExecutor.h"

namespace platform::test {

/// What tests expect to be logged isn't printed, from the start of their program; a `LogCapture` sees it.
inline const bool quiet = (Log::threshold = LogLevel::Fault, true);

/// One thread for all queues: work waits until `drain`, time until `advance`.
struct ByHand {
    void drain() { executor.drain(); }
    void advance(Duration by)
    {
        clock.advance(by, [this] { drain(); });
    }
    std::shared_ptr<Queue> makeQueue(const std::string& label, Queue::Kind kind = Queue::Kind::Serial)
    {
        return Queue::make(label, kind, executor, clock);
    }

    ManualClock clock;
    ManualExecutor executor;
};

} // namespace platform::test
