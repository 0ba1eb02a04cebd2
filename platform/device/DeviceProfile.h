#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/values/Value.h"

namespace platform {

class FileSystem;
class RunLoop;

/// What the manufacturer or administrator says about the device in device.json. All members may be missing.
struct DeviceProfile {
    std::optional<std::string> countryCode;      ///< "countryCode": ISO 3166, overrides the locale's region
    std::optional<std::string> storefront;       ///< "storefront": the media store's storefront identifier
    bool managedAccount = false;                 ///< "managedAccount"
    bool newsSubscribed = false;                 ///< "newsSubscribed": to the manufacturer's own news
    double screenScale = 1.0;                    ///< "screenScale": 0.5 to 8, otherwise 1.0
    std::optional<std::string> geoMetadata;      ///< "geoMetadata": the geo client's metadata string
    std::optional<std::string> geoEnvironment;   ///< "geoEnvironment": name of the geo resource environment
    std::optional<std::string> geoSessionId;     ///< "geoSession" / "id"
    std::optional<std::string> geoSessionEntity; ///< "geoSession" / "entity"

    bool operator==(const DeviceProfile&) const = default;
};

/// Reads a profile. Members of the wrong type and unknown ones count as missing, and are added to `problems`:
/// "countryCode: expected a string".
[[nodiscard]] DeviceProfile deviceProfileFromValue(const Value& value, std::vector<std::string>& problems);

/// Reports the profile and its changes. Any thread.
class DeviceProfileSource {
public:
    virtual ~DeviceProfileSource() = default;
    [[nodiscard]] virtual DeviceProfile profile() = 0;
    /// Adds a handler, which runs on the run loop's thread with the new profile after every change.
    virtual void onChange(std::function<void(const DeviceProfile&)> handler) = 0;
};

/// Returns a source that reads `path` (device.json) with the first request, and again after changes. A missing file is
/// an empty profile; so is a damaged one, which is logged. Destroy it on the run loop's thread; `files` and the run
/// loop must outlive it.
[[nodiscard]] std::unique_ptr<DeviceProfileSource>
makeDeviceProfileSource(FileSystem& files, std::filesystem::path path, RunLoop& runLoop);

} // namespace platform
