#include "tools/devserver/Service.h"

#include <gtest/gtest.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"

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

TEST_F(ServiceTest, ControlRefusesWhatItDoesNotKnowAndSaysWhatItDoes)
{
    const std::pair<const char*, const char*> bad[] = {
        {"/control/faults", "{}"},
        {"/control/faults", R"({"endpoint": "search", "fault": "delay:x"})"},
        {"/control/faults", R"({"endpoint": "search", "fault": "cut", "count": -1})"},
        {"/control/faults", "{"},
        {"/control/search", R"({"maxage": 1})"},
        {"/control/bag", "7"},
        {"/control/resources/bump", R"({"name": "Nothing"})"},
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

TEST_F(ServiceTest, NoFaultGivesABodyToAnAnswerThatMayHaveNone)
{
    Request call = request("GET", "/resources/TAVQIFeatures?version=1");
    call.headers = {{"If-None-Match", "1"}};
    for (const char* fault : {"cut", "notjson", "huge:10", "endless"}) {
        ASSERT_TRUE(service.faults.add("resource", fault, 1));
        const Answer answer = service.answer(call);
        EXPECT_EQ(answer.status, 304);
        EXPECT_TRUE(answer.body.empty() && answer.paddedTo == 0 && !answer.cut && !answer.goesOn) << fault;
    }
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

} // namespace
} // namespace devserver
