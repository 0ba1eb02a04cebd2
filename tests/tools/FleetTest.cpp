#include <gmock/gmock.h>

#include "platform/base/Log.h"
#include "platform/files/Files.h"
#include "tools/fleet/Report.h"
#include "tools/fleet/SimulatedDevice.h"

namespace tavrin::fleet {
namespace {

using namespace std::chrono_literals;

const std::vector<replay::TypedQuery>& corpus()
{
    static const auto queries = [] {
        const auto text = platform::makeSystemFiles()->read(SOURCE_DIR "/tools/replay/corpus.txt", 1u << 20);
        auto parsed = replay::parseCorpus(text.value().view()).value();
        parsed.resize(40);
        return parsed;
    }();
    return queries;
}

struct FleetTest : testing::Test {
    FleetTest() { platform::Log::threshold = platform::LogLevel::Fault; }
    ~FleetTest() override { platform::Log::threshold = platform::LogLevel::Default; }

    Traffic simulate(std::string_view scenarioName, std::uint64_t devices, int days, std::uint64_t seed = 1,
                     Duration bin = 5min)
    {
        const Typing typing(corpus(), assumptions, 40);
        const World world(assumptions, typing, *zonesNamed(zones), days);
        scenario = *scenarioNamed(scenarioName, days, busiestHour(world.zones, world.curve));
        Traffic traffic(world.end, bin);
        for (std::uint64_t device = 0; device < devices; ++device)
            SimulatedDevice(world, scenario, mixed(seed * 1'000'003 + device), traffic).run();
        return traffic;
    }
    /// The bins in which there were requests of a kind.
    static std::vector<std::size_t> binsWith(const Traffic& traffic, Kind kind)
    {
        std::vector<std::size_t> bins;
        for (std::size_t bin = 0; bin < traffic.size(); ++bin)
            if (traffic.requests(bin, kind) > 0) bins.push_back(bin);
        return bins;
    }

