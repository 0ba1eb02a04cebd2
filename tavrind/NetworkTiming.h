#pragma once

#include <optional>
#include <string>

#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

/// The uploaded form of a finished task's timing data (docs/timing.md). Any thread.
namespace tavrin {

/// A named part of the timing data. These exist only while timing data is formatted.
struct TavrinNetEventFeedback {
    std::string name;
};

/// A point in time, in seconds on the loader's clock; finite and not 0.
struct TavrinNetEventTimingFeedback : TavrinNetEventFeedback {
    double value = 0;
};

/// Statistics of a connection.
struct TavrinNetEventStatsFeedback : TavrinNetEventFeedback {
    platform::Dictionary stats;
};

/// Returns an array of pairs of a name and a value: first the points in time, oldest first, in whole milliseconds since
/// the oldest, then the statistics. Returns null for anything but a dictionary.
[[nodiscard]] platform::Value formatNetworkTimingData(const platform::Value& timingData);

/// Returns the peer's address: "192.0.2.7:443", "[2001:db8::1f]:8443". Returns nothing if it is missing, too short or
/// of another family.
[[nodiscard]] std::optional<std::string> peerAddress(const platform::Value& timingData);

} // namespace tavrin
