#pragma once

#include <memory>

#include "platform/device/SystemNotifier.h"

namespace platform {

class RunLoop;

/// Emits the signal "Posted" (the name) of `interface` from the object at `path` on the user's session bus, to which it
/// connects with the first post. Without a bus, posts are logged and lost. Made and destroyed on the run loop's thread;
/// the run loop must outlive it.
[[nodiscard]] std::unique_ptr<SystemNotifier> makeSessionBusNotifier(RunLoop& runLoop, std::string path,
                                                                     std::string interface);

} // namespace platform
