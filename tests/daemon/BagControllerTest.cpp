#include <cmath>

#include "CoreTavrin/TAVBag.h"
#include "platform/values/PropertyList.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tests/support/FeedbackFixture.h"

namespace tavrin::test {
namespace {

const std::filesystem::path kPath = "/caches/com.quorvane.tavrind/bag.plist";

TEST(BagStaleness, IsDecidedByTimeThenByUrl)
{
    const auto now = platform::dateFromSecondsSince1970(1000000);
    const std::string url = "u";
    const auto same = [] { return std::string("u"); };
    const auto other = [] { return std::string("v"); };
    EXPECT_EQ(bagStaleness(1000599, &url, now, same), BagStaleness::Expired);
    EXPECT_EQ(bagStaleness(1000600, &url, now, same), BagStaleness::Fresh);
    EXPECT_EQ(bagStaleness(1000601, &url, now, same), BagStaleness::Fresh);
    EXPECT_EQ(bagStaleness(1000601, &url, now, other), BagStaleness::UrlChanged);
    EXPECT_EQ(bagStaleness(1000601, nullptr, now, same), BagStaleness::NoUrl);
    EXPECT_EQ(bagStaleness(std::nullopt, &url, now, same), BagStaleness::Expired);
    EXPECT_EQ(bagStaleness(NAN, &url, now, same), BagStaleness::Expired);
    EXPECT_EQ(bagStaleness(1014400, &url, now, same), BagStaleness::Fresh) << "just fetched";
    EXPECT_EQ(bagStaleness(1014402, &url, now, same), BagStaleness::Expired) << "fetched in the future";
    EXPECT_EQ(bagStaleness(1e300, &url, now, same), BagStaleness::Expired);
}

TEST(BagVersion, ComparesNumbersAsNumbers)
{
    const std::pair<const char*, const char*> ordered[]{
        {"9", "10"},   {"", "1"},    {"1.9", "1.10"},
        {"a2", "a10"}, {"1", "1.0"}, {"99999999999999999998", "99999999999999999999"}};
    for (const auto& [a, b] : ordered) {
        EXPECT_TRUE(versionPrecedes(a, b)) << a << " " << b;
        EXPECT_FALSE(versionPrecedes(b, a)) << a << " " << b;
    }
    EXPECT_FALSE(versionPrecedes("010", "10"));
    EXPECT_FALSE(versionPrecedes("10", "010"));
}

TEST(BagVersion, OneThatDoesNotComeIsAskedForLessAndLessOften)
{
    AnnouncedVersion announced;
    const auto at = [&](const char* version, const char* current, std::chrono::minutes now) {
        return announced.take(version, current, static_cast<std::uint64_t>(platform::Duration(now).count()));
    };
    const std::tuple<const char*, const char*, int, bool> steps[]{
        {"10", "8", 0, true},   {"10", "8", 0, false},    {"9", "8", 0, false},      {"10", "8", 1, true},
        {"10", "8", 2, false},  {"10", "8", 3, true},     {"10", "8", 6, false},     {"10", "8", 7, true},
        {"11", "8", 7, false},  {"11", "10", 7, true},    {"11", "10", 7, false},    {"11", "10", 8, true},
        {"12", "10", 8, false}, {"13", "10", 1000, true}, {"14", "10", 1003, false}, {"15", "10", 1004, true}};
    for (const auto& [version, current, minute, fetched] : steps)
        EXPECT_EQ(at(version, current, std::chrono::minutes(minute)), fetched) << version << " at " << minute;
    for (int day = 1; day < 20; ++day) (void)at("15", "10", day * 24h);
    EXPECT_FALSE(at("15", "10", 19 * 24h + 239min));
    EXPECT_TRUE(at("15", "10", 19 * 24h + 240min)) << "four hours at most";
}

struct BagControllerTest : DaemonTest {
    BagControllerTest() { start(); }

