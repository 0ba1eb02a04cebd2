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

/// The parts of a link (RFC 3986, 3) that say where it leads. All of it is ASCII: characters that a URL can't hold are
/// percent-encoded, and characters that need no escape are not escaped.
struct DeepLinkComponents {
    std::string scheme; ///< lower-case
    std::string host;   ///< lower-case; empty if the link has none
    std::string path;
};
/// Returns nothing for a text that isn't an absolute URL, has control characters or a port that is no number, or is
/// longer than 64 KiB.
[[nodiscard]] std::optional<DeepLinkComponents> deepLinkComponents(std::string_view link);
/// Host and path, without a leading "www." and trailing "/".
[[nodiscard]] std::string tavrin_normalizedURLStringForDeepLinkIngest(const DeepLinkComponents& link);

/// The links of one activity of an application, one or two.
struct DeepLinkEntry {
    std::string bundleIdentifier;
    std::vector<std::string> links;
};

/// Links by application, as they are recorded.
using DeepLinkSubmission = std::map<std::string, std::set<std::string>>;

struct FilteredDeepLinks {
    DeepLinkSubmission submission;
    int whitelistedButDenied = 0;
    int notWhitelistedButDenied = 0;
    int urls = 0;
    int bundleIdentifiers = 0;
};

/// What becomes of activities on their way to the privacy recorder: pure functions.
struct DeepLinks {
    using List = std::set<std::string, std::less<>>;

    /// The links of the activities that are open to everyone and have any.
    [[nodiscard]] static std::vector<DeepLinkEntry> deepLinksFor(const std::vector<platform::AppActivity>& events);
    /// Keeps the links of applications on the whitelist, as their normalised texts in lower case, but for those on the
    /// blacklist; of all other applications the identifier alone, unless that is on the blacklist.
    [[nodiscard]] static FilteredDeepLinks _normalizeAndFilterDeepLinks(const std::vector<DeepLinkEntry>& entries,
                                                                        const List& blacklist, const List& whitelist);
    [[nodiscard]] static bool _isUniversalLink(const DeepLinkComponents& link);
    static void save(const std::string& key, std::string link, DeepLinkSubmission& submission);
    /// Returns the applications in a random order, so that a run that ends early doesn't always leave out the same.
    [[nodiscard]] static std::vector<std::string> recordingOrder(const DeepLinkSubmission& submission,
                                                                 std::mt19937_64& random);
};

} // namespace tavrin
