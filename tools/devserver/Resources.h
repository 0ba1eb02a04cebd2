#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "tools/devserver/Http.h"

/// The downloadable resources that the bag lists.
namespace devserver {

/// Returns the bag keys of the resources.
[[nodiscard]] const std::vector<std::string_view>& resourceNames();

/// Returns "…/resources/NAME?version=V". The service redirects lookup hints to a path that contains the version.
[[nodiscard]] std::string resourceUrl(std::string_view base, std::string_view name, std::int64_t version);

/// Returns the file with an ETag, status 304 if "If-None-Match" names its version, a redirect for lookup hints, or 404
/// for an unknown name. `path` is the part after "/resources/".
[[nodiscard]] Answer resourceAnswer(std::string_view base, std::string_view path, const Request& request);

} // namespace devserver
