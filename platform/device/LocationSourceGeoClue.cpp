// The device's location from GeoClue2, over the system bus. All calls are asynchronous, on the run loop's thread.

#include "platform/device/LocationSourceGeoClue.h"

#include <mutex>

#include <systemd/sd-bus.h>

#include "platform/base/Log.h"
#include "platform/device/LocationSource.h"
#include "platform/run/RunLoop.h"

namespace platform {

namespace {

constexpr const char* kService = "org.freedesktop.GeoClue2";
constexpr const char* kManagerPath = "/org/freedesktop/GeoClue2/Manager";
constexpr const char* kClientInterface = "org.freedesktop.GeoClue2.Client";
constexpr const char* kLocationInterface = "org.freedesktop.GeoClue2.Location";

// GeoClue's accuracy levels.
constexpr std::uint32_t kAccuracyCity = 4;
constexpr std::uint32_t kAccuracyStreet = 6;
constexpr std::uint32_t kAccuracyExact = 8;

/// GeoClue doesn't say what a fix came from; its accuracy, in metres, does well enough.
std::string sourceForAccuracy(double metres)
{
    return metres <= 50 ? "gps" : metres <= 1500 ? "wifi" : "cell";
}

class GeoClueLocation final : public LocationSource {
public:
    GeoClueLocation(RunLoop& runLoop, std::string desktopId) : _runLoop(runLoop), _desktopId(std::move(desktopId)) {}
    ~GeoClueLocation() override
    {
        sd_bus_slot_unref(_updates);
        sd_bus_flush_close_unref(_bus);
    }

    void setAllowedSources(std::set<std::string> sources) override
    {
        _runLoop.execute(Priority::Default, [this, sources = std::move(sources)] { allow(sources); });
    }
    std::optional<Location> current() override
    {
        std::lock_guard lock(_mutex);
        return _current;
    }
    void requestUpdate() override
    {
        // A running client reports by itself whenever the place changes; only a failed start is worth another try.
        std::lock_guard lock(_mutex);
        if (!_wantsRestart) return;
        _wantsRestart = false;
        _runLoop.execute(Priority::Default, [this] { start(); });
    }
    void onChange(Handler handler) override
    {
        std::lock_guard lock(_mutex);
        _handler = std::move(handler);
    }

private:
    void allow(const std::set<std::string>& sources)
    {
        if (sources == _allowed) return;
        _allowed = sources;
        if (_allowed.empty()) return stop("no source is allowed");
        // A client keeps the accuracy that it was started with, and the last place is told again to none.
        if (!_clientPath.empty()) stop("other sources are allowed");
        start();
    }

    void start()
    {
        if (_allowed.empty() || _isAsking || !_clientPath.empty()) return;
        if (!_bus) {
            if (const int failed = sd_bus_open_system(&_bus); failed < 0) return lose("no system bus", true);
            sd_bus_attach_event(_bus, _runLoop.handle(), SD_EVENT_PRIORITY_NORMAL);
        }
        _isAsking = sd_bus_call_method_async(_bus, nullptr, kService, kManagerPath, "org.freedesktop.GeoClue2.Manager",
                                             "GetClient", handler<&GeoClueLocation::gotClient>, this, "") >= 0;
    }

    int gotClient(sd_bus_message* message)
    {
        const char* path = nullptr;
        _isAsking = false;
        if (_allowed.empty()) return 0;
        if (sd_bus_message_is_method_error(message, nullptr) || sd_bus_message_read(message, "o", &path) < 0) {
            lose("GeoClue is not there", true);
            return 0;
        }
        _clientPath = path;
        sd_bus_match_signal_async(_bus, &_updates, kService, path, kClientInterface, "LocationUpdated",
                                  handler<&GeoClueLocation::locationUpdated>, nullptr, this);
        setClientProperty("DesktopId", "s", _desktopId.c_str());
        const std::uint32_t accuracy = _allowed.contains("gps")    ? kAccuracyExact
                                       : _allowed.contains("wifi") ? kAccuracyStreet
                                                                   : kAccuracyCity;
        setClientProperty("RequestedAccuracyLevel", "u", accuracy);
        sd_bus_call_method_async(_bus, nullptr, kService, path, kClientInterface, "Start",
                                 handler<&GeoClueLocation::started>, this, "");
        return 0;
    }

