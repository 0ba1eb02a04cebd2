#include "platform/device/SystemNotifierSessionBus.h"

#include <systemd/sd-bus.h>

#include "platform/base/Log.h"
#include "platform/device/Device.h"
#include "platform/device/SystemNotifier.h"
#include "platform/run/RunLoop.h"

namespace platform {

namespace {

class SessionBusNotifier final : public SystemNotifier {
public:
    SessionBusNotifier(RunLoop& runLoop, std::string path, std::string interface)
        : _runLoop(runLoop), _path(std::move(path)), _interface(std::move(interface))
    {}
    ~SessionBusNotifier() override { sd_bus_flush_close_unref(_bus); }

    void post(const std::string& name) override
    {
        _runLoop.execute(Priority::Default, [this, name] { emit(name); });
    }

private:
    void emit(const std::string& name)
    {
        if (!_bus) {
            if (sd_bus_open_user(&_bus) < 0) return defaultLog().info("no session bus to tell {}", name);
            sd_bus_attach_event(_bus, _runLoop.handle(), SD_EVENT_PRIORITY_NORMAL);
        }
        if (const int sent = sd_bus_emit_signal(_bus, _path.c_str(), _interface.c_str(), "Posted", "s", name.c_str());
            sent < 0) {
            defaultLog().error("the session bus didn't take {}", name);
            _bus = sd_bus_flush_close_unref(_bus); // another try with the next
        }
    }

    RunLoop& _runLoop;
    const std::string _path;
    const std::string _interface;
    sd_bus* _bus = nullptr; // loop's thread
};

} // namespace

std::unique_ptr<SystemNotifier> makeSessionBusNotifier(RunLoop& runLoop, std::string path, std::string interface)
{
    return std::make_unique<SessionBusNotifier>(runLoop, std::move(path), std::move(interface));
}

} // namespace platform
