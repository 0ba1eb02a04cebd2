#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace tavrin::ctl {

/// What a user sees as one character: a letter with its accents, an emoji with its modifiers.
struct Character {
    std::string_view bytes; ///< of the text that it was found in
    int columns = 0;        ///< that a terminal gives it: 0, 1 or 2
};

/// The characters of a UTF-8 text, in order. A byte that is no part of valid UTF-8 counts as one.
[[nodiscard]] std::vector<Character> charactersOf(std::string_view text);

[[nodiscard]] int columnsOf(std::string_view text);

/// As much of the text as fits; what was cut is an ellipsis.
[[nodiscard]] std::string clipped(std::string_view text, int columns);
/// The same, filled up with blanks.
[[nodiscard]] std::string padded(std::string_view text, int columns);

} // namespace tavrin::ctl
