#pragma once

#include <filesystem>
#include <memory>

#include "platform/device/DeviceUse.h"

namespace platform {

class RunLoop;

/// Returns a source that reads the power supplies in `supplies` and asks logind over the system bus. Without supplies
/// the device counts as on mains; without logind the screen counts as not in use and the device as unlocked. Create and
/// destroy it on the run loop's thread; the run loop must outlive it.
[[nodiscard]] std::unique_ptr<DeviceUseSource>
makeSystemDeviceUse(RunLoop& runLoop, std::filesystem::path supplies = "/sys/class/power_supply");

/// Returns true if the kernel's power supplies include a battery of the device itself, and none is online. A battery of
/// a peripheral doesn't count.
[[nodiscard]] bool isOnBattery(const std::filesystem::path& supplies);

} // namespace platform
