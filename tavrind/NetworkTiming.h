#pragma once

#include <optional>
#include <string>

#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

/// Timing data of a finished task (docs/timing.md) in the form that is uploaded.
namespace tavrin {

/// Something that the timing data tells under a name. These exist only while timing data is formatted.
struct TavrinNetEventFeedback {
    std::string name;
};

/// A moment: seconds on the loader's clock, finite and not 0.
struct TavrinNetEventTimingFeedback : TavrinNetEventFeedback {
    double value = 0;
};

/// Counts of a connection.
struct TavrinNetEventStatsFeedback : TavrinNetEventFeedback {
    platform::Dictionary stats;
};

/// Pairs of names and what they stand for: first the moments, oldest first, as whole milliseconds after the oldest,
/// then the statistics. Empty where the data has neither, null for what is no dictionary.
[[nodiscard]] platform::Value formatNetworkTimingData(const platform::Value& timingData);

/// The peer's address in timing data: "192.0.2.7:443", "[2001:db8::1f]:8443". None where it is missing, too short, or
/// of another family.
[[nodiscard]] std::optional<std::string> peerAddress(const platform::Value& timingData);

} // namespace tavrin
