#include "platform/net/BackgroundSession.h"

#include <algorithm>
#include <fcntl.h>
#include <unistd.h>

#include <fmt/format.h>
#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/files/Sqlite.h"
#include "platform/net/NetworkStatus.h"
#include "platform/values/Json.h"
#include "tests/support/ByHand.h"
#include "tests/support/FakeUrlLoader.h"
#include "tests/support/FullDisk.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
using test::FakeUrlLoader;
namespace fs = std::filesystem;

const UrlRequest kRequest{.url = *Url::parse("https://a.example/r")};

std::string contentsOf(const FileHandle& file)
{
    return std::string(readFile(file, 1u << 20).value_or(Bytes("(none)")).view());
}

/// Writes down what it is told, a line each.
struct Recorder final : BackgroundSessionDelegate {
    std::vector<std::string> told;
    void taskDidFinishDownloading(const std::shared_ptr<BackgroundTask>& task, const fs::path& file,
                                  const UrlResponse&) override
    {
        told.push_back(
            fmt::format("{} file {}", task->identifier(), contentsOf(FileHandle(open(file.c_str(), O_RDONLY)))));
    }
    void taskDidComplete(const std::shared_ptr<BackgroundTask>& task, const std::optional<UrlResponse>& response,
                         const std::optional<Error>& error) override
    {
        told.push_back(fmt::format("{} {} {} note {}", task->identifier(), response ? response->statusCode : 0,
                                   error ? error->code : 0, toJson(task->note())));
    }
    void sessionDidFinishEvents() override { told.push_back("all"); }
    void sessionDidBecomeInvalid(const Error& error) override { told.push_back("invalid " + error.domain); }
};

/// A process with one background session on a directory; its loads are answered by hand.
struct Process : test::ByHand {
    explicit Process(const fs::path& root_, BackgroundSessionConfiguration configuration = {.identifier = "uploads"},
                     test::ManualClock* clock_ = nullptr)
        : root(root_), time(clock_ ? *clock_ : clock)
    {
        network.set({});
        session = sessions->make(std::move(configuration), delegate, queue);
        drain();
    }
    ~Process()
    {
        session.reset();
        drain();
        loader.cancelAll();
        drain();
    }
    void advance(Duration by)
    {
        time.advance(by, [this] { drain(); });
    }
    std::shared_ptr<BackgroundTask> upload(std::string_view body, const std::string& url = "https://a.example/up")
    {
        test::writeFile(root / "body", body);
        auto task = session->uploadTask({.url = *Url::parse(url), .method = "POST"}, root / "body");
        fs::remove(root / "body");
        EXPECT_TRUE(task) << task.error().description();
        return task.value_or(nullptr);
    }
    std::shared_ptr<BackgroundTask> resumed(std::string_view body, const std::string& url = "https://a.example/up")
    {
        auto task = upload(body, url);
        task->resume();
        drain();
        return task;
    }
    /// The attempts that are under way.
    std::vector<std::shared_ptr<FakeUrlLoader::Task>> attempts()
    {
        drain();
        std::vector<std::shared_ptr<FakeUrlLoader::Task>> running;
        for (const auto& task : loader.sessions.at(0)->tasks)
            if (!task->finished) running.push_back(task);
        return running;
    }
    void answer(int status, HttpHeaders headers = {})
    {
        attempts().at(0)->respond(status, "", std::move(headers));
        drain();
    }
    void fail(std::int64_t code, std::string_view domain = kUrlErrorDomain)
    {
        attempts().at(0)->fail(Error(std::string(domain), code));
        drain();
    }
    /// Answers attempts, also those made later, until there are none.
    void answerAll(int status)
    {
        for (int i = 0; i < 200; ++i) {
            for (const auto& attempt : attempts()) attempt->respond(status, "");
            advance(1h);
        }
    }
    std::vector<std::string> told() { return std::exchange(delegate->told, {}); }

    fs::path root;
    test::ManualClock& time; ///< its own, or one that outlives it
    FakeUrlLoader loader;
    NetworkStatus network;
    std::shared_ptr<Queue> queue = makeQueue("delegate");
    std::shared_ptr<Recorder> delegate = std::make_shared<Recorder>();
    std::unique_ptr<FileSystem> files = makeSystemFiles();
    std::unique_ptr<BackgroundSessions> sessions = makeBackgroundSessions({.files = *files,
                                                                           .loader = loader,
                                                                           .network = network,
                                                                           .clock = time,
                                                                           .executor = executor,
                                                                           .directory = root / "transfers",
                                                                           .temporary = root});
    std::shared_ptr<BackgroundSession> session;
};