    Assumptions assumptions;
    std::string zones = "world";
    Scenario scenario{};
};

TEST_F(FleetTest, EverySessionBecomesOneUploadInEveryScenario)
{
    for (const ScenarioName& name : scenarioNames()) {
        const Traffic traffic = simulate(name.name, 100, 2);
        EXPECT_GT(traffic.sessions, 1000u) << name.name;
        EXPECT_EQ(traffic.sessions, traffic.sent + traffic.lost + traffic.expired + traffic.waiting) << name.name;
        EXPECT_EQ(traffic.lost > 0, name.name == "busy") << name.name;
        EXPECT_EQ(traffic.expired, 0u) << name.name;
    }
}

TEST_F(FleetTest, ASeedMakesTheSameFleetAgain)
{
    const std::string first = csv(simulate("outage", 20, 2), nullptr);
    EXPECT_EQ(first, csv(simulate("outage", 20, 2), nullptr));
    EXPECT_NE(first, csv(simulate("outage", 20, 2, 2), nullptr));
}

TEST_F(FleetTest, AnHoursOutageAtMostTriplesTheMean)
{
    const Traffic usual = simulate("week", 1000, 2, 1, 30min);
    const Traffic traffic = simulate("outage", 1000, 2, 1, 30min);
    for (std::size_t bin = 0; bin < traffic.size(); ++bin) {
        const auto& counts =
            scenario.outage->contains(bin * traffic.bin()) ? traffic.answered(bin) : traffic.refused(bin);
        EXPECT_THAT(counts, testing::Each(0u)) << bin;
    }
    const Peak peak = peakOf(traffic, usual, scenario.incident, {});
    EXPECT_GT(peak.during, peak.usual);
    EXPECT_LE(peak.during, 3);
    EXPECT_LE(peak.after, 3);
    const Peak uploads = peakOf(traffic, usual, scenario.incident, Kind::Upload);
    EXPECT_LE(uploads.during, 4) << "retries within minutes make it 7";
    EXPECT_LE(uploads.after, 3.5);
    EXPECT_LE(peak.untilNormal, 4h);
}

TEST_F(FleetTest, AClockThatIsSetBackDoesNotTurnNightIntoDay)
{
    const auto lastDay = [&](std::string_view name) {
        const Traffic traffic = simulate(name, 300, 3, 1, 1h);
        double requests = 0;
        for (std::size_t bin = 48; bin < traffic.size(); ++bin) requests += traffic.requests(bin, {});
        return requests;
    };
    EXPECT_NEAR(lastDay("clock-change") / lastDay("week"), 1, 0.1);
}

TEST_F(FleetTest, ADeviceKeepsToTheTimesOfItsPolicies)
{
    assumptions.alwaysOn = assumptions.meteredShare = 1;
    assumptions.crashesPerDay = assumptions.offlineDays = 0;
    zones = "one"; // UTC + 1 h
    for (std::uint64_t seed = 1; seed <= 5; ++seed) {
        const Traffic traffic = simulate("week", 1, 6, seed, 1min);
        const auto bags = binsWith(traffic, Kind::Bag);
        ASSERT_GT(bags.size(), 6u);
        for (std::size_t i = 1; i < bags.size(); ++i) EXPECT_GE(bags[i] - bags[i - 1], 229u) << "fresh for 3 h 50 min";
        const auto resources = binsWith(traffic, Kind::Resource);
        ASSERT_FALSE(resources.empty());
        for (const std::size_t bin : resources) {
            const auto after = std::ranges::upper_bound(bags, bin);
            ASSERT_NE(after, bags.begin());
            const auto since = bin - *std::prev(after);
            EXPECT_GE(since, 1u);
            EXPECT_LE(since, 61u + 13 * 60) << "an hour, and the metered hours";
            EXPECT_FALSE(bin % 1440 >= 8 * 60 && bin % 1440 < 15 * 60 + 30) << "metered";
        }
        const auto visits = binsWith(traffic, Kind::Warm), lookups = binsWith(traffic, Kind::Lookup);
        ASSERT_GT(visits.size(), 6u);
        for (const std::size_t bin : binsWith(traffic, Kind::Upload)) {
            // A session lasts for 10 to 15 minutes, and a pass follows within 10.
            const auto sessionBegan = [&](std::size_t use) { return use + 10 <= bin && bin <= use + 26; };
            EXPECT_TRUE(std::ranges::any_of(visits, sessionBegan) || std::ranges::any_of(lookups, sessionBegan)) << bin;
        }
    }
}

TEST(DailyCurve, HasItsEventsADayAndMostInTheEvening)
{
    const DailyCurve curve;
    Random random(1);
    Duration at{};
    int events = 0, evening = 0;
    for (; at < 24h * 1000; at = curve.next(at, 3, random), ++events) {
        const Duration hour = at % Duration(24h);
        if (hour >= 18h && hour < 22h) ++evening;
    }
    EXPECT_NEAR(events, 3000, 200);
    EXPECT_NEAR(evening, events * (1.40 + 1.6 + 1.75 + 1.7) / 24, 150);
    EXPECT_GT(curve.at(20h), 1.5);
}

TEST_F(FleetTest, TheCacheNeedsResponsesToAnswer)
{
    const auto searched = [&](double latency) {
        assumptions.latency = latency;
        unsigned keys = 0, searches = 0;
        const Typing typing(corpus(), assumptions, 40);
        for (const Visit& visit : typing.visits()) {
            keys += visit.keys;
            searches += visit.searches;
        }
        return static_cast<double>(searches) / keys;
    };
    EXPECT_LT(searched(0), 0.3);
    EXPECT_GT(searched(0.3), searched(0.1));
    EXPECT_GT(searched(10), 0.6) << "who types on before the first response asks for every key";
}

} // namespace
} // namespace tavrin::fleet
