#include <gtest/gtest.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/values/Json.h"
#include "tavrind/Assembly.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TavrinBagController.h"
#include "tests/support/TestDevice.h"

namespace tavrin {
namespace {

using platform::Url;
using platform::UrlComponents;
using platform::UrlRequest;

struct RequestFactoryTest : testing::Test {
    RequestFactoryTest()
    {
        device.locale.context = {.identifier = "de_CH",
                                 .systemLanguage = "de",
                                 .preferredLanguages = {"de-CH", "en"},
                                 .calendar = "gregorian",
                                 .is24Hour = true,
                                 .measurementSystem = "Metric",
                                 .region = "CH"};
        device.profile.current = {.storefront = "143459",
                                  .managedAccount = true,
                                  .geoMetadata = "meta",
                                  .geoEnvironment = "prod",
                                  .geoSessionId = "session-1"};
        factory = TAVNetworkRequestFactory::make(assembly);
        assembly.requestFactory = factory;
        device.drain();
    }

    /// Gives the factory all that it may know.
    void knowEverything()
    {
        device.notifications.post(
            {.name = TAVBagChangeNotification, .userInfo = {{"bag", std::make_shared<const TAVBag>(bag)}}});
        device.drain();
        device.location.moveTo(platform::Location{47.375, 8.545, "wifi"});
        factory->didUpdateStorefrontIdentifier("143459");
        factory->didUpdateSubscriptionDictionaries({platform::Value::dictionaryOf({{"provider", "fuse"}})});
        device.drain();
    }

    static TAVBag bagOf(std::string_view json) { return TAVBag(platform::parseJson(json).value(), "Vistrel/4"); }

