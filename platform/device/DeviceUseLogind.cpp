#include "platform/device/DeviceUseLogind.h"

#include <string>
#include <utility>
#include <vector>

#include "platform/base/Mutex.h"
#include "platform/device/DeviceUse.h"
#include "platform/files/Files.h"
#include "platform/ipc/SystemBus.h"
#include "platform/run/RunLoop.h"
#include "platform/values/Dictionary.h"

namespace platform {

namespace {

constexpr const char* kLogind = "org.freedesktop.login1";

/// Returns the first line of a file, or the empty string.
std::string lineOf(FileSystem& files, const std::filesystem::path& path)
{
    const auto contents = files.read(path, 4096);
    std::string line(contents ? contents->view() : "");
    return line.substr(0, line.find('\n'));
}

class SystemDeviceUse final : public DeviceUseSource {
public:
    SystemDeviceUse(RunLoop& runLoop, std::filesystem::path supplies)
        : _runLoop(runLoop), _supplies(std::move(supplies)), _bus(runLoop, ipc::SystemBus::Bus::System)
    {}

    void ask(Answer answer) override
    {
        {
            MutexLock lock(_mutex);
            _waiting.push_back(std::move(answer));
            if (_waiting.size() > 1) return; // a request is pending
        }
        _runLoop.execute(Priority::Default, [this] {
            // "auto" is the session of this process or, for a user service, the user's graphical session.
            _bus.getProperties({kLogind, "/org/freedesktop/login1/session/auto", "org.freedesktop.login1.Session"},
                               [this](const auto& properties) { answered(properties); });
        });
    }
    DeviceUse last() override
    {
        MutexLock lock(_mutex);
        return _last;
    }

private:
    void answered(const std::expected<Dictionary, ipc::CallError>& properties)
    {
        if (!properties) {
            const std::string& error = properties.error().name;
            const bool noSession = error.starts_with(kLogind) || error == "org.freedesktop.DBus.Error.UnknownObject";
            return found(false, !noSession || _hadSession);
        }
        const auto is = [&](const char* name, bool otherwise) {
            const Value* value = properties->find(name);
            return value ? value->asBool().value_or(otherwise) : otherwise;
        };
        _hadSession = true;
        found(is("Active", true) && !is("IdleHint", false) && !is("LockedHint", false), true);
    }

    void found(bool screenInUse, bool unlocked)
    {
        const DeviceUse use{.onBattery = isOnBattery(_supplies), .screenInUse = screenInUse, .unlocked = unlocked};
        std::vector<Answer> waiting;
        {
            MutexLock lock(_mutex);
            _last = use;
            waiting.swap(_waiting);
        }
        for (Answer& tell : waiting) tell(use);
    }

    RunLoop& _runLoop;
    const std::filesystem::path _supplies;
    ipc::SystemBus _bus; // run loop's thread, like the next
    bool _hadSession = false;
    Mutex _mutex;
    DeviceUse _last GUARDED_BY(_mutex);
    std::vector<Answer> _waiting GUARDED_BY(_mutex);
};

} // namespace

bool isOnBattery(const std::filesystem::path& supplies)
{
    const auto files = makeSystemFiles();
    bool battery = false;
    for (const std::string& name : files->list(supplies).value_or(std::vector<std::string>())) {
        const auto line = [&](const char* file) { return lineOf(*files, supplies / name / file); };
        if (line("online") == "1") return false;
        // The battery of a peripheral, such as a mouse, has the scope "Device".
        battery = battery || (line("type") == "Battery" && line("scope") != "Device" && line("present") != "0");
    }
    return battery;
}

std::unique_ptr<DeviceUseSource> makeSystemDeviceUse(RunLoop& runLoop, std::filesystem::path supplies)
{
    return std::make_unique<SystemDeviceUse>(runLoop, std::move(supplies));
}

} // namespace platform
