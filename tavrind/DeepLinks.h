#pragma once

#include <map>
#include <optional>
#include <random>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/device/AppActivities.h"

namespace tavrin {

/// The parts of a link that identify its target (RFC 3986, section 3), in ASCII. Characters that a URL can't contain
/// are percent-encoded; characters that need no escape are not escaped.
struct DeepLinkComponents {
    std::string scheme; ///< lower-case
    std::string host;   ///< lower-case; empty if the link has none
    std::string path;
};
/// Parses a link. Returns nothing if the text is not an absolute URL, has control characters or a port that is not a
/// number, or is longer than 64 KiB.
[[nodiscard]] std::optional<DeepLinkComponents> deepLinkComponents(std::string_view link);
/// Returns host and path, without a leading "www." and without trailing "/".
[[nodiscard]] std::string tavrin_normalizedURLStringForDeepLinkIngest(const DeepLinkComponents& link);

/// The one or two links of an application's activity.
struct DeepLinkEntry {
    std::string bundleIdentifier;
    std::vector<std::string> links;
};

/// The links to record, by application.
using DeepLinkSubmission = std::map<std::string, std::set<std::string>>;

struct FilteredDeepLinks {
    DeepLinkSubmission submission;
    int whitelistedButDenied = 0;
    int notWhitelistedButDenied = 0;
    int urls = 0;
    int bundleIdentifiers = 0;
};

/// The steps from activities to the privacy recorder's input. Pure functions, any thread.
struct DeepLinks {
    using List = std::set<std::string, std::less<>>;

    /// Returns the links of those public activities that have any.
    [[nodiscard]] static std::vector<DeepLinkEntry> deepLinksFor(const std::vector<platform::AppActivity>& events);
    /// For an application on the whitelist, returns its normalised links in lower case, without those on the blacklist.
    /// For any other application, returns only its identifier, unless that is on the blacklist.
    [[nodiscard]] static FilteredDeepLinks _normalizeAndFilterDeepLinks(const std::vector<DeepLinkEntry>& entries,
                                                                        const List& blacklist, const List& whitelist);
    [[nodiscard]] static bool _isUniversalLink(const DeepLinkComponents& link);
    static void save(const std::string& key, std::string link, DeepLinkSubmission& submission);
    /// Returns the applications in a random order, so that runs that end early don't always omit the same ones.
    [[nodiscard]] static std::vector<std::string> recordingOrder(const DeepLinkSubmission& submission,
                                                                 std::mt19937_64& random);
};

} // namespace tavrin
