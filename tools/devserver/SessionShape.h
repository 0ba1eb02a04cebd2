#pragma once

#include <optional>
#include <string>

#include "platform/values/Value.h"

namespace devserver {

/// Checks the shape of an uploaded session: its keys in their order with values of their types, and events with a known
/// "type" and a "timestamp", ordered by time; "resource_versions", the last key, is optional. Returns the first
/// problem; nullopt if there is none.
[[nodiscard]] std::optional<std::string> sessionShapeProblem(const platform::Value& session);

} // namespace devserver
