#include "tools/devserver/Service.h"

#include <sys/socket.h>
#include <thread>

#include <gtest/gtest.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tools/devserver/Images.h"

namespace devserver {
namespace {

using platform::Value;

class ServiceTest : public testing::Test {
protected:
    static Request request(std::string method, std::string_view target, std::string body = "")
    {
        Request request;
        request.method = std::move(method);
        const std::size_t mark = target.find('?');
        request.path = target.substr(0, mark);
        if (mark != target.npos) request.query = target.substr(mark + 1);
        request.body = std::move(body);
        request.peer = "127.0.0.1";
        return request;
    }
    Answer get(std::string_view target) { return service.answer(request("GET", target)); }
    Answer post(std::string_view target, std::string body = "")
    {
        return service.answer(request("POST", target, std::move(body)));
    }
    static Value json(const Answer& answer) { return platform::parseJson(answer.body).value_or(Value()); }

    Service service{"https://127.0.0.1:8443"};
};

TEST_F(ServiceTest, EveryUrlInAnAnswerIsServed)
{
    const Value set = json(get("/search?q=weat"))[0];
    const auto targetOf = [&](const Value& url) {
        return url.asString() ? url.asString()->substr(service.base.size()) : "no URL";
    };
    EXPECT_EQ(set["status"], Value("OK"));
    EXPECT_EQ(set["max_age"], Value(60));
    EXPECT_EQ(set["partial_client_ip"], Value("127.0.0.0"));
    EXPECT_TRUE(set["duration"].asDouble());
    EXPECT_GT(json(get(targetOf(set["sections"][0]["more_results_url"])))[0]["results"].count(), 0u);
    const Value card = json(get(targetOf(set["results"][0]["card_url"])));
    EXPECT_EQ(card[0]["results"][0]["card"]["title"], set["results"][0]["title"]);
    EXPECT_TRUE(get(targetOf(set["results"][0]["thumbnail"]["url"])).body.starts_with("\x89PNG"));
    EXPECT_EQ(get("/warm").status, 204);
    const Value bag = service.bag.document();
    for (const auto& [key, value] : *bag.asDictionary()) {
        if (const std::string* url = value.asString(); url && url->starts_with(service.base)) {
            EXPECT_NE(endpointOf(request("GET", targetOf(value))), "unknown") << key;
        }
    }
}

TEST_F(ServiceTest, RequestsAreToldApartByPathAndItems)
{
    const std::pair<const char*, const char*> cases[] = {
        {"/search?q=a", "search"},
        {"/search?qtype=zkw", "zkw"},
        {"/search?q=a&qtype=suggested", "search"},
        {"/search?ltype=x&q=a", "lookup"},
        {"/flight?q=a", "flight"},
        {"/feedback?v=2", "upload"},
        {"/images/", "image"},
        {"/images", "unknown"},
        {"/", "unknown"},
        {"/controls", "unknown"},
    };
    for (const auto& [target, endpoint] : cases) EXPECT_EQ(endpointOf(request("GET", target)), endpoint) << target;
}

TEST_F(ServiceTest, MistakesInRequestsAreNamed)
{
    const std::pair<const char*, int> cases[] = {
        {"/search", 400}, {"/more?q=a&section=x", 400}, {"/card?id=x", 404}, {"/feedback", 405}, {"/nothing", 404}};
    for (const auto& [target, status] : cases) {
        const Answer answer = get(target);
        EXPECT_EQ(answer.status, status) << target;
        EXPECT_TRUE(json(answer)["error"].asString()) << target;
    }
    EXPECT_EQ(post("/search?q=a").status, 405);
    EXPECT_EQ(get("/search?q=" + std::string(2001, 'a')).status, 400);
}

TEST_F(ServiceTest, ImagesTakeTheBytesThatAreAskedFor)
{
    const std::string plain = get("/images/a%2Fb").body;
    EXPECT_TRUE(plain.starts_with("\x89PNG\r\n\x1a\n"));
    EXPECT_EQ(plain, imageFor("a/b"));
    EXPECT_NE(plain, get("/images/c").body);
    EXPECT_EQ(get("/images/a%2Fb?size=20").body, plain) << "it needs more";
    for (const std::size_t size : {plain.size() + 12, std::size_t{20'000}}) {
        const std::string padded = get("/images/a%2Fb?size=" + std::to_string(size)).body;
        EXPECT_EQ(padded.size(), size);
        const std::size_t before = plain.size() - 12; // the last chunk
        EXPECT_EQ(padded.substr(0, before), plain.substr(0, before));
        EXPECT_EQ(padded.substr(before + 4, 4), "fiLl");
        EXPECT_TRUE(padded.ends_with(plain.substr(before)));
    }
    EXPECT_EQ(get("/images/a?size=16777217").status, 400);
}

TEST_F(ServiceTest, FlightsAreFoundByNumberAndAirline)
{
    for (const char* query : {"QA412", "qa+412", "412", "alpenluft%20athens"}) {
        const Value found = json(get(std::string("/flight?q=") + query));
        ASSERT_GT(found[0]["results"].count(), 0u) << query;
        EXPECT_TRUE(found[0]["results"][0]["title"].asString()->starts_with("QA 412")) << query;
    }
    EXPECT_EQ(json(get("/flight?q=weather"))[0]["results"].count(), 0u);
}

TEST_F(ServiceTest, ControlRefusesWhatItDoesNotKnowAndSaysWhatItDoes)
{
    const std::pair<const char*, const char*> bad[] = {
        {"/control/faults", "{}"},
        {"/control/faults", R"({"endpoint": "search", "fault": "delay:x"})"},
        {"/control/faults", R"({"endpoint": "search", "fault": "cut", "time": 1})"},
        {"/control/faults", R"({"endpoint": "search", "fault": "cut", "count": -1})"},
        {"/control/faults", "[]"},
        {"/control/faults", "{"},
        {"/control/faults/clear", R"({"endpoint": "search"})"},
        {"/control/search", R"({"max_age": -1})"},
        {"/control/search", R"({"maxage": 1})"},
        {"/control/bag", "7"},
        {"/control/resources/bump", R"({"name": "Nothing"})"},
        {"/control/resources/bump", R"({"name": 7})"},
    };
    for (const auto& [target, body] : bad) {
        const Answer answer = post(target, body);
        EXPECT_EQ(answer.status, 400) << target << body;
        EXPECT_TRUE(json(answer)["error"].asString());
    }
    EXPECT_EQ(get("/control/log?since=x").status, 400);
    EXPECT_EQ(get("/control/log?endpoint=serch").status, 400);
    EXPECT_EQ(get("/control/nothing").status, 404);
    EXPECT_EQ(get("/control").status, 404);
    EXPECT_EQ(get("/control/reset").status, 404) << "changes come by POST";
}

TEST_F(ServiceTest, ControlIsForThisMachineOverHttp)
{
    Request call = request("GET", "/control/status");
    call.peer = "192.0.2.1";
    EXPECT_EQ(service.answer(call).status, 403);
    call.peer = "::1";
    EXPECT_EQ(service.answer(call).status, 200);
    call.secure = true;
    EXPECT_EQ(service.answer(call).status, 404);
}

TEST_F(ServiceTest, TheLogShowsRequestsButNoControlCallsAndNoSecrets)
{
    Request search = request("GET", "/search?q=weather&locale=de_CH");
    search.headers = {{"X-Quorvane-UserGuid", "G"}, {"authorization", "Bearer s3cret"}};
    static_cast<void>(service.answer(search));
    static_cast<void>(get("/bag"));
    static_cast<void>(get("/control/status"));
    const Value status = json(get("/control/status"));
    EXPECT_EQ(status["requests"], Value(2));
    EXPECT_EQ(platform::toJson(status["by_endpoint"]), R"({"bag":1,"search":1})");

    const Answer log = get("/control/log?endpoint=search");
    const Value entry = json(log)["requests"][0];
    EXPECT_EQ(entry["query"], Value("q=weather&locale=de_CH"));
    EXPECT_EQ(entry["headers"]["X-Quorvane-UserGuid"], Value("G"));
    EXPECT_EQ(log.body.find("s3cret"), std::string::npos);
    EXPECT_EQ(json(log)["requests"].count(), 1u);
    EXPECT_EQ(json(get("/control/log?since=1"))["requests"][0]["endpoint"], Value("bag"));
    EXPECT_EQ(json(get("/control/log?count=0"))["requests"].count(), 0u);
    for (std::size_t i = 0; i < RequestLog::kKept; ++i) static_cast<void>(get("/warm"));
    EXPECT_EQ(json(get("/control/log"))["requests"].count(), RequestLog::kKept) << "bounded";
    EXPECT_EQ(json(get("/control/status"))["requests"], Value(RequestLog::kKept + 2));
}

TEST_F(ServiceTest, FaultsStrikeTheirEndpointAndResetEndsThem)
{
    ASSERT_EQ(post("/control/faults", R"({"endpoint": "bag", "fault": "status:503"})").status, 200);
    ASSERT_EQ(post("/control/bag", R"({"isEnabled": false})").status, 200);
    ASSERT_EQ(post("/control/search", R"({"max_age": 0})").status, 200);
    EXPECT_EQ(get("/bag").status, 503);
    EXPECT_EQ(get("/search?q=weather").status, 200);
    EXPECT_TRUE(json(get("/search?q=weather"))[0]["max_age"].isNull()) << "0 is no limit";
    EXPECT_EQ(post("/control/reset").status, 200);
    EXPECT_EQ(json(get("/bag"))["isEnabled"], Value(true));
    EXPECT_EQ(json(get("/search?q=weather"))[0]["max_age"], Value(60));
}

TEST_F(ServiceTest, AResourceCanBeHalvedOrEmptied)
{
    const std::string whole = get("/resources/TAVQIFeatures").body;
    ASSERT_EQ(post("/control/faults", R"({"endpoint": "resource", "fault": "half", "count": 1})").status, 200);
    ASSERT_EQ(post("/control/faults", R"({"endpoint": "resource", "fault": "empty", "count": 1})").status, 200);
    EXPECT_EQ(get("/resources/TAVQIFeatures").body, whole.substr(0, whole.size() / 2));
    EXPECT_EQ(get("/resources/TAVQIFeatures").body, "");
    EXPECT_EQ(json(post("/control/resources/bump", R"({"name": "TAVQIFeatures"})"))["resource_version"], Value(2));
    EXPECT_EQ(json(get("/bag"))["TAVQIFeatures"], Value(service.base + "/resources/TAVQIFeatures?version=2"));
}

TEST_F(ServiceTest, ARaisedBagVersionIsAnnounced)
{
    EXPECT_EQ(json(post("/control/bag/bump"))["version"], Value(2));
    const Answer answer = get("/search?q=weather");
    EXPECT_EQ(*findHeader(answer.headers, "X-Quorvane-ForceFetch"), R"({"bag": 2})");
    EXPECT_EQ(json(get("/bag"))["version"], Value(2));
}

// ---- Held back

TEST_F(ServiceTest, AHangEndsByReleaseByThePeerAndByStopping)
{
    int ends[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
    const platform::FileHandle ours(ends[0]);
    platform::FileHandle peer(ends[1]);
    const auto hang = [&](int connection, Answer& answer) {
        EXPECT_TRUE(service.faults.add("bag", "hang", 1));
        return std::thread([this, connection, &answer] {
            Request call = request("GET", "/bag");
            call.connection = connection;
            answer = service.answer(call);
        });
    };
    // Releasing before the request waits would miss it: again until it is over.
    std::atomic<bool> over = false;
    Answer released;
    EXPECT_TRUE(service.faults.add("bag", "hang", 1));
    std::thread first([&] {
        released = get("/bag");
        over = true;
    });
    while (!over) {
        service.gate.release();
        std::this_thread::yield();
    }
    first.join();
    EXPECT_EQ(released.status, 200);
    EXPECT_EQ(json(released)["version"], Value(1)) << "the answer that it would have had";

    Answer left;
    std::thread second = hang(ours.fd(), left);
    peer = platform::FileHandle();
    second.join();
    EXPECT_TRUE(left.cut);

    Answer stopped;
    std::thread third = hang(-1, stopped);
    service.stop();
    third.join();
    EXPECT_EQ(stopped.status, 200);
    EXPECT_TRUE(service.faults.add("bag", "delay:600000", 1));
    EXPECT_EQ(get("/bag").status, 200) << "nothing waits after the stop";
}

} // namespace
} // namespace devserver
