// The state of the network from NetworkManager, over the system bus. Everything is asynchronous, on the run loop's
// thread.

#include "platform/net/NetworkStatusNetworkManager.h"

#include <systemd/sd-bus.h>

#include "platform/base/Log.h"
#include "platform/net/NetworkStatus.h"
#include "platform/run/RunLoop.h"

namespace platform {

namespace {

constexpr const char* kService = "org.freedesktop.NetworkManager";
constexpr const char* kPath = "/org/freedesktop/NetworkManager";
constexpr const char* kProperties = "org.freedesktop.DBus.Properties";

class NetworkManagerStatus final : public NetworkStatus {
public:
    explicit NetworkManagerStatus(RunLoop& runLoop)
        : NetworkStatus([this] { _runLoop.execute(Priority::Default, [this] { start(); }); }), _runLoop(runLoop)
    {}
    ~NetworkManagerStatus() override { sd_bus_flush_close_unref(_bus); }

private:
    void start()
    {
        if (sd_bus_open_system(&_bus) < 0) return lose("no system bus");
        sd_bus_attach_event(_bus, _runLoop.handle(), SD_EVENT_PRIORITY_NORMAL);
        sd_bus_match_signal_async(_bus, nullptr, kService, kPath, kProperties, "PropertiesChanged",
                                  handler<&NetworkManagerStatus::ask>, nullptr, this);
        // Comes and goes: whoever owns its name now, or no one, is asked.
        sd_bus_add_match_async(_bus, nullptr,
                               "type='signal',sender='org.freedesktop.DBus',member='NameOwnerChanged',"
                               "arg0='org.freedesktop.NetworkManager'",
                               handler<&NetworkManagerStatus::ask>, nullptr, this);
        sd_bus_match_signal_async(_bus, nullptr, "org.freedesktop.DBus.Local", nullptr, "org.freedesktop.DBus.Local",
                                  "Disconnected", handler<&NetworkManagerStatus::busWent>, nullptr, this);
        ask(nullptr);
    }

    int ask(sd_bus_message*)
    {
        sd_bus_message* call = nullptr;
        if (sd_bus_message_new_method_call(_bus, &call, kService, kPath, kProperties, "GetAll") < 0) return 0;
        sd_bus_message_set_auto_start(call, false);
        sd_bus_message_append(call, "s", kService);
        if (sd_bus_call_async(_bus, nullptr, call, handler<&NetworkManagerStatus::answered>, this, 0) < 0)
            lose("the system bus went");
        sd_bus_message_unref(call);
        return 0;
    }

    int answered(sd_bus_message* message)
    {
        if (sd_bus_message_is_method_error(message, nullptr))
            lose("NetworkManager is not there");
        else if (const auto state = read(message))
            set(*state);
        else
            lose("NetworkManager's answer can't be read");
        return 0;
    }

    static std::optional<NetworkState> read(sd_bus_message* message)
    {
        std::uint32_t state = 0;
        std::uint32_t metered = 0;
        if (sd_bus_message_enter_container(message, 'a', "{sv}") < 0) return std::nullopt;
        while (sd_bus_message_enter_container(message, 'e', "sv") > 0) {
            const char* name = nullptr;
            if (sd_bus_message_read(message, "s", &name) < 0) return std::nullopt;
            const std::string_view key = name;
            std::uint32_t* const wanted = key == "State" ? &state : key == "Metered" ? &metered : nullptr;
            const int done =
                wanted ? sd_bus_message_read(message, "v", "u", wanted) : sd_bus_message_skip(message, "v");
            if (done < 0 || sd_bus_message_exit_container(message) < 0) return std::nullopt;
        }
        return networkStateOf(state, metered);
    }

    int busWent(sd_bus_message*)
    {
        lose("the system bus went");
        return 0;
    }

    void lose(const char* reason)
    {
        defaultLog().info("the network's state isn't known, taken as online and unmetered: {}", reason);
        set({});
    }

    /// A bus callback that calls a member.
    template <int (NetworkManagerStatus::*member)(sd_bus_message*)>
    static int handler(sd_bus_message* message, void* self, sd_bus_error*)
    {
        return (static_cast<NetworkManagerStatus*>(self)->*member)(message);
    }

    RunLoop& _runLoop;
    sd_bus* _bus = nullptr; // loop's thread
};

} // namespace

std::unique_ptr<NetworkStatus> makeNetworkManagerStatus(RunLoop& runLoop)
{
    return std::make_unique<NetworkManagerStatus>(runLoop);
}

NetworkState networkStateOf(std::uint32_t state, std::uint32_t metered)
{
    // Below this there is no route out of the link; 0 is NetworkManager not knowing.
    constexpr std::uint32_t kConnectedSite = 60;
    constexpr std::uint32_t kYes = 1;
    constexpr std::uint32_t kGuessYes = 3;
    return {.online = state == 0 || state >= kConnectedSite, .metered = metered == kYes || metered == kGuessYes};
}

} // namespace platform
