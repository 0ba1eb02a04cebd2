#include <fmt/ranges.h>

#include "CoreTavrin/TAVBag.h"
#include "tests/power/PowerCut.h"
#include "tests/support/FeedbackFixture.h"

namespace tavrin::test {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;

/// A daemon on a real directory.
struct DaemonOnDisk final : FeedbackTest {
    DaemonOnDisk(platform::FileSystem& files, const fs::path& root) : FeedbackTest(&files, root)
    {
        EXPECT_TRUE(files.createDirectories(root / "tmp")); // the system makes it
    }
    void TestBody() override {}

    /// A bag that lists a resource, and the download of that.
    void fetchBagWithResource(int version)
    {
        assembly().bagController->forceFetchBag(Value::dictionaryOf({{"bag", version}}));
        device.drain();
        respond(fmt::format(R"({{"version": "{}", "feedbackURL": "https://f.example/feedback",
                             "TAVQIFeatures": "https://r.example/f?version={}"}})",
                            version, version));
    }
    void deliverResource(int version)
    {
        device.advance(61s);
        device.background.loads.at("com.quorvane.tavrind")
            ->tasks.back()
            ->respond(200, fmt::format("contents of version {}", version));
        device.drain();
    }
};

/// What the life of a daemon promised, by numbers of calls of the disk.
struct Promises {
    /// A value that changes: its states, and the calls within which each became the value.
    struct Change {
        std::string value;
        std::size_t begun, done;
    };
    /// The life of an event, in numbers of system calls: when it was acknowledged, when its move from the file to an
    /// upload began and ended, and when the settling of the upload's result began and ended.
    struct Event {
        std::size_t reported = SIZE_MAX, taken = SIZE_MAX, uploading = SIZE_MAX, answered = SIZE_MAX,
                    settled = SIZE_MAX;
    };
    std::vector<Change> bag{{"", 0, 0}}, resource{{"", 0, 0}}, sent{{"0", 0, 0}};
    std::map<std::string, Event> events;
};

/// What a restarted daemon has.
struct Found {
    std::string bag, resource, sent, resourceUrl;
    std::vector<std::string> events; ///< of all uploads that it sends
    bool booksClose = false;
};

Promises live(const platform::test::RecordedDisk& disk, platform::FileSystem& files)
{
    Promises made;
    DaemonOnDisk daemon(files, disk.root);
    const auto changes = [&](std::vector<Promises::Change>& of, std::string value, const auto& work) {
        const std::size_t begun = disk.calls();
        work();
        of.push_back({std::move(value), begun, disk.calls()});
    };
    const auto report = [&](const std::string& event) {
        daemon.report("ZRDidGoToSiteFeedback", {{"input", event}});
        made.events[event].reported = disk.calls();
    };
    const auto upload = [&](const std::vector<std::string>& events) {
        for (const std::string& event : events) made.events.at(event).taken = disk.calls();
        daemon.upload();
        for (const std::string& event : events) made.events.at(event).uploading = disk.calls();
    };
    const auto answer = [&](int status, const std::vector<std::string>& events) {
        const std::size_t begun = disk.calls();
        for (const std::string& event : events) made.events.at(event).answered = begun;
        daemon.uploads().back()->respond(status);
        daemon.device.drain();
        for (const std::string& event : events) made.events.at(event).settled = disk.calls();
        made.sent.push_back({std::to_string(daemon.booked(FeedbackFate::Sent)), begun, disk.calls()});
    };

    daemon.device.userDefaults.set("TAVDownloadDelay", 60); // exactly, not at some time within the window
    changes(made.bag, "9", [&] { changes(made.sent, "", [&] { daemon.begin(); }); });
    made.sent.back().value = std::to_string(daemon.booked(FeedbackFate::Sent));
    report("event-a");
    report("event-b");
    daemon.flushSession();
    report("event-c");
    upload({"event-a", "event-b"});
    changes(made.bag, "1000", [&] { daemon.fetchBagWithResource(1000); });
    changes(made.resource, "contents of version 1000", [&] { daemon.deliverResource(1000); });
    answer(200, {"event-a", "event-b"});

    daemon.restart(); // a kill: the session with event-c ends
    daemon.connection = daemon.client();
    report("event-d");
    upload({"event-c"});
    daemon.flushSession();
    upload({"event-d"});
    answer(500, {"event-d"});
    changes(made.bag, "1001", [&] { daemon.fetchBagWithResource(1001); });
    changes(made.resource, "contents of version 1001", [&] { daemon.deliverResource(1001); });
    return made;
}

