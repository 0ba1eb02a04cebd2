#pragma once

#include <algorithm>
#include <string_view>

namespace platform {

/// Whether the text has the form of a URL's scheme (RFC 3986, 3.1), without ":".
[[nodiscard]] inline bool isUrlScheme(std::string_view text)
{
    const auto isLetter = [](char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); };
    return !text.empty() && isLetter(text.front()) && std::ranges::all_of(text, [&](char c) {
        return isLetter(c) || (c >= '0' && c <= '9') || c == '+' || c == '-' || c == '.';
    });
}

} // namespace platform
