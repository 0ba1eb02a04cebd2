#pragma once

#include <cstddef>
#include <expected>
#include <string>
#include <string_view>

#include "platform/values/Error.h"
#include "platform/values/Value.h"

namespace platform {

/// Reads a binary property list of at most `maximumSize` bytes, nested at most `kMaximumDepth` deep.
/// Types that JSON doesn't know but for dates and data are refused.
[[nodiscard]] std::expected<Value, Error> parsePropertyList(std::string_view bytes,
                                                            std::size_t maximumSize = 64u << 20);

/// Writes a binary property list. Null entries of dictionaries and arrays are left out: the format has none. Integers
/// beyond 2^63-1 become reals, dates are kept to the microsecond. Refused: a null, texts with a NUL or broken UTF-8,
/// dates beyond 2001 by more than 68 years, nesting beyond `kMaximumDepth`.
[[nodiscard]] std::expected<std::string, Error> toPropertyList(const Value& value);

} // namespace platform
