#include "platform/device/SystemNotifierSessionBus.h"

#include "platform/base/Log.h"
#include "platform/device/SystemNotifier.h"
#include "platform/ipc/SystemBus.h"
#include "platform/run/RunLoop.h"

namespace platform {

namespace {

class SessionBusNotifier final : public SystemNotifier {
public:
    SessionBusNotifier(RunLoop& runLoop, std::string path, std::string interface)
        : _runLoop(runLoop), _path(std::move(path)), _interface(std::move(interface)),
          _bus(runLoop, ipc::SystemBus::Bus::User)
    {}

    void post(const std::string& name) override
    {
        _runLoop.execute(Priority::Default, [this, name] {
            if (!_bus.emit(_path, _interface, "Posted", name))
                defaultLog().info("the signal {} can't be sent on the session bus", name);
        });
    }

private:
    RunLoop& _runLoop;
    const std::string _path;
    const std::string _interface;
    ipc::SystemBus _bus; // run loop's thread
};

} // namespace

std::unique_ptr<SystemNotifier> makeSessionBusNotifier(RunLoop& runLoop, std::string path, std::string interface)
{
    return std::make_unique<SessionBusNotifier>(runLoop, std::move(path), std::move(interface));
}

} // namespace platform
