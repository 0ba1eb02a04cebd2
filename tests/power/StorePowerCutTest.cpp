#include <algorithm>
#include <array>
#include <cmath>
#include <functional>
#include <ostream>
#include <set>
#include <sstream>
#include <unistd.h>

#include <fmt/ranges.h>

#include "CoreTavrin/Traces.h"
#include "platform/device/ActivityScheduler.h"
#include "platform/device/AppActivities.h"
#include "platform/device/DataDetectorStore.h"
#include "platform/files/Counters.h"
#include "platform/files/Files.h"
#include "platform/files/UserDefaults.h"
#include "platform/net/BackgroundStore.h"
#include "platform/net/HttpCacheStore.h"
#include "platform/privacy/PrivacyRecorder.h"
#include "platform/run/Transactions.h"
#include "platform/values/Json.h"
#include "searchrecords/ZRRecords.h"
#include "tavrind/ClientSessionHeader.h"
#include "tavrind/FeedbackBooks.h"
#include "tavrind/FileContainer.h"
#include "tavrind/StoredSession.h"
#include "tavrind/TavrinDiagnosticDataReporter.h"
#include "tavrind/TavrinFeedback.h"
#include "tests/power/PowerCut.h"
#include "tests/support/ByHand.h"
#include "tests/support/FakeActivities.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;

/// What one store lives through: steps that end in a known state.
struct Life : test::ByHand {
    explicit Life(test::RecordedDisk& disk_) : disk(disk_) {}

    /// Does something after which a restart finds `states.back()`; one that interrupts it may also find the others.
    template <class Work> void step(std::vector<std::string> states, Work work)
    {
        const std::size_t begun = disk.calls();
        work();
        drain();
        for (std::string& state : states) {
            const bool isLast = &state == &states.back();
            steps.push_back({std::move(state), begun, isLast ? disk.calls() : SIZE_MAX});
        }
    }
    struct Step {
        std::string state;
        std::size_t begun, done; ///< numbers of calls
    };
    test::RecordedDisk& disk;
    const fs::path& root = disk.root;
    const std::unique_ptr<FileSystem> files = makeSystemFiles();
    std::vector<Step> steps{{"", 0, 0}};
};

/// What a power cut may take of a store. A kill takes nothing that was done.
enum class Keeps {
    Everything, ///< nothing
    Earlier,    ///< the latest steps
    Torn,       ///< those, and parts of the words that are left
    Words,      ///< any word of the state, which is missing then or as it was in an earlier state
};

struct Store {
    const char* name;
    Keeps keeps;
    std::function<void(Life&)> live;
    /// Opens the store and returns its state, words with blanks between.
    std::function<std::string(Life&)> look;
};

void PrintTo(const Store& store, std::ostream* out)
{
    *out << store.name;
}

template <class T> T value(Result<T> result)
{
    EXPECT_TRUE(result) << result.error().description();
    return std::move(*result);
}

void done(const Result<void>& result)
{
    EXPECT_TRUE(result) << result.error().description();
}

// ---- the stores ----

void useSettings(Life& life)
{
    const auto open = [&] {
        return std::make_unique<UserDefaults>(*life.files, life.root / "a/b.json", life.makeQueue("a"));
    };
    auto settings = open();
    life.step({R"({"a":1})"}, [&] { settings->set("a", 1); });
    life.step({R"({"a":1,"b":"text"})"}, [&] {
        settings->set("b", "text");
        done(settings->synchronize());
    });
    settings = open();
    life.step({R"({"b":"text"})"}, [&] { settings->remove("a"); });
}

std::string lookAtSettings(Life& life)
{
    const std::string text = toJson(UserDefaults(*life.files, life.root / "a/b.json", life.makeQueue("a")).contents());
    return text == "{}" ? "" : text;
}

void useCounters(Life& life)
{
    CounterStore counters(*life.files, life.root / "state/counters.json", life.makeQueue("a"));
    counters.add("a", 1);
    life.step({"a=1"}, [&] { counters.synchronize(); });
    counters.add("b", 2);
    life.step({"a=1 b=2"}, [&] { life.advance(1min); });
    counters.add("a", 1);
    life.step({"a=2 b=2"}, [&] { counters.synchronize(); });
}

std::string lookAtCounters(Life& life)
{
    std::string words;
    for (const auto& [name, count] :
         CounterStore(*life.files, life.root / "state/counters.json", life.makeQueue("a")).snapshot())
        words += (words.empty() ? "" : " ") + name + "=" + std::to_string(count);
    return words;
}

