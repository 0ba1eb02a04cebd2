#pragma once

#include <cstdint>
#include <memory>

#include "platform/net/NetworkStatus.h"

namespace platform {

class RunLoop;

/// The status that NetworkManager tells over the system bus, connected to when someone asks. Without NetworkManager or
/// system bus: online and unmetered. The run loop must outlive it; made and destroyed on its thread.
[[nodiscard]] std::unique_ptr<NetworkStatus> makeNetworkManagerStatus(RunLoop& runLoop);

/// What NetworkManager's properties "State" (NMState) and "Metered" (NMMetered) mean.
[[nodiscard]] NetworkState networkStateOf(std::uint32_t state, std::uint32_t metered);

} // namespace platform
