#pragma once

#include <algorithm>
#include <string_view>

namespace platform {

/// Returns true if the text, without ":", has the form of a URL scheme (RFC 3986, 3.1). Any thread.
[[nodiscard]] inline bool isUrlScheme(std::string_view text)
{
    const auto isLetter = [](char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); };
    return !text.empty() && isLetter(text.front()) && std::ranges::all_of(text, [&](char c) {
        return isLetter(c) || (c >= '0' && c <= '9') || c == '+' || c == '-' || c == '.';
    });
}

} // namespace platform
