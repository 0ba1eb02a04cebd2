#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace platform {

/// The length of a UTF-8 text in UTF-16 units. A byte that is no part of valid UTF-8 counts as one.
[[nodiscard]] std::size_t utf16Length(std::string_view text);

/// A text in lower case, by Unicode's rules without those of any one language.
[[nodiscard]] std::string lowerCased(std::string_view text);

} // namespace platform
