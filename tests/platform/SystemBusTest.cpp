#include <csignal>
#include <cstdlib>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>
#include <systemd/sd-bus.h>

#include "platform/base/Log.h"
#include "platform/device/DeviceUse.h"
#include "platform/device/DeviceUseLogind.h"
#include "platform/device/LocationSource.h"
#include "platform/device/LocationSourceGeoClue.h"
#include "platform/net/NetworkStatus.h"
#include "platform/net/NetworkStatusNetworkManager.h"
#include "platform/run/RunLoop.h"
#include "tests/support/ManualClock.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

using namespace std::chrono_literals;

/// A message bus of the test's own, in the system bus's place, and services on it whose properties the test sets.
struct SystemBusTest : testing::Test {
    SystemBusTest()
    {
        Log::threshold = LogLevel::Fault;
        test::writeFile(directory / "bus.conf",
                        "<busconfig><type>session</type><listen>unix:path=" + (directory / "bus").string() +
                            "</listen><policy context=\"default\"><allow send_destination=\"*\"/><allow own=\"*\"/>"
                            "<allow user=\"*\"/><allow receive_sender=\"*\"/></policy></busconfig>");
        startBus();
        setenv("DBUS_SYSTEM_BUS_ADDRESS", ("unix:path=" + (directory / "bus").string()).c_str(), 1);
    }
    void startBus()
    {
        int ready[2];
        EXPECT_EQ(pipe(ready), 0);
        const std::string configuration = "--config-file=" + (directory / "bus.conf").string();
        const std::string print = "--print-address=" + std::to_string(ready[1]);
        const char* const arguments[]{"dbus-daemon", "--nofork", configuration.c_str(), print.c_str(), nullptr};
        EXPECT_EQ(posix_spawnp(&daemon, arguments[0], nullptr, nullptr, const_cast<char* const*>(arguments), environ),
                  0);
        close(ready[1]);
        char byte = 0;
        EXPECT_EQ(read(ready[0], &byte, 1), 1) << "dbus-daemon doesn't start";
        close(ready[0]);
    }
    void stopBus()
    {
        sd_bus_flush_close_unref(std::exchange(service, nullptr));
        if (daemon <= 0) return;
        kill(daemon, SIGTERM);
        waitpid(std::exchange(daemon, 0), nullptr, 0);
    }
    ~SystemBusTest() override
    {
        stopBus();
        unsetenv("DBUS_SYSTEM_BUS_ADDRESS");
    }

    void serve(const char* name)
    {
        ASSERT_GE(sd_bus_open_system(&service), 0);
        sd_bus_attach_event(service, loop.handle(), SD_EVENT_PRIORITY_NORMAL);
        ASSERT_GE(sd_bus_request_name(service, name, 0), 0);
    }

    test::TemporaryDirectory directory;
    test::ManualClock clock;
    pid_t daemon = 0;
    RunLoop loop;
    sd_bus* service = nullptr;
};

struct Network {
    std::uint32_t state = 70;
    std::uint32_t metered = 2;
};
const sd_bus_vtable kNetwork[]{
    SD_BUS_VTABLE_START(0),
    SD_BUS_PROPERTY("State", "u", nullptr, offsetof(Network, state), SD_BUS_VTABLE_PROPERTY_EMITS_CHANGE),
    SD_BUS_PROPERTY("Metered", "u", nullptr, offsetof(Network, metered), SD_BUS_VTABLE_PROPERTY_EMITS_CHANGE),
    SD_BUS_VTABLE_END,
};

TEST_F(SystemBusTest, NetworkManagerIsFollowedAndMayGo)
{
    constexpr const char* kName = "org.freedesktop.NetworkManager";
    constexpr const char* kPath = "/org/freedesktop/NetworkManager";
    Network network{.metered = 1};
    serve(kName);
    sd_bus_add_object_vtable(service, nullptr, kPath, kName, kNetwork, &network);
    const auto status = makeNetworkManagerStatus(loop, clock);
    EXPECT_EQ(status->current(), std::nullopt);
    const auto becomes = [&](const NetworkState& state) {
        return test::runUntil(loop, [&] { return status->current() == state; });
    };
    EXPECT_TRUE(becomes({.online = true, .metered = true}));
    network = {.state = 20, .metered = 0};
    sd_bus_emit_properties_changed(service, kPath, kName, "State", "Metered", nullptr);
    EXPECT_TRUE(becomes({.online = false}));
    sd_bus_release_name(service, kName);
    EXPECT_TRUE(becomes({})) << "without it, the network is taken as there";
    sd_bus_request_name(service, kName, 0);
    EXPECT_TRUE(becomes({.online = false})) << "back again";

    stopBus();
    EXPECT_TRUE(becomes({}));
    const auto nextAttempt = [&](std::chrono::seconds delay) {
        clock.advance(delay, [] {});
        bool done = false;
        loop.execute(Priority::Default, [&] { done = true; });
        EXPECT_TRUE(test::runUntil(loop, [&] { return done; }));
    };
    nextAttempt(5s);
    startBus();
    serve(kName);
    sd_bus_add_object_vtable(service, nullptr, kPath, kName, kNetwork, &network);
    nextAttempt(10s);
    EXPECT_TRUE(becomes({.online = false})) << "the bus has restarted";
}

