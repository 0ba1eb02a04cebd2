#include "platform/net/UrlSessionCaching.h"

#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/net/HttpCache.h"
#include "platform/values/Dictionary.h"
#include "tests/support/ByHand.h"
#include "tests/support/FakeUrlLoader.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/TestHttpServer.h"
#include "tests/support/UrlLoads.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
using test::FakeUrlLoader;
using test::httpAnswer;
using test::Load;
using test::Outcome;
using test::TestHttpServer;

const Url kUrl = *Url::parse("https://example.com/a");
const HttpHeaders kFresh{{"Cache-Control", "max-age=60"}, {"ETag", "\"1\""}};

/// A caching session whose loads the test answers by hand, on queues that it drains.
struct CachingSessionTest : testing::Test, test::ByHand {
    ~CachingSessionTest() override { executor.drain(); } // what waits keeps the cache
    void open(std::size_t memory = 1u << 20)
    {
        cache = HttpCache::make({.memoryCapacity = memory,
                                 .directory = directory / "http",
                                 .files = files.get(),
                                 .queue = cacheQueue,
                                 .clock = &clock});
        session = makeCachingSession(loads, cache, queue);
    }
    std::unique_ptr<Load> make(UrlRequest request = {.url = kUrl})
    {
        return std::make_unique<Load>(*session, std::move(request), queue);
    }
    std::unique_ptr<Load> start(UrlRequest request = {.url = kUrl})
    {
        auto load = make(std::move(request));
        load->task->resume();
        executor.drain();
        return load;
    }
    /// The loads that were sent, none of which has been answered.
    [[nodiscard]] std::vector<FakeUrlLoader::Task*> sent() const
    {
        std::vector<FakeUrlLoader::Task*> sent;
        for (const auto& task : loads->tasks)
            if (task->resumed && !task->finished) sent.push_back(task.get());
        return sent;
    }
    Outcome answer(Load& load, int status, const std::string& body, HttpHeaders headers = {})
    {
        const auto waiting = sent();
        if (waiting.size() != 1) throw std::runtime_error("not one load is sent");
        waiting[0]->respond(status, body, std::move(headers));
        executor.drain();
        return load.wait();
    }

    /// Cancels the load and returns how it ended.
    Outcome cancelled(Load& load)
    {
        load.task->cancel();
        executor.drain();
        return load.wait();
    }

    const std::unique_ptr<FileSystem> files = makeSystemFiles();
    test::TemporaryDirectory directory;
    std::shared_ptr<Queue> queue = makeQueue("test.delegate");
    std::shared_ptr<Queue> cacheQueue = makeQueue("test.httpCache");
    std::shared_ptr<FakeUrlLoader::Session> loads =
        std::make_shared<FakeUrlLoader::Session>(UrlSessionConfiguration{}, queue);
    std::shared_ptr<HttpCache> cache;
    std::shared_ptr<UrlSession> session;
};

