#include "platform/net/NetworkStatusNetworkManager.h"

#include "platform/base/Log.h"
#include "platform/ipc/SystemBus.h"
#include "platform/net/NetworkStatus.h"
#include "platform/run/RunLoop.h"
#include "platform/values/Dictionary.h"

namespace platform {

namespace {

const ipc::SystemBus::Object kManager{"org.freedesktop.NetworkManager", "/org/freedesktop/NetworkManager",
                                      "org.freedesktop.NetworkManager"};

class NetworkManagerStatus final : public NetworkStatus {
public:
    explicit NetworkManagerStatus(RunLoop& runLoop)
        : NetworkStatus([this, &runLoop] { runLoop.execute(Priority::Default, [this] { follow(); }); }),
          _bus(runLoop, ipc::SystemBus::Bus::System, [this] { lose("the system bus has disconnected"); })
    {}

private:
    void follow()
    {
        _changes = _bus.onSignal({kManager.service, kManager.path, "org.freedesktop.DBus.Properties"},
                                 "PropertiesChanged", [this](const auto&) { read(); });
        _owners = _bus.onOwnerChange(kManager.service, [this] { read(); });
        read();
    }

    void read()
    {
        _bus.getProperties(kManager, [this](const std::expected<Dictionary, ipc::CallError>& properties) {
            if (!properties) return lose(properties.error().message);
            const auto number = [&](const char* name) {
                const Value* value = properties->find(name);
                return static_cast<std::uint32_t>(value ? value->asUInt().value_or(0) : 0);
            };
            set(networkStateOf(number("State"), number("Metered")));
        });
    }

    void lose(const std::string& reason)
    {
        defaultLog().info("the network state is unknown and counts as online and unmetered: {}", reason);
        set({});
    }

    ipc::SystemBus _bus; // run loop's thread, like the next two
    ipc::SystemBus::Watch _changes;
    ipc::SystemBus::Watch _owners;
};

} // namespace

std::unique_ptr<NetworkStatus> makeNetworkManagerStatus(RunLoop& runLoop)
{
    return std::make_unique<NetworkManagerStatus>(runLoop);
}

NetworkState networkStateOf(std::uint32_t state, std::uint32_t metered)
{
    // NM_STATE_CONNECTED_SITE; states below it have no default route. 0 is NM_STATE_UNKNOWN.
    constexpr std::uint32_t kConnectedSite = 60;
    constexpr std::uint32_t kYes = 1;
    constexpr std::uint32_t kGuessYes = 3;
    return {.online = state == 0 || state >= kConnectedSite, .metered = metered == kYes || metered == kGuessYes};
}

} // namespace platform
