#include "platform/device/DeviceProfile.h"

#include <cerrno>
#include <mutex>
#include <vector>

#include "platform/base/Log.h"
#include "platform/base/Mutex.h"
#include "platform/files/Files.h"
#include "platform/files/FileWatch.h"
#include "platform/run/RunLoop.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"

namespace platform {

namespace {

constexpr std::size_t kMaximumProfileSize = 1u << 20;
constexpr double kSmallestScale = 0.5;
constexpr double kLargestScale = 8;

std::optional<std::string> text(const Value& object, std::string_view key)
{
    const Value& value = object[key];
    const std::string* string = value.asString();
    if (!value.isNull() && !string) defaultLog().error("device.json: {}: expected a string", key);
    return string && !string->empty() ? std::optional(*string) : std::nullopt;
}

class FileProfile final : public DeviceProfileSource {
public:
    FileProfile(FileSystem& files, std::filesystem::path path, RunLoop& runLoop)
        : _files(files), _path(std::move(path)), _runLoop(runLoop)
    {}

    DeviceProfile profile() override
    {
        MutexLock lock(_mutex);
        if (!_profile) {
            _profile = read();
            // The watch lives on the run loop's thread. `changed` reports a change that preceded it.
            _runLoop.execute(Priority::Default, [this] {
                _watch.emplace(_runLoop, _path, [this] { changed(); });
                changed();
            });
        }
        return *_profile;
    }

    void onChange(std::function<void(const DeviceProfile&)> handler) override
    {
        MutexLock lock(_mutex);
        _handlers.push_back(std::move(handler));
    }

private:
    DeviceProfile read()
    {
        const auto bytes = _files.read(_path, kMaximumProfileSize);
        if (!bytes) {
            if (bytes.error().code != ENOENT)
                defaultLog().error("device.json can't be read: {}", bytes.error().description());
            return {};
        }
        const auto value = parseJson(bytes->view(), kMaximumProfileSize);
        if (!value) defaultLog().error("device.json is broken: {}", value.error().description());
        return value ? deviceProfileFromValue(*value) : DeviceProfile();
    }

    void changed()
    {
        std::vector<std::function<void(const DeviceProfile&)>> handlers;
        DeviceProfile fresh = read();
        {
            MutexLock lock(_mutex);
            if (fresh == _profile) return;
            _profile = fresh;
            handlers = _handlers;
        }
        for (const auto& handler : handlers) handler(fresh);
    }

    FileSystem& _files;
    const std::filesystem::path _path;
    RunLoop& _runLoop;
    Mutex _mutex;
    std::optional<DeviceProfile> _profile GUARDED_BY(_mutex);
    std::vector<std::function<void(const DeviceProfile&)>> _handlers GUARDED_BY(_mutex);
    std::optional<FileWatch> _watch; // loop's thread
};

} // namespace

DeviceProfile deviceProfileFromValue(const Value& value)
{
    if (!value.asDictionary()) defaultLog().error("device.json: expected an object");
    DeviceProfile profile;
    profile.countryCode = text(value, "countryCode");
    profile.storefront = text(value, "storefront");
    profile.managedAccount = value["managedAccount"].asBool().value_or(false);
    profile.newsSubscribed = value["newsSubscribed"].asBool().value_or(false);
    const double scale = value["screenScale"].asDouble().value_or(1.0);
    if (scale >= kSmallestScale && scale <= kLargestScale)
        profile.screenScale = scale;
    else
        defaultLog().error("device.json: screenScale: expected {} to {}", kSmallestScale, kLargestScale);
    profile.geoMetadata = text(value, "geoMetadata");
    profile.geoEnvironment = text(value, "geoEnvironment");
    profile.geoSessionId = text(value["geoSession"], "id");
    profile.geoSessionEntity = text(value["geoSession"], "entity");
    return profile;
}

std::unique_ptr<DeviceProfileSource> makeDeviceProfileSource(FileSystem& files, std::filesystem::path path,
                                                             RunLoop& runLoop)
{
    return std::make_unique<FileProfile>(files, std::move(path), runLoop);
}

} // namespace platform
