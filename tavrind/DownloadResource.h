#pragma once

#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/net/Url.h"
#include "platform/values/Value.h"

namespace tavrin {

/// What is known of a resource's file.
struct DownloadResource {
    std::string identifier;
    /// As the bag had it when the file, or word that it is current, was received; none before that.
    std::optional<platform::Url> url;
    /// Where that URL led, if elsewhere.
    std::optional<platform::Url> redirectUrl;

    bool operator==(const DownloadResource&) const = default;
};

using DownloadResources = std::map<std::string, DownloadResource, std::less<>>;

/// The table of resources as it is kept in the user defaults: identifier → {"url", "redirect_url"}. Reading leaves out
/// identifiers and URLs that are none.
[[nodiscard]] platform::Value valueOf(const DownloadResources& resources);
[[nodiscard]] DownloadResources resourcesIn(const platform::Value& value);

/// Whether an identifier names a downloadable resource. Only these become file names.
[[nodiscard]] bool isResource(std::string_view identifier);
/// Lookup hints: fetched again with every bag, while lookups are enabled, and with the location.
[[nodiscard]] bool isLookupResource(std::string_view identifier);

/// Why a resource that the bag has at `url` must be downloaded: "update", "missing" or "lookup"; none if it needn't.
[[nodiscard]] std::optional<std::string_view> downloadReason(const DownloadResource& resource, const platform::Url& url,
                                                             bool fileExists);

} // namespace tavrin
