#include <systemd/sd-bus.h>

#include "platform/Device.h"
#include "platform/Log.h"
#include "platform/RunLoop.h"

namespace platform {

namespace {

constexpr const char* kPath = "/com/quorvane/tavrind";
constexpr const char* kInterface = "com.quorvane.Notify";

class SessionBusNotifier final : public SystemNotifier {
public:
    explicit SessionBusNotifier(RunLoop& runLoop) : _runLoop(runLoop) {}
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
        if (const int sent = sd_bus_emit_signal(_bus, kPath, kInterface, "Posted", "s", name.c_str()); sent < 0) {
            defaultLog().error("the session bus didn't take {}", name);
            _bus = sd_bus_flush_close_unref(_bus); // another try with the next
        }
    }

    RunLoop& _runLoop;
    sd_bus* _bus = nullptr; // loop's thread
};

} // namespace

std::unique_ptr<SystemNotifier> makeSessionBusNotifier(RunLoop& runLoop)
{
    return std::make_unique<SessionBusNotifier>(runLoop);
}

} // namespace platform
