#pragma once

#include <memory>
#include <string>

#include "platform/device/LocationSource.h"

namespace platform {

class RunLoop;

/// Returns a source that uses GeoClue2 over the system bus. It has no location if the bus, the service or the user's
/// permission is missing; the user grants permission to `desktopId`. Connects after sources have been allowed. Create
/// and destroy it on the run loop's thread; the run loop must outlive it.
[[nodiscard]] std::unique_ptr<LocationSource> makeGeoClueLocationSource(RunLoop& runLoop, std::string desktopId);

} // namespace platform
