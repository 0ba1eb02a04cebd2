#pragma once

#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/net/Url.h"
#include "platform/values/Value.h"

namespace tavrin {

/// A downloadable resource, and where its file came from.
struct DownloadResource {
    std::string identifier;
    /// The bag's URL when the file was received or confirmed (304); nothing before that.
    std::optional<platform::Url> url;
    /// The final URL, if that URL redirected.
    std::optional<platform::Url> redirectUrl;

    bool operator==(const DownloadResource&) const = default;
};

using DownloadResources = std::map<std::string, DownloadResource, std::less<>>;

/// The table of resources as it is kept in the user defaults: identifier → {"url", "redirect_url"}. Reading skips
/// unknown identifiers and invalid URLs.
[[nodiscard]] platform::Value valueOf(const DownloadResources& resources);
[[nodiscard]] DownloadResources resourcesIn(const platform::Value& value);

/// Whether an identifier names a downloadable resource. Only these become file names.
[[nodiscard]] bool isResource(std::string_view identifier);
/// Lookup hints: fetched again with every bag, while lookups are enabled, and with the location.
[[nodiscard]] bool isLookupResource(std::string_view identifier);

/// Why a resource that the bag has at `url` must be downloaded: "update", "missing" or "lookup"; nothing if it needn't
/// be.
[[nodiscard]] std::optional<std::string_view> downloadReason(const DownloadResource& resource, const platform::Url& url,
                                                             bool fileExists);

} // namespace tavrin
