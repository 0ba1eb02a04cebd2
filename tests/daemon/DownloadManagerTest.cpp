#include "tavrind/DownloadManager.h"

#include <unistd.h>

#include "platform/values/Json.h"
#include "tests/support/AssemblyFixture.h"

namespace tavrin {
namespace {

std::optional<Url> urlOf(std::string_view text)
{
    return Url::parse(text);
}

TEST(DownloadReason, IsANewUrlAMissingFileOrALookup)
{
    const Url url = *urlOf("https://r.example/a?version=2");
    const std::string plain = "TAVQIFeatures", hints = "TAVLookupHintsWeekly";
    const struct {
        DownloadResource resource;
        bool fileExists;
        std::optional<std::string_view> reason;
    } cases[]{
        {{plain}, false, "update"},
        {{plain}, true, "update"},
        {{plain, urlOf("https://r.example/a?version=1")}, true, "update"},
        {{plain, url}, false, "missing"},
        {{plain, url}, true, {}},
        {{plain, url, urlOf("https://elsewhere.example/")}, true, {}},
        {{hints}, true, "update"},
        {{hints, url}, false, "missing"},
        {{hints, url}, true, "lookup"},
    };
    for (const auto& c : cases) EXPECT_EQ(downloadReason(c.resource, url, c.fileExists), c.reason);
}

TEST(DownloadTable, ReadsBackWhatItIsGivenAndNothingElse)
{
    const DownloadResources resources{
        {"TAVQIFeatures", {"TAVQIFeatures", urlOf("https://r.example/a"), urlOf("https://r.example/b")}},
        {"TAVVistrelModels", {"TAVVistrelModels"}}};
    EXPECT_EQ(resourcesIn(valueOf(resources)), resources);
    EXPECT_EQ(resourcesIn(Value::dictionaryOf({{"../bag.plist", Dictionary{{"url", "https://r.example/a"}}},
                                               {"TAVQIFeatures", "https://r.example/a"},
                                               {"TAVVistrelModels", Dictionary{{"url", 1}, {"redirect_url", "x"}}}})),
              (DownloadResources{{"TAVVistrelModels", {"TAVVistrelModels"}}}));
    for (const Value& broken : {Value(), Value("x"), Value(Value::Array{1})}) EXPECT_TRUE(resourcesIn(broken).empty());
}

struct FakeLookup final : LookupResources {
    bool enabled = true;
    bool lookupEnabled() const override { return enabled; }
};

struct DownloadManagerTest : test::AssemblyTest {
    DownloadManagerTest()
    {
        device.userDefaults.set("TAVDownloadDelay", 60); // exactly, not at some time within the window
        assembly.requestFactory = TAVNetworkRequestFactory::make(assembly);
        makeManager();
    }

    void makeManager()
    {
        manager = DownloadManager::make(assembly);
        manager->setLookupResources(lookup);
        assembly.downloadManager = manager;
        assembly.downloadURLSession =
            device.background.make({.identifier = "com.quorvane.tavrind"}, manager,
                                   device.device.serialQueue("test.delegate", platform::Rank::Root));
        device.drain();
    }

    auto& tasks() { return device.background.loads.at("com.quorvane.tavrind")->tasks; }
    /// Another process, whose session takes up what is under way.
    void restart()
    {
        assembly.downloadURLSession.reset();
        assembly.downloadManager.reset();
        manager.reset();
        device.drain();
        makeManager();
    }

    void bag(Dictionary resources)
    {
        resources.set("supportedGeoLocationSources", Value::Array{"wifi"});
        announce(std::move(resources));
    }
    /// A bag that lists one resource, and the download that it leads to.
    auto download(const std::string& identifier, std::string url)
    {
        bag({{identifier, std::move(url)}});
        device.advance(60s);
        return tasks().empty() ? nullptr : tasks().back();
    }
    void deliver(int status, std::string contents, std::optional<Url> from = {})
    {
        tasks().back()->respond(status, std::move(contents), {}, std::move(from));
        device.drain();
    }
    std::string contents(const std::string& identifier)
    {
        const auto found = device.files.files.find(directory / identifier);
        return found == device.files.files.end() ? "(none)" : found->second;
    }
    Value stored(const std::string& identifier) { return device.userDefaults.value("download_resources")[identifier]; }

