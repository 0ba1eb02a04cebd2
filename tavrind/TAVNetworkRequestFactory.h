#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
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
struct TAVCardRequest;
struct TAVLookupRequest;
struct TAVMoreResultsRequest;
struct TAVRequest;
class TAVBag;
class TavrinBagController;

/// Posted by the request factory when the device has moved to another area; see `platform::isSignificantMove`.
inline constexpr const char* TAVSignificantLocationChange = "TAVSignificantLocationChange";
/// Posted once requests tell of the change, from a task of the factory's queue; no object, no user info.
inline constexpr const char* TAVLocaleChangeNotification = "TAVLocaleChangeNotification";
inline constexpr const char* TAVTimeZoneChangeNotification = "TAVTimeZoneChangeNotification";
inline constexpr const char* TAVCountryCodeChangeNotification = "TAVCountryCodeChangeNotification";
/// Something in the device's profile changed.
inline constexpr const char* TAVEffectiveSettingsChangeNotification = "TAVEffectiveSettingsChangeNotification";

/// Bit of a field mask: leave out where the device is and which applications it has.
inline constexpr std::uint64_t kFieldMaskNoLocation = 1;

/// What requests tell of the device. Empty texts are left out of requests.
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
    std::string lookupGeoLocationLatLng; ///< the location as of the last search that was sent
    std::string storeFrontIdentifier;
    bool isManagedAccount = false;
    std::string subscriptionInfo; ///< JSON array
    std::string geoClientMetadata;
    std::string geoEnvironment;
    std::string geoSessionId;
    std::string geoSessionEntity;
    platform::Uuid userGuid; ///< for requests that bring none
    std::vector<platform::QueryItem> debuggingQueryItems;
};

/// Builds every HTTP request that the daemon sends to the service.
///
/// Each kind of request is a recipe: a URL, the items that it forces, the request's own items, and then the shared
/// items and headers of the table in the .cpp, as defaults. A recipe runs in one synchronous block on the context
/// queue, so a request sees one consistent snapshot of the context. The factory keeps that context current from the
/// device's locale, time zone, profile, location and subscriptions, and says when a change affects the bag.
///
/// Operations whose URL may be missing answer none for it. Any thread.
class TAVNetworkRequestFactory : public std::enable_shared_from_this<TAVNetworkRequestFactory>,
                                 public TavrinSubscriptionManagerDelegate {
public:
    using Request = std::optional<platform::UrlRequest>;

    /// Computes the context and starts to follow its changes.
    static std::shared_ptr<TAVNetworkRequestFactory> make(Assembly& assembly);
    explicit TAVNetworkRequestFactory(Assembly& assembly);
    ~TAVNetworkRequestFactory() override;

    [[nodiscard]] platform::UrlRequest bagFetchRequest(const TavrinBagController& controller,
                                                       const std::string& userAgent, const std::string& version);
    /// Never sent: its URL tells when the bag must be fetched anew.
    [[nodiscard]] platform::UrlRequest bagCacheRequest(const TavrinBagController& controller,
                                                       const std::string& userAgent, const std::string& version);

    /// Changes with everything of the context that the URL of a bag request is made of.
    [[nodiscard]] std::uint64_t bagContextGeneration() const { return _bagContextGeneration; }

    // A client's requests. The bag carries the client's user agent; `timeout` is the client's, if it has one.
    [[nodiscard]] Request searchRequest(const TAVRequest& request, const TAVBag& bag, const platform::Uuid& userGuid,
                                        std::uint64_t fieldMask = 0, std::optional<platform::Duration> timeout = {});
    [[nodiscard]] Request zeroKeywordRequest(const TAVRequest& request, const TAVBag& bag,
                                             const platform::Uuid& userGuid, std::uint64_t fieldMask = 0,
                                             std::optional<platform::Duration> timeout = {});
    /// The bag may be missing; hence the agent.
    [[nodiscard]] Request moreResultsRequest(const TAVMoreResultsRequest& request, const TAVBag* bag,
                                             const std::optional<std::string>& userAgent,
                                             const platform::Uuid& userGuid, std::uint64_t fieldMask = 0,
                                             std::optional<platform::Duration> timeout = {});
    [[nodiscard]] Request lookupRequest(const TAVLookupRequest& request, const TAVBag& bag,
                                        const platform::Uuid& userGuid, std::optional<platform::Duration> timeout = {});
    [[nodiscard]] Request cardRequest(const TAVCardRequest& request, const TAVBag& bag, const platform::Uuid& userGuid,
                                      std::optional<platform::Duration> timeout = {});
    /// A flight search or flight lookup.
    [[nodiscard]] Request flightRequest(const TAVRequest& request, const TAVBag& bag, const platform::Uuid& userGuid,
                                        std::optional<platform::Duration> timeout = {});

    [[nodiscard]] platform::UrlRequest fileDownloadRequest(const platform::Url& url, const std::string& version,
                                                           bool includeLatLong);
    /// Method POST, without the body.
    [[nodiscard]] platform::UrlRequest flusherUploadRequest(const platform::Url& url, platform::Duration timeout,
                                                            const std::string& digest);
    [[nodiscard]] platform::UrlRequest warmRequest(const platform::Url& url);

    /// Keeps the current location for file downloads; called after each network search.
    void setPerformedSearch();
    /// The geo service's session entity, if there is a session.
    [[nodiscard]] std::optional<std::string> getMapsUserSessionEntity();

    void didUpdateStorefrontIdentifier(const std::optional<std::string>& storefront) override;
    void didUpdateSubscriptionDictionaries(const std::vector<platform::Value>& subscriptions) override;

    /// A copy of the context. For diagnostics and tests.
    [[nodiscard]] RequestContext context();

private:
    struct Recipe;

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
    std::optional<platform::Location> _area; // where the last significant move led, or the first location known
    bool _locationServicesSetUp = false;
    std::set<std::string> _supportedGeoLocationSources;
    platform::NotificationCenter::Token _bagObserver;
    platform::NotificationCenter::Token _guidObserver;
};

} // namespace tavrin
