#pragma once

#include "platform/base/Log.h"

namespace platform::ipc {

/// The log of the transport: sockets, limits that peers reached, messages that were refused.
inline const Log kLog("platform", "ipc");

} // namespace platform::ipc
