#pragma once

#include <filesystem>
#include <memory>

#include "platform/device/DeviceUse.h"

namespace platform {

class RunLoop;

/// Reads the power supplies in `supplies` and asks logind over the system bus. Without supplies the device is on mains;
/// without logind no one is at the screen, and the device is unlocked. Made and destroyed on the run loop's thread; the
/// run loop must outlive it.
[[nodiscard]] std::unique_ptr<DeviceUseSource>
makeSystemDeviceUse(RunLoop& runLoop, std::filesystem::path supplies = "/sys/class/power_supply");

/// Returns true if the kernel's power supplies include a battery of the device's own, and none is plugged in.
[[nodiscard]] bool isOnBattery(const std::filesystem::path& supplies);

} // namespace platform
