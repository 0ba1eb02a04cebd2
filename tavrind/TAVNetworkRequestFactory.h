#pragma once

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Uuid.h"
#include "platform/device/LocationSource.h"
#include "platform/net/UrlSession.h"
#include "platform/run/NotificationCenter.h"
#include "tavrind/TavrinSubscriptionManager.h"

namespace platform {
class Queue;
struct DeviceProfile;
} // namespace platform

namespace tavrin {

struct Assembly;
struct TAVRequest;
class TAVBag;
class TavrinBagController;

/// Posted by the request factory after the device has moved to another area; see `platform::isSignificantMove`.
inline constexpr const char* TAVSignificantLocationChange = "TAVSignificantLocationChange";
/// Posted from a task of the factory's queue once requests reflect the change; no object, no user info.
inline constexpr const char* TAVLocaleChangeNotification = "TAVLocaleChangeNotification";
inline constexpr const char* TAVTimeZoneChangeNotification = "TAVTimeZoneChangeNotification";
inline constexpr const char* TAVCountryCodeChangeNotification = "TAVCountryCodeChangeNotification";
/// Posted in the same way after any field of the device's profile has changed.
inline constexpr const char* TAVEffectiveSettingsChangeNotification = "TAVEffectiveSettingsChangeNotification";

/// Bit of a field mask: omits the device's location and its installed applications.
inline constexpr std::uint64_t kFieldMaskNoLocation = 1;
/// Returns the mask of a client's requests.
[[nodiscard]] std::uint64_t fieldMaskFor(std::string_view userAgent);

/// The state of the device that requests report. Requests omit empty texts.
struct RequestContext {
    std::string localeIdentifier;
    std::string effectiveSystemLanguage;
    std::string preferredLanguages; ///< JSON array of language tags
    std::string localeCalendarIdentifier;
    std::string is24hDateFormat; ///< "1" or empty
    std::string localTimeZoneName;
    std::string localeMeasurementSystem;
    std::string geoDeviceCountryCode;
    std::string geoLocationLatLng;
    std::string geoLocationSource;
    std::string lookupGeoLocationLatLng; ///< the location when the last search was sent
    std::string storeFrontIdentifier;
    bool isManagedAccount = false;
    std::string subscriptionInfo; ///< JSON array
    std::string geoClientMetadata;
    std::string geoEnvironment;
    std::string geoSessionId;
    std::string geoSessionEntity;
    platform::Uuid userGuid; ///< for client requests with a nil GUID
    std::vector<platform::QueryItem> debuggingQueryItems;
};

/// Where the parts of a request come from, by name: "bag", "answer" (the URL of an earlier answer), "user" (the
/// client's request), "client", "device", "settings" or "default" (the same in all requests of the kind).
struct RequestOrigins {
    std::map<std::string, std::string_view> items;
    std::map<std::string, std::string_view> headers;
};

/// A client's request, with the client's properties that it contains. It only refers to its parts: valid during the
/// call.
struct ClientRequest {
    const TAVRequest& request;
    const TAVBag* bag = nullptr; ///< may be null for more results only
    platform::Uuid userGuid;
    std::string userAgent;
    std::uint64_t fieldMask = 0;               ///< for search, zero keyword and more results; others ignore it
    std::optional<platform::Duration> timeout; ///< the client's; default: the bag's
    RequestOrigins* origins = nullptr; ///< for a preview: receives the origins, and no location update is requested
};

/// Builds every HTTP request that the daemon sends to the service.
///
/// Each kind of request is a recipe: a URL, forced items, the request's own items, and then the shared items and
/// headers of the table in the .cpp as defaults. A recipe runs in one synchronous block on the context queue, so a
/// request sees one consistent snapshot of the context. The factory updates the context from the device's locale, time
/// zone, profile, location and subscriptions, and announces changes that affect the bag.
///
/// Any thread.
class TAVNetworkRequestFactory : public std::enable_shared_from_this<TAVNetworkRequestFactory>,
                                 public TavrinSubscriptionManagerDelegate {
public:
    using Request = std::optional<platform::UrlRequest>;

    /// Creates the factory, starts to observe the device, and computes the context asynchronously; the first request
    /// waits for it.
    static std::shared_ptr<TAVNetworkRequestFactory> make(Assembly& assembly);
    explicit TAVNetworkRequestFactory(Assembly& assembly);
    ~TAVNetworkRequestFactory() override;

    /// Creates the request for the bag of the device's country; it ignores the HTTP cache. `version` may be empty.
    [[nodiscard]] platform::UrlRequest bagFetchRequest(const TavrinBagController& controller,
                                                       const std::string& userAgent, const std::string& version);
    /// This request is never sent. Its URL identifies the bag's context: if it has changed since the fetch, the bag is
    /// stale.
    [[nodiscard]] platform::UrlRequest bagCacheRequest(const TavrinBagController& controller,
                                                       const std::string& userAgent, const std::string& version);

    /// Returns a number that changes with every part of the context that the URL of a bag request contains.
    [[nodiscard]] std::uint64_t bagContextGeneration() const { return _bagContextGeneration; }

    // A client's requests. Each returns nothing if the bag or the request lacks the URL.
    [[nodiscard]] Request searchRequest(const ClientRequest& client);
    [[nodiscard]] Request zeroKeywordRequest(const ClientRequest& client);
    /// `client.request` must be a `TAVMoreResultsRequest`.
    [[nodiscard]] Request moreResultsRequest(const ClientRequest& client);
    /// `client.request` must be a `TAVLookupRequest`.
    [[nodiscard]] Request lookupRequest(const ClientRequest& client);
    /// `client.request` must be a `TAVCardRequest`.
    [[nodiscard]] Request cardRequest(const ClientRequest& client);
    /// For a flight search or flight lookup.
    [[nodiscard]] Request flightRequest(const ClientRequest& client);

    /// Creates the request for a resource file. `version` is sent as "If-None-Match" unless it is empty.
    /// `includeLatLong` adds the location of the last search, if it is known.
    [[nodiscard]] platform::UrlRequest fileDownloadRequest(const platform::Url& url, const std::string& version,
                                                           bool includeLatLong);
    /// Creates a POST request without a body.
    [[nodiscard]] platform::UrlRequest flusherUploadRequest(const platform::Url& url, platform::Duration timeout,
                                                            const std::string& digest);
    /// Creates a request that only opens a connection; it has no shared items and ignores the HTTP cache.
    [[nodiscard]] platform::UrlRequest warmRequest(const platform::Url& url);

    /// Stores the current location for later file downloads. Call it after each network search.
    void setPerformedSearch();
    /// Returns the session entity of the device's geo service; nothing if it has no session.
    [[nodiscard]] std::optional<std::string> getMapsUserSessionEntity();

    void didUpdateStorefrontIdentifier(const std::optional<std::string>& storefront) override;
    void didUpdateSubscriptionDictionaries(const std::vector<platform::Value>& subscriptions) override;

    /// Returns a copy of the context. For diagnostics and tests.
    [[nodiscard]] RequestContext context();

private:
    struct Recipe;

    [[nodiscard]] Request _clientRequest(unsigned kind, const ClientRequest& client,
                                         const std::optional<platform::Url>& url,
                                         const std::vector<platform::QueryItem>& forced);
    [[nodiscard]] platform::UrlRequest build(Recipe& recipe);
    [[nodiscard]] std::string _deviceCountryCode();
    void _setUpDebuggingQueryItems();
    void _updateLocale();
    void _updateTimeZone();
    bool _updateProfile(const platform::DeviceProfile& profile);
    void _post(const char* notification) const;
    void _updateLocation(const std::optional<platform::Location>& location, const std::string& reason);
    void _setNoLocationWithReason(const std::string& reason);
    void _startLocationUpdate();
    void _notifyBagRefreshRequired();
    void bagChangeNotification(const std::shared_ptr<const TAVBag>& bag);
    void guuidChangeNotification();

    Assembly& _assembly;
    std::atomic<std::uint64_t> _bagContextGeneration = 0;
    std::shared_ptr<platform::Queue> _contextAccessQueue;
    RequestContext _context; // on _contextAccessQueue, like all below
    std::optional<platform::Location> _currentLocation;
    std::optional<platform::Location> _area; // the location after the last significant move, or the first known
    bool _locationServicesSetUp = false;
    std::set<std::string> _supportedGeoLocationSources;
    platform::NotificationCenter::Token _bagObserver;
    platform::NotificationCenter::Token _guidObserver;
};

} // namespace tavrin
