#include "platform/net/NetworkStatusNetworkManager.h"

#include <algorithm>

#include "platform/base/Log.h"
#include "platform/ipc/SystemBus.h"
#include "platform/net/NetworkStatus.h"
#include "platform/run/Clock.h"
#include "platform/run/RunLoop.h"
#include "platform/values/Dictionary.h"

namespace platform {

namespace {

const ipc::SystemBus::Object kManager{"org.freedesktop.NetworkManager", "/org/freedesktop/NetworkManager",
                                      "org.freedesktop.NetworkManager"};

/// How soon to connect again to a bus that has disconnected: it may be restarting. Later attempts double the delay.
constexpr Duration kFirstReconnect = std::chrono::seconds(5);
constexpr Duration kLongestReconnect = std::chrono::hours(1);

class NetworkManagerStatus final : public NetworkStatus {
public:
    NetworkManagerStatus(RunLoop& runLoop, Clock& clock)
        : NetworkStatus([this] { followSoon(); }), _runLoop(runLoop), _clock(clock),
          _bus(runLoop, ipc::SystemBus::Bus::System, [this] {
              lose("the system bus has disconnected");
              _reconnect = kFirstReconnect;
              followLater();
          })
    {}
    ~NetworkManagerStatus() override { _clock.cancel(_timer); }

private:
    /// Any thread.
    void followSoon()
    {
        _runLoop.execute(Priority::Default, [weak = std::weak_ptr(_alive)] {
            if (const auto alive = weak.lock()) (*alive)->follow();
        });
    }

    void followLater()
    {
        _timer = _clock.after(_reconnect, [this] { followSoon(); });
        _reconnect = std::min(2 * _reconnect, kLongestReconnect);
    }

    void follow()
    {
        // Without a bus at the start there is none to wait for.
        if (!_bus.connect() && _reconnect > Duration(0)) return followLater();
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
            const NetworkState state = networkStateOf(number("State"), number("Metered"));
            if (current() != state)
                defaultLog().info("the network is {}, {}", state.online ? "online" : "offline",
                                  state.metered ? "metered" : "unmetered");
            set(state);
        });
    }

    void lose(const std::string& reason)
    {
        defaultLog().info("the network state is unknown and counts as online and unmetered: {}", reason);
        set({});
    }

    RunLoop& _runLoop;
    Clock& _clock;
    const std::shared_ptr<NetworkManagerStatus*> _alive = std::make_shared<NetworkManagerStatus*>(this);

    // Run loop's thread.
    Duration _reconnect{};
    Clock::TimerId _timer = 0;
    ipc::SystemBus _bus;
    ipc::SystemBus::Watch _changes;
    ipc::SystemBus::Watch _owners;
};

} // namespace

std::unique_ptr<NetworkStatus> makeNetworkManagerStatus(RunLoop& runLoop, Clock& clock)
{
    return std::make_unique<NetworkManagerStatus>(runLoop, clock);
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
