#pragma once

#include <cstddef>
#include <expected>
#include <string>
#include <string_view>

#include "platform/values/Error.h"
#include "platform/values/Value.h"

namespace platform {

/// Parses a binary property list ("bplist00") of at most `maximumSize` bytes, nested at most `kMaximumDepth` deep.
/// Returns an error for types that JSON doesn't have, except dates and data. Any thread.
[[nodiscard]] std::expected<Value, Error> parsePropertyList(std::string_view bytes,
                                                            std::size_t maximumSize = 64u << 20);

/// Writes a binary property list. The format has no null, so null entries of dictionaries and arrays are left out.
/// Integers beyond 2^63-1 become reals; dates are rounded to the microsecond. Returns an error for a null value, texts
/// with a NUL or invalid UTF-8, dates more than 68 years from 2001, and nesting beyond `kMaximumDepth`. Any thread.
[[nodiscard]] std::expected<std::string, Error> toPropertyList(const Value& value);

} // namespace platform