struct Session {
    int active = 1, idle = 0, locked = 0;
};
const sd_bus_vtable kSession[]{
    SD_BUS_VTABLE_START(0),
    SD_BUS_PROPERTY("Active", "b", nullptr, offsetof(Session, active), 0),
    SD_BUS_PROPERTY("IdleHint", "b", nullptr, offsetof(Session, idle), 0),
    SD_BUS_PROPERTY("LockedHint", "b", nullptr, offsetof(Session, locked), 0),
    SD_BUS_VTABLE_END,
};

TEST_F(SystemBusTest, LogindSaysWhetherSomeoneIsAtTheScreen)
{
    auto use = makeSystemDeviceUse(loop, directory.path);
    const auto ask = [&] {
        std::optional<DeviceUse> answer;
        use->ask([&](const DeviceUse& found) { answer = found; });
        EXPECT_EQ(answer, std::nullopt) << "never inside the call";
        EXPECT_TRUE(test::runUntil(loop, [&] { return answer.has_value(); }));
        EXPECT_EQ(use->last(), answer);
        return answer.value_or(DeviceUse());
    };
    EXPECT_EQ(ask(), DeviceUse()) << "there is no logind";
    serve("org.freedesktop.login1");
    use = makeSystemDeviceUse(loop, directory.path);
    EXPECT_EQ(ask(), (DeviceUse{.unlocked = false})) << "nobody has logged in yet";
    Session session;
    sd_bus_slot* slot = nullptr;
    sd_bus_add_object_vtable(service, &slot, "/org/freedesktop/login1/session/auto", "org.freedesktop.login1.Session",
                             kSession, &session);
    const std::pair<Session, bool> cases[]{
        {{1, 0, 0}, true}, {{0, 0, 0}, false}, {{1, 1, 0}, false}, {{1, 0, 1}, false}};
    for (const auto& [now, inUse] : cases) {
        session = now;
        EXPECT_EQ(ask(), (DeviceUse{.screenInUse = inUse}));
    }
    sd_bus_slot_unref(slot);
    EXPECT_EQ(ask(), DeviceUse()) << "logged out, but has been there";
}

/// A GeoClue with one client, which is at one place until it is moved.
struct GeoClue {
    double latitude = 47.37, longitude = 8.54, accuracy = 20;
    std::uint32_t wanted = 0;    // the accuracy level of the client
    std::uint32_t threshold = 0; // metres
    char* desktopId = nullptr;   // sd-bus allocates it
    int started = 0, stopped = 0;