Found restart(platform::FileSystem& files, const fs::path& root)
{
    DaemonOnDisk daemon(files, root);
    daemon.start();
    Found found;
    const auto bag = daemon.assembly().bagController->currentBag();
    if (files.info(root / "caches/com.quorvane.tavrind/bag.plist")) found.bag = bag ? bag->version() : "damaged";
    if (const auto text = files.read(root / "caches/com.quorvane.tavrind/TAVQIFeatures", 1 << 20))
        found.resource = std::string(text->view());
    const Value url = daemon.device.userDefaults.value("download_resources")["TAVQIFeatures"]["url"];
    found.resourceUrl = url.asString() ? *url.asString() : "";
    found.sent = std::to_string(daemon.booked(FeedbackFate::Sent));
    daemon.upload();
    for (const auto& task : daemon.allUploads()) {
        const std::string text = platform::toJson(DaemonOnDisk::decoded(*task));
        for (std::size_t at = 0; (at = text.find("event-", at)) != std::string::npos; ++at)
            found.events.push_back(text.substr(at, 7));
    }
    daemon.expectBooksClose();
    return found;
}

TEST(DaemonPowerCutTest, KeepsItsPromises)
{
    const auto files = platform::makeSystemFiles();
    platform::test::RecordedDisk disk;
    const Promises made = live(disk, *files);
    disk.stop();
    ASSERT_TRUE(disk.after(disk.calls(), {platform::test::RecordedDisk::Luck::Kind::Everything, 0}) == disk.now())
        << "a change was missed";

    const auto judge = [&](const platform::test::Cut& cut, const Found& found) {
        const auto holds = [&](const char* what, const std::vector<Promises::Change>& changes,
                               const std::string& value) {
            std::vector<std::string> expected;
            for (const Promises::Change& change : changes) {
                if (change.done <= cut.calls) expected.clear();
                if (change.begun < cut.calls || change.done == 0) expected.push_back(change.value);
            }
            EXPECT_TRUE(std::ranges::find(expected, value) != expected.end())
                << cut.name << ": " << what << " is \"" << value << "\" instead of one of "
                << fmt::format("{}", expected);
        };
        holds("the bag", made.bag, found.bag);
        holds("the resource", made.resource, found.resource);
        holds("the number of sent events", made.sent, found.sent);
        const std::string url = found.resourceUrl;
        EXPECT_TRUE(url.empty() || found.resource >= "contents of version " + url.substr(url.size() - 4))
            << cut.name << ": the settings name " << url << " without its file";
        for (const auto& [name, event] : made.events) {
            const bool isSettled = event.settled <= cut.calls;
            const bool isKept =
                event.uploading <= cut.calls || (cut.isKill && event.reported <= cut.calls && event.taken >= cut.calls);
            const auto copies = std::ranges::count(found.events, name);
            EXPECT_LE(copies, isSettled ? 0 : 1) << cut.name << ": " << name << " is sent again";
            EXPECT_GE(copies, isKept && event.answered >= cut.calls ? 1 : 0) << cut.name << ": " << name << " is lost";
        }
    };
    platform::test::afterEachCut(disk, platform::test::Cuts::Few, [&] { return restart(*files, disk.root); }, judge);
}

} // namespace
} // namespace tavrin::test