struct BackgroundSessionTest : testing::Test {
    [[nodiscard]] fs::path store() const { return root.path / "transfers" / "uploads"; }
    [[nodiscard]] std::ptrdiff_t bodies() const
    {
        return std::ranges::count_if(fs::directory_iterator(store()),
                                     [](const auto& entry) { return entry.path().extension() == ".body"; });
    }
    test::TemporaryDirectory root;
    using Told = std::vector<std::string>;
};

TEST_F(BackgroundSessionTest, AnUploadHasItsOwnCopyAndEndsOnce)
{
    Process process(root.path);
    EXPECT_FALSE(fs::exists(root / "transfers")) << "nothing is made before there is something to keep";
    const auto task = process.upload("the body");
    EXPECT_TRUE(process.attempts().empty()) << "nothing moves before resume";
    test::writeFile(root / "body", "another body");
    task->setNote(Value::dictionaryOf({{"count", 3}}));
    task->resume();
    task->resume();
    ASSERT_EQ(process.attempts().size(), 1u);
    EXPECT_EQ(contentsOf(process.attempts()[0]->files.upload), "the body");
    EXPECT_EQ(test::modeOf(store()), 0700u);
    for (const auto& entry : fs::directory_iterator(store()))
        EXPECT_EQ(test::modeOf(entry.path()), 0600u) << entry.path();
    process.attempts()[0]->timing = "timing";
    process.answer(500);
    EXPECT_EQ(process.told(), (Told{"1 500 0 note {\"count\":3}", "all"})) << "any status ends a task";
    EXPECT_EQ(task->timingData(), Value("timing"));
    task->cancel();
    process.drain();
    EXPECT_TRUE(process.told().empty());
    EXPECT_FALSE(fs::exists(store() / "1.body"));
}

TEST_F(BackgroundSessionTest, ADownloadIsHandedOverInAFileThatGoes)
{
    Process process(root.path);
    process.session->downloadTask(kRequest).value()->resume();
    const auto attempt = process.attempts().at(0);
    ASSERT_EQ(pwrite(attempt->files.download.fd(), "resource", 8, 0), 8);
    attempt->respond(200, "");
    process.drain();
    EXPECT_EQ(process.told(), (Told{"1 file resource", "1 200 0 note null", "all"}));
    EXPECT_FALSE(fs::exists(store() / "1.download"));
}

// ---- kills ----

/// What becomes of a store that was copied while a process went through the life of one task.
TEST_F(BackgroundSessionTest, AKillAtAnyMomentLosesAndDoublesNothing)
{
    Process process(root.path);
    int step = 0;
    const auto copyOf = [&](int n) { return root.path / fmt::format("copy{}", n); };
    const auto kill = [&] {
        fs::create_directories(copyOf(step) / "transfers");
        fs::copy(store(), copyOf(step) / "transfers" / "uploads");
        ++step;
    };
    auto task = process.upload("whole body");
    kill(); // 0
    task->setNote(7);
    kill(); // 1
    task->resume();
    kill(); // 2: resumed
    process.drain();
    kill(); // 3: under way
    process.fail(kUrlConnectionLost);
    kill(); // 4: waiting for its next attempt
    process.advance(1h);
    process.attempts().at(0)->respond(204, "");
    kill(); // 5: answered, unheard
    process.drain();
    kill(); // 6: over

    const bool goesOn[]{false, false, true, true, true, true, false};
    for (int n = 0; n < step; ++n) {
        Process after(copyOf(n));
        after.advance(1h);
        EXPECT_EQ(after.attempts().size(), goesOn[n] ? 1u : 0u) << n;
        for (const auto& attempt : after.attempts()) EXPECT_EQ(contentsOf(attempt->files.upload), "whole body") << n;
        after.answerAll(200);
        EXPECT_EQ(after.told(), goesOn[n] ? (Told{"1 200 0 note 7", "all"}) : Told{}) << n;
        EXPECT_FALSE(fs::exists(copyOf(n) / "transfers/uploads/1.body")) << n;
    }
}

TEST_F(BackgroundSessionTest, AnAnswerIsReportedAgainWhereItsOwnerWasKilledHearingIt)
{
    {
        Process process(root.path);
        (void)process.resumed("x");
        process.delegate.reset(); // nobody hears it
        process.answer(200, {{"ETag", "e"}});
    }
    Process next(root.path);
    EXPECT_EQ(next.told(), (Told{"1 200 0 note null", "all"}));
    EXPECT_TRUE(next.attempts().empty()) << "the body isn't sent again";
}