    platform::test::TestDevice device;
    Assembly assembly{device.device};
    std::shared_ptr<TAVNetworkRequestFactory> factory;
    TAVBag bag = bagOf(R"({"searchURL": "https://s.example/search", "flightURL": "https://s.example/flight",
        "sendGeoEnvironmentHeader": true, "supportedGeoLocationSources": ["wifi"]})");
    platform::Uuid guid = *platform::Uuid::parse("11111111-2222-4333-8444-555555555555");
};

/// A request's items and headers, as the kinds' table names them: "q=…" for an item, "Name: …" for a header.
std::set<std::string> contents(const UrlRequest& request)
{
    std::set<std::string> all;
    for (const auto& item : UrlComponents(request.url).queryItems())
        all.insert(item.name + "=" + item.value.value_or("<none>"));
    for (const auto& [name, value] : request.headers) all.insert(name + ": " + value);
    return all;
}

// Every recipe against the table: a row names the kinds that have it, by letter.
TEST_F(RequestFactoryTest, EveryKindCarriesItsColumnOfTheTable)
{
    device.userDefaults.set("TAVDebugParameters", "debug=1");
    factory = TAVNetworkRequestFactory::make(assembly);
    assembly.requestFactory = factory;
    device.drain();
    knowEverything();

    const auto controller = TavrinBagController::make(assembly);
    const auto search = TAVSearchRequest::searchRequestWithString("weat", StartSearchTrigger::Suggestion);
    TAVZeroKeywordRequest zeroKeyword;
    TAVMoreResultsRequest more;
    TAVLookupRequest lookup;
    TAVCardRequest card;
    TAVFlightSearchRequest flight;
    for (TAVRequest* request :
         std::initializer_list<TAVRequest*>{search.get(), &zeroKeyword, &more, &lookup, &card, &flight}) {
        request->scale = 2;
        request->keyboardInputMode = "de_CH@sw";
        request->topics = platform::Value::Array{"sports"};
        request->queryItems = {std::make_shared<TAVQueryItem>("own", "1")};
    }
    more.moreResultsURL = card.cardURL = Url::parse("https://m.example/x");
    lookup.queryString = "The quick brown fox jumps over the lazy dog and runs away through the forest";
    lookup.clientContext = "mail";
    lookup.hintDomain = "places";
    lookup.selectionType = LookupSelectionType::HintTap;
    flight.queryString = "AB12";
    factory->setPerformedSearch();
    device.drain();

    const std::map<char, UrlRequest> requests{
        {'b', factory->bagFetchRequest(*controller, "tavrind/1", "7")},
        {'a', factory->bagCacheRequest(*controller, "tavrind/1", "7")},
        {'s', *factory->searchRequest(*search, bag, guid)},
        {'z', *factory->zeroKeywordRequest(zeroKeyword, bag, guid)},
        {'m', *factory->moreResultsRequest(more, &bag, bag.userAgent(), guid)},
        {'l', *factory->lookupRequest(lookup, bag, guid)},
        {'c', *factory->cardRequest(card, bag, guid)},
        {'f', *factory->flightRequest(flight, bag, guid)},
        {'d', factory->fileDownloadRequest(*Url::parse("https://r.example/f"), "3", true)},
        {'u', factory->flusherUploadRequest(*Url::parse("https://u.example/up"), std::chrono::seconds(300), "abc")},
        {'w', factory->warmRequest(*Url::parse("https://s.example/warm"))},
    };
    const std::pair<const char*, const char*> table[]{
        {"debug=1", "baszmlcfu"},
        {"own=1", "szmlcf"},
        {"q=weat", "s"},
        {"qtype=suggested", "s"},
        {"qtype=zkw", "z"},
        {"q=The quick brown fox jumps over the lazy dog and runs away through the forest", "l"},
        {"q=AB12", "f"},
        {"key=walrus7351", "bszmlcfdu"},
        {"version=7", "ba"},
        {"agent=tavrind/1", "a"},
        {"locale=de_CH", "baszmlcfu"},
        {"esl=de", "baszmlcf"},
        {"cc=CH", "baszlcfu"},
        {"X-Quorvane-Languages: [\"de-CH\",\"en\"]", "bszmlcfu"},
        {"card=1", "s"},
        {"X-Quorvane-TopTopics: [\"sports\"]", "s"},
        {"kb_ime=de_CH@sw", "szlf"},
        {"calendar=gregorian", "sz"},
        {"time_zone=Europe/Zurich", "sz"},
        {"units=Metric", "sz"},
        {"24h=1", "s"},
        {"X-Quorvane-GeoMetadata: meta", "szlcf"},
        {"latlng=47.375000,8.545000", "szmlcf"},
        {"geosrc=wifi", "szmlcf"},
        {"mode=managed", "szmlf"},
        {"storefront=143459", "szmlcf"},
        {"X-Quorvane-Subscriptions: [{\"provider\":\"fuse\"}]", "szmlcf"},
        {"X-Quorvane-UserGuid: 11111111-2222-4333-8444-555555555555", "szmlcf"},
        {"User-Agent: Vistrel/4", "szmlcf"},
        {"User-Agent: tavrind/1", "b"},
        {"User-Agent: Vistrel/1", "d"},
        {"User-Agent: tavrind/0.1.0", "u"},
        {"X-Quorvane-UI-Scale: 2.0", "szmlcf"},
        {"X-Quorvane-GeoEnvironment: prod", "szc"},
        {"X-Quorvane-GeoSession: session-1", "szlcf"},
        {"context=mail", "l"},
        {"ldomain=places", "l"},
        {"ltype=hint", "l"},
        {"qlang=en", "l"},
        {"X-Quorvane-FuzzedLatLong: 47.375000,8.545000", "d"},
        {"If-None-Match: 3", "d"},
        {"X-Quorvane-Digest: abc", "u"},
        {"Content-Encoding: deflate", "u"},
    };
    for (const auto& [kind, request] : requests) {
        std::set<std::string> expected;
        for (const auto& [entry, kinds] : table)
            if (std::string_view(kinds).contains(kind)) expected.insert(entry);
        EXPECT_EQ(contents(request), expected) << "request kind " << kind;
    }
    EXPECT_EQ(requests.at('u').method, "POST");
    EXPECT_EQ(requests.at('u').timeout, std::chrono::seconds(300));
    EXPECT_EQ(requests.at('b').cachePolicy, UrlRequest::CachePolicy::ReloadIgnoringCache);
    EXPECT_EQ(requests.at('w').cachePolicy, UrlRequest::CachePolicy::ReloadIgnoringCache);
}

TEST_F(RequestFactoryTest, TheFieldMaskHidesPlaceAndApplications)
{
    knowEverything();
    TAVSearchRequest search;
    TAVZeroKeywordRequest zeroKeyword;
    TAVMoreResultsRequest more;
    more.moreResultsURL = Url::parse("https://m.example/x");
    TAVCardRequest card;
    card.cardURL = more.moreResultsURL;
    const auto masked = kFieldMaskNoLocation;
    for (const auto& request : {factory->searchRequest(search, bag, guid, masked),
                                factory->zeroKeywordRequest(zeroKeyword, bag, guid, masked),
                                factory->moreResultsRequest(more, &bag, bag.userAgent(), guid, masked)}) {
        EXPECT_FALSE(request->url.queryValue("latlng") || request->url.queryValue("geosrc"));
        EXPECT_FALSE(request->headers.find("X-Quorvane-Whitelisted-App-Signature"));
    }
    EXPECT_TRUE(factory->cardRequest(card, bag, guid)->url.queryValue("latlng"));
}

TEST_F(RequestFactoryTest, TheEndpointsOwnItemsAndTheQuerysItemsWin)
{
    const TAVBag own = bagOf(R"({"searchURL": "https://s.example/search?key=theirs&locale=xx"})");
    TAVSearchRequest search;
    search.queryString = "typed";
    search.queryItems = {std::make_shared<TAVQueryItem>("q", "forced"), nullptr};
    const auto request = factory->searchRequest(search, own, guid);
    EXPECT_EQ(request->url.queryValue("key"), "theirs");
    EXPECT_EQ(request->url.queryValue("locale"), "xx");
    EXPECT_EQ(request->url.queryValue("q"), "forced");
    EXPECT_FALSE(request->url.queryValue("qtype"));
    EXPECT_FALSE(request->timeout) << "left to the session";
    EXPECT_FALSE(request->headers.find("X-Quorvane-GeoEnvironment"));

    const TAVBag timed = bagOf(R"({"searchURL": "https://s.example/", "timeoutIntervalForRequest": 7})");
    EXPECT_EQ(factory->searchRequest(search, timed, guid)->timeout, std::chrono::seconds(7));
    EXPECT_EQ(factory->searchRequest(search, timed, guid, 0, std::chrono::seconds(2))->timeout,
              std::chrono::seconds(2));
}

TEST_F(RequestFactoryTest, WithoutUrlThereIsNoRequest)
{
    const TAVBag empty = bagOf("{}");
    EXPECT_FALSE(factory->searchRequest(TAVSearchRequest(), empty, guid));
    EXPECT_FALSE(factory->zeroKeywordRequest(TAVZeroKeywordRequest(), empty, guid));
    EXPECT_FALSE(factory->lookupRequest(TAVLookupRequest(), empty, guid));
    EXPECT_FALSE(factory->flightRequest(TAVFlightSearchRequest(), empty, guid));
    EXPECT_FALSE(factory->cardRequest(TAVCardRequest(), empty, guid));
    EXPECT_FALSE(factory->moreResultsRequest(TAVMoreResultsRequest(), nullptr, {}, guid));
}

TEST_F(RequestFactoryTest, ALookupInNoLanguageSaysNone)
{
    TAVLookupRequest lookup;
    lookup.queryString = "42";
    lookup.selectionType = LookupSelectionType::Explicit;
    const auto request = factory->lookupRequest(lookup, bag, guid);
    EXPECT_FALSE(request->url.queryValue("qlang") || request->url.queryValue("lctxlang"));
    EXPECT_EQ(request->url.queryValue("ltype"), "explicit");
    EXPECT_TRUE(request->url.string().contains("&context&")) << request->url.string();
}

TEST_F(RequestFactoryTest, OnlyAllowedSourcesTellThePlace)
{
    device.location.moveTo(platform::Location{47.375, 8.545, "wifi"});
    device.drain();
    EXPECT_TRUE(factory->context().geoLocationLatLng.empty()) << "no bag has allowed a source";
    knowEverything();
    EXPECT_EQ(device.location.allowed, std::set<std::string>{"wifi"});
    device.location.moveTo(platform::Location{1, 2, "gps"});
    device.drain();
    EXPECT_TRUE(factory->context().geoLocationLatLng.empty());

    TAVMoreResultsRequest more;
    more.moreResultsURL = Url::parse("https://m.example/x?latlng=1,2");
    const int before = device.location.updatesRequested;
    const auto withoutBag = factory->moreResultsRequest(more, nullptr, "agent/1", guid);
    EXPECT_EQ(*withoutBag->headers.find("User-Agent"), "agent/1");
    EXPECT_EQ(device.location.updatesRequested, before) << "its URL says where the search was made";
    (void)factory->searchRequest(TAVSearchRequest(), bag, guid);
    EXPECT_EQ(device.location.updatesRequested, before + 1);
}

TEST_F(RequestFactoryTest, ChangesThatConcernTheBagAreTold)
{
    int told = 0;
    const auto token = device.notifications.observe(TAVBagRefreshRequired, [&](const auto&) { ++told; }, factory.get());
    device.drain();
    EXPECT_EQ(told, 0) << "not for the first computation";

    device.profile.change({.storefront = "1"}); // the country stays the locale's
    device.drain();
    EXPECT_EQ(told, 0);
    device.profile.change({.countryCode = "CN"});
    device.drain();
    EXPECT_EQ(told, 1);
    device.locale.handler(platform::LocaleSource::Change::TimeZone);
    device.drain();
    EXPECT_EQ(told, 1);
    device.locale.context.identifier = "fr_CH";
    device.locale.handler(platform::LocaleSource::Change::Locale);
    device.drain();
    EXPECT_EQ(told, 2);
    EXPECT_EQ(factory->context().localeIdentifier, "fr_CH");
}

TEST_F(RequestFactoryTest, MalformedDebugParametersAreLoggedAndLeftOut)
{
    platform::test::LogCapture log;
    device.userDefaults.set("TAVDebugParameters", "a=1&b&=c&d=&e=f=g&&h=2");
    const auto debugged = TAVNetworkRequestFactory::make(assembly);
    device.drain();
    EXPECT_EQ(debugged->context().debuggingQueryItems, (std::vector<platform::QueryItem>{{"a", "1"}, {"h", "2"}}));
    EXPECT_EQ(log.count("invalid query components: "), 5);
}

} // namespace
} // namespace tavrin
