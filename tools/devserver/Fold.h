#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace devserver {

/// A text folded for comparison, in UTF-8: without case and diacritics, with compatibility forms resolved, each run of
/// white space replaced by one blank, and no leading blank.
struct Folded {
    std::string text;
    /// For each byte of `text`, and for its end: the position in the original of the character that it came from.
    std::vector<std::uint32_t> source;
};

[[nodiscard]] Folded fold(std::string_view text);

/// The position of a word in a folded text, in bytes.
struct Word {
    std::size_t begin = 0;
    std::size_t end = 0;
};

/// Returns the words of a folded text, in order. A symbol or an emoji is a word. Text in scripts without blanks is
/// split with a dictionary.
[[nodiscard]] std::vector<Word> wordsOf(std::string_view folded);

/// Returns the text in lower case, by the rules of the root locale.
[[nodiscard]] std::string lowerCased(std::string_view text);

} // namespace devserver
