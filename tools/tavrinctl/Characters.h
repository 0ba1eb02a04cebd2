#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace tavrin::ctl {

/// A grapheme cluster: a letter with its accents, an emoji with its modifiers.
struct Character {
    std::string_view bytes; ///< a part of the text it was found in
    int columns = 0;        ///< width on a terminal: 0, 1 or 2
};

/// Splits a UTF-8 text into grapheme clusters. Each invalid byte is a cluster of its own.
[[nodiscard]] std::vector<Character> charactersOf(std::string_view text);

[[nodiscard]] int columnsOf(std::string_view text);

/// Cuts a text to a width and marks the cut with an ellipsis.
[[nodiscard]] std::string clipped(std::string_view text, int columns);
/// The same, padded with blanks to the width.
[[nodiscard]] std::string padded(std::string_view text, int columns);

} // namespace tavrin::ctl
