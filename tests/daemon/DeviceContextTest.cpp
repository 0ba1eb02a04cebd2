// What the device is like, from the device to what the daemon sends and does.

#include <cstdlib>

#include <gtest/gtest.h>

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Json.h"
#include "tavrind/Assembly.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinUserGUIDController.h"
#include "tavrind/TAVTracing.h"
#include "tests/support/DaemonFixture.h"

namespace tavrin::test {
namespace {

using namespace std::chrono_literals;
using platform::Location;
using platform::Url;

const Location kZurich{47.375, 8.545, "wifi"};
const Location kGeneva{46.205, 6.145, "wifi"};

struct DeviceContextTest : DaemonTest {
    void startWithBag(const char* sources = R"(["wifi"])")
    {
        startWithoutBag();
        bag(sources);
    }
    void bag(const char* sources)
    {
        auto fresh = platform::parseJson(kBag).value();
        fresh.mutableDictionary().set("supportedGeoLocationSources", platform::parseJson(sources).value());
        device.notifications.post(
            {.name = TAVBagChangeNotification,
             .userInfo = {{"bag", std::make_shared<const TAVBag>(std::move(fresh), "Vistrel/4")}}});
        device.drain();
    }
    void move(std::optional<Location> location)
    {
        device.location.moveTo(std::move(location));
        device.drain();
    }
    std::string header(const platform::UrlRequest& request, const char* name)
    {
        const std::string* value = request.headers.find(name);
        return value ? *value : "";
    }
};

TEST_F(DeviceContextTest, SomeKindsOfRequestAskWhereTheDeviceIs)
{
    startWithoutBag();
    auto connection = client();
    deliverBag();
    const struct {
        const char* className;
        Dictionary fields;
        int updates;
    } cases[]{
        {"TAVSearchRequest", {{"queryString", "weather"}}, 1},
        {"TAVZeroKeywordRequest", {}, 1},
        {"TAVMoreResultsRequest", {{"moreResultsURL", "https://m.example/x?q=1"}}, 1},
        {"TAVMoreResultsRequest", {{"moreResultsURL", "https://m.example/x?latlng=1,2"}}, 0},
        {"TAVLookupRequest", {{"queryString", "tree"}}, 1},
        {"TAVCardRequest", {{"cardURL", "https://c.example/card"}}, 0},
    };
    std::int64_t queryId = 0;
    for (const auto& c : cases) {
        const int before = device.location.updatesRequested;
        const std::size_t requests = tasks().size();
        (void)request(*connection, c.className, ++queryId, c.fields);
        EXPECT_EQ(tasks().size(), requests + 1) << c.className;
        EXPECT_EQ(device.location.updatesRequested - before, c.updates) << c.className;
        respond("[]"); // a lookup would be repeated after the end of the test
    }
}

TEST_F(DeviceContextTest, DownloadsTellThePlaceOfTheLastSearchUntilItIsLost)
{
    startWithBag();
    const auto& factory = assembly().requestFactory;
    const auto place = [&](bool included = true) {
        return header(factory->fileDownloadRequest(*Url::parse("https://r.example/"), "", included),
                      "X-Quorvane-FuzzedLatLong");
    };
    const auto performSearch = [&] {
        factory->setPerformedSearch();
        device.drain();
    };
    performSearch();
    move(kZurich);
    EXPECT_EQ(place(), "") << "no search was made here";
    performSearch();
    EXPECT_EQ(place(), "47.375000,8.545000");
    EXPECT_EQ(place(false), "");
    move(kGeneva);
    EXPECT_EQ(place(), "47.375000,8.545000");
    performSearch();
    EXPECT_EQ(place(), "46.205000,6.145000");
    move(std::nullopt);
    EXPECT_EQ(place(), "");
    move(kZurich);
    EXPECT_EQ(place(), "");
    performSearch();
    bag("[]");
    EXPECT_EQ(place(), "") << "the bag has withdrawn the source";
}

TEST_F(DeviceContextTest, ABagWithdrawsSources)
{
    startWithBag();
    move(kZurich);
    EXPECT_EQ(assembly().requestFactory->context().geoLocationLatLng, "47.375000,8.545000");
    bag(R"(["gps", "cell"])");
    EXPECT_EQ(device.location.allowed, (std::set<std::string>{"cell", "gps"}));
    EXPECT_EQ(assembly().requestFactory->context().geoLocationLatLng, "");
    EXPECT_EQ(assembly().requestFactory->context().geoLocationSource, "");
    move(kZurich);
    EXPECT_EQ(assembly().requestFactory->context().geoLocationLatLng, "") << "reported late";
}

TEST_F(DeviceContextTest, LanguagesThatCannotBeEncodedAreLeftOut)
{
    for (const auto& [language, header] : {std::pair("de-CH", R"(["de-CH","en"])"), {"d\xc3\xa9", ""}, {"d e", ""}}) {
        const platform::test::LogCapture log;
        device.locale.context.preferredLanguages = {language, "en"};
        startWithoutBag();
        EXPECT_EQ(this->header(lastTask()->originalRequest(), "X-Quorvane-Languages"), header) << language;
        EXPECT_EQ(log.count("Error encoding preferred languages"), *header ? 0 : 1) << language;
    }
}

TEST_F(DeviceContextTest, TheFactoryTakesANewGuid)
{
    startWithBag();
    const auto first = assembly().guidController->currentUserGUID();
    assembly().guidController->reset();
    device.drain();
    const auto second = assembly().requestFactory->context().userGuid;
    EXPECT_NE(second, first);
    EXPECT_EQ(second, assembly().guidController->currentUserGUID());
}

TEST_F(DeviceContextTest, ALookupIsRepeatedUntilTheClientsTimeOut)
{
    startWithoutBag();
    auto connection = connect();
    connection->call("Configure", {Value::dictionaryOf({{"class", "TAVSessionConfiguration"},
                                                        {"identifier", "com.quorvane.vistrel"},
                                                        {"userAgent", "Vistrel/4"},
                                                        {"timeoutIntervalForRequest", 5.0}})});
    device.drain();
    deliverBag();
    for (const auto& [passed, attempts] : {std::pair(4s, 2u), {6s, 1u}}) {
        auto lookup = request(*connection, "TAVLookupRequest", passed.count(), {{"queryString", "tree"}});
        const std::size_t before = tasks().size();
        device.advance(passed);
        lastTask()->fail(platform::Error("X", 1));
        device.advance(0s);
        EXPECT_EQ(tasks().size() - before + 1, attempts) << passed.count();
        EXPECT_EQ(lookup->answered(), attempts == 1) << passed.count();
    }
}

TEST_F(DeviceContextTest, SettingsAreReadAtStart)
{
    const std::string file = "/caches/com.quorvane.tavrind/session.7";
    start();
    EXPECT_TRUE(device.loader.sessions[0]->configuration.allowFastOpenAndTickets);
    const bool privateData = platform::Log::privateData.exchange(false);
    start();
    EXPECT_FALSE(platform::Log::privateData);
    device.userDefaults.set("TAVNoParallax", true);
    device.userDefaults.set("TAVLogPrivateData", true);
    start();
    EXPECT_FALSE(device.loader.sessions[0]->configuration.allowFastOpenAndTickets);
    EXPECT_TRUE(platform::Log::privateData);
    platform::Log::privateData = privateData;

    for (const auto& [age, kept] : {std::pair(7200.0, true), {3600.0, false}}) {
        device.userDefaults.set("TAVSessionMaxAge", age);
        device.files.directories.insert("/caches/com.quorvane.tavrind");
        device.files.files[file] = "";
        device.files.created[file] = device.clock.wallNow() - 5400s;
        start();
        EXPECT_EQ(device.files.files.contains(file), kept) << age;
    }
}

TEST(TracingDeathTest, IsSwitchedByItsSettingOncePerProcess)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe"); // in processes of their own, which have read nothing yet
    for (const bool enabled : {false, true})
        EXPECT_EXIT(
            {
                platform::test::TestDevice device;
                device.userDefaults.set("TraceEnabled", enabled);
                TAVTracingSetup(device.userDefaults);
                device.userDefaults.set("TraceEnabled", !enabled);
                TAVTracingSetup(device.userDefaults);
                std::exit(TAVTraceEnabled ? 7 : 8);
            },
            testing::ExitedWithCode(enabled ? 7 : 8), "");
}

TEST_F(DeviceContextTest, WhatStartedTheDaemonIsLogged)
{
    const platform::test::LogCapture log;
    device.device.launchEvents = {"due.timer", "daemon.socket"};
    start();
    EXPECT_EQ(log.count("launch event for due.timer"), 1);
    EXPECT_EQ(log.count("launch event for daemon.socket"), 1);
}

} // namespace
} // namespace tavrin::test
