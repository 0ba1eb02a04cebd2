#pragma once

#include <optional>
#include <string>

#include "platform/values/Value.h"

namespace devserver {

/// What is wrong with the shape of an uploaded session, at the first place where something is; nothing where it is as
/// it should be: the keys in their order with values of their types, and events with a known "type" and a "timestamp",
/// in order of time. A session without "resource_versions" ends before it.
[[nodiscard]] std::optional<std::string> sessionShapeProblem(const platform::Value& session);

} // namespace devserver
