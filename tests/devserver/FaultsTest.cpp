#include "tools/devserver/Faults.h"

#include <gtest/gtest.h>

#include "platform/values/Error.h"
#include "platform/values/Json.h"

namespace devserver {
namespace {

using Kind = Fault::Kind;

TEST(Faults, ReadsFaults)
{
    const std::pair<const char*, std::vector<Fault>> good[] = {
        {"delay:0", {{Kind::Delay, 0}}},
        {"delay:200,status:503", {{Kind::Delay, 200}, {Kind::Status, 503}}},
        {"cut", {{Kind::Cut, 0}}},
        {"huge:1073741824", {{Kind::Huge, 1u << 30}}},
        {"notjson,cut,hang", {{Kind::NotJson, 0}, {Kind::Cut, 0}, {Kind::Hang, 0}}},
    };
    for (const auto& [text, expected] : good) {
        const auto faults = parseFaults(text);
        ASSERT_TRUE(faults) << text << ": " << faults.error();
        EXPECT_EQ(*faults, expected) << text;
    }
    for (const char* bad : {"", ",", "cut,", "dlay:1", "delay", "delay:", "delay:-1", "delay:1s", "delay:600001",
                            "status:99", "status:600", "cut:1", "huge:0", "huge:1073741825",
                            "deep:99999999999999999999", "delay: 1", "cut,cut,cut,cut,cut,cut,cut,cut,cut"}) {
        const auto faults = parseFaults(bad);
        ASSERT_FALSE(faults) << bad;
        EXPECT_FALSE(faults.error().empty());
    }
    EXPECT_NE(parseFaults("dlay:1").error().find("delay:MS"), std::string::npos) << "the error says what is allowed";
}

TEST(Faults, CountedRulesEndAndOthersStay)
{
    Faults faults;
    ASSERT_TRUE(faults.add("search", "status:500", 2));
    ASSERT_TRUE(faults.add("*", "cut", 0));
    EXPECT_EQ(faults.take("search"), (std::vector<Fault>{{Kind::Status, 500}}));
    EXPECT_EQ(faults.take("bag"), (std::vector<Fault>{{Kind::Cut, 0}}))
        << "another endpoint takes nothing from the count";
    EXPECT_EQ(faults.take("search"), (std::vector<Fault>{{Kind::Status, 500}}));
    EXPECT_EQ(faults.take("search"), (std::vector<Fault>{{Kind::Cut, 0}}));
    EXPECT_EQ(faults.count(), 1u);
    faults.clear();
    EXPECT_TRUE(faults.take("search").empty());
}

Answer spoilt(std::string_view fault, std::string body)
{
    Answer answer{.body = std::move(body)};
    Request request;
    request.path = "/search";
    request.query = "q=a%20b";
    request.secure = true;
    request.headers = {{"Host", "127.0.0.1:8443"}};
    const auto faults = parseFaults(fault);
    for (const Fault& f : faults.value()) spoil(answer, f, request);
    return answer;
}

TEST(Faults, SpoilsAnswers)
{
    EXPECT_EQ(spoilt("status:503", "[]").status, 503);
    EXPECT_EQ(spoilt("status:206", "[1]").body, "[1]");
    EXPECT_EQ(spoilt("status:204", "[1]").body, "");
    EXPECT_EQ(spoilt("status:304", "[1]").body, "");
    EXPECT_TRUE(spoilt("cut", "[]").cut);
    EXPECT_FALSE(platform::parseJson(spoilt("notjson", "[]").body));
    EXPECT_EQ(spoilt("wrongtype", R"({"a":1})").body, R"([{"a":1}])");
    EXPECT_EQ(spoilt("wrongtype", "[1]").body, R"({"results":[1]})");
    EXPECT_EQ(spoilt("wrongvalues", R"({"a":1,"b":["x",{"c":null}],"d":true})").body,
              R"({"a":"seven","b":[7,{"c":false}],"d":"seven"})");
    EXPECT_EQ(spoilt("deep:3", "[]").body, "[[[]]]");
    EXPECT_EQ(spoilt("huge:4096", "[]").paddedTo, 4096u);
    const Answer redirect = spoilt("redirect", "[]");
    EXPECT_EQ(redirect.status, 302);
    EXPECT_EQ(*findHeader(redirect.headers, "location"), "/search?q=a%20b") << "to itself";
    EXPECT_EQ(*findHeader(spoilt("elsewhere", "[]").headers, "location"), "https://localhost:8443/search?q=a%20b");
    EXPECT_EQ(spoilt("empty", "[]").body, "");
    EXPECT_EQ(spoilt("endless", "[]").body, "[]");
    EXPECT_EQ(*findHeader(spoilt("status:429,retryafter:86400", "[]").headers, "Retry-After"), "86400");
    const Answer bomb = spoilt("gzipbomb:1000000", "[]");
    EXPECT_LT(bomb.body.size(), 4096u);
    EXPECT_EQ(*findHeader(bomb.headers, "Content-Encoding"), "gzip");
}

} // namespace
} // namespace devserver
