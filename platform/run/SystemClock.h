#pragma once

#include <memory>

#include "platform/run/Clock.h"

namespace platform {

class RunLoop;

/// Returns the device's clock. Its timers fire on the run loop's thread and share one timer descriptor: the process
/// wakes only when one is due. Destroy it on the run loop's thread; the run loop must outlive it.
[[nodiscard]] std::unique_ptr<Clock> makeSystemClock(RunLoop& runLoop);

} // namespace platform
