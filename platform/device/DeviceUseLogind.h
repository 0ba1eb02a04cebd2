#pragma once

#include <filesystem>
#include <memory>

#include "platform/device/DeviceUse.h"

namespace platform {

class RunLoop;

/// Reads the power supplies in `supplies`, and asks logind over the system bus. Without supplies: mains. Without
/// logind: nobody at the screen, unlocked. The run loop must outlive it; made and destroyed on its thread.
[[nodiscard]] std::unique_ptr<DeviceUseSource>
makeSystemDeviceUse(RunLoop& runLoop, std::filesystem::path supplies = "/sys/class/power_supply");

/// Whether the device runs on a battery of its own, by the kernel's power supplies; not where one of them is plugged
/// in.
[[nodiscard]] bool isOnBattery(const std::filesystem::path& supplies);

} // namespace platform
