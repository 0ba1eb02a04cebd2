#pragma once

#include <memory>
#include <string>

#include "platform/device/LocationSource.h"

namespace platform {

class RunLoop;

/// GeoClue2 on the system bus. Without a bus, the service or the user's leave there is no location.
/// Nothing is contacted before sources are allowed. The user grants leave to `desktopId`.
[[nodiscard]] std::unique_ptr<LocationSource> makeGeoClueLocationSource(RunLoop& runLoop, std::string desktopId);

} // namespace platform
