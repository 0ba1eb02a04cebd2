#include "CoreTavrin/TAVBag.h"

#include <fstream>

#include <gtest/gtest.h>

#include "platform/values/Json.h"

namespace tavrin {
namespace {

TAVBag bagOf(std::string_view json, std::string userAgent = "Vistrel/4")
{
    return TAVBag(platform::parseJson(json).value(), std::move(userAgent));
}

TEST(TAVBag, FallsBackToDefaults)
{
    for (const char* empty : {"{}", "[]", "7"}) {
        const TAVBag none = bagOf(empty);
        EXPECT_TRUE(none.isEnabled() && none.feedbackEnabled());
        EXPECT_EQ(none.minimumQueryLength(), 1u);
        EXPECT_FALSE(none.searchURL() || none.timeoutIntervalForRequest() || none.urlForIdentifier("x"));
        EXPECT_TRUE(none.version().empty() && none.problems().empty());
    }
}

TEST(TAVBag, AClientSeesItsOwnView)
{
    constexpr const char* kJson = R"({"isEnabled": true, "clients": {"news": {"isEnabled": false}, "kivo": 3}})";
    EXPECT_FALSE(bagOf(kJson, "News/1").isEnabled());
    EXPECT_TRUE(bagOf(kJson, "Vistrel/1").isEnabled());
    EXPECT_TRUE(bagOf(kJson, "vistrel news").isEnabled()) << "the first name in list order applies";
    EXPECT_TRUE(bagOf(kJson, "kivo").isEnabled());
    EXPECT_TRUE(bagOf(kJson, "").isEnabled());
}

// Every key with every wrong type reads as if it were missing, and is named once.
TEST(TAVBag, WrongTypesReadAsDefaultsAndAreNamed)
{
    for (const TAVBag::KnownKey& known : TAVBag::knownKeys()) {
        const std::string key(known.name);
        unsigned complaints = 0;
        for (const char* value : {"true", "-1", "1e99", "\"ftp://x/\"", "\"\"", "[]", "{}"}) {
            const TAVBag bag = bagOf("{\"" + key + "\": " + value + ", \"clients2\": 1}", "news/1");
            const auto problems = bag.problems();
            ASSERT_LE(problems.size(), 1u);
            complaints += problems.size();
            if (problems.empty()) continue;
            EXPECT_TRUE(problems.front().starts_with(key + ": expected")) << problems.front();
            EXPECT_TRUE(bag.isEnabled() && bag.feedbackEnabled() && !bag.searchURL() && !bag.resourceURL(key));
            EXPECT_EQ(bag.minimumQueryLength(), 1u);
            EXPECT_EQ(bag.subscriptionTTL(), 86400);
        }
        EXPECT_GE(complaints, 3u) << key;
    }
    EXPECT_EQ(bagOf(R"({"clients": {"news": {"isEnabled": 3}}})").problems().front(),
              "clients.news.isEnabled: expected true or false");
}

TEST(TAVBag, EveryKeyIsDocumented)
{
    std::ifstream file(SOURCE_DIR "/docs/bag.md");
    const std::string page(std::istreambuf_iterator<char>(file), {});
    for (const TAVBag::KnownKey& key : TAVBag::knownKeys())
        EXPECT_TRUE(page.contains("`" + std::string(key.name) + "`")) << key.name;
}

TEST(TAVBag, CrossesIpcWhole)
{
    const TAVBag bag = bagOf(R"({"version": "7", "clients": {"news": {"isEnabled": false}}})", "news/2");
    const auto back = TAVBagRecord(bag).bag();
    ASSERT_TRUE(back);
    EXPECT_EQ(back->rawBag(), bag.rawBag());
    EXPECT_FALSE(back->isEnabled());
    TAVBagRecord broken;
    broken.rawBag = platform::Bytes("[1]");
    EXPECT_FALSE(broken.bag());
}

} // namespace
} // namespace tavrin
