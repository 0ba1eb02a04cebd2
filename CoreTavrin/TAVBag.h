#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/net/Url.h"
#include "platform/values/Record.h"
#include "platform/values/Value.h"

namespace tavrin {

/// The bag: the service's configuration of the daemon, in the view of one client.
///
/// Every accessor reads the top-level key of its own name. A dictionary under "clients" holds, by client name, keys
/// that override the top level; the name that `extractClientNameFromString` finds in the user agent applies. A key that
/// is missing, or whose value has the wrong type, reads as its default. docs/bag.md lists every key.
///
/// Immutable, and cheap to copy: the raw bag is shared. Any thread.
class TAVBag {
public:
    /// Wraps a raw bag. Any value but a dictionary counts as an empty bag.
    TAVBag(platform::Value rawBag, std::string userAgent);

    [[nodiscard]] const platform::Value& rawBag() const { return _rawBag; }
    [[nodiscard]] const std::string& userAgent() const { return _userAgent; }

    [[nodiscard]] std::string version() const;  ///< a number reads as its text; default ""
    [[nodiscard]] bool isEnabled() const;       ///< default true
    [[nodiscard]] bool feedbackEnabled() const; ///< default true
    /// In UTF-16 code units; default 1.
    [[nodiscard]] std::uint64_t minimumQueryLength() const;
    /// In seconds, above 0; no default.
    [[nodiscard]] std::optional<double> timeoutIntervalForRequest() const;

    // URLs are absolute and use http or https. They have no default.

    [[nodiscard]] std::optional<platform::Url> searchURL() const;
    [[nodiscard]] std::optional<platform::Url> warmURL() const;
    [[nodiscard]] std::optional<platform::Url> flightURL() const;
    [[nodiscard]] std::optional<platform::Url> feedbackURL() const;
    [[nodiscard]] std::optional<platform::Url> crowdsourcingURL() const;
    /// The template of an image's URL, with "{id}".
    [[nodiscard]] std::optional<std::string> imageURL() const;
    /// Returns that template with the percent-encoded identifier in place of "{id}"; nothing if "{id}" is
    /// missing.
    [[nodiscard]] std::optional<platform::Url> urlForIdentifier(std::string_view identifier) const;
    /// Returns the URL of the downloadable resource with this identifier.
    [[nodiscard]] std::optional<platform::Url> resourceURL(std::string_view identifier) const;

    [[nodiscard]] bool sendGeoEnvironmentHeader() const; ///< default false
    [[nodiscard]] std::vector<std::string>
    supportedGeoLocationSources() const;                            ///< of "gps", "cell", "wifi"; default none
    [[nodiscard]] std::optional<bool> hashtagImagesVisible() const; ///< nothing: don't change the setting
    [[nodiscard]] std::optional<std::vector<std::string>> subscriptionProviderDomainWhitelist() const;
    [[nodiscard]] std::optional<std::vector<std::string>> subscriptionProviderBundleIdentifierWhitelist() const;
    [[nodiscard]] double subscriptionTTL() const; ///< in seconds, above 0; default 86400

    /// Returns one message for each key, at the top level or in a client's view, whose value has the wrong type.
    [[nodiscard]] std::vector<std::string> problems() const;

    /// A key that the daemon reads, with the type of its value as text: "true or false".
    struct KnownKey {
        std::string_view name;
        std::string_view expected;
        bool (*accepts)(const platform::Value&);
    };
    /// Returns all of them; the keys of downloadable resources come last.
    [[nodiscard]] static const std::vector<KnownKey>& knownKeys();

private:
    template <class Key> [[nodiscard]] auto read(const Key& key) const;

    platform::Value _rawBag;
    platform::Value _clientView; // the overriding keys, or null
    std::string _userAgent;
};

inline constexpr std::string_view kTAVInstalledAppWhitelist = "TAVInstalledAppWhitelist";
inline constexpr std::string_view kTAVLookupHintsWeekly = "TAVLookupHintsWeekly";
inline constexpr std::string_view kTAVLookupHintsMonthly = "TAVLookupHintsMonthly";
inline constexpr std::string_view kTAVCrowdsourcingBlacklist = "TAVCrowdsourcingBlacklist";
inline constexpr std::string_view kTAVCrowdsourcingWhitelist = "TAVCrowdsourcingWhitelist";
/// The identifiers of the downloadable resources, in the order of processing.
extern const std::vector<std::string_view> kTAVResourceIdentifiers;

/// The form in which a bag crosses IPC.
struct TAVBagRecord : platform::RecordOf<TAVBagRecord> {
    static constexpr std::string_view kClass = "TAVBag";
    platform::Bytes rawBag; ///< JSON text
    std::string userAgent;

    TAVBagRecord() = default;
    explicit TAVBagRecord(const TAVBag& bag);
    /// Returns the bag; null if `rawBag` is not a JSON object.
    [[nodiscard]] std::shared_ptr<const TAVBag> bag() const;
    static constexpr auto fields()
    {
        return std::tuple{platform::field("rawBag", &TAVBagRecord::rawBag),
                          platform::field("userAgent", &TAVBagRecord::userAgent)};
    }
};

} // namespace tavrin
