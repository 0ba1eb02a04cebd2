#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/values/Value.h"

namespace platform {

class FileSystem;
class RunLoop;

/// What the device's maker or manager says about the device, from device.json. Every member may be missing.
struct DeviceProfile {
    std::optional<std::string> countryCode;      ///< "countryCode": ISO 3166, overrides the locale's region
    std::optional<std::string> storefront;       ///< "storefront": the media store's storefront identifier
    bool managedAccount = false;                 ///< "managedAccount"
    bool newsSubscribed = false;                 ///< "newsSubscribed": to the maker's own news
    double screenScale = 1.0;                    ///< "screenScale": 0.5 to 8; else 1.0
    std::optional<std::string> geoMetadata;      ///< "geoMetadata": the geo client's metadata string
    std::optional<std::string> geoEnvironment;   ///< "geoEnvironment": name of the geo resource environment
    std::optional<std::string> geoSessionId;     ///< "geoSession" / "id"
    std::optional<std::string> geoSessionEntity; ///< "geoSession" / "entity"

    bool operator==(const DeviceProfile&) const = default;
};

/// Reads a profile; members of the wrong type are logged and read as missing.
[[nodiscard]] DeviceProfile deviceProfileFromValue(const Value& value);

/// The profile and word of its changes. Any thread.
class DeviceProfileSource {
public:
    virtual ~DeviceProfileSource() = default;
    [[nodiscard]] virtual DeviceProfile profile() = 0;
    /// Called on the run loop's thread with the new profile after a change, beside the handlers that are there.
    virtual void onChange(std::function<void(const DeviceProfile&)> handler) = 0;
};

/// `path` (device.json), read when first asked for and watched. Missing: an empty profile. Broken: logged, empty.
[[nodiscard]] std::unique_ptr<DeviceProfileSource>
makeDeviceProfileSource(FileSystem& files, std::filesystem::path path, RunLoop& runLoop);

} // namespace platform
