#pragma once

#include <memory>

#include "platform/run/Clock.h"

namespace platform {

class RunLoop;

/// The device's clock. Timers share one timer descriptor on the run loop: nothing wakes while none is due.
[[nodiscard]] std::unique_ptr<Clock> makeSystemClock(RunLoop& runLoop);

} // namespace platform
