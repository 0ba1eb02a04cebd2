#pragma once

#include <memory>

#include "platform/device/SystemNotifier.h"

namespace platform {

class RunLoop;

/// Returns a notifier that emits the signal "Posted" (argument: the name) of `interface` from the object at `path` on
/// the user's session bus. Connects with the first post. Without a bus, posts are logged and dropped. Create and
/// destroy it on the run loop's thread; the run loop must outlive it.
[[nodiscard]] std::unique_ptr<SystemNotifier> makeSessionBusNotifier(RunLoop& runLoop, std::string path,
                                                                     std::string interface);

} // namespace platform
