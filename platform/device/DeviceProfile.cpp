#include "platform/device/DeviceProfile.h"

#include <cerrno>
#include <utility>
#include <vector>

#include <fmt/format.h>

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

/// The members of one object of the file that have not been read yet.
struct Members {
    Dictionary left;
    std::vector<std::string>& problems;

    Members(const Value& object, std::vector<std::string>& problems_)
        : left(object.asDictionary() ? *object.asDictionary() : Dictionary()), problems(problems_)
    {}
    /// Removes a member and returns it; null if it is missing.
    Value take(std::string_view key)
    {
        const Value* found = left.find(key);
        Value value = found ? *found : Value();
        left.remove(key);
        return value;
    }
    void expect(bool fits, std::string_view key, const Value& value, std::string_view expected)
    {
        if (!fits && !value.isNull()) problems.push_back(fmt::format("{}: expected {}", key, expected));
    }
    std::optional<std::string> text(std::string_view key)
    {
        const Value value = take(key);
        const std::string* string = value.asString();
        expect(string, key, value, "a string");
        return string && !string->empty() ? std::optional(*string) : std::nullopt;
    }
    bool flag(std::string_view key)
    {
        const Value value = take(key);
        const auto truth = value.asBool();
        expect(truth.has_value(), key, value, "true or false");
        return truth.value_or(false);
    }
    void end()
    {
        for (const auto& [key, member] : left) problems.push_back(fmt::format("{}: there is no such member", key));
    }
};

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
        if (!value) {
            defaultLog().error("device.json is broken: {}", value.error().description());
            return {};
        }
        std::vector<std::string> problems;
        DeviceProfile profile = deviceProfileFromValue(*value, problems);
        for (const std::string& problem : problems) defaultLog().error("device.json: {}", problem);
        return profile;
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

DeviceProfile deviceProfileFromValue(const Value& value, std::vector<std::string>& problems)
{
    if (!value.asDictionary()) problems.emplace_back("expected an object");
    Members members(value, problems);
    DeviceProfile profile;
    profile.countryCode = members.text("countryCode");
    profile.storefront = members.text("storefront");
    profile.managedAccount = members.flag("managedAccount");
    profile.newsSubscribed = members.flag("newsSubscribed");
    const Value scale = members.take("screenScale");
    const double number = scale.asDouble().value_or(0);
    const bool inRange = number >= kSmallestScale && number <= kLargestScale;
    members.expect(inRange, "screenScale", scale, fmt::format("a number from {} to {}", kSmallestScale, kLargestScale));
    if (inRange) profile.screenScale = number;
    profile.geoMetadata = members.text("geoMetadata");
    profile.geoEnvironment = members.text("geoEnvironment");
    const Value geoSession = members.take("geoSession");
    members.expect(geoSession.asDictionary(), "geoSession", geoSession, "an object");
    Members session(geoSession, problems);
    profile.geoSessionId = session.text("id");
    profile.geoSessionEntity = session.text("entity");
    session.end();
    members.end();
    return profile;
}

std::unique_ptr<DeviceProfileSource> makeDeviceProfileSource(FileSystem& files, std::filesystem::path path,
                                                             RunLoop& runLoop)
{
    return std::make_unique<FileProfile>(files, std::move(path), runLoop);
}

} // namespace platform
