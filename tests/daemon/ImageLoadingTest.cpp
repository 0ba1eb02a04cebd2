#include <algorithm>

#include <fmt/format.h>

#include "CoreTavrin/ResponseImages.h"
#include "CoreTavrin/TAVBag.h"
#include "platform/net/HttpCache.h"
#include "platform/values/Json.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "searchrecords/ZRNetworkFeedback.h"
#include "tavrind/ClientStateManager.h"
#include "tavrind/ImageFetches.h"
#include "tests/support/DaemonFixture.h"

namespace tavrin::test {
namespace {

using platform::JsonView;
using platform::LogLevel;
using platform::Url;

Value image(const std::string& url)
{
    return Dictionary{{"url", url}};
}

platform::JsonDocument json(std::string_view text)
{
    return platform::JsonDocument::parse(text).value();
}

Strings textsOf(const std::vector<Url>& urls)
{
    Strings texts;
    for (const Url& url : urls) texts.push_back(url.string());
    return texts;
}

TEST(ResponseImages, StandUnderTheirRoles)
{
    Strings found;
    const auto names = [&](std::string_view response) {
        found.clear();
        enumerateImagesInResponse(json(response).root(), [&](JsonView each) { found.push_back(each.json()); });
        return found;
    };
    EXPECT_EQ(imageRoleKeys().size(), 19u);
    for (const std::string_view key : imageRoleKeys()) {
        const std::string role(key);
        EXPECT_EQ(names(fmt::format(R"({{"{}":{{"id":1}}}})", role)).size(), 1u) << role;
        EXPECT_EQ(names(fmt::format(R"({{"card":{{"{}":[1,2]}}}})", role)), (Strings{"1", "2"})) << role;
    }
    const struct {
        const char* response;
        Strings found;
    } cases[]{
        {R"([{"results": [{"more": {"deeper": [[{"icon": {"id": "a"}}]]}}, {"icon": {"id": "b"}}]}, {"glyph": {"id": "c"}}])",
         {R"({"id":"a"})", R"({"id":"b"})", R"({"id":"c"})"}},
        {R"({"icon": "https://a.example/x", "image": 3, "thumbnail": null, "posters": []})", {}},
        {R"({"icon": {"id": "a", "image": {"id": "inside"}}, "posters": [[{"image": {"id": "inside"}}]]})",
         {R"({"id":"a","image":{"id":"inside"}})", R"([{"image":{"id":"inside"}}])"}},
        {R"({"Icon": {"id": "a"}, "icons": {"id": "a"}, "url": "https://a.example/", "id": "a"})", {}},
        {"[]", {}},
        {"3", {}},
        {R"({"icon": {"id": "a"}, "icon": {"id": "b"}})", {R"({"id":"b"})"}},
        {R"({"icon": {"id": "a"}, "glyph": {"id": "c"}, "icon": 3})", {R"({"id":"c"})"}},
        {R"({"icon": 3, "glyph": {"id": "c"}, "icon": {"id": "a"}})", {R"({"id":"a"})", R"({"id":"c"})"}},
    };
    for (const auto& c : cases) EXPECT_EQ(names(c.response), c.found) << c.response;
    enumerateImagesInResponse(JsonView(), [](JsonView) { FAIL(); });
}

TEST(ResponseImages, AreIdentifiedByUrlAndId)
{
    const auto response =
        json(R"([{"icon": {"url": "x", "id": "i", "width": 3}, "posters": [{"id": "j", "url": 3}, "k", {}]}])");
    EXPECT_EQ(collectResponseImageIdentifiers(response.root()),
              (Value::Array{Dictionary{{"url", "x"}, {"id", "i"}}, Dictionary{{"id", "j"}}}));
}

TEST(ResponseImages, AreOrderedByWhatIsKnownOfThem)
{
    const TAVBag bag(Dictionary{{"imageURL", "https://i.example/{id}"}}, "A/1");
    std::set<std::string> seen;
    OrderedImages images;
    const auto all = json(R"([
        {"url": "https://A.example/1", "id": "one"}, {"id": "a/ü b"}, {"url": "https://A.example/1"}, "text", 7, null,
        {"url": "not a url", "id": "two"}, {"url": "mailto:x@y.example"}, {"url": "file:///etc/passwd"},
        {"url": "ftp://f.example/x"}, {"id": 4, "url": ["x"]}, {"id": "one"}, {}])");
    for (const JsonView each : all.root().elements()) collectOrderedImages(bag, each.value(), &seen, images);
    EXPECT_EQ(textsOf(images.primary),
              (Strings{"https://A.example/1", "https://i.example/a%2F%C3%BC%20b", "ftp://f.example/x"}));
    EXPECT_EQ(textsOf(images.secondary), (Strings{"https://i.example/one", "https://i.example/two"}));
    EXPECT_EQ(images.hosts, (std::set<std::string>{"a.example", "f.example", "i.example"}));

    OrderedImages again;
    for (int i = 0; i < 2; ++i) collectOrderedImages(bag, image("https://A.example/1"), &seen, again);
    EXPECT_TRUE(again.primary.empty()) << "all of them were seen";
    EXPECT_EQ(again.hosts, std::set<std::string>{"a.example"});
    for (int i = 0; i < 2; ++i) collectOrderedImages(bag, image("https://A.example/1"), nullptr, again);
    EXPECT_EQ(again.primary.size(), 2u) << "nothing is looked up";
    collectOrderedImages(TAVBag(Value(), "A/1"), Dictionary{{"id", "x"}}, nullptr, again);
    EXPECT_EQ(again.primary.size(), 2u) << "the bag has no template";
}

struct ImageFetchesTest : testing::Test {
    /// "host/image".
    static Url url(const std::string& name) { return *Url::parse("https://" + name); }
    bool add(const std::string& name, const ImageGroup& group = nullptr) { return fetches.add({url(name), {}}, group); }
    bool join(const std::string& name, const ImageGroup& group) { return fetches.join(url(name), group); }
    /// What begins now, in order.
    Strings begun()
    {
        Strings names;
        while (const auto fetch = fetches.next()) names.push_back(fetch->url.string().substr(8));
        return names;
    }
    Strings end(const std::string& name)
    {
        fetches.end(url(name));
        return begun();
    }
    static std::string on(std::size_t host, std::size_t image) { return fmt::format("h{}/{}", host, image); }

    ImageFetches fetches;
    const std::shared_ptr<int> client = std::make_shared<int>();
};

TEST_F(ImageFetchesTest, BeginInTurn)
{
    Strings added;
    for (std::size_t i = 0; i < ImageFetches::kUnderWay + 3; ++i) EXPECT_TRUE(add(added.emplace_back(on(i % 9, i))));
    EXPECT_EQ(begun(), Strings(added.begin(), added.end() - 3));
    EXPECT_TRUE(join(added[0], client) && join(added[0], client)) << "it is under way";
    EXPECT_EQ(client.use_count(), 2) << "listed once";
    EXPECT_TRUE(join(added.back(), nullptr)) << "nobody waits for it, so it stays where it is";
    EXPECT_FALSE(join("h1/x", client));
    EXPECT_TRUE(end("h1/x").empty() && end(added.back()).empty()) << "unknown, and not begun";
    for (std::size_t i = 0; i < 3; ++i) EXPECT_EQ(end(added[i]), Strings{added[ImageFetches::kUnderWay + i]});
    EXPECT_EQ(client.use_count(), 1) << "its fetch has ended";
}

TEST_F(ImageFetchesTest, ThoseThatAClientWaitsForHaveSlotsOfTheirOwn)
{
    for (std::size_t i = 0; i < ImageFetches::kUnderWay + 3; ++i) EXPECT_TRUE(add(on(i, i)));
    EXPECT_EQ(begun().size(), ImageFetches::kUnderWay);
    EXPECT_TRUE(add("a/1", client));
    EXPECT_EQ(begun(), Strings{"a/1"});
    EXPECT_TRUE(join("h26/26", client));
    EXPECT_TRUE(join("h26/26", client));
    EXPECT_EQ(begun(), Strings{"h26/26"}) << "it changes lanes";
    EXPECT_EQ(end("h0/0"), Strings{"h24/24"});
    for (std::size_t i = 2; i < ImageFetches::kUnderWay; ++i) EXPECT_TRUE(add(on(100 + i, 0), client));
    EXPECT_EQ(begun().size(), ImageFetches::kUnderWay - 2);
    EXPECT_TRUE(add("b/1", client));
    EXPECT_TRUE(end("h24/24") == Strings{"h25/25"} && begun().empty()) << "slots of the one aren't the other's";
    EXPECT_EQ(end("h26/26"), Strings{"b/1"});
}

TEST_F(ImageFetchesTest, NoHostTakesMoreThanItsShare)
{
    for (std::size_t i = 0; i < 2 * ImageFetches::kUnderWayOfHost; ++i) EXPECT_TRUE(add(on(1, i)));
    for (const char* other : {"h2/0", "h3/0"}) EXPECT_TRUE(add(other));
    EXPECT_EQ(begun(), (Strings{"h1/0", "h1/1", "h1/2", "h1/3", "h1/4", "h1/5", "h1/6", "h1/7", "h2/0", "h3/0"}));
    EXPECT_TRUE(end("h2/0").empty());
    EXPECT_EQ(end("h1/4"), Strings{"h1/8"});
    EXPECT_TRUE(join("h1/12", client) && join("h1/10", client));
    EXPECT_EQ(begun(), (Strings{"h1/12", "h1/10"})) << "those that a client waits for have a share of their own";
    EXPECT_EQ(end("h1/0"), Strings{"h1/9"});
    EXPECT_EQ(end("h1/1"), Strings{"h1/11"}) << "the tenth has begun";
}

TEST_F(ImageFetchesTest, AFullLaneTakesNoMore)
{
    EXPECT_TRUE(add("ahead/1"));
    for (std::size_t i = 0; i < ImageFetches::kWaiting; ++i) EXPECT_TRUE(add(on(i % 99, i), client));
    EXPECT_FALSE(add("h1/x", client));
    EXPECT_TRUE(join("ahead/1", client) && begun().back() == "ahead/1") << "it stays in its lane, and is awaited";
    EXPECT_TRUE(add("ahead/2"));
}

struct ImageLoadingTest : DaemonTest {
    ImageLoadingTest()
    {
        start();
        deliverBag(R"({"version": "9", "searchURL": "https://s.example/search", "timeoutIntervalForRequest": 7,
                       "imageURL": "https://i.example/{id}"})");
        connection = client();
        endpoint = device.ipc.connect("com.quorvane.TAVEndpointXPC");
        device.drain();
        session->records.clear();
    }

    /// A search that is answered with `images` under the role "posters".
    void answerSearch(const Value& images)
    {
        ++queryId;
        (void)search(*connection, queryId, fmt::format("query {}", queryId));
        session->records.clear();
        respond(platform::toJson(
            Value::Array{Dictionary{{"status", "OK"}, {"results", Value::Array{Dictionary{{"posters", images}}}}}}));
    }
    std::shared_ptr<FakeCall> load(Value::Array images, std::uint64_t timeout = 1'000'000'000)
    {
        return call(*endpoint, "LoadImages", {std::move(images), timeout});
    }
    /// Image requests that have been sent, in order, and are not answered yet.
    std::vector<std::shared_ptr<Task>> fetches()
    {
        std::vector<std::shared_ptr<Task>> found;
        for (const auto& each : device.loader.sessions)
            for (const auto& task : each->tasks)
                if (task->resumed && !task->finished && task->originalRequest().maximumResponseSize &&
                    task->originalRequest().url.path() != "/bag")
                    found.push_back(task);
        return found;
    }
    Strings fetched()
    {
        Strings urls;
        for (const auto& task : fetches()) urls.push_back(task->originalRequest().url.string());
        return urls;
    }
    void answerAll(int status = 200, const std::string& body = "pixels")
    {
        for (auto left = fetches(); !left.empty(); left = fetches()) {
            for (const auto& task : left) task->respond(status, body);
            device.drain();
        }
    }
    static std::string bytes(FakeCall& call, const std::string& name)
    {
        const platform::Bytes* image = call.argument(0)[name].asBytes();
        return image ? std::string(image->view()) : "none";
    }

    std::shared_ptr<FakeConnection> connection, endpoint;
    std::int64_t queryId = 0;
};

TEST_F(ImageLoadingTest, AnAnswersImagesAreFetchedAhead)
{
    const std::size_t timers = device.clock.pendingTimers();
    LogCapture log;
    answerSearch(*platform::parseJson(
        R"([{"url": "https://a.example/1", "id": "one"}, {"id": "two"}, {"url": "https://a.example/1"}])"));
    EXPECT_EQ(fetched(), (Strings{"https://a.example/1", "https://i.example/two", "https://i.example/one"}));
    EXPECT_EQ(fetches()[0]->originalRequest().timeout, platform::Duration(7s));
    EXPECT_EQ(fetches()[0]->originalRequest().maximumResponseSize, 10u << 20);
    EXPECT_EQ(device.transactions.open().at("imageFetch"), 3);
    EXPECT_EQ(assembly().clientStateManager->validImageHosts(), (std::set<std::string>{"a.example", "i.example"}));
    EXPECT_TRUE(log.has(LogLevel::Default, "Tavrin_Images", "fetching image https://a.example/1"));

    const auto started = session->last<ZRStartNetworkSearchFeedback>();
    ASSERT_TRUE(started);
    EXPECT_EQ(started->url, "https://i.example/one");
    EXPECT_EQ(started->input, "");
    EXPECT_EQ(static_cast<int>(started->triggerEvent), 15);
    EXPECT_EQ(static_cast<int>(started->endpoint), 7);
    EXPECT_TRUE(started->headers.asDictionary());
    EXPECT_EQ(session->records.back()->userAgent, ClientSessionManager::tavrindUserAgent());
    EXPECT_EQ(session->records.back()->queryId, 0);

    const auto last = fetches().back();
    last->timing = Dictionary{{"mark", 1}};
    answer(*last, "pixels");
    const auto end = session->last<ZREndNetworkSearchFeedback>();
    ASSERT_TRUE(end);
    EXPECT_EQ(end->uuid, started->uuid);
    EXPECT_EQ(end->responseSize, 6);
    EXPECT_EQ(end->statusCode, 200);
    EXPECT_EQ(end->networkTimingData["mark"], Value(1));
    const auto kept = assembly().urlSession->cache()->find(*Url::parse("https://i.example/one"));
    ASSERT_TRUE(kept);
    EXPECT_EQ(kept->body.view(), "pixels");
    EXPECT_TRUE(log.has(LogLevel::Default, "Tavrin_Images", "Fetched image https://i.example/one"));
    EXPECT_TRUE(log.has(LogLevel::Default, "Tavrin_Images", "caching 6 bytes for https://i.example/one"));
    answerAll();
    EXPECT_TRUE(device.transactions.open().empty());
    EXPECT_EQ(device.clock.pendingTimers(), timers) << "nothing wakes for a fetch that has ended";

    session->records.clear();
    answerSearch(*platform::parseJson(R"([{"url": "https://a.example/1", "id": "one"}])"));
    EXPECT_TRUE(fetches().empty());
    EXPECT_EQ(session->takeClasses(), Strings{"TAVEndNetworkSearchFeedback"}) << "of the search";
    EXPECT_EQ(log.count("found https://a.example/1 in cache"), 1);
}

TEST_F(ImageLoadingTest, ImagesLeadNoFurtherThanRedirectsOfTheirAnswer)
{
    using platform::UrlSource;
    const auto sourceOfNext = [&] { return fetches().at(0)->originalRequest().source; };
    const auto loaded = [&](const std::string& url) {
        const auto call = load({image(url)});
        const auto source = sourceOfNext();
        answerAll();
        return source;
    };
    EXPECT_EQ(loaded("https://a.example/first"), (UrlSource{.secure = true, .isPublic = true})) << "the bag's service";

    const struct {
        const char* url;
        std::optional<bool> publicPeer;
        UrlSource source;
    } cases[]{
        {"https://s.example/", true, {.secure = true, .isPublic = true}},
        {"https://s.example/", false, {.secure = true, .isPublic = false}},
        {"http://s.example/", std::nullopt, {.secure = false, .isPublic = true}},
        {"http://127.0.0.1/", std::nullopt, {.secure = false, .isPublic = false}},
    };
    for (const auto& c : cases) {
        ++queryId;
        (void)search(*connection, queryId, fmt::format("query {}", queryId));
        lastTask()->finish(
            platform::Bytes(fmt::format(R"([{{"icon": {{"url": "https://a.example/{}"}}}}])", queryId)),
            platform::UrlResponse{.url = *Url::parse(c.url), .statusCode = 200, .publicPeer = c.publicPeer},
            std::nullopt);
        device.drain();
        EXPECT_EQ(sourceOfNext(), c.source) << c.url;
        answerAll();
        EXPECT_EQ(loaded(fmt::format("https://a.example/asked/{}", queryId)), c.source) << c.url;
    }
}

TEST_F(ImageLoadingTest, AClientMayDoWithoutThem)
{
    connection = connect(78);
    configure(*connection, "com.quorvane.news", "News/1", {{"dontPreloadImages", true}});
    answerSearch(Value::Array{image("https://a.example/1")});
    EXPECT_TRUE(fetches().empty());
}

TEST_F(ImageLoadingTest, WhatIsOnItsWayIsFetchedOnce)
{
    answerSearch(Value::Array{image("https://a.example/1")});
    answerSearch(Value::Array{image("https://a.example/1"), image("https://a.example/2")});
    auto call = load({image("https://a.example/2"), image("https://a.example/2")});
    EXPECT_EQ(fetched(), (Strings{"https://a.example/1", "https://a.example/2"}));
    answer(*fetches()[1], "two");
    ASSERT_TRUE(call->answered()) << "it waits for none of the others";
    EXPECT_EQ(bytes(*call, "https://a.example/2"), "two");
    answerAll(404);
    answerSearch(Value::Array{image("https://a.example/1")});
    EXPECT_EQ(fetched(), Strings{"https://a.example/1"}) << "what failed is tried again";
}

TEST_F(ImageLoadingTest, OtherSchemesAreRefused)
{
    LogCapture log;
    answerSearch(Value::Array{image("ftp://a.example/1"), image("gopher://a.example/2"), image("file:///etc/passwd"),
                              image("file://localhost/etc/passwd"), image("https://a.example/1")});
    EXPECT_EQ(fetched(), Strings{"https://a.example/1"});
    EXPECT_TRUE(log.has(LogLevel::Fault, "Tavrin_Images", "invalid url scheme: ftp://a.example/1"));
    auto call = load({image("ftp://a.example/1"), image("file:///etc/passwd")});
    EXPECT_EQ(call->argument(0), Value(Dictionary())) << "there is nothing to wait for";
}

TEST_F(ImageLoadingTest, AClientGetsWhatIsThereInTime)
{
    const auto begin = device.clock.hostTicks();
    auto call = load({image("https://a.example/1"), Dictionary{{"url", "https://a.example/2"}, {"id", "two"}},
                      Dictionary{{"id", "three"}}, image("https://a.example/4"),
                      Dictionary{{"url", "nowhere"}, {"id", "five"}}, Dictionary()},
                     2'000'000'000);
    EXPECT_EQ(fetched(), (Strings{"https://a.example/1", "https://a.example/2", "https://i.example/three",
                                  "https://a.example/4", "https://i.example/two", "https://i.example/five"}));
    auto behind = load({});
    EXPECT_TRUE(behind->pending()) << "the connection's calls keep their order";
    const auto all = fetches();
    all[0]->respond(200, "one");
    all[1]->respond(404, "no such image");
    for (const std::size_t i : {2, 4, 5}) all[i]->respond(200, fmt::format("image {}", i));
    device.drain();
    EXPECT_TRUE(call->pending()) << "the fourth may still come";
    device.advance(2s - platform::Duration(device.clock.hostTicks() - begin) - 1ns);
    EXPECT_TRUE(call->pending());
    device.advance(1ns);
    ASSERT_TRUE(call->answered());
    EXPECT_EQ(call->argument(0), Value(Dictionary{{"https://a.example/1", platform::Bytes("one")},
                                                  {"two", platform::Bytes("image 4")},
                                                  {"three", platform::Bytes("image 2")},
                                                  {"five", platform::Bytes("image 5")}}));
    EXPECT_TRUE(behind->answered());

    answer(*all[3], "late");
    auto again = load({image("https://a.example/4")}, 0);
    ASSERT_TRUE(again->answered());
    EXPECT_EQ(bytes(*again, "https://a.example/4"), "late") << "it came after all";
}

TEST_F(ImageLoadingTest, NobodyWaitsLongerThanAMinute)
{
    auto call = load({image("https://a.example/1")}, UINT64_MAX);
    device.advance(60s - 1ns);
    EXPECT_TRUE(call->pending());
    device.advance(1ns);
    EXPECT_TRUE(call->answered());
    EXPECT_EQ(fetches().size(), 1u) << "it goes on";
}

TEST_F(ImageLoadingTest, WithoutABagThereAreNoImages)
{
    startWithoutBag();
    endpoint = device.ipc.connect("com.quorvane.TAVEndpointXPC");
    EXPECT_EQ(load({image("https://a.example/1")})->argument(0), Value(Dictionary()));
    const auto response =
        std::make_shared<const platform::JsonDocument>(json(R"({"icon":{"url":"https://a.example/1"}})"));
    assembly().clientStateManager->processImagesFromResponse(response, nullptr, {});
    device.drain();
    EXPECT_TRUE(fetches().empty());
}

TEST_F(ImageLoadingTest, EveryFailureIsToldAndTheNextImageIsFetched)
{
    const struct {
        const char* name;
        std::function<void(Task&)> answer;
        const char* log;
        std::string domain;
        const char* reason; // of the error that is recorded; null for none
        bool disk = true;   // has a place for the image
    } cases[]{
        {"transport", [](Task& task) { task.fail(platform::Error::withReason("UrlErrorDomain", -1004, "refused")); },
         "Error fetching image https://a.example/0: UrlErrorDomain -1004: refused", "TAVErrorDomain",
         "image fetch error UrlErrorDomain -1004: refused"},
        {"status", [](Task& task) { task.respond(503, "later"); }, "Bad status code 503 for image https://a.example/1",
         "", nullptr},
        {"no status", [](Task& task) { task.finish(platform::Bytes(), std::nullopt, std::nullopt); },
         "Bad status code 0 for image https://a.example/2", "", nullptr},
        {"nothing in it", [](Task& task) { task.respond(200, ""); }, "mmap failed POSIX 22", "POSIX",
         "Invalid argument"},
        {"no file", [](Task& task) { task.respond(200, "pixels"); }, "opening file failed POSIX 24", "TAVErrorDomain",
         "file open failed", false},
    };
    int number = 0;
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        LogCapture log;
        if (!c.disk) failOn("temporary", EMFILE);
        auto call = load({image(fmt::format("https://a.example/{}", number++))});
        session->records.clear();
        c.answer(*fetches().at(0));
        device.drain();
        ASSERT_TRUE(call->answered());
        EXPECT_EQ(call->argument(0), Value(Dictionary()));
        EXPECT_TRUE(log.has(LogLevel::Error, "Tavrin_Images", c.log));
        EXPECT_EQ(session->records.size(), c.reason ? 1u : 0u);
        if (const auto error = session->last<ZRErrorFeedback>()) {
            EXPECT_EQ(error->error->domain, c.domain);
            EXPECT_TRUE(error->error->reason().starts_with(c.reason)) << error->error->reason();
            EXPECT_EQ(session->records.back()->userAgent, ClientSessionManager::tavrindUserAgent());
        }
        EXPECT_TRUE(device.transactions.open().empty());
    }
}

TEST_F(ImageLoadingTest, TenThousandImagesTakeTurns)
{
    Value::Array images;
    for (int i = 0; i < 10'100; ++i) images.push_back(image(fmt::format("https://host{}.example/{}", i, i)));
    LogCapture log;
    answerSearch(images);
    EXPECT_EQ(fetches().size(), ImageFetches::kUnderWay);
    EXPECT_EQ(log.count("10000 images wait already, not fetching 76 further ones"), 1);
    EXPECT_EQ(assembly().clientStateManager->validImageHosts().size(), 1000u);

    auto call = load({image("https://a.example/wanted"), image("https://host9000.example/9000")});
    EXPECT_EQ(fetches().size(), ImageFetches::kUnderWay + 2) << "what hangs ahead keeps no client waiting";
    answerAll();
    EXPECT_EQ(bytes(*call, "https://host9000.example/9000"), "pixels");
    EXPECT_TRUE(device.transactions.open().empty());
}

TEST_F(ImageLoadingTest, AnAnswerHoldsSoManyBytesOnly)
{
    assembly().urlSession = device.loader.makeSession(
        {.cache = platform::HttpCacheConfiguration{.memoryCapacity = 400u << 20, .clock = &device.clock}},
        device.device.serialQueue("test.urlSession", platform::Rank::Root));
    const std::string large(5u << 20, 'x');
    Value::Array images;
    for (int i = 0; i < 4; ++i) images.push_back(image(fmt::format("https://a.example/{}", i)));
    auto call = load(images);
    answerAll(200, large);
    ASSERT_TRUE(call->answered());
    EXPECT_EQ(call->argument(0).count(), 3u);
    EXPECT_EQ(bytes(*call, "https://a.example/3"), "none");
}

} // namespace
} // namespace tavrin::test