void useBooks(Life& life)
{
    using tavrin::FeedbackFate;
    tavrin::FeedbackBooks books(*life.files, life.root / "state/books.json", life.makeQueue("a"));
    books.record(FeedbackFate::Closed, 3);
    life.step({"3 recorded"}, [&] { books.saveSoon(); });
    books.move(FeedbackFate::Closed, FeedbackFate::Uploading, 3);
    life.step({"3 recorded 3 sent settled"}, [&] { books.settle("upload", FeedbackFate::Sent, 3); });
    books.record(FeedbackFate::TooOld, 1);
    life.step({"4 recorded 3 sent settled"}, [&] { books.save(); });
}

std::string lookAtBooks(Life& life)
{
    const tavrin::FeedbackBooks books(*life.files, life.root / "state/books.json", life.makeQueue("a"));
    std::string words = books.recorded() == 0 ? "" : fmt::format("{} recorded", books.recorded());
    if (const auto sent = books.count(tavrin::FeedbackFate::Sent)) words += fmt::format(" {} sent", sent);
    return words + (books.isSettled("upload") ? " settled" : "");
}

/// The activities of a process, whose lived time goes on from that of the file.
struct Activities {
    explicit Activities(Life& life)
        : use(life.executor), scheduler(makeActivityScheduler(
                                  {life.clock, life.executor, *life.files, use, life.root / "state/activities.json"}))
    {
        scheduler->registerActivity("a", {.repeating = true, .delay = 300s, .interval = 1000s}, [](const auto&) {});
        life.drain();
    }
    test::FakeDeviceUse use;
    const std::unique_ptr<ActivityScheduler> scheduler;
};

void useActivities(Life& life)
{
    const Activities activities(life);
    life.steps.front().state = "300"; // after a restart it waits for its delay at least
    life.step({"1000"}, [&] { life.advance(300s); });
}

std::string lookAtActivities(Life& life)
{
    const Activities activities(life);
    std::string words;
    activities.scheduler->describe([&](const Value::Array& all) {
        for (const Value& activity : all)
            words += fmt::format("{}", std::lround(activity["inSeconds"].asDouble().value_or(0)));
    });
    life.drain();
    return words;
}

bool sameBytes(std::span<std::uint8_t> bytes)
{
    std::ranges::fill(bytes, std::uint8_t{7});
    return true;
}

void useRecorder(Life& life)
{
    PrivacyRecorder recorder(*life.files, life.clock, life.root / "state/privacy", sameBytes);
    const auto record = [&](const std::set<std::string>& texts) {
        EXPECT_EQ(recorder.record("key", texts).value_or(0), texts.size());
    };
    life.step({"2 debits", "2 debits 2 reports"}, [&] { record({"a", "b"}); });
    life.step({"5 debits 2 reports", "5 debits 5 reports"}, [&] { record({"c", "d", "e"}); });
}

std::string lookAtRecorder(Life& life)
{
    std::string words;
    if (const auto text = life.files->read(life.root / "state/privacy/ledger", 1 << 20)) {
        const auto ledger = PrivacyLedger::parse(text->view());
        if (!ledger || ledger->secret[0] != 7) return "a damaged ledger";
        int debits = 0;
        for (const auto& debit : ledger->debits) debits += debit.reports;
        words = fmt::format("{} debits", debits);
    }
    if (const auto text = life.files->read(life.root / "state/privacy/reports.json", 1 << 20)) {
        const auto reports = parseJson(text->view());
        words += reports ? fmt::format(" {} reports", reports->count()) : " damaged reports";
    }
    return words;
}

FileHandle temporaryFile(Life& life, std::string_view contents)
{
    auto file = value(life.files->createTemporary());
    EXPECT_EQ(pwrite(file.fd(), contents.data(), contents.size(), 0), static_cast<ssize_t>(contents.size()));
    return file;
}

void useHints(Life& life)
{
    const auto hints = makeDataDetectorStore(*life.files, life.root / "data/hints");
    const auto set = [&](const std::string& text) {
        const auto file = temporaryFile(life, text);
        done(hints->setSource(2, &file, "signature-of-" + text));
    };
    life.step({"old", "old signature-of-old"}, [&] { set("old"); });
    life.step({"old", "new", "new signature-of-new"}, [&] { set("new"); });
    life.step({"new", ""}, [&] { done(hints->setSource(2, nullptr, "")); });
}

