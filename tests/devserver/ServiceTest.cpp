#include "tools/devserver/Service.h"

#include <gtest/gtest.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tools/devserver/Matching.h"

namespace devserver {
namespace {

using platform::Value;

class ServiceTest : public testing::Test {
protected:
    static Request request(std::string method, std::string_view target, std::string body = "")
    {
        const std::size_t mark = std::min(target.find('?'), target.size());
        return {.method = std::move(method),
                .path = std::string(target.substr(0, mark)),
                .query = std::string(target.substr(std::min(mark + 1, target.size()))),
                .body = std::move(body),
                .peer = "127.0.0.1"};
    }
    Answer get(std::string_view target) { return service.answer(request("GET", target)); }
    static Value json(const Answer& answer) { return platform::parseJson(answer.body).value_or(Value()); }

    Service service{"https://127.0.0.1:8443"};
};

TEST_F(ServiceTest, EveryUrlInAnAnswerIsServed)
{
    const Value set = json(get("/search?q=weat"))[0];
    const auto targetOf = [&](const Value& url) {
        return url.asString() ? url.asString()->substr(service.base.size()) : "no URL";
    };
    EXPECT_GT(json(get(targetOf(set["sections"][0]["more_results_url"])))[0]["results"].count(), 0u);
    const Value card = json(get(targetOf(set["results"][0]["card_url"])));
    EXPECT_EQ(card[0]["results"][0]["card"]["title"], set["results"][0]["title"]);
    EXPECT_TRUE(get(targetOf(set["results"][0]["thumbnail"]["url"])).body.starts_with("\x89PNG"));
    const Value bag = service.bag.document();
    for (const auto& [key, value] : *bag.asDictionary()) {
        if (const std::string* url = value.asString(); url && url->starts_with(service.base)) {
            EXPECT_NE(endpointOf(request("GET", targetOf(value))), "unknown") << key;
        }
    }
}

TEST_F(ServiceTest, EverySetIsFoundAgainByWhatWasTyped)
{
    // Sets are cached under "query" for inputs that it begins with.
    for (const char* typed : {"We", "weather", "zur", "ZÜR", "東", "ακρ", "برج", "weather l", " we"}) {
        const auto sets = SearchAnswers(Catalogue(), service.base).search(typed);
        ASSERT_GT(sets.count(), 0u) << typed;
        for (const auto& set : *sets.asArray())
            EXPECT_TRUE(set["query"].asString()->starts_with(lowerCased(typed))) << typed;
    }
}

TEST_F(ServiceTest, TheResourceAtHandIsNotSentAgainWhateverTheFault)
{
    Request call = request("GET", "/resources/TAVQIFeatures?version=1");
    call.headers = {{"If-None-Match", "1"}};
    for (const char* fault : {"delay:0", "cut", "notjson", "huge:10", "endless"}) {
        ASSERT_TRUE(service.faults.add("resource", fault, 1));
        const Answer answer = service.answer(call);
        EXPECT_EQ(answer.status, 304);
        EXPECT_TRUE(answer.body.empty() && answer.paddedTo == 0 && !answer.cut && !answer.goesOn) << fault;
    }
    call.headers = {{"If-None-Match", "2"}};
    EXPECT_EQ(service.answer(call).status, 200);
}

TEST_F(ServiceTest, ControlRefusesWhatItDoesNotKnowAndStrangers)
{
    const std::pair<const char*, const char*> bad[] = {
        {"/control/faults", "{}"}, {"/control/faults", R"({"endpoint": "search", "fault": "cut", "count": -1})"},
        {"/control/faults", "{"},  {"/control/search", R"({"maxage": 1})"},
        {"/control/bag", "7"},     {"/control/resources/bump", R"({"name": "Nothing"})"},
    };
    for (const auto& [target, body] : bad)
        EXPECT_EQ(service.answer(request("POST", target, body)).status, 400) << target << body;
    EXPECT_EQ(get("/control/log?endpoint=serch").status, 400);
    EXPECT_EQ(get("/control/reset").status, 404) << "changes come by POST";
    Request call = request("GET", "/control/status");
    call.peer = "192.0.2.1";
    EXPECT_EQ(service.answer(call).status, 403);
    call.peer = "::1";
    call.secure = true;
    EXPECT_EQ(service.answer(call).status, 404) << "over plain HTTP only";
}

TEST_F(ServiceTest, TheLogShowsRequestsButNoControlCallsAndNoSecrets)
{
    Request search = request("GET", "/search?q=weather&locale=de_CH");
    search.headers = {{"X-Quorvane-UserGuid", "G"}, {"authorization", "Bearer s3cret"}};
    (void)service.answer(search);
    (void)get("/bag");
    EXPECT_EQ(platform::toJson(json(get("/control/status"))["by_endpoint"]), R"({"bag":1,"search":1})");
    const Answer log = get("/control/log?endpoint=search");
    EXPECT_EQ(json(log)["requests"].count(), 1u);
    EXPECT_EQ(json(log)["requests"][0]["headers"]["X-Quorvane-UserGuid"], Value("G"));
    EXPECT_FALSE(log.body.contains("s3cret"));
    for (std::size_t i = 0; i < RequestLog::kKept; ++i) (void)get("/warm");
    EXPECT_EQ(json(get("/control/log"))["requests"].count(), RequestLog::kKept) << "bounded";
}

} // namespace
} // namespace devserver