    ~GeoClue() { free(desktopId); }
    void fix(sd_bus* bus) const
    {
        sd_bus_emit_signal(bus, "/client", "org.freedesktop.GeoClue2.Client", "LocationUpdated", "oo", "/", "/place");
    }
};
GeoClue& geoClue(void* data)
{
    return *static_cast<GeoClue*>(data);
}
const sd_bus_vtable kGeoClueManager[]{
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD(
        "GetClient", "", "o",
        +[](sd_bus_message* call, void*, sd_bus_error*) { return sd_bus_reply_method_return(call, "o", "/client"); },
        SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
};
const sd_bus_vtable kGeoClueClient[]{
    SD_BUS_VTABLE_START(0),
    SD_BUS_WRITABLE_PROPERTY("DesktopId", "s", nullptr, nullptr, offsetof(GeoClue, desktopId),
                             SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_WRITABLE_PROPERTY("DistanceThreshold", "u", nullptr, nullptr, offsetof(GeoClue, threshold),
                             SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_WRITABLE_PROPERTY("RequestedAccuracyLevel", "u", nullptr, nullptr, offsetof(GeoClue, wanted),
                             SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD(
        "Start", "", "",
        +[](sd_bus_message* call, void* data, sd_bus_error*) {
            ++geoClue(data).started;
            sd_bus_reply_method_return(call, "");
            geoClue(data).fix(sd_bus_message_get_bus(call));
            return 1;
        },
        SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD(
        "Stop", "", "",
        +[](sd_bus_message* call, void* data, sd_bus_error*) {
            ++geoClue(data).stopped;
            return sd_bus_reply_method_return(call, "");
        },
        SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_SIGNAL("LocationUpdated", "oo", 0),
    SD_BUS_VTABLE_END,
};
const sd_bus_vtable kGeoCluePlace[]{
    SD_BUS_VTABLE_START(0),
    SD_BUS_PROPERTY("Latitude", "d", nullptr, offsetof(GeoClue, latitude), 0),
    SD_BUS_PROPERTY("Longitude", "d", nullptr, offsetof(GeoClue, longitude), 0),
    SD_BUS_PROPERTY("Accuracy", "d", nullptr, offsetof(GeoClue, accuracy), 0),
    SD_BUS_VTABLE_END,
};

TEST_F(SystemBusTest, GeoClueIsAskedAsExactlyAsIsAllowedAndAnewWhereThatChanges)
{
    GeoClue geo;
    serve("org.freedesktop.GeoClue2");
    sd_bus_add_object_vtable(service, nullptr, "/org/freedesktop/GeoClue2/Manager", "org.freedesktop.GeoClue2.Manager",
                             kGeoClueManager, &geo);
    sd_bus_add_object_vtable(service, nullptr, "/client", "org.freedesktop.GeoClue2.Client", kGeoClueClient, &geo);
    sd_bus_add_object_vtable(service, nullptr, "/place", "org.freedesktop.GeoClue2.Location", kGeoCluePlace, &geo);
    const auto location = makeGeoClueLocationSource(loop, "com.example.service");
    std::vector<std::string> told;
    location->onChange(
        [&](const auto& place, const std::string& reason) { told.push_back(place ? place->source : reason); });
    const auto becomes = [&](const std::optional<Location>& place) {
        return test::runUntil(loop, [&] { return location->current() == place; });
    };
    const struct {
        std::set<std::string> allowed;
        double accuracy;
        std::uint32_t level;
        std::string source;
    } cases[]{
        {{"cell"}, 5000, 4, "cell"}, {{"gps"}, 20, 8, "gps"},         {{"wifi", "cell"}, 300, 6, "wifi"},
        {{"gps"}, 20, 8, "gps"},     {{"gps", "cell"}, 20, 8, "gps"},
    };
    int started = 0;
    for (const auto& c : cases) {
        geo.accuracy = c.accuracy;
        location->setAllowedSources(c.allowed);
        EXPECT_TRUE(test::runUntil(loop, [&] { return geo.started == started + 1; }));
        EXPECT_TRUE(becomes(fuzz(geo.latitude, geo.longitude, c.source))) << c.source;
        EXPECT_EQ(geo.wanted, c.level);
        EXPECT_EQ(geo.stopped, started++) << "the one before";
    }
    EXPECT_STREQ(geo.desktopId, "com.example.service");
    EXPECT_EQ(geo.threshold, 200u) << "every fix of a device at rest wakes the daemon";
    geo.accuracy = 300;
    geo.fix(service);
    EXPECT_TRUE(becomes(std::nullopt));
    EXPECT_EQ(told.back(), "its source is not allowed");
    geo.latitude = -33.9;
    geo.longitude = 18.4;
    geo.accuracy = 20;
    geo.stopped = 0;
    geo.fix(service);
    EXPECT_TRUE(becomes(fuzz(-33.9, 18.4, "gps")));
    sd_bus_release_name(service, "org.freedesktop.GeoClue2");
    EXPECT_TRUE(becomes(std::nullopt));
    EXPECT_EQ(told.back(), "GeoClue has gone");
    sd_bus_request_name(service, "org.freedesktop.GeoClue2", 0);
    location->requestUpdate();
    EXPECT_TRUE(becomes(fuzz(-33.9, 18.4, "gps"))) << "back again";
    ++started;
    location->setAllowedSources({});
    EXPECT_TRUE(becomes(std::nullopt));
    location->setAllowedSources({"gps"});
    location->setAllowedSources({}); // while a client is asked for
    EXPECT_TRUE(test::runUntil(loop, [&] { return geo.stopped == 1; }));
    geo.fix(service);
    loop.runOnce(Duration::zero());
    EXPECT_EQ(geo.started, started);
    EXPECT_EQ(location->current(), std::nullopt);
}

} // namespace
} // namespace platform