std::string lookAtHints(Life& life)
{
    const auto source = life.files->read(life.root / "data/hints/2.source", 1 << 20);
    const auto signature = makeDataDetectorStore(*life.files, life.root / "data/hints")->clientSignature(2);
    return (source ? std::string(source->view()) : "") + (signature ? " " + *signature : "");
}

void useAppActivities(Life& life)
{
    const AppActivities activities(*life.files, life.root / "data");
    std::string words;
    for (int i = 1; i <= 3; ++i) {
        words += fmt::format("{}app{}", i == 1 ? "" : " ", i);
        life.step({words}, [&] {
            done(activities.add({.start = life.clock.wallNow() + std::chrono::seconds(i),
                                 .bundleIdentifier = fmt::format("app{}", i),
                                 .contentUrl = std::string(2000, 'u')},
                                life.clock.wallNow()));
        });
    }
}

std::string lookAtAppActivities(Life& life)
{
    const AppActivities activities(*life.files, life.root / "data");
    // What an interrupted application left is only undone by the next.
    const Result<void> added =
        activities.add({.start = life.clock.wallNow() + 1h, .bundleIdentifier = ""}, life.clock.wallNow());
    if (!added) return "can't be added to: " + added.error().description();
    const auto all = activities.queryAppActivitiesAfterDate({}, life.clock.wallNow() + 59min, 100);
    if (!all) return "can't be read: " + all.error().description();
    std::string words;
    for (const AppActivity& activity : *all) words += (words.empty() ? "" : " ") + activity.bundleIdentifier;
    return words;
}

std::shared_ptr<const UrlRequest> requestTo(const std::string& url)
{
    return std::make_shared<const UrlRequest>(UrlRequest{.url = *Url::parse(url), .method = "POST"});
}

