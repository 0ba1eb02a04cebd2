#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace devserver {

/// A text as it is compared: without case and diacritics, compatibility forms resolved, white space in single blanks
/// and none in front. UTF-8.
struct Folded {
    std::string text;
    /// For each byte of `text`, and its end: where in the original the character begins that it came from.
    std::vector<std::uint32_t> source;
};

[[nodiscard]] Folded fold(std::string_view text);

/// A word's bytes in a folded text.
struct Word {
    std::size_t begin = 0;
    std::size_t end = 0;
};

/// The words of a folded text, in order; a symbol or an emoji is a word. Scripts without blanks are cut by dictionary.
[[nodiscard]] std::vector<Word> wordsOf(std::string_view folded);

/// Lower case by the root locale's rules.
[[nodiscard]] std::string lowerCased(std::string_view text);

} // namespace devserver
