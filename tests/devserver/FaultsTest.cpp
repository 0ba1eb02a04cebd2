#include "tools/devserver/Faults.h"

#include <gmock/gmock.h>

namespace devserver {
namespace {

using Kind = Fault::Kind;

TEST(Faults, ReadsFaultsAndSaysWhatIsAllowed)
{
    EXPECT_EQ(parseFaults("delay:200,status:503,cut"),
              (std::vector<Fault>{{Kind::Delay, 200}, {Kind::Status, 503}, {Kind::Cut, 0}}));
    for (const char* bad : {"", ",", "cut,", "dlay:1", "delay", "delay:", "delay:-1", "delay:1s", "delay:600001",
                            "status:99", "status:600", "cut:1", "huge:0", "huge:1073741825",
                            "deep:99999999999999999999", "delay: 1", "cut,cut,cut,cut,cut,cut,cut,cut,cut"})
        EXPECT_FALSE(parseFaults(bad)) << bad;
    EXPECT_THAT(parseFaults("dlay:1").error(), testing::HasSubstr("delay:MS"));
}

TEST(Faults, CountedRulesEndAndOthersStay)
{
    Faults faults;
    ASSERT_TRUE(faults.add("search", "status:500", 1));
    ASSERT_TRUE(faults.add("*", "cut", 0));
    EXPECT_EQ(faults.take("bag"), (std::vector<Fault>{{Kind::Cut, 0}})) << "takes nothing from the count of another";
    EXPECT_EQ(faults.take("search"), (std::vector<Fault>{{Kind::Status, 500}}));
    EXPECT_EQ(faults.take("search"), (std::vector<Fault>{{Kind::Cut, 0}}));
    EXPECT_EQ(faults.count(), 1u);
}

TEST(Faults, SpoilAnswers)
{
    const auto spoilt = [](const char* fault, std::string body) {
        Answer answer{.body = std::move(body)};
        const Request request{
            .path = "/search", .query = "q=a%20b", .headers = {{"Host", "127.0.0.1:8443"}}, .secure = true};
        const auto faults = parseFaults(fault);
        for (const Fault& each : faults.value()) spoil(answer, each, request);
        return answer;
    };
    const struct {
        const char *fault, *body, *spoilt;
    } cases[]{
        {"status:206", "[1]", "[1]"},
        {"status:204", "[1]", ""},
        {"status:304", "[1]", ""},
        {"wrongtype", R"({"a":1})", R"([{"a":1}])"},
        {"wrongtype", "[1]", R"({"results":[1]})"},
        {"wrongvalues", R"({"a":1,"b":["x",{"c":null}],"d":true})", R"({"a":"seven","b":[7,{"c":false}],"d":"seven"})"},
        {"deep:3", "[]", "[[[]]]"},
        {"empty", "[]", ""},
    };
    for (const auto& c : cases) EXPECT_EQ(spoilt(c.fault, c.body).body, c.spoilt) << c.fault;
    EXPECT_EQ(*findHeader(spoilt("redirect", "[]").headers, "location"), "/search?q=a%20b") << "to itself";
    EXPECT_EQ(*findHeader(spoilt("elsewhere", "[]").headers, "location"), "https://localhost:8443/search?q=a%20b");
    EXPECT_EQ(*findHeader(spoilt("status:429,retryafter:86400", "[]").headers, "Retry-After"), "86400");
    EXPECT_LT(spoilt("gzipbomb:1000000", "[]").body.size(), 4096u);
}

} // namespace
} // namespace devserver