    const std::filesystem::path directory = "/caches/com.quorvane.tavrind";
    std::shared_ptr<FakeLookup> lookup = std::make_shared<FakeLookup>();
    std::shared_ptr<DownloadManager> manager;
    std::string watched = "TAVQIFeatures"; ///< whose deletion is told; a bag deletes all that it doesn't list
    std::vector<std::string> told;
    platform::NotificationCenter::Token completed =
        device.notifications.observe(TAVFileDownloadCompletedNotification, [this](const platform::Notification& n) {
            told.push_back(n.get<std::string>("identifier") + " at " + n.get<std::filesystem::path>("url").string() +
                           ": " + device.files.files.at(n.get<std::filesystem::path>("url")));
        });
    platform::NotificationCenter::Token deleted =
        device.notifications.observe(TAVFileDeletedNotification, [this](const platform::Notification& n) {
            if (n.userInfo.contains("url")) ADD_FAILURE();
            if (n.get<std::string>("identifier") == watched) told.push_back("deleted");
        });
};

TEST_F(DownloadManagerTest, AResourceIsFetchedOnceForEachUrlWithTheVersionAtHand)
{
    bag({{"TAVQIFeatures", "https://r.example/f?version=1"}});
    device.advance(59s);
    EXPECT_TRUE(tasks().empty());
    device.advance(1s);
    ASSERT_EQ(tasks().size(), 1u);
    const auto& first = tasks()[0]->originalRequest();
    EXPECT_TRUE(tasks()[0]->resumed);
    EXPECT_EQ(first.url.queryValue("version"), "1");
    EXPECT_EQ(header(first, "X-Quorvane-Download-Identifier"), "TAVQIFeatures");
    EXPECT_EQ(header(first, "If-None-Match"), "");
    EXPECT_TRUE(log.count("reason: update delay: 60.000000"));
    EXPECT_TRUE(stored("TAVQIFeatures")["url"].isNull()) << "not before the answer";
    EXPECT_EQ(manager->fileHandleForResource("TAVQIFeatures").error().code, 404);

    deliver(200, "one");
    EXPECT_EQ(contents("TAVQIFeatures"), "one");
    EXPECT_EQ(told.back(), "TAVQIFeatures at /caches/com.quorvane.tavrind/TAVQIFeatures: one");
    EXPECT_EQ(stored("TAVQIFeatures")["url"], Value("https://r.example/f?version=1"));
    EXPECT_EQ(manager->resourceVersions(), (Dictionary{{"TAVQIFeatures", "1"}}));
    EXPECT_EQ(device.counters.value("com.quorvane.tavrind.resourcefilesfetched"), 1);

    EXPECT_EQ(download("TAVQIFeatures", "https://r.example/f?version=1")->identifier(), 1u) << "nothing new";
    const auto second = download("TAVQIFeatures", "https://r.example/f?version=2");
    EXPECT_EQ(header(second->originalRequest(), "If-None-Match"), "1");
    const std::size_t before = told.size();
    deliver(304, "");
    EXPECT_EQ(contents("TAVQIFeatures"), "one");
    EXPECT_EQ(told.size(), before);
    EXPECT_EQ(manager->resourceVersions(), (Dictionary{{"TAVQIFeatures", "2"}}));

    device.files.files.erase(directory / "TAVQIFeatures");
    const auto third = download("TAVQIFeatures", "https://r.example/f?version=2");
    EXPECT_TRUE(log.count("reason: missing"));
    EXPECT_EQ(header(third->originalRequest(), "If-None-Match"), "") << "word that it is current would not help";
}

TEST_F(DownloadManagerTest, WhatFailsLeavesTheOldFileAndIsTriedAgainWithTheNextBag)
{
    download("TAVQIFeatures", "https://r.example/f?version=1");
    deliver(200, "old");
    const platform::Error endless(std::string(platform::kUrlErrorDomain), platform::kUrlTooLarge);
    const struct {
        const char* what;
        std::function<void()> happens;
        const char* line;
    } cases[]{
        {"not there", [&] { deliver(404, "sorry"); }, "status code 404"},
        {"server error", [&] { deliver(500, ""); }, "status code 500"},
        {"too large", [&] { tasks().back()->fail(endless); }, "download error"},
        {"disk full",
         [&] {
             device.files.fault = [](auto operation, auto&) { return operation == "replace" ? ENOSPC : 0; };
             deliver(200, "new");
         },
         "error copying download"},
        {"no directory",
         [&] {
             device.files.fault = [](auto operation, auto&) { return operation == "mkdir" ? EACCES : 0; };
             deliver(200, "new");
         },
         "error getting cache directory"},
        {"cancelled", [&] { tasks().back()->cancel(); }, ""},
    };
    std::size_t started = 1;
    for (const auto& c : cases) {
        const int lines = log.count(c.line);
        download("TAVQIFeatures", "https://r.example/f?version=2");
        ASSERT_EQ(tasks().size(), ++started) << c.what;
        c.happens();
        device.drain();
        device.files.fault = nullptr;
        EXPECT_GT(log.count(c.line), lines) << c.what;
        EXPECT_EQ(contents("TAVQIFeatures"), "old") << c.what;
        EXPECT_EQ(stored("TAVQIFeatures")["url"], Value("https://r.example/f?version=1")) << c.what;
    }
    EXPECT_EQ(device.counters.value("com.quorvane.tavrind.resourcefilesfetched"), 1);
    download("TAVQIFeatures", "https://r.example/f?version=2");
    deliver(200, "");
    EXPECT_EQ(contents("TAVQIFeatures"), "") << "an empty answer is an empty file";
}

TEST_F(DownloadManagerTest, WhatStandsInAResourcesPlaceIsNoResourceAndIsNotTouched)
{
    device.files.directories.insert(directory / "TAVQIFeatures");
    for (std::size_t bags = 1; bags <= 2; ++bags) {
        download("TAVQIFeatures", "https://r.example/f");
        ASSERT_EQ(tasks().size(), bags) << "with every bag again";
        deliver(200, "new");
        EXPECT_EQ(log.count("error copying download"), static_cast<int>(bags));
        EXPECT_EQ(manager->fileHandleForResource("TAVQIFeatures").error().code, 500);
    }
    EXPECT_EQ(told, std::vector<std::string>());
    bag({});
    EXPECT_TRUE(device.files.directories.contains(directory / "TAVQIFeatures"));
    device.files.directories.erase(directory / "TAVQIFeatures");
    download("TAVQIFeatures", "https://r.example/f");
    deliver(200, "new");
    EXPECT_EQ(contents("TAVQIFeatures"), "new");
}

TEST_F(DownloadManagerTest, BagsInQuickSuccessionLeadToOneDownloadOfTheLast)
{
    bag({{"TAVQIFeatures", "https://r.example/f?version=1"}, {"TAVVistrelModels", "https://r.example/m"}});
    device.advance(30s);
    bag({{"TAVQIFeatures", "https://r.example/f?version=2"}});
    device.advance(300s);
    ASSERT_EQ(tasks().size(), 1u) << "one is no longer listed, the other was asked for twice";
    EXPECT_EQ(tasks()[0]->originalRequest().url.queryValue("version"), "2");

    bag({{"TAVQIFeatures", "https://r.example/f?version=3"}});
    EXPECT_TRUE(tasks()[0]->finished) << "cancelled";
    EXPECT_TRUE(log.count("canceling https://r.example/f?"));
    deliver(200, "two"); // came too late
    EXPECT_EQ(contents("TAVQIFeatures"), "(none)");
    device.advance(60s);
    ASSERT_EQ(tasks().size(), 2u);
    deliver(200, "three");
    EXPECT_EQ(contents("TAVQIFeatures"), "three");

    bag({{"TAVQIFeatures", "https://r.example/f?version=4"}});
    device.advance(30s);
    bag({});
    bag({{"TAVQIFeatures", "https://r.example/f?version=4"}});
    device.advance(59s);
    EXPECT_EQ(tasks().size(), 2u) << "the delay that was called off is over, the other isn't";
    device.advance(1s);
    EXPECT_EQ(tasks().size(), 3u);
}

TEST_F(DownloadManagerTest, WhatTheBagNoLongerListsIsDeleted)
{
    download("TAVQIFeatures", "https://r.example/f");
    deliver(200, "x");
    told.clear();
    bag({});
    EXPECT_EQ(contents("TAVQIFeatures"), "(none)");
    EXPECT_FALSE(manager->resourceForKey("TAVQIFeatures"));
    EXPECT_TRUE(stored("TAVQIFeatures").isNull());
    EXPECT_EQ(told, std::vector<std::string>{"deleted"});
    device.notifications.post({.name = TAVBagChangeNotification, .userInfo = {{"bagError", platform::Error()}}});
    device.drain();
    EXPECT_EQ(told.size(), 1u) << "a failed fetch changes nothing";
}

TEST_F(DownloadManagerTest, AnUnknownResourceOfAnotherVersionIsLogged)
{
    platform::UrlRequest request{.url = *urlOf("https://r.example/gone")};
    request.headers.set("X-Quorvane-Download-Identifier", "TAVGone");
    assembly.downloadURLSession->downloadTask(request).value()->resume();
    deliver(200, "x");
    for (const char* line : {"failed to find download for identifier: TAVGone",
                             "could not find resource for download identifier: TAVGone", "can't find TAVGone"})
        EXPECT_EQ(log.count(line), 1) << line;
    EXPECT_EQ(contents("TAVGone"), "(none)");
}

TEST_F(DownloadManagerTest, LookupHintsFollowTheBagTheirRedirectAndTheLocation)
{
    bag({});
    moveTo(platform::fuzz(47.37, 8.54, "wifi"));
    performSearch();

    const std::string hints = "TAVLookupHintsWeekly";
    const auto first = download(hints, "https://r.example/hints?version=1");
    EXPECT_EQ(header(first->originalRequest(), "X-Quorvane-FuzzedLatLong"),
              assembly.requestFactory->context().geoLocationLatLng);
    deliver(200, "x", urlOf("https://r.example/de/hints/2026/w1"));
    EXPECT_EQ(stored(hints)["redirect_url"], Value("https://r.example/de/hints/2026/w1"));
    EXPECT_EQ(Value(DownloadManager(assembly).resourceVersions())[hints], Value("2026-w1-hints"))
        << "before any task runs";

    // Ahead of the redirect, too.
    for (const auto& from : {urlOf("https://r.example/de/hints/2026/w1"), std::optional<Url>(), std::optional<Url>()}) {
        const auto before = tasks().size();
        const auto again = download(hints, "https://r.example/hints?version=1");
        EXPECT_EQ(tasks().size(), before + 1) << "with every bag";
        EXPECT_EQ(header(again->originalRequest(), "If-None-Match"), "2026-w1-hints");
        deliver(304, "", from);
    }
    (void)download(hints, "https://r.example/hints?version=1");
    deliver(200, "x"); // from where it was asked for
    EXPECT_TRUE(stored(hints)["redirect_url"].isNull()) << "the earlier redirect is not that of this file";

    std::size_t before = tasks().size();
    bag({{hints, "https://r.example/hints?version=2"}});
    lookup->enabled = false;
    device.advance(60s);
    EXPECT_EQ(tasks().size(), before) << "disabled during the delay";
    EXPECT_EQ(log.count("TAVLookupHintsWeekly is disabled, not downloading"), 1);
    (void)download(hints, "https://r.example/hints?version=2");
    EXPECT_EQ(tasks().size(), before);
    bag({});
    EXPECT_EQ(contents(hints), "x") << "left as it was";
    EXPECT_TRUE(manager->resourceForKey(hints));
    EXPECT_EQ(log.count("TAVLookupHintsWeekly is disabled, not downloading"), 3) << "with every bag";
    lookup->enabled = true;

    watched = hints;
    told.clear();
    moveTo(platform::fuzz(47.40, 8.56, "wifi")); // 4 km
    EXPECT_TRUE(manager->resourceForKey(hints));
    moveTo(platform::fuzz(47.50, 8.72, "wifi"));
    EXPECT_FALSE(manager->resourceForKey(hints));
    EXPECT_EQ(contents(hints), "x");
    EXPECT_EQ(told, std::vector<std::string>{"deleted"}) << "whoever uses the hints of another place stops";
    EXPECT_TRUE(stored(hints).isNull());
    const auto elsewhere = download(hints, "https://r.example/hints?version=1");
    EXPECT_EQ(header(elsewhere->originalRequest(), "If-None-Match"), "") << "another place has other hints";
}

TEST_F(DownloadManagerTest, OnlyLookupHintsAreAskedForWithTheLocation)
{
    bag({});
    Dictionary all;
    for (const std::string_view identifier : kTAVResourceIdentifiers)
        all.set(std::string(identifier), "https://r.example/" + std::string(identifier));
    device.location.moveTo(platform::fuzz(47.37, 8.54, "wifi"));
    bag(std::move(all));
    performSearch();
    device.advance(60s);
    ASSERT_EQ(tasks().size(), kTAVResourceIdentifiers.size());
    for (const auto& task : tasks()) {
        const std::string identifier = header(task->originalRequest(), "X-Quorvane-Download-Identifier");
        EXPECT_EQ(header(task->originalRequest(), "X-Quorvane-FuzzedLatLong") != "",
                  identifier == "TAVLookupHintsWeekly" || identifier == "TAVLookupHintsMonthly")
            << identifier;
    }
}

TEST_F(DownloadManagerTest, NothingOvertakesABagThatWaitsForTheListOfDownloads)
{
    using Task = std::shared_ptr<platform::BackgroundTask>;
    using Answer = std::move_only_function<void(std::vector<Task>)>;
    struct SlowSession final : platform::BackgroundSession {
        platform::Result<Task> uploadTask(platform::UrlRequest, const std::filesystem::path&) override { return {}; }
        platform::Result<Task> downloadTask(platform::UrlRequest) override { return {}; }
        void getTasks(Answer callback) override { answers.push_back(std::move(callback)); }
        void describe(std::move_only_function<void(Value::Array)> callback) override { callback({}); }
        std::vector<Answer> answers;
    };
    const auto slow = std::make_shared<SlowSession>();
    assembly.downloadURLSession = slow;
    const std::string hints = "TAVLookupHintsWeekly";
    const std::string monthly = "TAVLookupHintsMonthly";
    bag({{hints, "https://r.example/hints"}, {monthly, "https://r.example/monthly"}});
    device.notifications.post({.name = TAVSignificantLocationChange});
    device.drain();
    EXPECT_EQ(log.count("deleting resource: " + hints), 0);
    EXPECT_TRUE(manager->resourceVersions().empty()) << "readers don't wait";
    ASSERT_EQ(slow->answers.size(), 1u);
    slow->answers[0]({});
    device.drain();
    for (const std::string& identifier : {hints, monthly}) {
        EXPECT_EQ(log.count("deleting resource: " + identifier), 1);
        EXPECT_FALSE(manager->resourceForKey(identifier)) << "the bag's resource was there first";
    }

    bag({{hints, "https://r.example/hints"}});
    device.advance(60s);
    EXPECT_TRUE(manager->resourceForKey(hints)) << "a list that never comes isn't waited for for ever";
}

TEST_F(DownloadManagerTest, ADownloadOutlivesTheProcess)
{
    download("TAVQIFeatures", "https://r.example/f?version=7");
    restart();
    deliver(200, "seven");
    EXPECT_EQ(contents("TAVQIFeatures"), "seven");
    restart();
    EXPECT_EQ(manager->resourceVersions(), (Dictionary{{"TAVQIFeatures", "7"}})) << "before the first bag";
    download("TAVQIFeatures", "https://r.example/f?version=7");
    EXPECT_TRUE(tasks().empty()) << "not fetched twice";

    download("TAVQIFeatures", "https://r.example/f?version=8");
    restart();
    const auto again = download("TAVQIFeatures", "https://r.example/f?version=8");
    ASSERT_EQ(tasks().size(), 2u);
    EXPECT_TRUE(tasks()[0]->finished) << "a bag begins it again";
    EXPECT_EQ(again->originalRequest().url, tasks()[0]->originalRequest().url);
    deliver(200, "eight");
    EXPECT_EQ(contents("TAVQIFeatures"), "eight");
}

TEST_F(DownloadManagerTest, TheDelayCanBeShortenedForDevelopment)
{
    for (const Value& wrong : {Value(-1), Value(86'401), Value("soon"), Value(1.5), Value(Value::Array{0})}) {
        device.userDefaults.set("TAVDownloadDelay", wrong);
        bag({{"TAVQIFeatures", "https://r.example/f"}});
        device.advance(59s);
        EXPECT_TRUE(tasks().empty()) << platform::toJson(wrong);
        bag({});
    }
    device.userDefaults.set("TAVDownloadDelay", 2);
    bag({{"TAVQIFeatures", "https://r.example/f"}});
    device.advance(1s);
    EXPECT_TRUE(tasks().empty());
    device.advance(1s);
    EXPECT_EQ(tasks().size(), 1u);
    EXPECT_TRUE(log.count("delay: 2.000000"));
}

TEST_F(DownloadManagerTest, DevicesStartADownloadAtDifferentTimes)
{
    device.userDefaults.set("TAVDownloadDelay", Value());
    bag({{"TAVQIFeatures", "https://r.example/f"}});
    device.advance(60s);
    EXPECT_TRUE(tasks().empty());
    device.advance(kDownloadWindow);
    EXPECT_EQ(tasks().size(), 1u);
}

TEST_F(DownloadManagerTest, ServesResourcesAndNoOtherFiles)
{
    download("TAVQIFeatures", "https://r.example/f");
    deliver(200, "four");
    device.files.files[directory / "bag.plist"] = "secret";
    device.files.directories.insert(directory / "TAVVistrelModels");

    const auto found = manager->fileHandleForResource("TAVQIFeatures");
    ASSERT_TRUE(found);
    std::array<char, 8> buffer{};
    EXPECT_EQ(read(found->file.fd(), buffer.data(), buffer.size()), 4);
    EXPECT_EQ(found->attributes["size"], Value(4));
    EXPECT_TRUE(found->attributes["modified"].asDate());
    for (const auto& [name, code] :
         {std::pair("TAVCorrectionDict", 404), {"bag.plist", 404}, {"../x", 404}, {"", 500}, {"TAVVistrelModels", 500}})
        EXPECT_EQ(manager->fileHandleForResource(name).error().code, code) << name;
}

} // namespace
} // namespace tavrin
