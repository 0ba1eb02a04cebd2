#include "CoreTavrin/TAVRequest.h"
#include "platform/values/Json.h"
#include "tavrind/AppWhitelistController.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/TavrinUserGUIDController.h"
#include "tests/support/AssemblyFixture.h"

namespace tavrin {
namespace {

using platform::UrlComponents;
using platform::UrlRequest;

struct RequestFactoryTest : test::AssemblyTest {
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
        makeFactory();
    }

    void makeFactory()
    {
        assembly.requestFactory = factory = TAVNetworkRequestFactory::make(assembly);
        device.drain();
    }
    /// Gives a factory all that it may know.
    void knowEverything()
    {
        device.userDefaults.set("TAVDebugParameters", "debug=1");
        makeFactory();
        announce(bag.rawBag());
        moveTo(kZurich);
        factory->didUpdateStorefrontIdentifier("143459");
        factory->didUpdateSubscriptionDictionaries({Value::dictionaryOf({{"provider", "fuse"}})});
        device.userDefaults.set("TAVAppWhitelistSignature", "c2lnbg==");
        assembly.appWhitelistController = std::make_shared<AppWhitelistController>(assembly);
        device.drain();
    }

    [[nodiscard]] ClientRequest of(const TAVRequest& request) const
    {
        return {.request = request, .bag = &bag, .userGuid = guid, .userAgent = "Vistrel/4"};
    }
    static TAVBag bagOf(std::string_view json) { return TAVBag(platform::parseJson(json).value(), "Vistrel/4"); }

