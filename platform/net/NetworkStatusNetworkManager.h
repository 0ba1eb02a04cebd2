#pragma once

#include <cstdint>
#include <memory>

#include "platform/net/NetworkStatus.h"

namespace platform {

class Clock;
class RunLoop;

/// Returns a status that observes NetworkManager over the system bus, from the first `current` or `observe` on. If
/// NetworkManager or the bus is missing, the network counts as online and unmetered. After the bus has disconnected, it
/// connects again. Create and destroy it on the run loop's thread; the run loop and the clock must outlive it.
[[nodiscard]] std::unique_ptr<NetworkStatus> makeNetworkManagerStatus(RunLoop& runLoop, Clock& clock);

/// Converts NetworkManager's properties "State" (NMState) and "Metered" (NMMetered).
[[nodiscard]] NetworkState networkStateOf(std::uint32_t state, std::uint32_t metered);

} // namespace platform