TEST_F(CachingSessionTest, FreshAnswersComeFromTheCacheOnTheDelegateQueue)
{
    for (const std::size_t memory : {std::size_t{1} << 20, std::size_t{0}}) {
        open(memory);
        const std::string body(20'000, memory ? 'm' : 'd');
        cache->remove(kUrl);
        auto first = start();
        EXPECT_EQ(answer(*first, 200, body, kFresh).body(), body);
        EXPECT_EQ(session->cache()->find(kUrl)->body.view(), body);

        auto second = start();
        EXPECT_TRUE(sent().empty());
        const Outcome outcome = second->wait();
        EXPECT_EQ(outcome.body(), body);
        EXPECT_EQ(outcome.status(), 200);
        EXPECT_EQ(outcome.response->headers, kFresh);
        EXPECT_TRUE(outcome.onDelegateQueue);
        EXPECT_EQ(outcome.timing["_kCFNTimingDataConnectionReused"].asBool(), false);
        EXPECT_GE(*outcome.timing["_kCFNTimingDataResponseEnd"].asDouble(),
                  *outcome.timing["_kCFNTimingDataFetchStart"].asDouble());
        EXPECT_EQ(outcome.timing["_kCFNTimingDataRequestStart"].asDouble(), 0.0) << "nothing was sent";
        EXPECT_GT(second->task->identifier(), first->task->identifier());
        second->task->cancel();
        executor.drain();
        EXPECT_EQ(second->completions(), 1);
    }
}

TEST_F(CachingSessionTest, AnAnswerIsInTheCacheBeforeItsCompletionRuns)
{
    open(0);
    std::unique_ptr<Load> second;
    std::shared_ptr<UrlTask> first = session->dataTask({.url = kUrl}, [&](auto, auto, auto) {
        second = make();
        second->task->resume();
    });
    first->resume();
    executor.drain();
    sent().at(0)->respond(200, "kept", kFresh);
    executor.drain();
    EXPECT_TRUE(sent().empty());
    EXPECT_EQ(second->wait().body(), "kept");
}

TEST_F(CachingSessionTest, WhatHappensToTheCachesFilesChangesNoAnswer)
{
    open(0);
    const std::string body(20'000, 'd');
    (void)answer(*start(), 200, body, kFresh);
    const auto cutShort = [&] {
        int files = 0;
        for (const auto& entry : std::filesystem::directory_iterator(directory / "http"))
            if (entry.path().extension() == ".body" && ++files) std::filesystem::resize_file(entry.path(), 0);
        ASSERT_EQ(files, 1);
    };
    auto fresh = start();
    cutShort();
    EXPECT_EQ(fresh->wait().body(), body);

    (void)answer(*start(), 200, body, kFresh); // what was kept is damaged
    clock.advance(60s, [] {});
    auto confirming = start();
    ASSERT_EQ(sent().size(), 1u);
    EXPECT_TRUE(sent()[0]->originalRequest().headers.find("If-None-Match"));
    cutShort();
    EXPECT_EQ(answer(*confirming, 304, "").body(), body);
    EXPECT_EQ(start()->wait().body(), body) << "kept anew";
}

TEST_F(CachingSessionTest, StaleAnswersAreConfirmed)
{
    open();
    EXPECT_EQ(answer(*start(), 200, "one", kFresh).body(), "one");
    clock.advance(60s, [] {});

    auto confirming = start();
    ASSERT_EQ(sent().size(), 1u);
    EXPECT_EQ(*sent()[0]->originalRequest().headers.find("If-None-Match"), "\"1\"");
    EXPECT_FALSE(confirming->task->originalRequest().headers.find("If-None-Match"));
    sent()[0]->timing = Dictionary{{"of", "the load"}};
    const Outcome outcome = answer(*confirming, 304, "", {{"Cache-Control", "max-age=10"}});
    EXPECT_EQ(outcome.status(), 200);
    EXPECT_EQ(outcome.body(), "one");
    EXPECT_EQ(*outcome.response->headers.find("Cache-Control"), "max-age=10");
    EXPECT_EQ(outcome.timing["of"].asString() ? *outcome.timing["of"].asString() : "", "the load");

    clock.advance(9s, [] {});
    EXPECT_EQ(start()->wait().body(), "one") << "fresh again";
    clock.advance(1s, [] {});
    EXPECT_EQ(answer(*start(), 200, "two", kFresh).body(), "two");
    EXPECT_EQ(start()->wait().body(), "two");

    // An answer that confirms something else is asked for once more, without a condition.
    clock.advance(61s, [] {});
    auto confused = start();
    sent().at(0)->respond(304, "", {{"ETag", "\"other\""}});
    executor.drain();
    ASSERT_EQ(sent().size(), 1u);
    EXPECT_FALSE(sent()[0]->originalRequest().headers.find("If-None-Match"));
    EXPECT_EQ(answer(*confused, 200, "three", {{"Cache-Control", "no-store"}}).body(), "three");
    EXPECT_FALSE(cache->find(kUrl)) << "what may not be kept took the place of what was";

    auto failing = start();
    sent().at(0)->fail(Error("x", 1));
    executor.drain();
    EXPECT_EQ(failing->wait().code(), 1);

    (void)answer(*start(), 200, "four", kFresh);
    clock.advance(60s, [] {});
    EXPECT_EQ(answer(*start(), 304, "", {{"Cache-Control", "no-store, max-age=60"}}).body(), "four");
    EXPECT_FALSE(cache->find(kUrl)) << "from now on it may not be kept";
}

TEST_F(CachingSessionTest, WhatMustNotBeAnsweredIsLoadedAndWhatMustNotBeKeptIsNot)
{
    open();
    (void)answer(*start(), 200, "kept", kFresh);
    UrlRequest reload{.url = kUrl, .cachePolicy = UrlRequest::CachePolicy::ReloadIgnoringCache};
    auto reloading = start(reload);
    ASSERT_EQ(sent().size(), 1u);
    EXPECT_FALSE(sent()[0]->originalRequest().headers.find("If-None-Match"));
    EXPECT_EQ(answer(*reloading, 200, "reloaded", kFresh).body(), "reloaded");
    EXPECT_EQ(start()->wait().body(), "reloaded");

    for (const char* field : {"Authorization", "Range"})
        EXPECT_EQ(answer(*start({.url = kUrl, .headers = {{field, "x"}}}), 200, "other", kFresh).body(), "other");
    EXPECT_EQ(cache->find(kUrl)->body.view(), "reloaded");

    EXPECT_EQ(answer(*start({.url = kUrl, .method = "POST"}), 500, "failed", kFresh).body(), "failed");
    EXPECT_TRUE(cache->find(kUrl)) << "nothing was changed";
    EXPECT_EQ(answer(*start({.url = kUrl, .method = "POST"}), 204, "", kFresh).body(), "");
    EXPECT_FALSE(cache->find(kUrl));

    cache->store(kUrl, {.url = kUrl, .statusCode = 200, .headers = {{"Cache-Control", "no-store, max-age=60"}}},
                 Bytes(std::string("x")));
    EXPECT_EQ(answer(*start(), 503, "", kFresh).status(), 503) << "it is for who looks for it, not for requests";
}

TEST_F(CachingSessionTest, ARedirectsAnswerIsKeptForWhereItLed)
{
    open();
    const Url target = *Url::parse("https://example.com/b");
    auto load = start();
    sent().at(0)->finish(Bytes("b"), UrlResponse{.url = target, .statusCode = 200, .headers = kFresh}, std::nullopt);
    executor.drain();
    EXPECT_EQ(load->wait().body(), "b");
    EXPECT_FALSE(cache->find(kUrl));
    EXPECT_EQ(start({.url = target})->wait().body(), "b");
}

TEST_F(CachingSessionTest, CancelEndsATaskOnceWhereverItIs)
{
    open(0);
    auto suspended = make();
    suspended->task->cancel();
    suspended->task->resume();
    executor.drain();
    EXPECT_EQ(suspended->wait().code(), kUrlCancelled);
    EXPECT_TRUE(sent().empty());

    auto asking = make();
    asking->task->resume();
    asking->task->cancel();
    EXPECT_EQ(cancelled(*asking).code(), kUrlCancelled);
    EXPECT_TRUE(sent().empty());

    auto loading = start();
    EXPECT_EQ(sent().size(), 1u);
    EXPECT_EQ(cancelled(*loading).code(), kUrlCancelled);

    auto answered = start();
    sent().at(0)->respond(200, "there first", kFresh);
    EXPECT_EQ(cancelled(*answered).body(), "there first");

    auto fromCache = make();
    fromCache->task->resume();
    cacheQueue->sync([] {}); // its answer waits on the delegate queue
    EXPECT_EQ(cancelled(*fromCache).body(), "there first");

    clock.advance(61s, [] {});
    auto confirming = start();
    sent().at(0)->respond(304, "", {{"ETag", "\"other\""}});
    EXPECT_EQ(cancelled(*confirming).code(), kUrlCancelled) << "before it is known that it must be loaded again";
    EXPECT_TRUE(sent().empty());

    for (const auto* load : {&suspended, &asking, &loading, &answered, &fromCache, &confirming})
        EXPECT_EQ((*load)->completions(), 1);
    auto never = make();
    const std::weak_ptr<UrlTask> dropped = never->task;
    never.reset();
    EXPECT_TRUE(dropped.expired()) << "a task and its load must not keep each other";
}

/// With the real loader, a service on loopback, and threads.
struct CachingLoaderTest : test::UrlLoads {
    ~CachingLoaderTest() override
    {
        cacheQueue->sync([] {}); // what waits keeps the cache
    }
    test::TemporaryDirectory directory;
    const std::unique_ptr<FileSystem> files = makeSystemFiles();
    std::shared_ptr<Queue> cacheQueue = Queue::make("test.httpCache", Queue::Kind::Serial, pool, clock);
    const UrlSessionConfiguration configuration{.cache = HttpCacheConfiguration{.memoryCapacity = 0,
                                                                                .directory = directory / "http",
                                                                                .files = files.get(),
                                                                                .queue = cacheQueue,
                                                                                .clock = &clock}};
};

TEST_F(CachingLoaderTest, SessionsOfTheRealLoaderHaveTheCacheThatTheyAskFor)
{
    TestHttpServer server(test::always({httpAnswer(200, "image", "Cache-Control: max-age=60\r\n")}));
    const auto session = loader->makeSession(configuration, queue);
    for (int i = 0; i < 2; ++i) {
        Load load(*session, {.url = server.url("/image")}, queue);
        load.task->resume();
        EXPECT_EQ(load.wait().body(), "image");
    }
    EXPECT_EQ(server.requests().size(), 1u);
    EXPECT_EQ(load(server.url("/image")).body(), "image");
    EXPECT_EQ(server.requests().size(), 2u) << "a session without a cache";
}

TEST_F(CachingLoaderTest, ACancelThatRacesWithTheRestIsNeverLostOrDoubled)
{
    TestHttpServer server(test::byPath({{"/0", {httpAnswer(200, "fresh", "Cache-Control: max-age=60\r\n")}},
                                        {"/1", {httpAnswer(200, "old", "ETag: \"1\"\r\n")}},
                                        {"/2", {""}}}));
    const auto codes =
        raceWithCancel(configuration, 150, [&](int i) { return server.url("/" + std::to_string(i % 3)); });
    for (std::size_t i = 0; i < codes.size(); ++i)
        EXPECT_TRUE(codes[i] == kUrlCancelled || (codes[i] == 0 && i % 3 != 2)) << i << ": " << codes[i];
}

} // namespace
} // namespace platform
