#include "platform/values/Json.h"
#include "tavrind/TavrinSubscriptionInfo.h"
#include "tavrind/TavrinSubscriptionManager.h"
#include "tests/support/AssemblyFixture.h"

namespace tavrin {
namespace {

TEST(SubscriptionInfo, ReadsPairsOrRefusesTheWholeText)
{
    const struct {
        std::string text;
        std::optional<Dictionary> pairs;
        const char* complaint;
    } cases[]{
        {"type=news,expires=3600", Dictionary{{"type", "news"}, {"expires", "3600"}}, nullptr},
        {"\t type = the news \r\n,\n expires\u00a0= 3600 ", Dictionary{{"type", "the news"}, {"expires", "3600"}},
         nullptr},
        {"a=b=c", Dictionary{{"a", "b=c"}}, nullptr},
        {"a==", Dictionary{{"a", "="}}, nullptr},
        {"", {}, nullptr},
        {"a=b,a=c", {}, "duplicate key a (full string: a=b,a=c)"},
        {"a=b,c", {}, "invalid key-value pair c (full string: a=b,c)"},
        {"a=b,", {}, "invalid key-value pair  (full string: a=b,)"},
        {",", {}, "invalid key-value pair"},
        {"=b", {}, "empty key or value"},
        {"a= ", {}, "empty key or value"},
        {"a=\xff\xfe,\x80=b", Dictionary{{"a", "\xff\xfe"}, {"\x80", "b"}}, nullptr},
        {"a=" + std::string(70'000, 'b'), {}, "more than 65536"},
    };
    for (const auto& c : cases) {
        platform::test::LogCapture log;
        EXPECT_EQ(TavrinSubscriptionInfo::dictionaryWithKeyValuePairListString(c.text), c.pairs) << c.text;
        EXPECT_EQ(log.count(c.complaint ? c.complaint : "Subscription"), c.complaint ? 1 : 0) << c.text;
    }
}

TEST(SubscriptionInfo, NeedsATypeAndExpiresSecondsFromNow)
{
    const platform::Date now = platform::dateFromSecondsSince1970(1'000'000);
    const struct {
        Dictionary dictionary;
        bool valid;
        std::optional<double> expires;
    } cases[]{
        {{{"type", "news"}, {"expires", "3600"}}, true, 1'003'600},
        {{{"type", "news"}, {"expires", 3600}}, true, 1'003'600},
        {{{"type", "news"}, {"expires", "-0.5"}}, true, 999'999.5},
        {{{"type", "news"}}, true, {}},
        {{{"type", "news"}, {"expires", "1e300"}}, true, 9.2e9},
        {{{"type", "news"}, {"expires", "3600s"}}, false, {}},
        {{{"type", "news"}, {"expires", ""}}, false, {}},
        {{{"type", "news"}, {"expires", "nan"}}, false, {}},
        {{{"type", "news"}, {"expires", Value()}}, false, {}},
        {{{"type", ""}}, false, {}},
        {{{"type", 3}}, false, {}},
        {{{"expires", 3600}}, false, {}},
    };
    for (const auto& c : cases) {
        const auto info = TavrinSubscriptionInfo::withDictionary(c.dictionary, now);
        ASSERT_EQ(info.has_value(), c.valid) << platform::toJson(c.dictionary);
        if (!info) continue;
        EXPECT_EQ(info->type(), "news");
        EXPECT_EQ(info->expirationDate().transform(platform::secondsSince1970), c.expires);
    }
    const auto info = TavrinSubscriptionInfo::withString("type=news, expires=10", now);
    EXPECT_FALSE(info->isExpired(now + 10s));
    EXPECT_TRUE(info->isExpired(now + 11s));
    EXPECT_FALSE(TavrinSubscriptionInfo::withString("expires=10", now));
}

struct SubscriptionManagerTest : test::AssemblyTest {
    SubscriptionManagerTest()
    {
        device.profile.current = {.storefront = "143459"};
        factory = TAVNetworkRequestFactory::make(assembly);
        manager = TavrinSubscriptionManager::make(assembly, factory);
        device.drain();
    }
    void changeProviders()
    {
        device.subscriptions.handler();
        device.drain();
    }
    std::string header() { return factory->context().subscriptionInfo; }

    static constexpr const char* kFuseOnly = R"([{"provider":"fuse","attribute":"premium","active":false}])";
    const Dictionary lists{{"subscriptionProviderDomainWhitelist", Value::Array{"d.example"}},
                           {"subscriptionProviderBundleIdentifierWhitelist", Value::Array{"a", "b"}},
                           {"subscriptionTTL", 60}};
    std::shared_ptr<TAVNetworkRequestFactory> factory;
    std::shared_ptr<TavrinSubscriptionManager> manager;
};

TEST_F(SubscriptionManagerTest, TheHeaderFollowsTheBagTheProvidersAndTheProfile)
{
    EXPECT_EQ(header(), "") << "no bag yet";
    changeProviders();
    EXPECT_EQ(header(), "");

    announce(lists);
    EXPECT_EQ(header(), kFuseOnly);
    EXPECT_EQ(device.subscriptions.asked.bundleIdentifiers, (std::vector<std::string>{"a", "b"}));
    EXPECT_EQ(device.subscriptions.asked.domains, std::vector<std::string>{"d.example"});
    EXPECT_EQ(device.subscriptions.asked.maximumExpiration, 60s);

    device.subscriptions.services = {{"daily", Dictionary{{"provider", "dai\x7fly"}}},
                                     {"fuse", Dictionary{{"provider", "an impostor"}}}};
    changeProviders();
    changeProfile({.storefront = "143441", .newsSubscribed = true});
    EXPECT_EQ(header(), R"([{"provider":"fuse","attribute":"premium","active":true},{"provider":"dai\u007fly"}])");
    EXPECT_EQ(manager->subscriptions().size(), 2u);
    EXPECT_EQ(factory->context().storeFrontIdentifier, "143441");

    announce(Dictionary{{"subscriptionProviderDomainWhitelist", Value::Array{"d.example"}}});
    EXPECT_EQ(header(), "") << "a list is missing";
    EXPECT_TRUE(manager->subscriptions().empty());
}

TEST_F(SubscriptionManagerTest, AFailureOfTheProvidersLeavesTheMakersOwn)
{
    EXPECT_EQ(factory->context().storeFrontIdentifier, "143459");
    device.subscriptions.services = {{"daily", Value::dictionaryOf({{"provider", "daily"}})}};
    announce(lists);
    EXPECT_NE(header(), kFuseOnly);
    device.subscriptions.services = std::unexpected(platform::Error::posix(EIO));
    changeProviders();
    EXPECT_EQ(header(), kFuseOnly);
    EXPECT_EQ(log.count("Error fetching third party subscription information from daemon: "), 1);
    device.notifications.post({.name = TAVBagChangeNotification, .userInfo = {{"bagError", platform::Error()}}});
    device.drain();
    EXPECT_EQ(header(), kFuseOnly);
}

TEST_F(SubscriptionManagerTest, TheHeaderHoldsWholeSubscriptionsUpToItsLimit)
{
    const std::string fuse = kFuseOnly;
    const auto subscription = [](const char* provider, std::size_t size) {
        return Value::dictionaryOf({{"provider", provider}, {"text", std::string(size, 'x')}});
    };
    const std::size_t rest = 4096 - fuse.size() - std::string(R"(,{"provider":"a","text":""})").size();
    device.subscriptions.services = {{"a", subscription("a", rest)}};
    announce(lists);
    EXPECT_EQ(header().size(), 4096u);
    EXPECT_EQ(log.count("subscription with"), 0);
    device.subscriptions.services = {
        {"a", subscription("a", 4090)}, {"b", subscription("b", 3000)}, {"c", subscription("c", 1)}};
    changeProviders();
    EXPECT_EQ(log.count("subscription with \"a\" is not sent"), 1);
    const auto sent = platform::parseJson(header()).value_or(Value());
    EXPECT_EQ(sent.count(), 3u);
    EXPECT_EQ(sent[0]["provider"], Value("fuse"));
    EXPECT_EQ(sent[2]["provider"], Value("c"));
    EXPECT_EQ(manager->subscriptions().size(), 4u);
}

} // namespace
} // namespace tavrin
