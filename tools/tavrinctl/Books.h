#pragma once

#include <string>
#include <vector>

#include "platform/values/Value.h"

namespace tavrin::ctl {

/// Formats the event counts of the feedback pipeline: recorded events and where they are, drops by reason, and whether
/// the sum is right. `books` is "feedback" in the daemon's status.
[[nodiscard]] std::vector<std::string> bookLines(const platform::Value& books);

} // namespace tavrin::ctl
