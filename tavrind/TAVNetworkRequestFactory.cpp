#include "tavrind/TAVNetworkRequestFactory.h"

#include <fmt/format.h>

#include "CoreTavrin/ClientVocabulary.h"
#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/device/Device.h"
#include "platform/device/DeviceProfile.h"
#include "platform/device/LocaleSource.h"
#include "platform/files/UserDefaults.h"
#include "platform/text/LanguageRecognizer.h"
#include "platform/values/Json.h"
#include "tavrind/AppWhitelistController.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/FeedbackRecords.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinURLRequestBuilder.h"
#include "tavrind/TavrinUserGUIDController.h"

namespace tavrin {

using platform::Duration;
using platform::QueryItem;
using platform::Url;
using platform::UrlRequest;
using platform::Uuid;
using platform::Value;

namespace {

constexpr const char* kApiKey = "walrus7351";
constexpr const char* kDownloadUserAgent = "Vistrel/1";

// The kinds of request as bits: each rule of the table below names the kinds that it applies to.
enum Kind : unsigned {
    kBagFetch = 1 << 0,
    kBagCache = 1 << 1,
    kSearch = 1 << 2,
    kZeroKeyword = 1 << 3,
    kMoreResults = 1 << 4,
    kLookup = 1 << 5,
    kCard = 1 << 6,
    kFlight = 1 << 7,
    kDownload = 1 << 8,
    kUpload = 1 << 9,
};
constexpr unsigned kClient = kSearch | kZeroKeyword | kMoreResults | kLookup | kCard | kFlight;

} // namespace

/// The parts of one request besides the context.
struct TAVNetworkRequestFactory::Recipe {
    unsigned kind;
    TavrinURLRequestBuilder builder;
    const ClientRequest* client = nullptr; // of the kinds in kClient
    std::string userAgent = {};
    std::string version = {};
    std::string digest = {};
    bool includeLatLong = false;
    std::optional<Duration> timeout = {};
    std::string signature = {};   // of the installed applications
    std::string_view origin = {}; // of what is added now

    [[nodiscard]] const TAVRequest& request() const { return client->request; }
    void item(const char* name, const std::string& value)
    {
        if (value.empty()) return;
        if (origins() && !builder.containsQueryItemWithName(name)) origins()->items[name] = origin;
        builder.defaultQueryItemWithName(name, value);
    }
    void header(const char* name, const std::string& value)
    {
        if (value.empty()) return;
        if (origins() && !builder.containsHttpHeaderWithName(name)) origins()->headers[name] = origin;
        builder.defaultHttpHeaderWithName(name, value);
    }
    void force(const QueryItem& item)
    {
        if (origins()) origins()->items[item.name] = origin;
        builder.forceQueryItem(item);
    }
    [[nodiscard]] RequestOrigins* origins() const { return client ? client->origins : nullptr; }
    [[nodiscard]] bool masked() const
    {
        return (client->fieldMask & kFieldMaskNoLocation) && (kind & (kSearch | kZeroKeyword | kMoreResults));
    }

    static void addLookupItems(Recipe& r, const RequestContext&);

