#pragma once

#include <latch>
#include <memory>

#include "platform/run/WorkerPool.h"

namespace platform::test {

/// Waits until a pool of `workers` threads has run what it was given so far.
inline void settle(WorkerPool& pool, unsigned workers)
{
    // All workers at once: none of them still runs anything else. Twice, for what the last jobs handed over.
    for (int i = 0; i < 2; ++i) {
        const auto together = std::make_shared<std::latch>(workers + 1);
        for (unsigned j = 0; j < workers; ++j)
            pool.execute(Priority::Default, [together] { together->arrive_and_wait(); });
        together->arrive_and_wait();
    }
}

} // namespace platform::test
