#pragma once

#include <cstdint>
#include <memory>

#include "platform/net/NetworkStatus.h"

namespace platform {

class RunLoop;

/// Follows NetworkManager over the system bus, from the first request on. Without NetworkManager or a system bus the
/// network counts as online and unmetered. Made and destroyed on the run loop's thread; the run loop must outlive it.
[[nodiscard]] std::unique_ptr<NetworkStatus> makeNetworkManagerStatus(RunLoop& runLoop);

/// Translates NetworkManager's properties "State" (NMState) and "Metered" (NMMetered).
[[nodiscard]] NetworkState networkStateOf(std::uint32_t state, std::uint32_t metered);

} // namespace platform
