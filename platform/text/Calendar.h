#pragma once

#include <cstdint>
#include <string_view>

#include "platform/base/Date.h"

namespace platform {

/// Returns the calendar day of `date` in a time zone, as days since 1970-01-01. `timeZone` is an IANA name; an unknown
/// name selects UTC. Any thread.
[[nodiscard]] std::int64_t localDay(Date date, std::string_view timeZone);

} // namespace platform
