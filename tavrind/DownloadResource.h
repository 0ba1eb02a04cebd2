#pragma once

#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/net/Url.h"
#include "platform/values/Value.h"

namespace tavrin {

/// A downloadable resource and the origin of its file.
struct DownloadResource {
    std::string identifier;
    /// The bag's URL when the file was received or confirmed (304); nothing before that.
    std::optional<platform::Url> url;
    /// The final URL, if that URL redirected.
    std::optional<platform::Url> redirectUrl;

    bool operator==(const DownloadResource&) const = default;
};

using DownloadResources = std::map<std::string, DownloadResource, std::less<>>;

/// Convert the table of resources to its form in the user defaults and back: identifier → {"url", "redirect_url"}.
/// Reading skips unknown identifiers and invalid URLs.
[[nodiscard]] platform::Value valueOf(const DownloadResources& resources);
[[nodiscard]] DownloadResources resourcesIn(const platform::Value& value);

/// Returns whether an identifier names a downloadable resource. Only such identifiers are used as file names.
[[nodiscard]] bool isResource(std::string_view identifier);
/// Returns whether an identifier names lookup hints. While lookups are enabled, hints are fetched again with every bag;
/// their requests contain the location.
[[nodiscard]] bool isLookupResource(std::string_view identifier);

/// Returns the version of the lookup hints at a URL: "c-d-b" for a path that begins with /a/b/c/d. Logs a shorter
/// path and returns nothing.
[[nodiscard]] std::optional<std::string> signatureFromURL(const platform::Url& url);

/// Returns why a resource that the bag lists at `url` must be downloaded: "update", "missing" or "lookup". Returns
/// nothing if it need not be downloaded.
[[nodiscard]] std::optional<std::string_view> downloadReason(const DownloadResource& resource, const platform::Url& url,
                                                             bool fileExists);

} // namespace tavrin