    static const inline platform::Location kZurich{47.375, 8.545, "wifi"};
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

TEST_F(RequestFactoryTest, APreviewSaysWhereEachPartComesFrom)
{
    knowEverything();
    bag = bagOf(R"({"searchURL": "https://s.example/search?tier=2&units=Metric"})");
    const auto search = TAVSearchRequest::searchRequestWithString("weat", StartSearchTrigger::Suggestion);
    search->scale = 2;
    search->queryItems = {std::make_shared<TAVQueryItem>("own", "1")};
    RequestOrigins origins;
    ClientRequest client = of(*search);
    const UrlRequest sent = *factory->searchRequest(client);
    const int updates = device.location.updatesRequested;
    client.origins = &origins;
    EXPECT_EQ(contents(*factory->searchRequest(client)), contents(sent)) << "the preview is the request";
    EXPECT_EQ(device.location.updatesRequested, updates) << "it asks for no location";

    const std::pair<const char*, std::vector<std::string>> parts[]{
        {"bag", {"tier", "units"}},
        {"client", {"User-Agent"}},
        {"default", {"qtype", "key", "card"}},
        {"device", {"locale", "latlng", "X-Quorvane-UserGuid"}},
        {"settings", {"debug"}},
        {"user", {"q", "own", "X-Quorvane-UI-Scale"}},
    };
    for (const auto& [from, names] : parts) {
        for (const std::string& name : names) {
            const auto& known = name.contains('-') ? origins.headers : origins.items;
            const auto found = known.find(name);
            EXPECT_EQ(found == known.end() ? "" : found->second, from) << name;
        }
    }
    for (const auto& item : UrlComponents(sent.url).queryItems())
        EXPECT_TRUE(origins.items.contains(item.name)) << item.name;
    for (const auto& [name, value] : sent.headers) EXPECT_TRUE(origins.headers.contains(name)) << name;
}

// Every recipe against the table: a row names the kinds that have it, by letter. The field mask hides the place and the
// applications of three kinds.
TEST_F(RequestFactoryTest, EveryKindCarriesItsColumnOfTheTable)
{
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
        request->topics = Value::Array{"sports"};
        request->queryItems = {std::make_shared<TAVQueryItem>("own", "1")};
    }
    more.moreResultsURL = card.cardURL = Url::parse("https://m.example/x");
    lookup.queryString = "The quick brown fox jumps over the lazy dog and runs away through the forest";
    lookup.queryContext = "Der schnelle braune Fuchs springt über den faulen Hund und läuft durch den Wald davon";
    lookup.clientContext = "mail";
    lookup.hintDomain = "places";
    lookup.selectionType = LookupSelectionType::HintTap;
    flight.queryString = "AB12";
    performSearch();

    const auto clientRequests = [&](unsigned mask) {
        const auto with = [&](const TAVRequest& request) {
            ClientRequest client = of(request);
            client.fieldMask = mask;
            return client;
        };
        return std::map<char, UrlRequest>{
            {'s', *factory->searchRequest(with(*search))},   {'z', *factory->zeroKeywordRequest(with(zeroKeyword))},
            {'m', *factory->moreResultsRequest(with(more))}, {'l', *factory->lookupRequest(with(lookup))},
            {'c', *factory->cardRequest(with(card))},        {'f', *factory->flightRequest(with(flight))}};
    };
    std::map<char, UrlRequest> requests{
        {'b', factory->bagFetchRequest(*controller, "tavrind/1", "7")},
        {'a', factory->bagCacheRequest(*controller, "tavrind/1", "7")},
        {'d', factory->fileDownloadRequest(*Url::parse("https://r.example/f"), "3", true)},
        {'u', factory->flusherUploadRequest(*Url::parse("https://u.example/up"), std::chrono::seconds(300), "abc")},
        {'w', factory->warmRequest(*Url::parse("https://s.example/warm"))},
    };
    const std::pair<std::string, const char*> table[]{
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
        {"X-Quorvane-Whitelisted-App-Signature: c2lnbg==", "smlcf"},
        {"mode=managed", "szmlf"},
        {"storefront=143459", "szmlcf"},
        {"X-Quorvane-Subscriptions: [{\"provider\":\"fuse\"}]", "szmlcf"},
        {"X-Quorvane-UserGuid: 11111111-2222-4333-8444-555555555555", "szmlcf"},
        {"User-Agent: Vistrel/4", "szmlcf"},
        {"User-Agent: tavrind/1", "b"},
        {"User-Agent: Vistrel/1", "d"},
        {"User-Agent: " + ClientSessionManager::tavrindUserAgent(), "u"},
        {"X-Quorvane-UI-Scale: 2.0", "szmlcf"},
        {"X-Quorvane-GeoEnvironment: prod", "szc"},
        {"X-Quorvane-GeoSession: session-1", "szlcf"},
        {"context=mail", "l"},
        {"ldomain=places", "l"},
        {"ltype=hint", "l"},
        {"qlang=en", "l"},
        {"lctxlang=de", "l"},
        {"X-Quorvane-FuzzedLatLong: 47.375000,8.545000", "d"},
        {"If-None-Match: 3", "d"},
        {"X-Quorvane-Digest: abc", "u"},
        {"Content-Encoding: deflate", "u"},
    };
    requests.merge(clientRequests(0));
    for (const auto& [kind, request] : requests) {
        std::set<std::string> expected;
        for (const auto& [entry, kinds] : table)
            if (std::string_view(kinds).contains(kind)) expected.insert(entry);
        EXPECT_EQ(contents(request), expected) << "request kind " << kind;
    }
    for (const auto& [kind, masked] : clientRequests(kFieldMaskNoLocation)) {
        std::set<std::string> expected = contents(requests.at(kind));
        if (std::string_view("szm").contains(kind))
            std::erase_if(expected, [](const std::string& entry) {
                return entry.starts_with("latlng") || entry.starts_with("geosrc") || entry.contains("Whitelisted-App");
            });
        EXPECT_EQ(contents(masked), expected) << "request kind " << kind;
    }
    EXPECT_EQ(requests.at('u').method, "POST");
    EXPECT_EQ(requests.at('u').timeout, std::chrono::seconds(300));
    EXPECT_EQ(requests.at('b').cachePolicy, UrlRequest::CachePolicy::ReloadIgnoringCache);
    EXPECT_EQ(requests.at('w').cachePolicy, UrlRequest::CachePolicy::ReloadIgnoringCache);
}

TEST_F(RequestFactoryTest, TheEndpointsOwnItemsAndTheQuerysItemsWin)
{
    bag = bagOf(R"({"searchURL": "https://s.example/search?key=theirs&locale=xx"})");
    TAVSearchRequest search;
    search.queryString = "typed";
    search.queryItems = {std::make_shared<TAVQueryItem>("q", "forced"), nullptr};
    const auto request = factory->searchRequest(of(search));
    EXPECT_EQ(request->url.queryValue("key"), "theirs");
    EXPECT_EQ(request->url.queryValue("locale"), "xx");
    EXPECT_EQ(request->url.queryValue("q"), "forced");
    EXPECT_FALSE(request->timeout) << "left to the session";
    EXPECT_FALSE(request->headers.find("X-Quorvane-GeoEnvironment"));

    bag = bagOf(R"({"searchURL": "https://s.example/", "timeoutIntervalForRequest": 7.5})");
    ClientRequest client = of(search);
    EXPECT_EQ(factory->searchRequest(client)->timeout, 7500ms);
    client.timeout = 2s;
    EXPECT_EQ(factory->searchRequest(client)->timeout, 2s);
}

TEST_F(RequestFactoryTest, TheTriggerSaysWhetherTheQueryIsASuggestion)
{
    TAVSearchRequest search;
    std::set<int> suggested;
    for (int trigger = 0; trigger <= static_cast<int>(StartSearchTrigger::Warm); ++trigger) {
        search.triggerEvent = static_cast<StartSearchTrigger>(trigger);
        if (factory->searchRequest(of(search))->url.queryValue("qtype") == "suggested") suggested.insert(trigger);
    }
    EXPECT_EQ(suggested, (std::set{8, 10}));
}

TEST_F(RequestFactoryTest, ALookupSaysWhatIsKnownOfIt)
{
    using Type = LookupSelectionType;
    const char* english = "The quick brown fox jumps over the lazy dog and runs away through the forest";
    std::string japanese = "aa"; // so that 4,096 bytes end within a character
    while (japanese.size() < 6000) japanese += "東京の天気予報を調べています。";
    const struct {
        std::string words;
        std::optional<std::string> context;
        Type selection;
        std::optional<std::string> qlang, lctxlang;
        const char* ltype;
    } cases[]{
        {"42", std::nullopt, Type::Explicit, std::nullopt, std::nullopt, "explicit"},
        {"42", "17", Type::Default, std::nullopt, std::nullopt, "default"},
        {"42", english, Type::HintTap, std::nullopt, "en", "hint"},
        {english, "", static_cast<Type>(7), "en", std::nullopt, "default"},
        {"42", japanese, Type::Default, std::nullopt, "ja", "default"},
    };
    for (const auto& c : cases) {
        TAVLookupRequest lookup;
        lookup.queryString = c.words;
        lookup.queryContext = c.context;
        lookup.selectionType = c.selection;
        const Url url = factory->lookupRequest(of(lookup))->url;
        EXPECT_EQ(url.queryValue("qlang"), c.qlang) << url.string();
        EXPECT_EQ(url.queryValue("lctxlang"), c.lctxlang) << url.string();
        EXPECT_EQ(url.queryValue("ltype"), c.ltype) << url.string();
        EXPECT_FALSE(url.queryValue("ldomain"));
        EXPECT_TRUE(url.string().contains("&context&")) << url.string();
    }
}

TEST_F(RequestFactoryTest, WhatTheDeviceDoesNotHaveIsLeftOut)
{
    device.locale.context = {.identifier = "de_CH",
                             .systemLanguage = "",
                             .preferredLanguages = {},
                             .calendar = "",
                             .is24Hour = false,
                             .measurementSystem = "",
                             .region = ""};
    device.profile.current = {};
    makeFactory();
    EXPECT_EQ(contents(*factory->searchRequest({.request = TAVSearchRequest(), .bag = &bag})),
              (std::set<std::string>{"card=1", "key=walrus7351", "locale=de_CH", "q=", "time_zone=Europe/Zurich"}));
}

TEST_F(RequestFactoryTest, OnlyAllowedSourcesTellThePlace)
{
    const auto place = [&] { return factory->context().geoLocationLatLng + factory->context().geoLocationSource; };
    moveTo(kZurich);
    EXPECT_EQ(place(), "") << "no bag has allowed a source";
    knowEverything();
    EXPECT_EQ(device.location.allowed, std::set<std::string>{"wifi"});
    moveTo(platform::Location{1, 2, "gps"});
    EXPECT_EQ(place(), "");
    moveTo(kZurich);
    EXPECT_EQ(place(), "47.375000,8.545000wifi");
    announce(Dictionary{{"supportedGeoLocationSources", Value::Array{"gps", 4, "cell"}}});
    EXPECT_EQ(device.location.allowed, (std::set<std::string>{"cell", "gps"}));
    EXPECT_EQ(place(), "") << "the bag has withdrawn the source";
    moveTo(kZurich);
    EXPECT_EQ(place(), "") << "reported late";
}

TEST_F(RequestFactoryTest, DownloadsTellThePlaceOfTheLastSearchUntilItIsLost)
{
    announce(bag.rawBag());
    const auto place = [&](bool included) {
        return header(factory->fileDownloadRequest(*Url::parse("https://r.example/"), "", included),
                      "X-Quorvane-FuzzedLatLong");
    };
    const std::tuple<const char*, std::function<void()>, const char*> steps[]{
        {"searched nowhere", [&] { performSearch(); }, ""},
        {"came, but hasn't searched", [&] { moveTo(kZurich); }, ""},
        {"searched", [&] { performSearch(); }, "47.375000,8.545000"},
        {"moved on", [&] { moveTo(platform::Location{46.205, 6.145, "wifi"}); }, "47.375000,8.545000"},
        {"searched there", [&] { performSearch(); }, "46.205000,6.145000"},
        {"lost", [&] { moveTo(std::nullopt); }, ""},
        {"found", [&] { moveTo(kZurich); }, ""},
        {"searched again", [&] { performSearch(); }, "47.375000,8.545000"},
        {"withdrawn by the bag", [&] { announce(Dictionary()); }, ""},
    };
    for (const auto& [name, happens, told] : steps) {
        happens();
        EXPECT_EQ(place(true), told) << name;
        EXPECT_EQ(place(false), "") << name;
    }
}

TEST_F(RequestFactoryTest, MostKindsAskWhereTheDeviceIs)
{
    TAVMoreResultsRequest more, placed;
    more.moreResultsURL = Url::parse("https://m.example/x");
    placed.moreResultsURL = Url::parse("https://m.example/x?latlng=1,2"); // says where the search was made
    TAVCardRequest card;
    card.cardURL = more.moreResultsURL;
    const auto asks = [&](auto recipe, const TAVRequest& request) {
        const int before = device.location.updatesRequested;
        EXPECT_TRUE((factory.get()->*recipe)(of(request)));
        return device.location.updatesRequested > before;
    };
    using Factory = TAVNetworkRequestFactory;
    EXPECT_TRUE(asks(&Factory::searchRequest, TAVSearchRequest()));
    EXPECT_TRUE(asks(&Factory::zeroKeywordRequest, TAVZeroKeywordRequest()));
    EXPECT_TRUE(asks(&Factory::lookupRequest, TAVLookupRequest()));
    EXPECT_TRUE(asks(&Factory::flightRequest, TAVFlightSearchRequest()));
    EXPECT_TRUE(asks(&Factory::moreResultsRequest, more));
    EXPECT_FALSE(asks(&Factory::moreResultsRequest, placed));
    EXPECT_FALSE(asks(&Factory::cardRequest, card));
}

TEST_F(RequestFactoryTest, LanguagesThatCannotBeEncodedAreLeftOut)
{
    for (const auto& [language, header] : {std::pair("de-CH", R"(["de-CH","en"])"), {"d\xc3\xa9", ""}, {"d e", ""}}) {
        const platform::test::LogCapture lines;
        device.locale.context.preferredLanguages = {language, "en"};
        changeLocale();
        EXPECT_EQ(factory->context().preferredLanguages, header) << language;
        EXPECT_EQ(lines.count("Error encoding preferred languages"), *header ? 0 : 1) << language;
    }
}

TEST_F(RequestFactoryTest, ANewGuidIsTaken)
{
    assembly.guidController = std::make_shared<TavrinUserGUIDController>(assembly);
    assembly.guidController->reset();
    device.drain();
    EXPECT_EQ(factory->context().userGuid, assembly.guidController->currentUserGUID());
}

TEST_F(RequestFactoryTest, TheDevicesCountrySaysWhereTheBagIs)
{
    const TavrinBagController controller(assembly);
    const auto host = [&] { return factory->bagFetchRequest(controller, "tavrind/1", "").url.host(); };
    EXPECT_EQ(host(), "bag.quorvane.example");
    changeProfile({.countryCode = "CN"});
    EXPECT_EQ(host(), "bag-cn.quorvane.example");
    EXPECT_EQ(factory->bagCacheRequest(controller, "tavrind/1", "").url.host(), "bag-cn.quorvane.example");
}

TEST_F(RequestFactoryTest, ChangesThatConcernTheBagAreTold)
{
    int told = 0;
    const auto token = device.notifications.observe(TAVBagRefreshRequired, [&](const auto&) { ++told; }, factory.get());
    device.drain();
    EXPECT_EQ(told, 0) << "not for the first computation";

    changeProfile({.storefront = "1"}); // the country stays the locale's
    EXPECT_EQ(told, 0);
    changeProfile({.countryCode = "CN"});
    EXPECT_EQ(told, 1);
    changeLocale(platform::LocaleSource::Change::TimeZone);
    EXPECT_EQ(told, 1);
    device.locale.context.identifier = "fr_CH";
    changeLocale();
    EXPECT_EQ(told, 2);
    EXPECT_EQ(factory->context().localeIdentifier, "fr_CH");
}

TEST_F(RequestFactoryTest, MalformedDebugParametersAreLoggedAndLeftOut)
{
    device.userDefaults.set("TAVDebugParameters", "a=1&b&=c&d=&e=f=g&&h=2");
    makeFactory();
    EXPECT_EQ(factory->context().debuggingQueryItems,
              (std::vector<platform::QueryItem>{{"a", "1"}, {"d", ""}, {"h", "2"}}));
    EXPECT_EQ(log.count("invalid query components: "), 4);
}

} // namespace
} // namespace tavrin
