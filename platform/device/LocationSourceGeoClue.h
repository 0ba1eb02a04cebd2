#pragma once

#include <memory>
#include <string>

#include "platform/device/LocationSource.h"

namespace platform {

class RunLoop;

/// Asks GeoClue2 over the system bus. There is no location without a bus, the service, or the user's permission, which
/// is given to `desktopId`. Nothing is contacted before sources are allowed. Made and destroyed on the run loop's
/// thread; the run loop must outlive it.
[[nodiscard]] std::unique_ptr<LocationSource> makeGeoClueLocationSource(RunLoop& runLoop, std::string desktopId);

} // namespace platform
