#include <algorithm>

#include <fmt/ranges.h>
#include <openssl/evp.h>

#include "tavrind/ClientSession.h"
#include "tavrind/CompressedOutputStream.h"
#include "tavrind/Deflater.h"
#include "tavrind/TavrinFeedbackFlusher.h"
#include "tests/support/FeedbackFixture.h"

namespace tavrin::test {
namespace {

using platform::ActivityState;

std::string sha512(std::string_view text)
{
    std::array<unsigned char, 64> digest{};
    EVP_Digest(text.data(), text.size(), digest.data(), nullptr, EVP_sha512(), nullptr);
    return fmt::format("{:02x}", fmt::join(digest, ""));
}

struct UploadTest : FeedbackTest {
    UploadTest() { begin(); }
    void TearDown() override { expectBooksClose(); }

    /// A session with one event and its end, uploaded.
    auto uploadOne()
    {
        closeSession();
        upload();
        return uploads().back();
    }
    /// Ends the newest upload.
    void answer(int status) { DaemonTest::answer(*uploads().back(), "", status); }
    void fail(std::int64_t code)
    {
        uploads().back()->fail(platform::Error::withReason(platform::kUrlErrorDomain, code, "no"));
        device.drain();
    }
    /// What was not made into an upload.
    std::size_t temporaryFiles() { return device.files.list("/tmp").value_or(Strings()).size(); }
};

TEST_F(UploadTest, WhatTheServiceGets)
{
    const auto task = uploadOne();
    EXPECT_TRUE(task->resumed);
    const platform::UrlRequest& request = task->originalRequest();
    EXPECT_EQ(request.method, "POST");
    EXPECT_EQ(assembly().backgroundFlusher->feedbackFlusher()->serverEndpoint()->string(),
              "https://f.example/feedback?v=2")
        << "the bag's own query is replaced";
    EXPECT_EQ(request.url.queryValue("v"), "2");
    EXPECT_EQ(request.timeout, platform::Duration(300s));
    const auto text = tools::inflateRaw(bodyOf(*task), 1u << 20).value();
    ASSERT_TRUE(request.headers.find("X-Quorvane-Digest"));
    EXPECT_EQ(*request.headers.find("X-Quorvane-Digest"), sha512(text));

    const Value session = decoded(*task);
    Strings keys;
    for (const auto& [key, value] : *session.asDictionary()) keys.push_back(key);
    EXPECT_EQ(keys, (Strings{"fb", "agent", "user_guid", "resource_versions", "first_use", "base_time",
                             "previous_session_end_reason"}));
    EXPECT_EQ(session["base_time"], Value(1767225600));
    EXPECT_TRUE(sessionFiles().empty());
    EXPECT_EQ(temporaryFiles(), 0u) << "nothing is left behind";
}

TEST_F(UploadTest, EndsAreCounted)
{
    const std::int64_t sent = counter("feedbacksent");
    const std::int64_t bookedAsSent = booked(FeedbackFate::Sent);
    uploadOne();
    answer(200);
    EXPECT_EQ(counter("feedbacksent") - sent, 7) << "top-level keys are what is counted";
    uploadOne()->files.progress(50, 200);
    device.drain();
    EXPECT_EQ(log.count("data transfer 25.000000 of 200.000000"), 1);
    answer(204); // any status but 200
    EXPECT_EQ(log.count("response error 204"), 1);
    EXPECT_EQ(counter("feedbacknotsent"), 7);
    for (const std::int64_t code : {platform::kUrlTooLarge, platform::kUrlConnectionLost}) {
        uploadOne();
        fail(code);
    }
    EXPECT_EQ(counter("feedbacknotsent"), 14) << "it is tried again";
    EXPECT_EQ(counter("fbrequesttimedout"), 0);
    device.advance(7 * 24h);
    EXPECT_EQ(counter("feedbacksent") - sent, 7);
    EXPECT_EQ(counter("feedbacknotsent"), 21) << "given up after a week";
    EXPECT_EQ(counter("fbrequesttimedout"), 1);
    EXPECT_TRUE(assembly().backgroundFlusher->feedbackFlusher()->feedbacksPerTask().empty());
    EXPECT_EQ(booked(FeedbackFate::Sent) - bookedAsSent, 2);
    EXPECT_EQ(booked(FeedbackFate::NotSent), 6);
}

TEST_F(UploadTest, UploadsWaitAWeekOnAnyNetworkAndDownloadsADayForOneFreeOfCharge)
{
    device.userDefaults.set("TAVDownloadDelay", 60);
    const auto downloads = [&] { return device.background.loads.at("com.quorvane.tavrind")->tasks.size(); };
    device.background.network.set({.metered = true});
    const auto task = uploadOne();
    EXPECT_FALSE(task->finished);
    fetchBag(R"({"version": "1000", "TAVQIFeatures": "https://r.example/f", "feedbackURL": "https://f.example/f"})");
    device.advance(2min);
    EXPECT_EQ(downloads(), 0u) << "metered";
    device.background.network.set({});
    device.drain();
    EXPECT_EQ(downloads(), 1u);

    const std::int64_t notSent = counter("feedbacknotsent");
    device.advance(24h - 10min);
    EXPECT_EQ(log.count("download task error"), 0);
    device.advance(10min);
    EXPECT_EQ(log.count("download task error"), 1);
    EXPECT_EQ(device.background.configurations.at("com.quorvane.tavrind.flusher.nsurlsession").requestTimeout, 300s);
    device.advance(6 * 24h - 10min);
    EXPECT_EQ(counter("feedbacknotsent"), notSent);
    EXPECT_FALSE(task->finished);
    device.advance(10min);
    EXPECT_TRUE(task->finished);
    EXPECT_GT(counter("feedbacknotsent"), notSent);
    EXPECT_GT(counter("fbrequesttimedout"), 0);
}

TEST_F(UploadTest, CrowdsourcingRecordsGoOutOnTheirOwn)
{
    report("ZRCustomFeedback", {{"feedbackType", 2}, {"jsonFeedback", Dictionary{{"tld", "ch"}}}});
    report("ZRCustomFeedback", {{"feedbackType", 2}}); // no JSON
    report("ZRCustomFeedback", {{"feedbackType", 2}, {"jsonFeedback", Value::Array{"seen"}}});
    EXPECT_EQ(counter("dp.submit"), 3);
    const std::int64_t counted = counter("feedbacksent"), sent = booked(FeedbackFate::Sent);
    LogCapture logged;
    platform::Log::privateData = false;
    upload();
    platform::Log::privateData = true;
    EXPECT_EQ(logged.count("Invalid JSON Object <private> error not a dictionary"), 2);
    EXPECT_EQ(temporaryFiles(), 2u) << "what could not be written stays";
    ASSERT_EQ(uploads().size(), 1u);
    EXPECT_EQ(assembly().crowdsourcingFeedbackFlusher->serverEndpoint()->string(), "https://f.example/crowd?y=2")
        << "as the bag has it";
    EXPECT_TRUE(uploads()[0]->originalRequest().url.string().starts_with("https://f.example/crowd?"));
    EXPECT_EQ(decoded(*uploads()[0]), Value(Dictionary{{"tld", "ch"}}));
    answer(200);
    EXPECT_EQ(counter("feedbacksent"), counted) << "only sessions are counted";
    EXPECT_EQ(booked(FeedbackFate::Sent) - sent, 1);
    EXPECT_EQ(booked(FeedbackFate::NotJson), 2);
    EXPECT_TRUE(assembly().crowdsourcingFeedbackFlusher->flushToWireSync().empty());
    EXPECT_EQ(logged.count("Sessions Flushed 0"), 1);
}

TEST_F(UploadTest, AnUploadOfAnEarlierProcessIsCountedAtItsEndAndForgotten)
{
    report("ZRCustomFeedback", {{"feedbackType", 2}, {"jsonFeedback", Dictionary()}});
    uploadOne();
    uploadOne();
    ASSERT_EQ(uploads().size(), 3u);
    restart();
    const std::int64_t sent = counter("feedbacksent");
    ASSERT_EQ(uploads().size(), 3u) << "taken up";
    for (std::size_t i = 0; i < 3; ++i) uploads()[i]->respond(i < 2 ? 200 : 503);
    device.drain();
    EXPECT_EQ(counter("feedbacksent") - sent, 7) << "not what the other flusher sent";
    EXPECT_EQ(counter("feedbacknotsent"), 7);
    restart();
    EXPECT_TRUE(uploads().empty());
    EXPECT_EQ(booked(FeedbackFate::Unknown), 0);
}

TEST_F(UploadTest, WhatWaitsInMemoryIsBounded)
{
    const Dictionary record{{"feedbackType", 2}, {"jsonFeedback", Dictionary{{"text", std::string(20'000, 'x')}}}};
    for (int i = 0; i < 500; ++i) report("ZRCustomFeedback", record);
    EXPECT_EQ(booked(FeedbackFate::BufferFull), 500 - 8 * 1024 * 1024 / 20'011);
    auto& flusher = *assembly().crowdsourcingFeedbackFlusher;
    EXPECT_EQ(flusher.countOfDatabuffer(), 500u - static_cast<std::size_t>(booked(FeedbackFate::BufferFull)));
    flusher.dropFeedbacks();
    device.drain();
    for (int i = 0; i < 1100; ++i) report("ZRCustomFeedback", {{"feedbackType", 2}, {"jsonFeedback", Dictionary()}});
    EXPECT_EQ(flusher.sessionBuffer().size(), 1000u);
    std::size_t bodies = 0;
    const std::int64_t before = counter("clientconnection");
    flusher.flushAllToWire([&bodies](const TavrinFeedbackFlusher::Bodies& flushed) { bodies = flushed.size(); });
    device.drain();
    EXPECT_EQ(bodies, 1000u);
    EXPECT_EQ(counter("clientconnection") - before, 1000) << "the counter of connections counts these, too";
}

TEST_F(UploadTest, SessionFilesAreBounded)
{
    const Dictionary record{{"feedbackType", 3}, {"jsonFeedback", Dictionary()}}; // a session of its own
    for (int i = 0; i < 103; ++i) report("ZRCustomFeedback", record);
    EXPECT_EQ(sessionFiles().size(), 100u);
    EXPECT_EQ(booked(FeedbackFate::NoContainer), 3);
    appear();
    EXPECT_EQ(sessionFiles().size(), 101u) << "a real session has its file all the same";
    upload();
    report("ZRCustomFeedback", record);
    EXPECT_EQ(sessionFiles().size(), 2u) << "there is room again";

    const auto& storage = assembly().persistentStorage;
    int created = 1; // the open session's
    while (storage->createFileContainerForWriting(FileUse::Session)) ++created;
    EXPECT_EQ(created, 2000);
}

TEST_F(UploadTest, ASessionWhoseFileStaysWaits)
{
    closeSession();
    for (const int fault : {EROFS, EACCES}) {
        failOn("remove", fault, "/session.");
        upload();
        EXPECT_TRUE(uploads().empty()) << "a restart would find the file, and send it again";
    }
    device.files.fault = nullptr;
    upload();
    EXPECT_EQ(uploads().size(), 1u);
}

TEST_F(UploadTest, ADiskThatCannotBeSyncedLosesNoSession)
{
    failOn("syncdir", EIO);
    uploadOne();
    EXPECT_EQ(uploads().size(), 1u);
    EXPECT_EQ(log.count("deleted session files may come back"), 1);
}

TEST_F(UploadTest, AnOutcomeIsOnDiskBeforeTheUploadIsForgottenAndIsBookedOnce)
{
    uploadOne();
    const std::int64_t sent = booked(FeedbackFate::Sent);
    const std::int64_t counted = counter("feedbacksent");
    device.files.fault = [&](std::string_view, const std::filesystem::path& path) {
        if (path.filename() == "feedback-books.json") {
            EXPECT_EQ(counter("feedbacksent"), counted) << "what is counted first is counted again after a kill";
        }
        return 0;
    };
    for (int process = 0; process < 2; ++process) { // the first is killed before the task is forgotten
        std::vector<std::shared_ptr<platform::BackgroundTask>> tasks;
        assembly().uploadURLSession->getTasks([&tasks](auto all) { tasks = std::move(all); });
        device.drain();
        ASSERT_EQ(tasks.size(), 1u);
        assembly().backgroundFlusher->taskDidComplete(tasks[0], platform::UrlResponse{{}, true, 200, {}}, {});
        device.files.fault = {};
        const auto& file = device.files.files.at("/state/com.quorvane.tavrind/feedback-books.json");
        EXPECT_EQ(platform::parseJson(file).value()["sent"], Value(sent + 2));
        EXPECT_EQ(counter("feedbacksent") - counted, 7);
        const auto& counters = device.files.files.at("/state/counters.json");
        EXPECT_EQ(platform::parseJson(counters).value()["com.quorvane.tavrind.feedbacksent"], Value(counted + 7));
        restart();
    }
    EXPECT_EQ(booked(FeedbackFate::Sent), sent + 2);
}

TEST_F(UploadTest, AReportIsAnsweredWhenItIsWritten)
{
    bool written = false;
    device.files.fault = [&written](std::string_view operation, const auto&) {
        written = written || operation == "append";
        return 0;
    };
    const auto call =
        connection->call("ReportEvent", {"event", std::int64_t{1}, Dictionary{{"class", "ZRClearInputFeedback"}}});
    connection->queue()->sync([] {}); // the call has been taken
    EXPECT_FALSE(written || call->answered());
    device.drain();
    EXPECT_TRUE(written && call->answered());
    device.files.fault = {};
}

TEST_F(UploadTest, TheBagDecidesOnTheEndpoint)
{
    LogCapture logged;
    closeSession();
    fetchBag(R"({"version": "1001", "feedbackEnabled": false, "feedbackURL": "https://f.example/feedback"})");
    const std::size_t files = sessionFiles().size();
    upload();
    EXPECT_TRUE(uploads().empty());
    EXPECT_TRUE(sessionFiles().empty()) << "dropped all the same";
    EXPECT_EQ(logged.count("Server endpoint not set"), static_cast<int>(files) + 1) << "and of crowdsourcing";
    EXPECT_GE(booked(FeedbackFate::EndpointUnset), 2);
    EXPECT_EQ(booked(FeedbackFate::Closed), 0);
}

TEST_F(UploadTest, StatesOfTheActivity)
{
    const auto& [criteria, handler] = device.activities.registered.at("com.quorvane.tavrind.flusher.background");
    EXPECT_EQ(criteria.delay, platform::Duration(300s));
    EXPECT_EQ(criteria.interval, platform::Duration(600s));
    EXPECT_EQ(criteria.gracePeriod, platform::Duration(300s));
    EXPECT_TRUE(criteria.repeating && criteria.allowBattery);

    closeSession();
    auto run = device.activities.run("com.quorvane.tavrind.flusher.background");
    EXPECT_EQ(run->state(), ActivityState::Continue);
    EXPECT_FALSE(device.transactions.open().empty()) << "the process is wanted";
    std::vector<ActivityState> during;
    device.files.fault = [&](std::string_view operation, const auto&) {
        if (operation == "remove") during.push_back(run->state());
        return 0;
    };
    device.drain();
    device.files.fault = {};
    EXPECT_FALSE(during.empty());
    EXPECT_EQ(std::ranges::count(during, ActivityState::Continue), std::ssize(during)) << "done when the pass is";
    EXPECT_EQ(run->state(), ActivityState::Done);
    EXPECT_TRUE(device.transactions.open().empty());

    closeSession();
    assembly().backgroundFlusher->setStopFlushing(true);
    run = device.activities.run("com.quorvane.tavrind.flusher.background");
    EXPECT_EQ(run->state(), ActivityState::Done);
    device.drain();
    EXPECT_EQ(sessionFiles().size(), 1u) << "stopped";
    assembly().backgroundFlusher->setStopFlushing(false);

    device.activities.run("com.quorvane.tavrind.flusher.background", true);
    device.drain();
    EXPECT_TRUE(log.has(platform::LogLevel::Fault, "Tavrin_Flusher", "State transition from 2 to 4 invalid"));
    EXPECT_TRUE(log.has(platform::LogLevel::Fault, "Tavrin_Flusher", "State transition from 2 to 5 invalid"));
    EXPECT_EQ(log.count("State transition"), 2);
    EXPECT_TRUE(sessionFiles().empty()) << "the pass ran all the same";

    settle();
    daemon.reset();
    device.drain();
    EXPECT_FALSE(device.activities.registered.contains("com.quorvane.tavrind.flusher.background"));
    start(); // for what the fixture tears down
}

TEST_F(UploadTest, FaultsOfTheDiskLoseOneSessionAndNothingElse)
{
    for (const auto& [operation, path, fate] : {std::tuple("create", "session.", FeedbackFate::NoContainer),
                                                {"append", "session.", FeedbackFate::NoContainer},
                                                {"create", "flusher_", FeedbackFate::NoBody},
                                                {"append", "flusher_", FeedbackFate::NoBody},
                                                {"mkdir", "com.quorvane.tavrind", FeedbackFate::NoContainer},
                                                {"write", ".body", FeedbackFate::NoTask},
                                                {"info", "session.", FeedbackFate::Unreadable},
                                                {"read", "session.", FeedbackFate::Unreadable}}) {
        SCOPED_TRACE(std::string(operation) + " " + path);
        begin();
        const std::int64_t before = booked(fate);
        failOn(operation, ENOSPC, path);
        closeSession();
        upload();
        device.files.fault = {};
        EXPECT_TRUE(uploads().empty() && sessionFiles().empty());
        EXPECT_EQ(booked(fate) - before, 2);
        EXPECT_EQ(typesIn(decoded(*uploadOne())), (Strings{"search_view_appear", "session_end"}));
        EXPECT_EQ(uploads().size(), 1u);
        expectBooksClose();
    }
    EXPECT_EQ(temporaryFiles(), 1u) << "of the body that could not be written";
}

TEST_F(UploadTest, WhatAKilledProcessLeftUnfinishedIsSweptOnceItIsOld)
{
    for (const char* name : {"flusher_123abc", "other"}) device.files.files[std::filesystem::path("/tmp") / name] = "x";
    const std::filesystem::path kept[]{"/config/other.json.0123ABCD.tmp", "/state/com.quorvane.tavrind/a.tmp",
                                       "/state/com.quorvane.tavrind/a.123.tmp"};
    const std::filesystem::path swept[]{"/config/com.quorvane.tavrind.json.0123ABCD.tmp",
                                        "/caches/com.quorvane.tavrind/bag.plist.0123ABCD.tmp",
                                        "/state/com.quorvane.tavrind/privacy/ledger.FFFFFFFF.tmp"};
    for (const auto& path : kept) device.files.files[path] = "x";
    for (const auto& path : swept) {
        device.files.directories.insert(path.parent_path());
        device.files.files[path] = "x";
    }
    restart();
    for (const auto& path : swept) EXPECT_TRUE(device.files.files.contains(path)) << path;
    EXPECT_EQ(temporaryFiles(), 2u) << "another process may be making it";
    device.advance(1h);
    upload();
    EXPECT_EQ(temporaryFiles(), 1u) << "with the next pass";
    for (const auto& path : kept) EXPECT_TRUE(device.files.files.contains(path)) << path;
    for (const auto& path : swept) EXPECT_FALSE(device.files.files.contains(path)) << path;
    device.files.files["/tmp/flusher_123abc"] = "x";
    restart();
    EXPECT_FALSE(device.files.files.contains("/tmp/flusher_123abc")) << "and at the start";
    EXPECT_TRUE(device.files.files.contains("/tmp/other"));
}

TEST_F(UploadTest, BooksAcrossKills)
{
    appear(); // lies in an open file when the process ends
    restart();
    EXPECT_EQ(booked(FeedbackFate::Closed), 2);
    connection = client();
    upload();
    EXPECT_EQ(typesIn(decoded(*uploads().at(0))), (Strings{"search_view_appear", "connection_invalidated"}));
    EXPECT_EQ(booked(FeedbackFate::Uploading), 2);
    expectBooksClose();

    // Closed and in the books, then gone; and with it what was in uploads.
    end(*connection);
    flushSession();
    upload();
    ClientSession(assembly(), std::make_shared<TavrinFeedback>(std::make_shared<ZRClearInputFeedback>(), 1, "", "A/1"))
        .sessionComplete();
    device.drain();
    const std::int64_t underWay = booked(FeedbackFate::Uploading) + booked(FeedbackFate::Closed);
    device.files.files.erase("/caches/com.quorvane.tavrind/" + sessionFiles().at(0));
    ASSERT_TRUE(device.files.removeDirectory("/state/transfers"));
    for (int i = 0; i < 2; ++i) {
        restart();
        EXPECT_EQ(booked(FeedbackFate::Unknown), underWay);
        expectBooksClose();
    }
}

TEST_F(UploadTest, DamagedBooksBeginAnew)
{
    for (const char* damage : {"", "[1]", "{\"recorded\": \"x\", \"sent\": -5, \"dropped\": 7}", "\xff"}) {
        device.files.directories.insert("/state/com.quorvane.tavrind");
        begin();
        device.files.files["/state/com.quorvane.tavrind/feedback-books.json"] = damage;
        restart();
        expectBooksClose();
        EXPECT_EQ(booked(FeedbackFate::Sent), 0) << damage;
    }
}

TEST_F(UploadTest, BooksThatCannotBeReadAreAddedLater)
{
    const auto path = "/state/com.quorvane.tavrind/feedback-books.json";
    device.files.directories.insert("/state/com.quorvane.tavrind");
    device.files.files[path] = R"({"recorded": 9, "sent": 5, "closed": 1, "dropped": {"noBody": 3}})";
    failOn("read", EMFILE, path);
    restart();
    closeSession();
    upload();
    EXPECT_EQ(booked(FeedbackFate::Sent), 0);
    device.files.fault = nullptr;
    upload();
    EXPECT_EQ(booked(FeedbackFate::Sent), 5);
    EXPECT_EQ(booked(FeedbackFate::NoBody), 3);
    EXPECT_EQ(booked(FeedbackFate::Unknown), 1);
}

/// Little of it repeats.
std::string textOf(std::size_t size)
{
    std::string text;
    for (std::size_t i = 0; text.size() < size; ++i) text += std::to_string(i * 2654435761u);
    text.resize(size);
    return text;
}

TEST(DeflaterTest, EitherLibraryWritesAWholeStreamInSmallPieces)
{
    const std::string text = textOf(300'000);
    for (const auto& make : {&Deflater::make, &Deflater::makeWithZlib}) {
        for (const auto& [size, step] :
             {std::pair<std::size_t, std::size_t>{0, 1}, {1, 1}, {5000, 1}, {300'000, 999}, {300'000, 300'000}}) {
            std::string packed;
            const auto take = [&packed](std::string_view piece) {
                EXPECT_TRUE(!piece.empty() && piece.size() <= 4096);
                packed += piece;
                return true;
            };
            const auto deflater = make();
            for (std::size_t at = 0; at < size; at += step)
                EXPECT_TRUE(deflater->write(std::string_view(text).substr(at, step), false, take));
            EXPECT_TRUE(deflater->write("", true, take));
            EXPECT_EQ(tools::inflateRaw(packed, 1u << 20).value(), text.substr(0, size));
        }
        int calls = 0;
        EXPECT_FALSE(make()->write(text, true, [&calls](std::string_view) { return ++calls < 3; }));
        EXPECT_EQ(calls, 3);
    }
}

TEST(CompressedOutputStreamTest, RoundTripAndDigest)
{
    for (const std::size_t size : {std::size_t{0}, std::size_t{1}, std::size_t{4096}, std::size_t{300'000}}) {
        const std::string text = textOf(size);
        CompressedOutputStream stream;
        EXPECT_EQ(stream.write("x"), -1) << "not open yet";
        stream.open();
        for (std::size_t at = 0; at < size; at += 999)
            EXPECT_EQ(stream.write(std::string_view(text).substr(at, 999)),
                      static_cast<std::ptrdiff_t>(std::min<std::size_t>(999, size - at)));
        stream.close();
        EXPECT_EQ(stream.streamStatus(), StreamStatus::Closed);
        const auto& packed = static_cast<const MemoryOutputStream&>(stream.outputStream()).contents();
        EXPECT_EQ(tools::inflateRaw(packed, 1u << 20).value(), text);
        EXPECT_EQ(stream.dataDigestForStream(), sha512(text));
        EXPECT_EQ(stream.write("x"), -1) << "closed";
    }
}

TEST(CompressedOutputStreamTest, ClosedBeforeItWasOpenedItStaysClosed)
{
    CompressedOutputStream stream;
    stream.close();
    stream.open();
    EXPECT_EQ(stream.write("x"), -1);
    stream.close();
    EXPECT_EQ(stream.streamStatus(), StreamStatus::Closed);
    EXPECT_EQ(stream.dataDigestForStream(), sha512(""));
    EXPECT_EQ(static_cast<const MemoryOutputStream&>(stream.outputStream()).contents(), "");
}

} // namespace
} // namespace tavrin::test