TEST_F(BackgroundSessionTest, ADownloadWhoseFileWasTakenIsMadeAgain)
{
    {
        Process process(root.path);
        process.session->downloadTask(kRequest).value()->resume();
        process.drain();
        process.delegate.reset();
        process.answer(200);
    }
    fs::remove(store() / "1.download");
    Process next(root.path);
    EXPECT_EQ(next.attempts().size(), 1u);
}

TEST_F(BackgroundSessionTest, WhatAKillLeftBehindIsSwept)
{
    {
        Process process(root.path);
        (void)process.resumed("x");
        (void)process.upload("never resumed");
        test::writeFile(store() / "99.body", "of no task");
        test::writeFile(store() / "98.download", "of no task");
    }
    Process next(root.path);
    EXPECT_TRUE(fs::exists(store() / "1.body"));
    for (const char* name : {"2.body", "99.body", "98.download"}) EXPECT_FALSE(fs::exists(store() / name)) << name;
    EXPECT_EQ(next.upload("new")->identifier(), 3u) << "an identifier isn't used twice";
}

// ---- stores that can't be used ----

TEST_F(BackgroundSessionTest, ADamagedStoreIsBegunAnew)
{
    const test::LogCapture log;
    const auto damage = [&](off_t offset, std::string_view bytes) {
        const FileHandle file(open((store() / "transfers.db").c_str(), O_WRONLY));
        EXPECT_EQ(pwrite(file.fd(), bytes.data(), bytes.size(), offset), std::ssize(bytes));
    };
    const std::pair<const char*, std::function<void()>> cases[]{
        {"no database", [&] { damage(0, "this is not a database"); }},
        {"broken page", [&] { damage(4096, std::string(4096, '\xff')); }},
        {"another shape",
         [&] {
             EXPECT_TRUE(Sqlite::open(store() / "transfers.db")->execute("ALTER TABLE task ADD COLUMN other TEXT"));
         }},
        {"empty", [&] { fs::resize_file(store() / "transfers.db", 0); }},
        {"cut", [&] { fs::resize_file(store() / "transfers.db", 5000); }},
    };
    for (const auto& [name, hurt] : cases) {
        fs::remove_all(store());
        {
            (void)Process(root.path).resumed("x");
        }
        hurt();
        Process next(root.path);
        EXPECT_TRUE(next.attempts().empty()) << name;
        EXPECT_TRUE(next.told().empty()) << name << ": not invalid";
        EXPECT_FALSE(fs::exists(store() / "1.body")) << name;
        (void)next.resumed("y");
        next.answer(200);
        EXPECT_EQ(next.told().size(), 2u) << name;
    }
    EXPECT_EQ(log.count("are damaged, starting with an empty list"), 4) << "an empty file is a new store";
}

TEST_F(BackgroundSessionTest, WhileTheStoreCantBeUsedTasksWorkAndEndWithTheProcess)
{
    fs::create_directory(root / "elsewhere");
    const std::pair<const char*, std::function<std::shared_ptr<void>()>> cases[]{
        {"another process", [&] { return std::make_shared<Process>(root.path); }},
        {"a link", [&] { return fs::create_directory_symlink(root / "elsewhere", store()), nullptr; }},
        {"a file", [&] { return test::writeFile(store(), ""), nullptr; }},
        {"a link for the database",
         [&] {
             fs::create_directory(store());
             return fs::create_symlink(root / "elsewhere/db", store() / "transfers.db"), nullptr;
         }},
    };
    for (const auto& [name, spoil] : cases) {
        fs::remove_all(root / "transfers");
        fs::create_directory(root / "transfers");
        auto other = spoil();
        if (other) (void)std::static_pointer_cast<Process>(other)->resumed("the other's");
        {
            Process process(root.path);
            (void)process.resumed("mine");
            ASSERT_EQ(process.attempts().size(), 1u) << name;
            EXPECT_EQ(contentsOf(process.attempts()[0]->files.upload), "mine");
            process.answer(200);
            EXPECT_EQ(process.told(), (Told{"invalid POSIX", "1 200 0 note null", "all"})) << name;
            (void)process.resumed("still temporary");
            other.reset();
            fs::remove_all(store());
            process.advance(1min);
            (void)process.resumed("beside the one that waits");
            EXPECT_FALSE(fs::exists(store())) << name;
            process.answerAll(200);
            (void)process.resumed("stored");
            EXPECT_EQ(bodies(), 1) << name;
        }
        EXPECT_TRUE(fs::is_empty(root / "elsewhere")) << name;
        for (const auto& entry : fs::directory_iterator(root.path))
            EXPECT_FALSE(entry.path().filename().string().starts_with("background")) << name;
    }
}