    /// A shared item or header: the kinds that have it, its origin in a client's request, and the function that adds
    /// it. Empty values are omitted.
    struct Rule {
        unsigned kinds;
        std::string_view origin;
        void (*apply)(Recipe&, const RequestContext&);
    };
    static const std::vector<Rule> kRules; // the table of docs/requests.md
};

const std::vector<TAVNetworkRequestFactory::Recipe::Rule> TAVNetworkRequestFactory::Recipe::kRules{
    {kBagFetch | kClient | kDownload | kUpload, "default", [](auto& r, auto&) { r.item("key", kApiKey); }},
    {kBagFetch | kBagCache, "default", [](auto& r, auto&) { r.item("version", r.version); }},
    {kBagCache, "default", [](auto& r, auto&) { r.item("agent", r.userAgent); }},
    {kBagFetch | kBagCache | kClient | kUpload, "device",
     [](auto& r, auto& c) { r.item("locale", c.localeIdentifier); }},
    {kBagFetch | kBagCache | kClient, "device", [](auto& r, auto& c) { r.item("esl", c.effectiveSystemLanguage); }},
    {kBagFetch | kBagCache | (kClient & ~kMoreResults) | kUpload, "device",
     [](auto& r, auto& c) { r.item("cc", c.geoDeviceCountryCode); }},
    {kBagFetch | kClient | kUpload, "device",
     [](auto& r, auto& c) { r.header("X-Quorvane-Languages", c.preferredLanguages); }},
    {kSearch, "default", [](auto& r, auto&) { r.item("card", "1"); }},
    {kSearch, "user",
     [](auto& r, auto&) {
         if (r.request().topics.count() > 0) r.header("X-Quorvane-TopTopics", platform::toJson(r.request().topics));
     }},
    {kSearch | kZeroKeyword | kLookup | kFlight, "user",
     [](auto& r, auto&) { r.item("kb_ime", r.request().keyboardInputMode.value_or("")); }},
    {kSearch | kZeroKeyword, "device",
     [](auto& r, auto& c) {
         r.item("calendar", c.localeCalendarIdentifier);
         r.item("time_zone", c.localTimeZoneName);
         r.item("units", c.localeMeasurementSystem);
     }},
    {kSearch, "device", [](auto& r, auto& c) { r.item("24h", c.is24hDateFormat); }},
    {kClient & ~kMoreResults, "device",
     [](auto& r, auto& c) { r.header("X-Quorvane-GeoMetadata", c.geoClientMetadata); }},
    {kClient, "device",
     [](auto& r, auto& c) {
         if (r.masked()) return;
         r.item("latlng", c.geoLocationLatLng);
         r.item("geosrc", c.geoLocationSource);
     }},
    {kClient & ~kZeroKeyword, "device",
     [](auto& r, auto&) {
         if (!r.masked()) r.header("X-Quorvane-Whitelisted-App-Signature", r.signature);
     }},
    {kClient & ~kCard, "device", [](auto& r, auto& c) { r.item("mode", c.isManagedAccount ? "managed" : ""); }},
    {kClient, "device", [](auto& r, auto& c) { r.item("storefront", c.storeFrontIdentifier); }},
    {kClient, "device", [](auto& r, auto& c) { r.header("X-Quorvane-Subscriptions", c.subscriptionInfo); }},
    {kClient, "device",
     [](auto& r, auto& c) {
         const Uuid& guid = r.client->userGuid.isNil() ? c.userGuid : r.client->userGuid;
         if (!guid.isNil()) r.header("X-Quorvane-UserGuid", guid.string());
     }},
    {kBagFetch | kClient | kDownload | kUpload, "client", [](auto& r, auto&) { r.header("User-Agent", r.userAgent); }},
    {kClient, "user",
     [](auto& r, auto&) {
         if (r.request().scale > 0) r.header("X-Quorvane-UI-Scale", fmt::format("{:.1f}", r.request().scale));
     }},
    {kSearch | kZeroKeyword | kCard, "device",
     [](auto& r, auto& c) {
         if (r.client->bag && r.client->bag->sendGeoEnvironmentHeader())
             r.header("X-Quorvane-GeoEnvironment", c.geoEnvironment);
     }},
    {kClient & ~kMoreResults, "device", [](auto& r, auto& c) { r.header("X-Quorvane-GeoSession", c.geoSessionId); }},
    {kLookup, "user", &Recipe::addLookupItems},
    {kDownload, "device",
     [](auto& r, auto& c) {
         if (r.includeLatLong) r.header("X-Quorvane-FuzzedLatLong", c.lookupGeoLocationLatLng);
     }},
    {kDownload, "device", [](auto& r, auto&) { r.header("If-None-Match", r.version); }},
    {kUpload, "device", [](auto& r, auto&) { r.header("X-Quorvane-Digest", r.digest); }},
};

void TAVNetworkRequestFactory::Recipe::addLookupItems(Recipe& r, const RequestContext&)
{
    const auto& lookup = static_cast<const TAVLookupRequest&>(r.request());
    const auto language = [](const std::string& text) {
        std::string recognized = platform::recognizedLanguage(text);
        return recognized == "und" ? std::string() : recognized;
    };
    r.builder.defaultQueryItemWithName("context", lookup.clientContext);
    r.item("ldomain", lookup.hintDomain.value_or(""));
    r.item("ltype", lookup.selectionType == LookupSelectionType::HintTap    ? "hint"
                    : lookup.selectionType == LookupSelectionType::Explicit ? "explicit"
                                                                            : "default");
    r.item("qlang", language(lookup.queryString));
    r.item("lctxlang", language(lookup.queryContext.value_or("")));
}

std::uint64_t fieldMaskFor(std::string_view userAgent)
{
    return tavrin_caseInsensitiveContainsString(userAgent, "messages") ? kFieldMaskNoLocation : 0;
}

std::shared_ptr<TAVNetworkRequestFactory> TAVNetworkRequestFactory::make(Assembly& assembly)
{
    auto factory = std::make_shared<TAVNetworkRequestFactory>(assembly);
    const std::weak_ptr<TAVNetworkRequestFactory> weak = factory;
    platform::Device& device = assembly.device;

    // Not on the start-up path: the first recipe waits for this task.
    factory->_contextAccessQueue->barrierAsync([weak] {
        auto self = weak.lock();
        if (!self) return;
        self->_setUpDebuggingQueryItems();
        self->_updateLocale();
        self->_updateTimeZone();
        self->_updateProfile(self->_assembly.device.profile.profile());
    });

    device.locale.onChange([weak](platform::LocaleSource::Change change) {
        auto self = weak.lock();
        if (!self) return;
        self->_contextAccessQueue->barrierAsync([weak, change] {
            auto again = weak.lock();
            if (!again) return;
            if (change == platform::LocaleSource::Change::TimeZone) {
                again->_updateTimeZone();
                return again->_post(TAVTimeZoneChangeNotification);
            }
            again->_updateLocale();
            again->_post(TAVLocaleChangeNotification);
            // Without a configured country, the country is the locale's region.
            if (again->_updateProfile(again->_assembly.device.profile.profile()))
                again->_post(TAVCountryCodeChangeNotification);
            again->_notifyBagRefreshRequired();
        });
    });
    device.profile.onChange([weak](const platform::DeviceProfile& profile) {
        auto self = weak.lock();
        if (!self) return;
        self->_contextAccessQueue->barrierAsync([weak, profile] {
            auto again = weak.lock();
            if (!again) return;
            const bool countryChanged = again->_updateProfile(profile);
            again->_post(TAVEffectiveSettingsChangeNotification);
            if (!countryChanged) return;
            again->_post(TAVCountryCodeChangeNotification);
            again->_notifyBagRefreshRequired();
        });
    });
    device.location.onChange([weak](const std::optional<platform::Location>& location, const std::string& reason) {
        auto self = weak.lock();
        if (!self) return;
        self->_contextAccessQueue->barrierAsync([weak, location, reason] {
            if (auto again = weak.lock()) again->_updateLocation(location, reason);
        });
    });

    factory->_bagObserver = assembly.notificationCenter.observe(
        TAVBagChangeNotification, [weak](const platform::Notification& notification) {
            auto self = weak.lock();
            if (!self) return;
            if (auto bag = notification.get<std::shared_ptr<const TAVBag>>("bag")) self->bagChangeNotification(bag);
        });
    factory->_guidObserver =
        assembly.notificationCenter.observe(TAVUserGUIDChangeNotification, [weak](const platform::Notification&) {
            if (auto self = weak.lock()) self->guuidChangeNotification();
        });
    return factory;
}

TAVNetworkRequestFactory::TAVNetworkRequestFactory(Assembly& assembly)
    : _assembly(assembly),
      _contextAccessQueue(assembly.device.concurrentQueue("com.quorvane.tavrind.contextaccess", rank::kContext))
{}

TAVNetworkRequestFactory::~TAVNetworkRequestFactory() = default;

UrlRequest TAVNetworkRequestFactory::build(Recipe& recipe)
{
    // Read before the context queue is entered, because the controller blocks on its own queue.
    if ((recipe.kind & kClient & ~kZeroKeyword) && _assembly.appWhitelistController)
        recipe.signature = _assembly.appWhitelistController->whitelistSignature();

    UrlRequest request = _contextAccessQueue->sync([&] {
        recipe.origin = "user";
        if (recipe.client)
            for (const auto& item : recipe.request().queryItems)
                if (item) recipe.force({item->name, item->value});
        recipe.origin = "settings";
        if (recipe.kind != kDownload)
            for (const QueryItem& item : _context.debuggingQueryItems) recipe.force(item);
        for (const Recipe::Rule& rule : Recipe::kRules) {
            if (!(rule.kinds & recipe.kind)) continue;
            recipe.origin = rule.origin;
            rule.apply(recipe, _context);
        }
        return recipe.builder.createMutableUrlRequest();
    });

    request.timeout = recipe.timeout;
    return request;
}

UrlRequest TAVNetworkRequestFactory::bagFetchRequest(const TavrinBagController& controller,
                                                     const std::string& userAgent, const std::string& version)
{
    const Url url = controller.bagFetchURLWithCountry(_deviceCountryCode());
    Recipe recipe{.kind = kBagFetch,
                  .builder = TavrinURLRequestBuilder::requestBuilderWithURL(url),
                  .userAgent = userAgent,
                  .version = version};
    UrlRequest request = build(recipe);
    request.cachePolicy = UrlRequest::CachePolicy::ReloadIgnoringCache;
    return request;
}

UrlRequest TAVNetworkRequestFactory::bagCacheRequest(const TavrinBagController& controller,
                                                     const std::string& userAgent, const std::string& version)
{
    const Url url = controller.bagFetchURLWithCountry(_deviceCountryCode());
    Recipe recipe{.kind = kBagCache,
                  .builder = TavrinURLRequestBuilder::requestBuilderWithURL(url),
                  .userAgent = userAgent,
                  .version = version};
    return build(recipe);
}

TAVNetworkRequestFactory::Request TAVNetworkRequestFactory::_clientRequest(unsigned kind, const ClientRequest& client,
                                                                           const std::optional<Url>& url,
                                                                           const std::vector<QueryItem>& forced)
{
    if (!url) return std::nullopt;
    Recipe recipe{.kind = kind,
                  .builder = TavrinURLRequestBuilder::requestBuilderWithURL(*url),
                  .client = &client,
                  .userAgent = client.userAgent,
                  .timeout = client.timeout};
    // If the search sent its location, the URL of its further results contains it.
    const bool placed = kind == kMoreResults && recipe.builder.containsQueryItemWithName("latlng");
    if (kind != kCard && !placed && !client.origins) _startLocationUpdate();
    if (client.origins) {
        const bool ofBag = kind != kMoreResults && kind != kCard;
        for (const QueryItem& item : platform::UrlComponents(*url).queryItems())
            client.origins->items[item.name] = ofBag ? "bag" : "answer";
    }
    for (const QueryItem& item : forced) {
        recipe.origin = item.name == "q" ? "user" : "default";
        recipe.force(item);
    }
    if (!recipe.timeout && client.bag)
        if (const auto seconds = client.bag->timeoutIntervalForRequest()) recipe.timeout = requestTimeout(*seconds);
    return build(recipe);
}

TAVNetworkRequestFactory::Request TAVNetworkRequestFactory::searchRequest(const ClientRequest& client)
{
    std::vector<QueryItem> forced{{"q", client.request.queryString}};
    if (client.request.triggerEvent == StartSearchTrigger::Suggestion ||
        client.request.triggerEvent == StartSearchTrigger::PartialSuggestion)
        forced.emplace_back("qtype", "suggested");
    return _clientRequest(kSearch, client, client.bag->searchURL(), forced);
}

TAVNetworkRequestFactory::Request TAVNetworkRequestFactory::zeroKeywordRequest(const ClientRequest& client)
{
    return _clientRequest(kZeroKeyword, client, client.bag->searchURL(), {{"qtype", "zkw"}});
}

TAVNetworkRequestFactory::Request TAVNetworkRequestFactory::moreResultsRequest(const ClientRequest& client)
{
    const auto& request = static_cast<const TAVMoreResultsRequest&>(client.request);
    return _clientRequest(kMoreResults, client, request.moreResultsURL, {});
}

TAVNetworkRequestFactory::Request TAVNetworkRequestFactory::lookupRequest(const ClientRequest& client)
{
    return _clientRequest(kLookup, client, client.bag->searchURL(), {{"q", client.request.queryString}});
}

TAVNetworkRequestFactory::Request TAVNetworkRequestFactory::cardRequest(const ClientRequest& client)
{
    return _clientRequest(kCard, client, static_cast<const TAVCardRequest&>(client.request).cardURL, {});
}

TAVNetworkRequestFactory::Request TAVNetworkRequestFactory::flightRequest(const ClientRequest& client)
{
    return _clientRequest(kFlight, client, client.bag->flightURL(), {{"q", client.request.queryString}});
}

UrlRequest TAVNetworkRequestFactory::fileDownloadRequest(const Url& url, const std::string& version,
                                                         bool includeLatLong)
{
    Recipe recipe{.kind = kDownload,
                  .builder = TavrinURLRequestBuilder::requestBuilderWithURL(url),
                  .userAgent = kDownloadUserAgent,
                  .version = version,
                  .includeLatLong = includeLatLong};
    return build(recipe);
}

UrlRequest TAVNetworkRequestFactory::flusherUploadRequest(const Url& url, Duration timeout, const std::string& digest)
{
    Recipe recipe{.kind = kUpload,
                  .builder = TavrinURLRequestBuilder::requestBuilderWithURL(url),
                  .userAgent = ClientSessionManager::tavrindUserAgent(),
                  .digest = digest,
                  .timeout = timeout};
    UrlRequest request = build(recipe);
    request.method = "POST";
    request.headers.set("Content-Encoding", "deflate");
    return request;
}

UrlRequest TAVNetworkRequestFactory::warmRequest(const Url& url)
{
    UrlRequest request = TavrinURLRequestBuilder::requestBuilderWithURL(url).createMutableUrlRequest();
    request.cachePolicy = UrlRequest::CachePolicy::ReloadIgnoringCache;
    return request;
}

void TAVNetworkRequestFactory::setPerformedSearch()
{
    _contextAccessQueue->barrierSync([this] {
        if (_currentLocation) _context.lookupGeoLocationLatLng = _context.geoLocationLatLng;
    });
}

std::optional<std::string> TAVNetworkRequestFactory::getMapsUserSessionEntity()
{
    std::string entity = _contextAccessQueue->sync([this] { return _context.geoSessionEntity; });
    return entity.empty() ? std::nullopt : std::optional(std::move(entity));
}

std::string TAVNetworkRequestFactory::_deviceCountryCode()
{
    return _contextAccessQueue->sync([this] { return _context.geoDeviceCountryCode; });
}

RequestContext TAVNetworkRequestFactory::context()
{
    return _contextAccessQueue->sync([this] { return _context; });
}

void TAVNetworkRequestFactory::_setUpDebuggingQueryItems()
{
    const auto parameters = _assembly.userDefaults.string("TAVDebugParameters");
    if (!parameters) return;
    ++_bagContextGeneration;
    log(kLogRequest).log("processing debug parameters: ({})", *parameters);
    std::string_view rest = *parameters;
    for (std::size_t end = 0; end != std::string_view::npos;) {
        end = rest.find('&');
        const std::string_view piece = rest.substr(0, end);
        if (end != std::string_view::npos) rest.remove_prefix(end + 1);
        const std::size_t equals = piece.find('=');
        const bool valid =
            equals != std::string_view::npos && equals > 0 && piece.find('=', equals + 1) == std::string_view::npos;
        if (valid)
            _context.debuggingQueryItems.emplace_back(std::string(piece.substr(0, equals)),
                                                      std::string(piece.substr(equals + 1)));
        else
            log(kLogRequest).error("invalid query components: {}", piece);
    }
}

void TAVNetworkRequestFactory::_updateLocale()
{
    const platform::LocaleContext locale = _assembly.device.locale.locale();
    _context.localeIdentifier = locale.identifier;
    _context.effectiveSystemLanguage = locale.systemLanguage;
    _context.localeCalendarIdentifier = locale.calendar;
    _context.is24hDateFormat = locale.is24Hour ? "1" : "";
    _context.localeMeasurementSystem = locale.measurementSystem;
    Value::Array languages;
    bool encodable = true;
    for (const std::string& language : locale.preferredLanguages) {
        for (unsigned char c : language) encodable = encodable && c > 0x20 && c < 0x7f;
        languages.emplace_back(language);
    }
    _context.preferredLanguages = encodable && !languages.empty() ? platform::toJson(languages) : "";
    if (!encodable) log(kLogRequest).error("Error encoding preferred languages {}.", platform::toJson(languages));
    ++_bagContextGeneration;
}

void TAVNetworkRequestFactory::_updateTimeZone()
{
    _context.localTimeZoneName = _assembly.device.locale.timeZone();
}

/// Returns whether the country has changed.
bool TAVNetworkRequestFactory::_updateProfile(const platform::DeviceProfile& profile)
{
    const std::string before = std::exchange(_context.geoDeviceCountryCode,
                                             profile.countryCode.value_or(_assembly.device.locale.locale().region));
    _context.isManagedAccount = profile.managedAccount;
    _context.geoClientMetadata = profile.geoMetadata.value_or("");
    _context.geoEnvironment = profile.geoEnvironment.value_or("");
    _context.geoSessionId = profile.geoSessionId.value_or("");
    _context.geoSessionEntity = profile.geoSessionEntity.value_or("");
    if (_context.geoSessionId.empty() && !_context.geoSessionEntity.empty())
        log(kLogRequest)
            .error("GEOUserSessionEntity does not respond to selector sessionIDString, actual class is geoSession");
    const bool changed = _context.geoDeviceCountryCode != before;
    if (changed) ++_bagContextGeneration;
    return changed;
}

void TAVNetworkRequestFactory::_post(const char* notification) const
{
    _assembly.notificationCenter.post({.name = notification});
}

void TAVNetworkRequestFactory::_updateLocation(const std::optional<platform::Location>& location,
                                               const std::string& reason)
{
    if (!location || !_supportedGeoLocationSources.contains(location->source)) return _setNoLocationWithReason(reason);
    _currentLocation = location;
    const bool moved = _area && platform::isSignificantMove(*_area, *location);
    if (moved || !_area) _area = location;
    if (moved) _assembly.notificationCenter.post({.name = TAVSignificantLocationChange, .object = this});
    _context.geoLocationLatLng = fmt::format("{:f},{:f}", location->latitude, location->longitude);
    _context.geoLocationSource = location->source;
}

void TAVNetworkRequestFactory::_setNoLocationWithReason(const std::string& reason)
{
    log(kLogRequest).info("no location: {}", reason);
    _currentLocation.reset();
    _context.geoLocationLatLng.clear();
    _context.geoLocationSource.clear();
    _context.lookupGeoLocationLatLng.clear();
}

void TAVNetworkRequestFactory::_startLocationUpdate()
{
    _assembly.device.location.requestUpdate();
}

void TAVNetworkRequestFactory::_notifyBagRefreshRequired()
{
    _assembly.device.mainQueue()->async([weak = weak_from_this()] {
        if (auto self = weak.lock())
            self->_assembly.notificationCenter.post({.name = TAVBagRefreshRequired, .object = self.get()});
    });
}

void TAVNetworkRequestFactory::bagChangeNotification(const std::shared_ptr<const TAVBag>& bag)
{
    const auto list = bag->supportedGeoLocationSources();
    _contextAccessQueue->barrierAsync(
        [self = shared_from_this(), sources = std::set<std::string>(list.begin(), list.end())] {
            const bool changed = !self->_locationServicesSetUp || sources != self->_supportedGeoLocationSources;
            self->_locationServicesSetUp = true;
            self->_supportedGeoLocationSources = sources;
            if (changed) self->_assembly.device.location.setAllowedSources(sources);
            if (!sources.contains(self->_context.geoLocationSource) && self->_currentLocation)
                self->_setNoLocationWithReason("the bag no longer allows its source");
        });
    if (const auto visible = bag->hashtagImagesVisible()) {
        _assembly.device.globalQueue(platform::Priority::Background)->async([self = shared_from_this(), visible] {
            platform::UserDefaults& defaults = self->_assembly.userDefaults;
            if (defaults.value("TAVHashtagImagesVisible").asBool() != visible)
                defaults.set("TAVHashtagImagesVisible", *visible);
        });
    }
}

void TAVNetworkRequestFactory::guuidChangeNotification()
{
    _contextAccessQueue->barrierAsync([self = shared_from_this()] {
        if (const auto& controller = self->_assembly.guidController)
            self->_context.userGuid = controller->currentUserGUID();
    });
}

void TAVNetworkRequestFactory::didUpdateStorefrontIdentifier(const std::optional<std::string>& storefront)
{
    _contextAccessQueue->barrierAsync([self = shared_from_this(), fresh = storefront.value_or("")] {
        // The storefront comes later than the other settings: an answer in between is for the former one.
        if (std::exchange(self->_context.storeFrontIdentifier, fresh) != fresh)
            self->_post(TAVEffectiveSettingsChangeNotification);
    });
}

void TAVNetworkRequestFactory::didUpdateSubscriptionDictionaries(const std::vector<Value>& subscriptions)
{
    _contextAccessQueue->barrierAsync([self = shared_from_this(), header = subscriptionsHeader(subscriptions)] {
        self->_context.subscriptionInfo = header;
    });
}

} // namespace tavrin
