#pragma once

#include <string>
#include <vector>

#include "platform/values/Value.h"

namespace tavrin {
class TAVBag;
}

/// Formats parts of the daemon's status for people.
namespace tavrin::ctl {

/// Formats a time span: "3 d 4 h", "2 min 5 s", "17 s"; with a minus sign if negative.
[[nodiscard]] std::string span(double seconds);

/// Formats the last fetch of "bag" in the status: "last fetch 3 s ago: self-signed certificate". Empty if there was
/// none.
[[nodiscard]] std::string lastFetchText(const platform::Value& bag);

/// Returns the lines of the status, each a name (empty in a row that continues the one above) and a text.
[[nodiscard]] std::vector<std::pair<std::string, std::string>> statusRows(const platform::Value& status);

/// Returns the bag's wrong values and the keys that are probably misspelt.
[[nodiscard]] std::vector<std::string> bagProblems(const TAVBag& bag);

} // namespace tavrin::ctl
