#include "tools/devserver/Bag.h"

#include <set>

#include <gtest/gtest.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tools/devserver/Resources.h"

namespace devserver {
namespace {

using platform::Value;

Value json(std::string_view text)
{
    return platform::parseJson(text).value();
}

TEST(Bag, OverridesAddReplaceAndRemoveKeys)
{
    Bag bag("https://h");
    ASSERT_TRUE(bag.merge(json(R"({"isEnabled": false, "warmURL": null, "clients": {"news": {}}})")));
    ASSERT_TRUE(bag.merge(json(R"({"minimumQueryLength": "two"})"))) << "wrong types are what tests ask for";
    EXPECT_EQ(bag.document()["isEnabled"], Value(false));
    EXPECT_FALSE(bag.document().asDictionary()->contains("warmURL"));
    EXPECT_TRUE(bag.document()["clients"]["news"].asDictionary());
    EXPECT_EQ(bag.document()["minimumQueryLength"], Value("two"));
    EXPECT_FALSE(bag.merge(json("[1]")));
    EXPECT_FALSE(bag.merge(Value::dictionaryOf({{"a", std::string(300'000, 'x')}})));
    EXPECT_FALSE(bag.document().asDictionary()->contains("a")) << "refused whole";
    bag.reset();
    EXPECT_EQ(bag.document(), Bag("https://h").document());
}

TEST(Bag, TheVersionOnlyCountsUp)
{
    Bag bag("https://h");
    EXPECT_EQ(bag.bump(), 2);
    bag.reset();
    EXPECT_EQ(bag.document()["version"], Value(2));
    ASSERT_TRUE(bag.merge(json(R"({"version": 40})")));
    EXPECT_EQ(bag.bump(), 41);
    ASSERT_TRUE(bag.merge(json(R"({"version": "x"})")));
    EXPECT_EQ(bag.document()["version"], Value("x"));
    ASSERT_TRUE(bag.merge(json(R"({"version": 50})")));
    EXPECT_EQ(bag.document()["version"], Value(50)) << "a number ends the override";
}

TEST(Resources, TheVersionAtHandIsNotSentAgain)
{
    Request request;
    request.query = "version=3";
    const Answer whole = resourceAnswer("https://h", "TAVQIFeatures", request);
    EXPECT_EQ(whole.status, 200);
    EXPECT_FALSE(whole.body.empty());
    for (const char* atHand : {"3", "\"3\""}) {
        request.headers = {{"if-none-match", atHand}};
        const Answer same = resourceAnswer("https://h", "TAVQIFeatures", request);
        EXPECT_EQ(same.status, 304);
        EXPECT_EQ(same.body, "");
    }
    request.headers = {{"If-None-Match", "2"}};
    EXPECT_EQ(resourceAnswer("https://h", "TAVQIFeatures", request).status, 200);
    for (const char* wrong : {"version=a/b", "version=", "version=12345"}) {
        request.query = wrong;
        EXPECT_EQ(resourceAnswer("https://h", "TAVQIFeatures", request).status, 400) << wrong;
    }
    for (const char* path : {"", "Nothing", "hints/1/TAVQIFeatures", "hints/1", "hints//TAVLookupHintsWeekly"})
        EXPECT_EQ(resourceAnswer("https://h", path, {}).status, 404) << path;
}

TEST(Resources, TheAllowListIsJsonInsideJson)
{
    const Answer answer = resourceAnswer("https://h", "TAVInstalledAppWhitelist", {});
    const Value outer = json(answer.body);
    EXPECT_EQ(outer["compression"], Value("RLE"));
    EXPECT_EQ(outer["encoding"], Value("bitmap"));
    const Value inner = json(*outer["apps"].asString());
    EXPECT_EQ(inner["version"].asString()->size() % 2, 0u);
    std::set<std::int64_t> identifiers;
    for (const auto& [name, entries] : *inner["apps"].asDictionary())
        EXPECT_TRUE(identifiers.insert(entries[0]["encoding_id"].asInt().value()).second) << name;
}

} // namespace
} // namespace devserver
