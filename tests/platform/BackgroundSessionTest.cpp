#include "platform/net/BackgroundSession.h"

#include <csignal>
#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fmt/format.h>
#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/files/Sqlite.h"
#include "platform/net/NetworkStatus.h"
#include "platform/values/Json.h"
#include "tests/support/FakeUrlLoader.h"
#include "tests/support/ManualClock.h"
#include "tests/support/ManualExecutor.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/TestDevice.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
using test::FakeUrlLoader;
namespace fs = std::filesystem;

std::string contentsOf(int fd)
{
    std::string text(1u << 20, '\0');
    const ssize_t count = pread(fd, text.data(), text.size(), 0);
    text.resize(static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    return text;
}

std::string contentsOf(const fs::path& path)
{
    const FileHandle file(open(path.c_str(), O_RDONLY));
    return file ? contentsOf(file.fd()) : "(none)";
}

/// Writes down what it is told, a line each.
struct Recorder final : BackgroundSessionDelegate {
    std::vector<std::string> told;
    void taskDidFinishDownloading(const std::shared_ptr<BackgroundTask>& task, const fs::path& file,
                                  const UrlResponse&) override
    {
        told.push_back(fmt::format("{} file {}", task->identifier(), contentsOf(file)));
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
struct Process {
    explicit Process(const fs::path& root_, BackgroundSessionConfiguration configuration = {.identifier = "uploads"},
                     test::ManualClock* clock_ = nullptr)
        : root(root_), clock(clock_ ? *clock_ : ownClock)
    {
        network.set({});
        session = sessions->make(std::move(configuration), delegate, queue);
        executor.drain();
    }
    ~Process()
    {
        session.reset();
        executor.drain();
        loader.cancelAll();
        executor.drain();
    }
    void advance(Duration by)
    {
        clock.advance(by, [this] { executor.drain(); });
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
        executor.drain();
        return task;
    }
    /// The attempts that are under way.
    std::vector<std::shared_ptr<FakeUrlLoader::Task>> attempts()
    {
        executor.drain();
        std::vector<std::shared_ptr<FakeUrlLoader::Task>> running;
        for (const auto& task : loader.sessions.at(0)->tasks)
            if (!task->finished) running.push_back(task);
        return running;
    }
    void answer(int status, HttpHeaders headers = {})
    {
        attempts().at(0)->respond(status, "", std::move(headers));
        executor.drain();
    }
    void fail(std::int64_t code, std::string_view domain = kUrlErrorDomain)
    {
        attempts().at(0)->fail(Error(std::string(domain), code));
        executor.drain();
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
    test::ManualClock ownClock;
    test::ManualClock& clock;
    test::ManualExecutor executor;
    FakeUrlLoader loader;
    NetworkStatus network;
    std::shared_ptr<Queue> queue = Queue::make("delegate", Queue::Kind::Serial, executor, clock);
    std::shared_ptr<Recorder> delegate = std::make_shared<Recorder>();
    std::unique_ptr<FileSystem> files = makeSystemFiles();
    std::unique_ptr<BackgroundSessions> sessions = makeBackgroundSessions({.files = *files,
                                                                           .loader = loader,
                                                                           .network = network,
                                                                           .clock = clock,
                                                                           .executor = executor,
                                                                           .directory = root / "transfers",
                                                                           .temporary = root});
    std::shared_ptr<BackgroundSession> session;
};

struct BackgroundSessionTest : testing::Test {
    BackgroundSessionTest() { Log::threshold = LogLevel::Fault; } // what is expected is captured, not printed
    [[nodiscard]] fs::path store() const { return root.path / "transfers" / "uploads"; }
    test::TemporaryDirectory root;
    using Told = std::vector<std::string>;
};

TEST_F(BackgroundSessionTest, AnUploadHasItsOwnCopyAndEndsOnce)
{
    auto life = std::make_unique<Process>(root.path);
    Process& process = *life;
    EXPECT_FALSE(fs::exists(root / "transfers")) << "nothing is made before there is something to keep";
    const auto task = process.upload("the body");
    EXPECT_TRUE(process.attempts().empty()) << "nothing moves before resume";
    test::writeFile(root / "body", "another body");
    task->setNote(Value::dictionaryOf({{"count", 3}}));
    task->resume();
    task->resume();
    ASSERT_EQ(process.attempts().size(), 1u);
    EXPECT_EQ(contentsOf(process.attempts()[0]->files.upload.fd()), "the body");
    struct stat status{};
    ASSERT_EQ(stat(store().c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777, 0700u);
    for (const auto& entry : fs::directory_iterator(store())) {
        ASSERT_EQ(stat(entry.path().c_str(), &status), 0);
        EXPECT_EQ(status.st_mode & 0777, 0600u) << entry.path();
    }
    process.answer(500);
    EXPECT_EQ(process.told(), (Told{"1 500 0 note {\"count\":3}", "all"})) << "any status ends a task";
    task->cancel();
    process.executor.drain();
    EXPECT_TRUE(process.told().empty());
    EXPECT_FALSE(fs::exists(store() / "1.body"));
    life.reset();
    Process next(root.path);
    EXPECT_TRUE(next.told().empty());
}

TEST_F(BackgroundSessionTest, ADownloadIsHandedOverInAFileThatGoes)
{
    Process process(root.path);
    auto task = process.session->downloadTask({.url = *Url::parse("https://a.example/r")});
    ASSERT_TRUE(task);
    (*task)->resume();
    const auto attempt = process.attempts().at(0);
    ASSERT_EQ(pwrite(attempt->files.download.fd(), "resource", 8, 0), 8);
    attempt->respond(200, "");
    process.executor.drain();
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
    process.executor.drain();
    kill(); // 3: under way
    process.fail(kUrlConnectionLost);
    kill(); // 4: waiting for its next attempt
    process.advance(1h);
    process.attempts().at(0)->respond(204, "");
    kill(); // 5: answered, unheard
    process.executor.drain();
    kill(); // 6: over

    const struct {
        int attempts, completions;
    } expected[]{{0, 0}, {0, 0}, {1, 1}, {1, 1}, {1, 1}, {1, 1}, {0, 0}};
    for (int n = 0; n < step; ++n) {
        Process after(copyOf(n));
        after.advance(1h);
        EXPECT_EQ(after.attempts().size(), static_cast<std::size_t>(expected[n].attempts)) << n;
        for (const auto& attempt : after.attempts())
            EXPECT_EQ(contentsOf(attempt->files.upload.fd()), "whole body") << n;
        after.answerAll(200);
        EXPECT_EQ(after.told(), expected[n].completions ? (Told{"1 200 0 note 7", "all"}) : Told{}) << n;
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
        auto task = process.session->downloadTask({.url = *Url::parse("https://a.example/r")});
        (*task)->resume();
        process.executor.drain();
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
    const auto damage = [&](std::size_t offset, std::string_view bytes) {
        const FileHandle file(open((store() / "transfers.db").c_str(), O_WRONLY));
        EXPECT_EQ(pwrite(file.fd(), bytes.data(), bytes.size(), static_cast<off_t>(offset)),
                  static_cast<ssize_t>(bytes.size()));
    };
    const auto alter = [&](const char* statement) {
        ASSERT_TRUE(Sqlite::open(store() / "transfers.db", Sqlite::Access::Exclusive)->execute(statement));
    };
    const struct {
        const char* name;
        std::function<void()> hurt;
    } cases[]{
        {"no database", [&] { damage(0, "this is not a database"); }},
        {"broken page", [&] { damage(4096, std::string(4096, '\xff')); }},
        {"another shape", [&] { alter("ALTER TABLE task ADD COLUMN other TEXT"); }},
        {"a table is missing", [&] { alter("DROP TABLE hold"); }},
        {"empty", [&] { fs::resize_file(store() / "transfers.db", 0); }},
        {"cut", [&] { fs::resize_file(store() / "transfers.db", 5000); }},
    };
    for (const auto& c : cases) {
        fs::remove_all(store());
        {
            (void)Process(root.path).resumed("x");
        }
        c.hurt();
        Process next(root.path);
        EXPECT_TRUE(next.attempts().empty()) << c.name;
        EXPECT_TRUE(next.told().empty()) << c.name << ": not invalid";
        EXPECT_FALSE(fs::exists(store() / "1.body")) << c.name;
        (void)next.resumed("y");
        next.answer(200);
        EXPECT_EQ(next.told().size(), 2u) << c.name;
    }
    EXPECT_EQ(log.count("are damaged and begun anew"), 5) << "an empty file is a new store";
}

TEST_F(BackgroundSessionTest, WhereTheStoreCantBeUsedTasksWorkAndEndWithTheProcess)
{
    fs::create_directory(root / "elsewhere");
    const struct {
        const char* name;
        std::function<std::shared_ptr<void>()> spoil;
    } cases[]{
        {"another process", [&] { return std::make_shared<Process>(root.path); }},
        {"a link",
         [&]() -> std::shared_ptr<void> {
             fs::create_directory(root / "transfers");
             fs::create_directory_symlink(root / "elsewhere", store());
             return nullptr;
         }},
        {"a file",
         [&]() -> std::shared_ptr<void> {
             fs::create_directory(root / "transfers");
             test::writeFile(store(), "");
             return nullptr;
         }},
        {"a link for the database",
         [&]() -> std::shared_ptr<void> {
             fs::create_directories(store());
             fs::create_symlink(root / "elsewhere/db", store() / "transfers.db");
             return nullptr;
         }},
    };
    for (const auto& c : cases) {
        fs::remove_all(root / "transfers");
        const auto other = c.spoil();
        if (other) (void)std::static_pointer_cast<Process>(other)->resumed("the other's");
        {
            Process process(root.path);
            (void)process.resumed("mine");
            ASSERT_EQ(process.attempts().size(), 1u) << c.name;
            EXPECT_EQ(contentsOf(process.attempts()[0]->files.upload.fd()), "mine");
            process.answer(200);
            EXPECT_EQ(process.told(), (Told{"invalid POSIX", "1 200 0 note null", "all"})) << c.name;
        }
        EXPECT_TRUE(fs::is_empty(root / "elsewhere")) << c.name;
        for (const auto& entry : fs::directory_iterator(root.path))
            EXPECT_FALSE(entry.path().filename().string().starts_with("background")) << c.name;
    }
}

TEST_F(BackgroundSessionTest, AStoreThatCannotBeOpenedIsTriedAgainAMinuteLater)
{
    const fs::path device = root / "device";
    Process process(device);
    test::writeFile(root / "body", "x");
    const auto upload = [&] {
        return process.session->uploadTask({.url = *Url::parse("https://a.example/")}, root / "body").has_value();
    };
    test::writeFile(device, ""); // in the way of its directories
    EXPECT_FALSE(upload());
    fs::remove(device);
    fs::create_directory(device);
    process.advance(59s);
    EXPECT_FALSE(upload());
    process.advance(1s);
    EXPECT_TRUE(upload());
}

TEST_F(BackgroundSessionTest, ATaskThatCantBeKeptIsAnError)
{
    BackgroundSessionConfiguration limits{.identifier = "uploads", .maximumTasks = 2, .maximumBodyBytes = 10};
    Process process(root.path, limits);
    const auto make = [&](const UrlRequest& request, std::string_view body) {
        test::writeFile(root / "body", body);
        return process.session->uploadTask(request, root / "body");
    };
    const UrlRequest fine{.url = *Url::parse("https://a.example/")};
    UrlRequest huge = fine;
    huge.headers.set("X", std::string(300'000, 'x'));
    EXPECT_EQ(make({}, "x").error().code, kUrlBadUrl);
    EXPECT_EQ(make(huge, "x").error().code, kUrlTooLarge);
    EXPECT_EQ(make(fine, "12345678901").error().code, kUrlTooLarge);
    EXPECT_EQ(process.session->uploadTask(fine, root / "nothing").error().code, ENOENT);
    fs::create_symlink(root / "body", root / "link");
    EXPECT_EQ(process.session->uploadTask(fine, root / "link").error().code, ELOOP);
    EXPECT_EQ(process.session->uploadTask(fine, root.path).error().domain, kPosixErrorDomain);

    const auto first = make(fine, "123456");
    ASSERT_TRUE(first);
    EXPECT_EQ(make(fine, "12345").error().code, kUrlTooLarge) << "together";
    auto second = make(fine, "1234");
    ASSERT_TRUE(second);
    EXPECT_EQ(make(fine, "").error().code, kUrlTooLarge) << "a third";
    second->reset();
    process.executor.drain();
    EXPECT_TRUE(make(fine, "1")) << "one that was let go of has made room";
    process.executor.drain();
    std::size_t bodies = 0;
    for (const auto& entry : fs::directory_iterator(store())) bodies += entry.path().extension() == ".body";
    EXPECT_EQ(bodies, 1u) << "nothing is left of what wasn't made, and the last was let go of at once";
    (*first)->setNote(std::string(200'000, 'n'));
    EXPECT_TRUE((*first)->note().isNull());
}

/// A limit on the size of files fails writes as a full disk does.
TEST_F(BackgroundSessionTest, OnAFullDiskATaskIsAnErrorAndTheOthersGoOn)
{
    Process process(root.path);
    const auto first = process.resumed("first");
    test::writeFile(root / "large", std::string(300'000, 'x'));
    test::writeFile(root / "small", "small");
    const UrlRequest request{.url = *Url::parse("https://a.example/")};

    std::signal(SIGXFSZ, SIG_IGN);
    rlimit before{};
    ASSERT_EQ(getrlimit(RLIMIT_FSIZE, &before), 0);
    rlimit full = before;
    full.rlim_cur = 200'000;
    ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &full), 0);
    const auto large = process.session->uploadTask(request, root / "large");
    bool refused = false;
    std::vector<std::shared_ptr<BackgroundTask>> kept;
    for (int i = 0; i < 100 && !refused; ++i) {
        auto made = process.session->uploadTask(request, root / "small");
        refused = !made;
        if (made) kept.push_back(*made);
    }
    process.answer(200);
    setrlimit(RLIMIT_FSIZE, &before);
    std::signal(SIGXFSZ, SIG_DFL);

    EXPECT_FALSE(large);
    EXPECT_TRUE(refused) << "the database's own log is full";
    EXPECT_EQ(process.told(), (Told{"1 200 0 note null"}));
    std::size_t bodies = 0;
    for (const auto& entry : fs::directory_iterator(store())) bodies += entry.path().extension() == ".body";
    EXPECT_LE(bodies, kept.size() + 1) << "nothing of those that weren't made";
    EXPECT_TRUE(process.session->uploadTask(request, root / "large")) << "once there is room";
    process.executor.drain();
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
    EXPECT_EQ(next.told(), (Told{fmt::format("1 0 {} note null", EIO), "all"}));
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
    process.executor.drain();
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
        EXPECT_LE(process.clock.pendingTimers(), 1u);
        process.advance(1min);
    }
    EXPECT_GT(attempts, 24);
    EXPECT_LT(attempts, 60) << "the delays grow";
    EXPECT_EQ(process.told(), (Told{fmt::format("1 0 {} note null", std::int64_t{kUrlTimedOut}), "all"}));
    EXPECT_EQ(process.clock.pendingTimers(), 0u);
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
    next.advance(2min);
    EXPECT_EQ(next.attempts().size(), 1u);
}

TEST_F(BackgroundSessionTest, SoManyAtOnceAndInTheirOrder)
{
    Process process(root.path, {.identifier = "uploads", .parallelTransfers = 2});
    std::vector<std::shared_ptr<BackgroundTask>> tasks;
    for (int i = 0; i < 5; ++i) tasks.push_back(process.resumed(std::to_string(i)));
    const auto running = process.attempts();
    ASSERT_EQ(running.size(), 2u);
    EXPECT_EQ(contentsOf(running[0]->files.upload.fd()) + contentsOf(running[1]->files.upload.fd()), "01");
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
    process.executor.drain();
    EXPECT_FALSE(onDelegateQueue);
    EXPECT_EQ(listed, (std::vector{tasks[1], tasks[2], tasks[4]}));
    const auto cancelled = fmt::format(" 0 {} note null", std::int64_t{kUrlCancelled});
    EXPECT_EQ(process.told(), (Told{"1" + cancelled, "4" + cancelled}));
    process.answerAll(200);
    EXPECT_EQ(process.told().back(), "all");
}

TEST_F(BackgroundSessionTest, ManyTasksAreTakenUpAndDone)
{
    constexpr int kTasks = 1000;
    const test::TemporaryDirectory quick("/dev/shm"); // as many syncs of a disk take a minute
    {
        Process process(quick.path, {.identifier = "uploads", .maximumTasks = kTasks});
        process.network.set({.online = false});
        for (int i = 0; i < kTasks; ++i) process.upload("body")->resume();
        EXPECT_FALSE(process.session->downloadTask({.url = *Url::parse("https://a.example/")}));
    }
    Process next(quick.path, {.identifier = "uploads", .parallelTransfers = 8});
    std::size_t done = 0;
    while (!next.attempts().empty()) {
        auto& tasks = next.loader.sessions.at(0)->tasks;
        for (const auto& attempt : next.attempts()) attempt->respond(200, "");
        next.executor.drain();
        std::erase_if(tasks, [](const auto& task) { return task->finished; });
    }
    for (const auto& line : next.told()) done += line.ends_with("note null");
    EXPECT_EQ(done, kTasks);
}

} // namespace
} // namespace platform
