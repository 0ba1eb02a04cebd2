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

/// Removes a member and returns it; null if it is missing.
Value take(Dictionary& members, std::string_view key)
{
    const Value* found = members.find(key);
    Value value = found ? *found : Value();
    members.remove(key);
    return value;
}

/// Logs a member that is there and doesn't fit.
void expect(bool fits, std::string_view key, const Value& value, std::string_view expected)
{
    if (!fits && !value.isNull()) defaultLog().error("device.json: {}: expected {}", key, expected);
}

std::optional<std::string> text(Dictionary& members, std::string_view key)
{
    const Value value = take(members, key);
    const std::string* string = value.asString();
    expect(string, key, value, "a string");
    return string && !string->empty() ? std::optional(*string) : std::nullopt;
}

bool flag(Dictionary& members, std::string_view key)
{
    const Value value = take(members, key);
    const auto truth = value.asBool();
    expect(truth.has_value(), key, value, "true or false");
    return truth.value_or(false);
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
    Dictionary members = value.asDictionary() ? *value.asDictionary() : Dictionary();
    DeviceProfile profile;
    profile.countryCode = text(members, "countryCode");
    profile.storefront = text(members, "storefront");
    profile.managedAccount = flag(members, "managedAccount");
    profile.newsSubscribed = flag(members, "newsSubscribed");
    const Value scale = take(members, "screenScale");
    const double number = scale.asDouble().value_or(0);
    const bool inRange = number >= kSmallestScale && number <= kLargestScale;
    expect(inRange, "screenScale", scale, "a number from 0.5 to 8");
    if (inRange) profile.screenScale = number;
    profile.geoMetadata = text(members, "geoMetadata");
    profile.geoEnvironment = text(members, "geoEnvironment");
    const Value geoSession = take(members, "geoSession");
    expect(geoSession.asDictionary(), "geoSession", geoSession, "an object");
    Dictionary session = geoSession.asDictionary() ? *geoSession.asDictionary() : Dictionary();
    profile.geoSessionId = text(session, "id");
    profile.geoSessionEntity = text(session, "entity");
    for (const Dictionary& unknown : {members, session})
        for (const auto& [key, member] : unknown) defaultLog().error("device.json: {}: there is no such member", key);
    return profile;
}

std::unique_ptr<DeviceProfileSource> makeDeviceProfileSource(FileSystem& files, std::filesystem::path path,
                                                             RunLoop& runLoop)
{
    return std::make_unique<FileProfile>(files, std::move(path), runLoop);
}

} // namespace platform
