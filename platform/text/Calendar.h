#pragma once

#include <cstdint>
#include <string_view>

#include "platform/base/Date.h"

namespace platform {

/// The day of `date` in a time zone (an IANA name; an unknown one is UTC), counted from 1970-01-01. Any thread.
[[nodiscard]] std::int64_t localDay(Date date, std::string_view timeZone);

} // namespace platform