    template <class T> void setClientProperty(const char* name, const char* type, T value)
    {
        sd_bus_call_method_async(_bus, nullptr, kService, _clientPath.c_str(), "org.freedesktop.DBus.Properties", "Set",
                                 nullptr, nullptr, "ssv", kClientInterface, name, type, value);
    }

    int started(sd_bus_message* message)
    {
        if (const sd_bus_error* error = sd_bus_message_get_error(message)) {
            _clientPath.clear();
            _updates = sd_bus_slot_unref(_updates);
            lose(error->message ? error->message : "GeoClue refused", true);
        }
        return 0;
    }

    int locationUpdated(sd_bus_message* message)
    {
        const char* before = nullptr;
        const char* now = nullptr;
        if (sd_bus_message_read(message, "oo", &before, &now) < 0) return 0;
        sd_bus_call_method_async(_bus, nullptr, kService, now, "org.freedesktop.DBus.Properties", "GetAll",
                                 handler<&GeoClueLocation::gotLocation>, this, "s", kLocationInterface);
        return 0;
    }

    int gotLocation(sd_bus_message* message)
    {
        std::optional<double> latitude;
        std::optional<double> longitude;
        double accuracy = 1e6;
        if (sd_bus_message_is_method_error(message, nullptr)) return 0;
        if (sd_bus_message_enter_container(message, 'a', "{sv}") < 0) return 0;
        while (sd_bus_message_enter_container(message, 'e', "sv") > 0) {
            const char* name = nullptr;
            double number = 0;
            if (sd_bus_message_read(message, "s", &name) < 0) return 0;
            const std::string_view key = name;
            const bool wanted = key == "Latitude" || key == "Longitude" || key == "Accuracy";
            if (!wanted)
                sd_bus_message_skip(message, "v");
            else if (sd_bus_message_read(message, "v", "d", &number) < 0)
                return 0;
            if (key == "Latitude")
                latitude = number;
            else if (key == "Longitude")
                longitude = number;
            else if (key == "Accuracy")
                accuracy = number;
            sd_bus_message_exit_container(message);
        }
        if (!latitude || !longitude) return 0;
        std::string source = sourceForAccuracy(accuracy);
        if (!_allowed.contains(source)) {
            lose("its source is not allowed", false);
            return 0;
        }
        set(fuzz(*latitude, *longitude, std::move(source)), "");
        return 0;
    }

    void stop(const char* reason)
    {
        _updates = sd_bus_slot_unref(_updates);
        if (!_clientPath.empty()) {
            sd_bus_call_method_async(_bus, nullptr, kService, _clientPath.c_str(), kClientInterface, "Stop", nullptr,
                                     nullptr, "");
            _clientPath.clear();
        }
        lose(reason, false);
    }

    void lose(const std::string& reason, bool mayRestart)
    {
        {
            std::lock_guard lock(_mutex);
            _wantsRestart = mayRestart && _restarts++ < kMaximumRestarts;
        }
        defaultLog().info("no location: {}", reason);
        set(std::nullopt, reason);
    }

    void set(std::optional<Location> location, const std::string& reason)
    {
        Handler handler;
        {
            std::lock_guard lock(_mutex);
            if (location == _current) return;
            _current = location;
            handler = _handler;
        }
        if (handler) handler(location, reason);
    }

    /// A bus callback that calls a member.
    template <int (GeoClueLocation::*member)(sd_bus_message*)>
    static int handler(sd_bus_message* message, void* self, sd_bus_error*)
    {
        return (static_cast<GeoClueLocation*>(self)->*member)(message);
    }

    static constexpr int kMaximumRestarts = 3;

    RunLoop& _runLoop;
    const std::string _desktopId;
    sd_bus* _bus = nullptr; // loop's thread, like the next four
    sd_bus_slot* _updates = nullptr;
    bool _isAsking = false; // for a client
    std::set<std::string> _allowed;
    std::string _clientPath;
    std::mutex _mutex;
    std::optional<Location> _current; // under the mutex, like the next three
    bool _wantsRestart = false;
    int _restarts = 0;
    Handler _handler;
};

} // namespace

std::unique_ptr<LocationSource> makeGeoClueLocationSource(RunLoop& runLoop, std::string desktopId)
{
    return std::make_unique<GeoClueLocation>(runLoop, std::move(desktopId));
}

} // namespace platform
