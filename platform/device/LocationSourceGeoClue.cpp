#include "platform/device/LocationSourceGeoClue.h"

#include "platform/base/Log.h"
#include "platform/base/Mutex.h"
#include "platform/device/LocationSource.h"
#include "platform/ipc/SystemBus.h"
#include "platform/run/RunLoop.h"
#include "platform/values/Dictionary.h"

namespace platform {

namespace {

constexpr const char* kGeoClue = "org.freedesktop.GeoClue2";

// GeoClue's accuracy levels.
constexpr std::uint32_t kAccuracyCity = 4;
constexpr std::uint32_t kAccuracyStreet = 6;
constexpr std::uint32_t kAccuracyExact = 8;
/// Metres below which a move is not reported: a fifth of a cell of `fuzz`. A device at rest then wakes nobody.
constexpr std::uint32_t kReportedMove = 200;

/// Returns true if there is no bus, or nobody on it provides the service.
bool isAbsence(const ipc::CallError& error)
{
    return error.name == "org.freedesktop.DBus.Error.Disconnected" ||
           error.name == "org.freedesktop.DBus.Error.ServiceUnknown";
}

/// GeoClue doesn't report the source of a fix; this guesses it from the accuracy in metres.
std::string sourceForAccuracy(double metres)
{
    return metres <= 50 ? "gps" : metres <= 1500 ? "wifi" : "cell";
}

class GeoClueLocation final : public LocationSource {
public:
    GeoClueLocation(RunLoop& runLoop, std::string desktopId)
        : _runLoop(runLoop), _desktopId(std::move(desktopId)),
          _bus(runLoop, ipc::SystemBus::Bus::System, [this] { forget("the system bus has disconnected"); })
    {}

    void setAllowedSources(std::set<std::string> sources) override
    {
        _runLoop.execute(Priority::Default, [this, sources = std::move(sources)] { allow(sources); });
    }
    std::optional<Location> current() override
    {
        MutexLock lock(_mutex);
        return _current;
    }
    void requestUpdate() override
    {
        // A running client reports every move, so only a failed start is repeated, and not on a device without GeoClue.
        MutexLock lock(_mutex);
        if (!_wantsRestart) return;
        _wantsRestart = false;
        _runLoop.execute(Priority::Default, [this] { start(); });
    }
    void onChange(Handler handler) override
    {
        MutexLock lock(_mutex);
        _handler = std::move(handler);
    }

private:
    void allow(const std::set<std::string>& sources)
    {
        if (sources == _allowed) return;
        _allowed = sources;
        if (_allowed.empty()) return stop("no source is allowed");
        // A client keeps the accuracy with which it was started, so other sources need another client.
        if (_client) stop("other sources are allowed");
        start();
    }

    void start()
    {
        if (_allowed.empty() || _isAsking || _client) return;
        _isAsking = true;
        _bus.call({kGeoClue, "/org/freedesktop/GeoClue2/Manager", "org.freedesktop.GeoClue2.Manager"}, "GetClient",
                  [this](const ipc::CallResult& result) { gotClient(result); });
    }

    void gotClient(const ipc::CallResult& result)
    {
        _isAsking = false;
        if (_allowed.empty()) return;
        const std::string* path = result && !result->args.empty() ? result->args[0].asString() : nullptr;
        if (!path)
            return lose(result ? "GeoClue gave no client" : result.error().message,
                        _wasThere || result || !isAbsence(result.error()));
        _wasThere = true;
        _client = {kGeoClue, *path, "org.freedesktop.GeoClue2.Client"};
        _updates = _bus.onSignal(*_client, "LocationUpdated", [this](const ipc::CallResult& places) {
            // The arguments are the old and the new location.
            if (places && places->args.size() == 2 && places->args[1].asString()) read(*places->args[1].asString());
        });
        _owner = _bus.onOwnerChange(kGeoClue, [this] { forget("GeoClue has gone"); });
        _bus.setProperty(*_client, "DesktopId", "s", _desktopId);
        _bus.setProperty(*_client, "RequestedAccuracyLevel", "u",
                         _allowed.contains("gps")    ? kAccuracyExact
                         : _allowed.contains("wifi") ? kAccuracyStreet
                                                     : kAccuracyCity);
        _bus.setProperty(*_client, "DistanceThreshold", "u", kReportedMove);
        _bus.call(*_client, "Start", [this](const ipc::CallResult& started) {
            if (!started) forget(started.error().message);
        });
    }

    void read(const std::string& place)
    {
        _bus.getProperties({kGeoClue, place, "org.freedesktop.GeoClue2.Location"}, [this](const auto& properties) {
            if (!properties) return;
            const auto number = [&](const char* name) {
                const Value* value = properties->find(name);
                return value ? value->asDouble() : std::nullopt;
            };
            const auto latitude = number("Latitude");
            const auto longitude = number("Longitude");
            if (!latitude || !longitude) return;
            constexpr double kUnknown = 1e6;
            std::string source = sourceForAccuracy(number("Accuracy").value_or(kUnknown));
            if (!_allowed.contains(source)) return lose("its source is not allowed", false);
            set(fuzz(*latitude, *longitude, std::move(source)), "");
        });
    }

    void stop(const char* reason)
    {
        if (_client) _bus.call(*_client, "Stop");
        endClient();
        lose(reason, false);
    }

    /// Drops a client that is dead already; `requestUpdate` may start another.
    void forget(const std::string& reason)
    {
        endClient();
        lose(reason, true);
    }

    void endClient()
    {
        _updates.reset();
        _owner.reset();
        _client.reset();
    }

    void lose(const std::string& reason, bool mayRestart)
    {
        {
            MutexLock lock(_mutex);
            _wantsRestart = mayRestart && _restarts++ < kMaximumRestarts;
        }
        defaultLog().info("no location: {}", reason);
        set(std::nullopt, reason);
    }

    void set(std::optional<Location> location, const std::string& reason)
    {
        Handler handler;
        {
            MutexLock lock(_mutex);
            if (location) _restarts = 0;
            if (location == _current) return;
            _current = location;
            handler = _handler;
        }
        if (handler) handler(location, reason);
    }

    static constexpr int kMaximumRestarts = 3; // without a location in between

    RunLoop& _runLoop;
    const std::string _desktopId;
    ipc::SystemBus _bus; // run loop's thread, like the next six
    ipc::SystemBus::Watch _updates;
    ipc::SystemBus::Watch _owner;
    bool _isAsking = false; // GetClient is pending
    bool _wasThere = false; // GeoClue has provided a client
    std::set<std::string> _allowed;
    std::optional<ipc::SystemBus::Object> _client;
    Mutex _mutex;
    std::optional<Location> _current GUARDED_BY(_mutex);
    bool _wantsRestart GUARDED_BY(_mutex) = false;
    int _restarts GUARDED_BY(_mutex) = 0;
    Handler _handler GUARDED_BY(_mutex);
};

} // namespace

std::unique_ptr<LocationSource> makeGeoClueLocationSource(RunLoop& runLoop, std::string desktopId)
{
    return std::make_unique<GeoClueLocation>(runLoop, std::move(desktopId));
}

} // namespace platform
