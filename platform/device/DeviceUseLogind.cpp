#include "platform/device/DeviceUseLogind.h"

#include <algorithm>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include <systemd/sd-bus.h>

#include "platform/base/Log.h"
#include "platform/device/DeviceUse.h"
#include "platform/files/Files.h"
#include "platform/run/RunLoop.h"

namespace platform {

namespace {

constexpr const char* kService = "org.freedesktop.login1";
constexpr const char* kSession = "org.freedesktop.login1.Session";

/// The one line of a file in sysfs.
std::string lineOf(FileSystem& files, const std::filesystem::path& path)
{
    const auto contents = files.read(path, 4096);
    std::string line(contents ? contents->view() : "");
    return line.substr(0, line.find('\n'));
}

class SystemDeviceUse final : public DeviceUseSource {
public:
    SystemDeviceUse(RunLoop& runLoop, std::filesystem::path supplies)
        : _runLoop(runLoop), _supplies(std::move(supplies))
    {}
    ~SystemDeviceUse() override { sd_bus_flush_close_unref(_bus); }

    void ask(Answer answer) override
    {
        {
            std::lock_guard lock(_mutex);
            _waiting.push_back(std::move(answer));
            if (_waiting.size() > 1) return; // is being found out
        }
        _runLoop.execute(Priority::Default, [this] { askLogind(); });
    }
    DeviceUse last() override
    {
        std::lock_guard lock(_mutex);
        return _last;
    }

private:
    void askLogind()
    {
        if (!_bus) {
            if (sd_bus_open_system(&_bus) < 0) return found(false, true);
            sd_bus_attach_event(_bus, _runLoop.handle(), SD_EVENT_PRIORITY_NORMAL);
        }
        // The session that the process is in; for a service of the user, the user's session at the screen.
        sd_bus_message* call = nullptr;
        if (sd_bus_message_new_method_call(_bus, &call, kService, "/org/freedesktop/login1/session/auto",
                                           "org.freedesktop.DBus.Properties", "GetAll") < 0)
            return found(false, true);
        sd_bus_message_set_auto_start(call, false);
        sd_bus_message_append(call, "s", kSession);
        const int sent = sd_bus_call_async(_bus, nullptr, call, answered, this, 0);
        sd_bus_message_unref(call);
        if (sent >= 0) return;
        _bus = sd_bus_flush_close_unref(_bus); // it went; the next question opens it anew
        found(false, true);
    }

    static int answered(sd_bus_message* message, void* self, sd_bus_error*)
    {
        static_cast<SystemDeviceUse*>(self)->answer(message);
        return 0;
    }

    void answer(sd_bus_message* message)
    {
        if (const sd_bus_error* error = sd_bus_message_get_error(message)) {
            const std::string_view name = error->name ? error->name : "";
            const bool noSession = name.starts_with(kService) || name == "org.freedesktop.DBus.Error.UnknownObject";
            return found(false, !noSession || _hadSession);
        }
        int active = 1;
        int idle = 0;
        int locked = 0;
        sd_bus_message_enter_container(message, 'a', "{sv}");
        while (sd_bus_message_enter_container(message, 'e', "sv") > 0) {
            const char* key = nullptr;
            if (sd_bus_message_read(message, "s", &key) < 0) break;
            const std::string_view name = key;
            int* const wanted = name == "Active"       ? &active
                                : name == "IdleHint"   ? &idle
                                : name == "LockedHint" ? &locked
                                                       : nullptr;
            const int done =
                wanted ? sd_bus_message_read(message, "v", "b", wanted) : sd_bus_message_skip(message, "v");
            if (done < 0 || sd_bus_message_exit_container(message) < 0) break;
        }
        _hadSession = true;
        found(active && !idle && !locked, true);
    }

    void found(bool screenInUse, bool unlocked)
    {
        const DeviceUse use{.onBattery = isOnBattery(_supplies), .screenInUse = screenInUse, .unlocked = unlocked};
        std::vector<Answer> waiting;
        {
            std::lock_guard lock(_mutex);
            _last = use;
            waiting.swap(_waiting);
        }
        for (Answer& tell : waiting) tell(use);
    }

    RunLoop& _runLoop;
    const std::filesystem::path _supplies;
    sd_bus* _bus = nullptr; // loop's thread, like the next
    bool _hadSession = false;
    std::mutex _mutex;
    DeviceUse _last; // under the mutex, like the next
    std::vector<Answer> _waiting;
};

} // namespace

bool isOnBattery(const std::filesystem::path& supplies)
{
    const auto files = makeSystemFiles();
    bool battery = false;
    for (const std::string& name : files->list(supplies).value_or(std::vector<std::string>())) {
        const auto line = [&](const char* file) { return lineOf(*files, supplies / name / file); };
        if (line("online") == "1") return false;
        // A mouse's battery is of the scope "Device".
        battery = battery || (line("type") == "Battery" && line("scope") != "Device" && line("present") != "0");
    }
    return battery;
}

std::unique_ptr<DeviceUseSource> makeSystemDeviceUse(RunLoop& runLoop, std::filesystem::path supplies)
{
    return std::make_unique<SystemDeviceUse>(runLoop, std::move(supplies));
}

} // namespace platform