TEST_F(BackgroundSessionTest, AStoreThatCannotBeOpenedIsTriedAgainWithTheNextTask)
{
    const fs::path device = root / "device";
    Process process(device);
    test::writeFile(root / "body", "x");
    test::writeFile(device, ""); // in the way of its directories
    EXPECT_FALSE(process.session->uploadTask(kRequest, root / "body"));
    fs::remove(device);
    fs::create_directory(device);
    EXPECT_TRUE(process.session->uploadTask(kRequest, root / "body"));
}

TEST_F(BackgroundSessionTest, ATaskThatCantBeKeptIsAnError)
{
    BackgroundSessionConfiguration limits{.identifier = "uploads", .maximumTasks = 2, .maximumBodyBytes = 10};
    Process process(root.path, limits);
    const auto make = [&](const UrlRequest& request, std::string_view body) {
        test::writeFile(root / "body", body);
        return process.session->uploadTask(request, root / "body");
    };
    UrlRequest huge = kRequest;
    huge.headers.set("X", std::string(300'000, 'x'));
    EXPECT_EQ(make({}, "x").error().code, kUrlBadUrl);
    EXPECT_EQ(make(huge, "x").error().code, kUrlTooLarge);
    EXPECT_EQ(make(kRequest, "12345678901").error().code, kUrlTooLarge);
    EXPECT_EQ(process.session->uploadTask(kRequest, root / "nothing").error().code, ENOENT);
    fs::create_symlink(root / "body", root / "link");
    EXPECT_EQ(process.session->uploadTask(kRequest, root / "link").error().code, ELOOP);
    EXPECT_EQ(process.session->uploadTask(kRequest, root.path).error().domain, kPosixErrorDomain);

    const auto first = make(kRequest, "123456");
    ASSERT_TRUE(first);
    EXPECT_EQ(make(kRequest, "12345").error().code, kUrlTooLarge) << "together";
    auto second = make(kRequest, "1234");
    ASSERT_TRUE(second);
    EXPECT_EQ(make(kRequest, "").error().code, kUrlTooLarge) << "a third";
    second->reset();
    process.drain();
    EXPECT_TRUE(make(kRequest, "1")) << "one that was let go of has made room";
    process.drain();
    EXPECT_EQ(bodies(), 1u) << "nothing is left of what wasn't made, and the last was let go of at once";
    (*first)->setNote(std::string(200'000, 'n'));
    EXPECT_TRUE((*first)->note().isNull());
}

TEST_F(BackgroundSessionTest, OnAFullDiskATaskIsAnErrorAndTheOthersGoOn)
{
    Process process(root.path);
    const auto first = process.resumed("first");
    test::writeFile(root / "large", std::string(300'000, 'x'));
    test::writeFile(root / "small", "small");
    std::vector<std::shared_ptr<BackgroundTask>> kept;
    test::onFullDisk(200'000, [&] {
        EXPECT_FALSE(process.session->uploadTask(kRequest, root / "large"));
        while (kept.size() < 100) {
            auto made = process.session->uploadTask(kRequest, root / "small");
            if (!made) break;
            kept.push_back(*made);
        }
        process.answer(200);
    });
    EXPECT_LT(kept.size(), 100u) << "the database's own log is full";
    EXPECT_EQ(process.told(), (Told{"1 200 0 note null"}));
    EXPECT_LE(bodies(), kept.size() + 1) << "nothing of those that weren't made";
    EXPECT_TRUE(process.session->uploadTask(kRequest, root / "large")) << "once there is room";
    process.drain();
    EXPECT_FALSE(fs::exists(store() / "1.body"));
}

TEST_F(BackgroundSessionTest, ABodyThatWasChangedOnDiskIsNotSent)
{
    {
        (void)Process(root.path).resumed("whole body");
    }
    fs::resize_file(store() / "1.body", 3);
    Process next(root.path);
    EXPECT_TRUE(next.attempts().empty());
    EXPECT_EQ(next.told(), (Told{fmt::format("1 0 {} note null", EBADMSG), "all"}));
}

// ---- waiting ----

TEST_F(BackgroundSessionTest, TasksWaitForTheNetworkThatTheyMayUse)
{
    const NetworkState offline{.online = false};
    const NetworkState metered{.metered = true};
    Process process(root.path, {.identifier = "uploads", .allowsMetered = false});
    process.network.set(offline);
    (void)process.resumed("x");
    EXPECT_TRUE(process.attempts().empty());
    process.network.set(metered);
    EXPECT_TRUE(process.attempts().empty());
    process.network.set({});
    EXPECT_EQ(process.attempts().size(), 1u);
    process.network.set(metered);
    EXPECT_TRUE(process.attempts().empty()) << "what is under way is broken off";
    process.network.set({});
    process.drain();
    process.network.set(offline);
    EXPECT_EQ(process.attempts().size(), 1u) << "the attempt finds out by itself";
    process.fail(kUrlCannotFindHost);
    process.network.set({});
    EXPECT_EQ(process.attempts().size(), 1u) << "no delay once the network is back";
    EXPECT_TRUE(process.told().empty());
}

TEST_F(BackgroundSessionTest, FailedAttemptsAreMadeAgainUntilTheTimeIsUp)
{
    Process process(root.path, {.identifier = "uploads", .resourceTimeout = 24h});
    (void)process.resumed("x");
    int attempts = 0;
    for (int minute = 0; minute < 24 * 60; ++minute) {
        if (!process.attempts().empty()) {
            ++attempts;
            process.fail(kUrlConnectionLost);
        }
        EXPECT_LE(process.time.pendingTimers(), 1u);
        process.advance(1min);
    }
    EXPECT_GT(attempts, 6) << "the longest delay is four hours";
    EXPECT_LT(attempts, 27) << "after two failures, the shortest is an hour";
    EXPECT_EQ(process.told(), (Told{fmt::format("1 0 {} note null", std::int64_t{kUrlTimedOut}), "all"}));
    EXPECT_EQ(process.time.pendingTimers(), 0u);
}

TEST_F(BackgroundSessionTest, ASuccessOfTheHostEndsItsDelays)
{
    Process process(root.path, {.identifier = "uploads", .parallelTransfers = 1});
    (void)process.resumed("1");
    (void)process.resumed("2", "https://b.example/");
    for (int failure = 0; failure < 4; ++failure) {
        process.fail(kUrlConnectionLost);
        process.advance(failure == 1 ? 30s : 0s);
    }
    (void)process.resumed("3");
    process.answer(503);
    EXPECT_TRUE(process.attempts().empty()) << "refused: the others would be, too";
    (void)process.resumed("4");
    process.answer(200);
    ASSERT_EQ(process.attempts().size(), 1u);
    EXPECT_EQ(process.attempts()[0]->originalRequest().url.host(), "a.example");
    process.fail(kUrlConnectionLost);
    process.advance(30s);
    ASSERT_EQ(process.attempts().size(), 1u) << "the delays begin anew";
    process.answer(200);
    EXPECT_TRUE(process.attempts().empty()) << "another host";
}

TEST_F(BackgroundSessionTest, AStartWindowHoldsForEveryReasonToStart)
{
    test::ManualClock clock;
    {
        Process process(root.path, {.identifier = "uploads"}, &clock);
        for (int i = 0; i < 40; ++i) {
            const auto task = process.upload("x");
            task->setStartWindow(1h);
            task->resume();
        }
        (void)process.resumed("y");
        process.answer(200);
        process.network.set({.online = false});
        process.drain();
        process.network.set({});
        EXPECT_TRUE(process.attempts().empty()) << "neither a success nor the network ends the wait";
    }
    Process next(root.path, {.identifier = "uploads", .parallelTransfers = 100}, &clock);
    next.advance(30min);
    EXPECT_NEAR(static_cast<double>(next.attempts().size()), 20, 15);
    next.advance(30min);
    EXPECT_EQ(next.attempts().size(), 40u);
}

TEST_F(BackgroundSessionTest, WhatCantGetBetterEndsATask)
{
    Process process(root.path);
    (void)process.resumed("x");
    process.fail(ENOSPC, kPosixErrorDomain);
    EXPECT_TRUE(process.told().empty());
    process.advance(1h);
    process.fail(kUrlForbiddenRedirect);
    EXPECT_EQ(process.told(), (Told{fmt::format("1 0 {} note null", std::int64_t{kUrlForbiddenRedirect}), "all"}));
}

TEST_F(BackgroundSessionTest, TheTimeOutGoesOnWithoutTheProcessAndLeapsOfTheClockDontCount)
{
    const auto sleep = &test::ManualClock::suspend;
    const auto off = &test::ManualClock::restartDevice;
    const auto leap = [](test::ManualClock& clock, Duration by) { clock.setWall(clock.wallNow() + by); };
    const struct {
        std::function<void(test::ManualClock&, Duration)> happens;
        Duration absence;
        bool endsAtOnce;
    } cases[]{{sleep, 6h, false},
              {sleep, 8 * 24h, true},
              {off, 6h, false},
              {off, 8 * 24h, true},
              {off, 400 * 24h, false},
              {off, -400 * 24h, false},
              {leap, 8 * 24h, false},
              {leap, -400 * 24h, false},
              {leap, 24h * 365 * 50, false},
              {leap, -24h * 365 * 50, false}};
    for (const auto& c : cases) {
        fs::remove_all(store());
        test::ManualClock clock;
        {
            (void)Process(root.path, {.identifier = "uploads"}, &clock).resumed("x");
        }
        c.happens(clock, c.absence);
        Process next(root.path, {.identifier = "uploads"}, &clock);
        EXPECT_EQ(next.attempts().size(), c.endsAtOnce ? 0u : 1u) << toSeconds(c.absence);
        // And while it runs: neither lost nor stuck.
        clock.setWall(clock.wallNow() + 24h * 365 * 20);
        next.advance(1h);
        EXPECT_EQ(next.attempts().size(), c.endsAtOnce ? 0u : 1u) << toSeconds(c.absence);
        clock.setWall(clock.wallNow() - 24h * 365 * 40);
        next.advance(7 * 24h);
        EXPECT_TRUE(next.attempts().empty()) << toSeconds(c.absence);
        EXPECT_EQ(next.told().size(), 2u) << toSeconds(c.absence);
    }
}

TEST_F(BackgroundSessionTest, AHostThatAsksForTimeIsLeftAlone)
{
    test::ManualClock clock;
    {
        Process process(root.path, {.identifier = "uploads", .parallelTransfers = 1}, &clock);
        (void)process.resumed("1");
        (void)process.resumed("2");
        (void)process.resumed("3", "https://b.example/");
        process.answer(503, {{"Retry-After", "7200"}});
        EXPECT_EQ(process.told(), (Told{"1 503 0 note null"}));
        ASSERT_EQ(process.attempts().size(), 1u);
        EXPECT_EQ(process.attempts()[0]->originalRequest().url.host(), "b.example");
        process.answer(200, {{"Retry-After", "0"}});
        process.advance(1h);
        EXPECT_TRUE(process.attempts().empty());
    }
    Process next(root.path, {.identifier = "uploads"}, &clock);
    next.advance(59min);
    EXPECT_TRUE(next.attempts().empty()) << "a restart doesn't shorten it";
    next.advance(1h + 2min);
    EXPECT_EQ(next.attempts().size(), 1u) << "two hours, and up to half as much";
}

TEST_F(BackgroundSessionTest, SoManyAtOnceAndInTheirOrder)
{
    Process process(root.path, {.identifier = "uploads", .parallelTransfers = 2});
    std::vector<std::shared_ptr<BackgroundTask>> tasks;
    for (int i = 0; i < 5; ++i) tasks.push_back(process.resumed(std::to_string(i)));
    const auto running = process.attempts();
    ASSERT_EQ(running.size(), 2u);
    EXPECT_EQ(contentsOf(running[0]->files.upload) + contentsOf(running[1]->files.upload), "01");
    tasks[0]->cancel();
    tasks[3]->cancel();
    EXPECT_EQ(process.attempts().size(), 2u) << "the next takes the place";
    std::vector<std::shared_ptr<BackgroundTask>> listed;
    bool onDelegateQueue = true;
    process.session->getTasks([&](auto all) {
        listed = std::move(all);
        onDelegateQueue = process.queue->isCurrent();
    });
    EXPECT_TRUE(listed.empty()) << "not inside the call";
    process.drain();
    EXPECT_FALSE(onDelegateQueue);
    EXPECT_EQ(listed, (std::vector{tasks[1], tasks[2], tasks[4]}));
    const auto cancelled = fmt::format(" 0 {} note null", std::int64_t{kUrlCancelled});
    EXPECT_EQ(process.told(), (Told{"1" + cancelled, "4" + cancelled}));
    process.answerAll(200);
    EXPECT_EQ(process.told().back(), "all");
}

} // namespace
} // namespace platform
