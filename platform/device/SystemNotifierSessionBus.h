#pragma once

#include <memory>

#include "platform/device/SystemNotifier.h"

namespace platform {

class RunLoop;

/// Emits the signal "Posted" (the name) of `interface` from the object at `path`, on the user's session bus. Connects
/// when there is something to tell. Made and destroyed on the run loop's thread.
[[nodiscard]] std::unique_ptr<SystemNotifier> makeSessionBusNotifier(RunLoop& runLoop, std::string path,
                                                                     std::string interface);

} // namespace platform
