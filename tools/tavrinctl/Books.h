#pragma once

#include <string>
#include <vector>

#include "platform/values/Value.h"

namespace tavrin::ctl {

/// The books of the feedback pipeline, in events, as lines for people: what was recorded is the sum of what became of
/// it, what was dropped and why, and whether that closes. `books` is the "feedback" of the daemon's status.
[[nodiscard]] std::vector<std::string> bookLines(const platform::Value& books);

} // namespace tavrin::ctl
