#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "tools/devserver/Http.h"

/// The downloadable resources that the bag lists.
namespace devserver {

/// The bag keys of the resources.
[[nodiscard]] const std::vector<std::string_view>& resourceNames();

/// ".../resources/NAME?version=V". The lookup hints redirect from there to a path that carries the version.
[[nodiscard]] std::string resourceUrl(std::string_view base, std::string_view name, std::int64_t version);

/// The file, with an ETag; 304 for the version at hand ("If-None-Match"); a redirect for lookup hints; 404 for an
/// unknown name. `path` is what follows "/resources/".
[[nodiscard]] Answer resourceAnswer(std::string_view base, std::string_view path, const Request& request);

} // namespace devserver