void useTransfers(Life& life)
{
    const LivedTime::Mark time = LivedTime(life.clock).mark();
    const auto open = [&] { return value(BackgroundStore::open(*life.files, life.root / "state/transfers")); };
    auto store = open();
    StoredTask upload{.isUpload = true, .request = requestTo("https://a.example/up")};
    StoredTask download{.request = requestTo("https://a.example/down")};
    const std::string body(10'000, 'u');
    life.step({"1:body"}, [&] {
        const auto file = temporaryFile(life, body);
        done(store->add(upload, &file, 1 << 20));
    });
    life.step({"1:body:resumed"}, [&] {
        upload.resumed = true;
        done(store->save(upload, time));
    });
    life.step({"1:body:resumed 2"}, [&] { done(store->add(download, nullptr, 0)); });
    life.step({"1:body:resumed 2:ended:received"}, [&] {
        const auto file = value(store->createDownload(download.identifier));
        EXPECT_EQ(::write(file.fd(), body.data(), body.size()), static_cast<ssize_t>(body.size()));
        done(store->syncDownload(download.identifier));
        download.outcome = {UrlResponse{.url = *Url::parse("https://a.example/down"), .statusCode = 200}, {}};
        done(store->save(download, time));
    });
    store.reset();
    store = open();
    life.step({"2:ended:received"}, [&] { done(store->forget(upload.identifier)); });
    life.step({""}, [&] { done(store->forget(download.identifier)); });
    StoredTask last{.isUpload = true, .request = requestTo("https://a.example/up")};
    life.step({"3:body"}, [&] {
        const auto file = temporaryFile(life, body);
        done(store->add(last, &file, 1 << 20));
    });
}

std::string lookAtTransfers(Life& life)
{
    const auto opened = BackgroundStore::open(*life.files, life.root / "state/transfers");
    if (!opened) return "can't be opened: " + opened.error().description();
    const auto isWhole = [](const FileHandle& file) {
        return readFile(file, 1 << 20)->view() == std::string(10'000, 'u');
    };
    std::string words;
    for (const StoredTask& task : (*opened)->takeContents().tasks) {
        words += fmt::format("{}{}", words.empty() ? "" : " ", task.identifier);
        if (task.isUpload) {
            const auto body = (*opened)->openBody(task);
            words += body && isWhole(*body) ? ":body" : ":damaged";
        }
        if (task.resumed) words += ":resumed";
        if (!task.outcome) continue;
        words += ":ended";
        const auto file = life.files->openForReading((*opened)->downloadPath(task.identifier));
        words += file && isWhole(*file) ? ":received" : ":damaged";
    }
    const auto names = *life.files->list(life.root / "state/transfers");
    for (const std::string& name : names)
        if (name.ends_with(".body") && !words.contains(name.substr(0, 1) + ":body")) words += " orphan " + name;
    StoredTask later{.isUpload = true, .request = requestTo("https://a.example/up")};
    const auto file = temporaryFile(life, "later");
    const auto added = (*opened)->add(later, &file, 1 << 20);
    return added ? words : "can't be added to: " + added.error().description();
}

std::shared_ptr<StoredResponse> responseOf(char contents, std::size_t size)
{
    auto stored = std::make_shared<StoredResponse>();
    stored->response = {.url = *Url::parse("https://a.example/"), .statusCode = 200};
    stored->body = Bytes(std::string(size, contents));
    return stored;
}

void useHttpCache(Life& life)
{
    auto cache = value(HttpCacheStore::open(*life.files, life.root / "caches/http", {45'000, 16384}));
    life.step({"1=a"}, [&] { value(cache->put("1", *responseOf('a', 500))); });
    life.step({"1=a 2=b"}, [&] { value(cache->put("2", *responseOf('b', 17'000))); });
    life.step({"1=a 2=c"}, [&] { value(cache->put("2", *responseOf('c', 18'000))); });
    life.step({"2=c"}, [&] { done(cache->remove("1")); });
    life.step({"2=c 3=d"}, [&] { value(cache->put("3", *responseOf('d', 18'000))); });
    life.step({"3=d 4=e"}, [&] { value(cache->put("4", *responseOf('e', 18'000))); });
}

std::string lookAtHttpCache(Life& life)
{
    const auto cache = HttpCacheStore::open(*life.files, life.root / "caches/http", {45'000, 16384});
    if (!cache) return "can't be opened: " + cache.error().description();
    std::string words;
    for (const char* key : {"1", "2", "3", "4"}) {
        const auto found = (*cache)->find(key);
        if (!found) return "can't be read: " + found.error().description();
        if (*found) words += fmt::format("{}{}={}", words.empty() ? "" : " ", key, (*found)->body.view()[0]);
        if (*found && (*found)->body.view().find_first_not_of((*found)->body.view()[0]) != std::string_view::npos)
            words += ":damaged";
    }
    const auto put = (*cache)->put("later", *responseOf('l', 17'000));
    return put ? words : "can't be added to: " + put.error().description();
}

/// Session files of a process.
struct Sessions {
    explicit Sessions(Life& life)
        : store(std::make_shared<const tavrin::FileContainerStore>(tavrin::FileContainerStore{
              *life.files, transactions, diagnosticData, life.makeQueue("a"), "tavrind/1", 4u << 20})),
          path(life.root / "session.1")
    {}
    Transactions transactions;
    CounterStore counters;
    tavrin::TavrinDiagnosticDataReporter diagnosticData{counters};
    const std::shared_ptr<const tavrin::FileContainerStore> store;
    const fs::path path;
};

/// The events of a session file: a name, which is also the text, and its length.
constexpr std::array kSessionEvents{std::pair('a', 100), std::pair('b', 5000), std::pair('c', 100),
                                    std::pair('d', 9000), std::pair('e', 100)};

void useSessionFile(Life& life)
{
    const Sessions sessions(life);
    const auto file = std::make_shared<tavrin::FileContainer>(sessions.store, sessions.path,
                                                              value(life.files->createForAppending(sessions.path)));
    life.step({""}, [&] { file->writeSessionHeader({}); });
    std::string words;
    for (const auto& [name, size] : kSessionEvents) {
        words += fmt::format("{}{}", words.empty() ? "" : " ", name);
        life.step({words}, [&] {
            auto record = std::make_shared<tavrin::ZRDidGoToSiteFeedback>();
            record->input = std::string(size, name);
            file->writeFeedback(std::make_shared<tavrin::TavrinFeedback>(record, 1, "", "", 0), {});
        });
    }
}

std::string lookAtSessionFile(Life& life)
{
    const Sessions sessions(life);
    const auto file = std::make_shared<tavrin::FileContainer>(sessions.store, sessions.path);
    const auto session = file->read().session;
    std::string words;
    if (!session) return "";
    for (std::size_t i = 0; const auto& event : session->feedbacks()) {
        const auto record = std::dynamic_pointer_cast<tavrin::ZRDidGoToSiteFeedback>(event->feedback());
        const auto& [name, size] = kSessionEvents.at(i++);
        const bool isWhole = record && record->input == std::string(size, name);
        words += fmt::format("{}{}{}", words.empty() ? "" : " ", name, isWhole ? "" : ":damaged");
    }
    return words;
}

void useAndRemoveTraces(Life& life)
{
    life.step({"traces"}, [&] {
        for (const char* directory : {"caches", "state", "data", "config"}) {
            const fs::path file = life.root / directory / "com.quorvane.tavrind" / "file";
            done(life.files->createDirectories(file.parent_path()));
            done(life.files->writeAtomically(file, "x"));
        }
        done(life.files->writeAtomically(life.root / "config/com.quorvane.tavrind.json", "{}"));
    });
    const Directories directories{.caches = life.root / "caches",
                                  .config = life.root / "config",
                                  .state = life.root / "state",
                                  .data = life.root / "data",
                                  .temporary = life.root / "tmp"};
    life.step({"traces", ""}, [&] { EXPECT_TRUE(tavrin::removeTraces(directories, true).empty()); });
}

std::string lookAtTraces(Life& life)
{
    for (const char* trace : {"caches/com.quorvane.tavrind", "state/com.quorvane.tavrind", "data/com.quorvane.tavrind",
                              "config/com.quorvane.tavrind.json"})
        if (fs::exists(life.root / trace)) return "traces";
    return "";
}

const Store kStores[]{
    {"Settings", Keeps::Everything, useSettings, lookAtSettings},
    {"Counters", Keeps::Everything, useCounters, lookAtCounters},
    {"Books", Keeps::Everything, useBooks, lookAtBooks},
    {"Activities", Keeps::Everything, useActivities, lookAtActivities},
    {"LedgerAndReports", Keeps::Everything, useRecorder, lookAtRecorder},
    {"LookupHints", Keeps::Everything, useHints, lookAtHints},
    {"AppActivities", Keeps::Earlier, useAppActivities, lookAtAppActivities},
    {"Transfers", Keeps::Everything, useTransfers, lookAtTransfers},
    {"SessionFile", Keeps::Torn, useSessionFile, lookAtSessionFile},
    {"HttpCache", Keeps::Words, useHttpCache, lookAtHttpCache},
    {"RemovedTraces", Keeps::Everything, useAndRemoveTraces, lookAtTraces},
};

std::set<std::string> wordsOf(const std::string& state)
{
    std::istringstream stream(state);
    return {std::istream_iterator<std::string>(stream), {}};
}

struct StorePowerCutTest : testing::TestWithParam<Store> {};

TEST_P(StorePowerCutTest, KeepsItsPromise)
{
    const Store& store = GetParam();
    test::RecordedDisk disk;
    Life life(disk);
    store.live(life);
    disk.stop();
    ASSERT_TRUE(disk.after(disk.calls(), {test::RecordedDisk::Luck::Kind::Everything, 0}) == disk.now())
        << "a change was missed";

    const auto look = [&] {
        Life later(disk);
        return store.look(later);
    };
    test::afterEachCut(disk, test::Cuts::All, look, [&](const test::Cut& cut, std::string found) {
        const Keeps keeps = cut.isKill ? Keeps::Everything : store.keeps;
        constexpr std::string_view kDamaged = ":damaged";
        if (keeps == Keeps::Torn)
            for (std::size_t at = 0; (at = found.find(kDamaged, at)) != std::string::npos;)
                found.erase(at, kDamaged.size());
        std::vector<std::string> expected;
        std::set<std::string> words;
        for (const Life::Step& step : life.steps) {
            if (step.done <= cut.calls && keeps == Keeps::Everything) expected.clear();
            if (step.begun >= cut.calls && step.done > 0) break;
            expected.push_back(step.state);
            words.merge(wordsOf(step.state));
        }
        if (std::ranges::find(expected, found) != expected.end()) return;
        if (keeps == Keeps::Words && std::ranges::includes(words, wordsOf(found))) return;
        ADD_FAILURE() << cut.name << "\nfound \"" << found << "\" instead of one of " << fmt::format("{}", expected);
    });
}

INSTANTIATE_TEST_SUITE_P(Stores, StorePowerCutTest, testing::ValuesIn(kStores),
                         [](const auto& store) { return std::string(store.param.name); });

} // namespace
} // namespace platform