    TavrinBagController& controller() { return *assembly().bagController; }
    int announced = 0;
    std::vector<platform::Error> errors;
    platform::NotificationCenter::Token token =
        device.notifications.observe(TAVBagChangeNotification, [this](const platform::Notification& notification) {
            if (notification.get<std::shared_ptr<const TAVBag>>("bag"))
                ++announced;
            else
                errors.push_back(notification.get<platform::Error>("bagError"));
        });
};

TEST_F(BagControllerTest, FetchesOnceKeepsItOnDiskAndRestartsFromThere)
{
    EXPECT_EQ(tasks().size(), 1u) << "start-up asks for the first bag";
    EXPECT_EQ(device.transactions.open(), (std::map<std::string, int>{{"bagFetch", 1}}));
    EXPECT_FALSE(controller().currentBag());
    EXPECT_FALSE(controller().currentBag());
    device.drain();
    EXPECT_EQ(tasks().size(), 1u) << "one fetch at a time";
    deliverBag();
    EXPECT_EQ(controller().currentBag()->version(), "9");
    EXPECT_EQ(announced, 1);
    EXPECT_TRUE(device.transactions.open().empty());
    EXPECT_EQ(counter("bag.fetches"), 1);
    const auto raw = controller().currentBag()->rawBag();
    EXPECT_EQ(raw["__expiration"].asDouble(), platform::secondsSince1970(device.clock.wallNow()) + 14400);
    EXPECT_TRUE(raw["__bagurl"].asString()->contains("agent=" + ClientSessionManager::tavrindUserAgent()));
    EXPECT_EQ(platform::parsePropertyList(device.files.files.at(kPath)), raw);

    start();
    EXPECT_EQ(controller().inMemoryBag()->version(), "9");
    EXPECT_EQ(announced, 2);
    EXPECT_TRUE(tasks().empty()) << "fresh enough";

    device.clock.setWall(device.clock.wallNow() + 14400s - 599s);
    EXPECT_EQ(controller().currentBag()->version(), "9") << "a stale bag is still answered";
    device.drain();
    EXPECT_EQ(tasks().size(), 1u) << "and fetched anew";
    EXPECT_EQ(counter("bag.expired"), 1);

    start();
    const auto another = TavrinBagController::make(assembly());
    EXPECT_TRUE(another->fetchInProgress() && another->inMemoryBag()) << "a stale bag is fetched anew as it is read";
}

// The service's faults: each leaves the current bag, is announced, and doesn't stop the next fetch.
TEST_F(BagControllerTest, FailedFetchesLeaveTheOldBag)
{
    deliverBag();
    const std::string onDisk = device.files.files.at(kPath);
    const std::tuple<std::function<void()>, const char*, int> faults[]{
        {[&] { lastTask()->fail(platform::Error::withReason("UrlErrorDomain", -1001, "timed out")); }, "timed out",
         -1001},
        {[&] { lastTask()->finish(std::nullopt, platform::UrlResponse{.statusCode = 200}, std::nullopt); }, "no data",
         2},
        {[&] { lastTask()->respond(304, ""); }, "statusCode 304", 2},
        {[&] { lastTask()->respond(500, kBag); }, "statusCode 500", 2},
        {[&] { lastTask()->respond(200, "[]"); }, "not JSON object", 2},
        {[&] { lastTask()->respond(200, "null"); }, "not JSON object", 2},
        {[&] { lastTask()->respond(200, "{"); }, nullptr, 0},
        {[&] { lastTask()->respond(200, ""); }, nullptr, 0},
        {[&] { lastTask()->respond(200, std::string(10000, '[')); }, nullptr, 0},
        {[&] { lastTask()->respond(200, platform::toJson(Dictionary{{"a", Value::Array(16'384)}})); }, nullptr, 0},
        {[&] { lastTask()->respond(200, "{\"a\": \"\xff\"}"); }, nullptr, 0},
    };
    for (const auto& [fault, reason, code] : faults) {
        expireBag();
        errors.clear();
        fault();
        device.drain();
        ASSERT_EQ(errors.size(), 1u);
        if (reason) {
            EXPECT_EQ(errors[0].reason(), reason);
            EXPECT_EQ(errors[0].code, code) << reason;
        }
        EXPECT_EQ(controller().inMemoryBag()->version(), "9");
    }
    EXPECT_EQ(device.files.files.at(kPath), onDisk);
    EXPECT_EQ(announced, 1);
    EXPECT_EQ(counter("bag.fetchesfailed"), std::ssize(faults));
    EXPECT_TRUE(device.transactions.open().empty());
}

TEST_F(BagControllerTest, ABrokenCacheFileIsAsGoodAsNone)
{
    const auto valid = platform::toPropertyList(Value::dictionaryOf({{"version", "1"}, {"__expiration", 9e9}})).value();
    const std::pair<std::string, bool> contents[]{{"", false},
                                                  {"bplist00", false},
                                                  {valid.substr(0, valid.size() - 1), false},
                                                  {platform::toPropertyList(Value::Array{1}).value(), false},
                                                  {valid, true}};
    for (const auto& [bytes, readable] : contents) {
        device.files.directories.insert(kPath.parent_path());
        device.files.files[kPath] = bytes;
        start();
        EXPECT_EQ(controller().inMemoryBag() != nullptr, readable) << bytes.size();
        EXPECT_EQ(tasks().size(), 1u) << "without a URL on record the bag is stale too";
    }
    device.files.files.erase(kPath);
    device.files.directories.insert(kPath);
    LogCapture log;
    start();
    EXPECT_TRUE(log.has(platform::LogLevel::Fault, "Tavrin_Bag", "Error reading from bag cache: "));
    deliverBag();
    EXPECT_EQ(controller().currentBag()->version(), "9") << "a directory in the file's place costs only the cache";
}

TEST_F(BagControllerTest, AFullDiskCostsOnlyTheCache)
{
    for (const char* operation : {"write", "mkdir"}) {
        failOn(operation, ENOSPC);
        LogCapture log;
        start();
        deliverBag();
        EXPECT_EQ(controller().currentBag()->version(), "9");
        EXPECT_FALSE(device.files.files.contains("/caches/com.quorvane.tavrind/bag.plist"));
        EXPECT_GE(log.count("Could not write to ") + log.count("Couldn't get path to cache bag.  Error: "), 1);
    }
}

TEST_F(BagControllerTest, AsksTheConfiguredEndpoint)
{
    const auto url = [&](const char* country) { return controller().bagFetchURLWithCountry(country).string(); };
    EXPECT_EQ(url("CH"), "https://bag.quorvane.example/bag");
    EXPECT_EQ(url(""), "https://bag.quorvane.example/bag");
    EXPECT_EQ(url("cn"), "https://bag-cn.quorvane.example/bag");
    device.userDefaults.set("TAVBagURL", "");
    EXPECT_EQ(url("CN"), "https://bag-cn.quorvane.example/bag");
    device.userDefaults.set("TAVBagURL", "https://localhost:1/bag");
    EXPECT_EQ(url("CN"), "https://localhost:1/bag");
    LogCapture log;
    device.userDefaults.set("TAVBagURL", "not a url");
    EXPECT_EQ(url("CH"), "https://bag.quorvane.example/bag");
    EXPECT_TRUE(
        log.has(platform::LogLevel::Error, "Tavrin_Bag", "Malformed tavrin bag URL in user defaults key TAVBagURL"));
}

TEST_F(BagControllerTest, OnlyAChangeOfTheUrlCausesAFetch)
{
    const auto changeLocale = [&](std::string identifier) {
        device.locale.context.identifier = std::move(identifier);
        device.locale.handler(platform::LocaleSource::Change::Locale);
        device.drain();
    };
    deliverBag();
    device.locale.context.preferredLanguages = {"fr"}; // a header of the fetch, not in the URL
    changeLocale(device.locale.context.identifier);
    EXPECT_EQ(tasks().size(), 1u);
    changeLocale("fr_CH");
    EXPECT_EQ(tasks().size(), 2u);
    changeLocale("de_CH"); // while the bag for fr_CH is fetched
    deliverBag();
    (void)controller().currentBag();
    device.drain();
    ASSERT_EQ(tasks().size(), 3u) << "the bag is for fr_CH";
    deliverBag();
    const platform::Notification fromAnother{.name = TAVBagRefreshRequired, .object = this};
    device.clock.setWall(device.clock.wallNow() + 14400s);
    device.notifications.post(fromAnother);
    device.drain();
    EXPECT_EQ(tasks().size(), 3u) << "only the request factory is listened to";
}

TEST_F(BagControllerTest, TellsTheSystemWhenTheNewsClientsFortuneChanges)
{
    deliverBag(R"({"clients": {"news": {"isEnabled": false}}})");
    EXPECT_EQ(device.notifier.posted, Strings{kNewsDisabledNotifyName});
    const auto refetch = [&](const char* body) {
        device.notifier.posted.clear();
        expireBag();
        deliverBag(body);
        return device.notifier.posted;
    };
    EXPECT_EQ(refetch(R"({"isEnabled": false})"), Strings{});
    EXPECT_EQ(refetch("{}"), Strings{kNewsEnabledNotifyName});
    device.notifier.posted.clear();
    start();
    EXPECT_TRUE(device.notifier.posted.empty()) << "a bag from disk is no news";
    EXPECT_EQ(refetch("{}"), Strings{});
    EXPECT_EQ(refetch(R"({"isEnabled": false})"), Strings{kNewsDisabledNotifyName});
}

TEST_F(BagControllerTest, AnAnnouncedVersionThatNeverComesIsFetchedOnce)
{
    deliverBag();
    const auto announce = [&] { controller().forceFetchBag(Value::dictionaryOf({{"bag", 100}})); };
    for (int answer = 0; answer < 3; ++answer) {
        announce();
        if (!lastTask()->finished) deliverBag();
    }
    EXPECT_EQ(tasks().size(), 2u);
    device.advance(1min);
    announce();
    EXPECT_EQ(tasks().size(), 3u);
    respond("", 503);
    announce();
    EXPECT_EQ(tasks().size(), 4u) << "a fetch that failed is repeated at once";
}

TEST_F(BagControllerTest, ABagThatIsLargerOnDiskComesBack)
{
    deliverBag(R"({"version": 7, "text": "\u00fc)" + std::string(5u << 20, 'a') + "\"}");
    start();
    ASSERT_TRUE(controller().inMemoryBag());
    EXPECT_EQ(controller().inMemoryBag()->version(), "7");
}

TEST_F(BagControllerTest, AFetchThatNeverEndsIsGivenUp)
{
    EXPECT_EQ(lastTask()->originalRequest().maximumResponseSize, 8u << 20);
    device.advance(119s);
    EXPECT_TRUE(errors.empty());
    device.advance(1s);
    ASSERT_EQ(errors.size(), 1u);
    EXPECT_EQ(errors[0].code, platform::kUrlTimedOut);
    EXPECT_FALSE(controller().currentBag());
    EXPECT_EQ(tasks().size(), 2u) << "another may begin";
    deliverBag();
    EXPECT_EQ(controller().currentBag()->version(), "9");
}

using BagFeedbackTest = FeedbackTest;

TEST_F(BagFeedbackTest, AFetchIsASessionOfItsOwn)
{
    for (const auto& [status, types] : {std::pair(200, Strings{"network_search_start", "network_search_end"}),
                                        {500, {"network_search_start", "network_search_end", "error"}}}) {
        startWithoutBag();
        deliverBag(kFeedbackBag);
        upload();
        const auto before = allUploads().size();
        expireBag();
        respond(kFeedbackBag, status);
        upload();
        EXPECT_EQ(allUploads().size(), before + 1);
        EXPECT_EQ(typesIn(decoded(*allUploads().back())), types);
    }
}

} // namespace
} // namespace tavrin::test
