#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

/// Counts the UTF-16 units of a UTF-8 text. Every byte that is not part of valid UTF-8 counts as one unit.
[[nodiscard]] std::size_t utf16Length(std::string_view text);

/// Returns the longest prefix of at most `size` bytes that ends at a UTF-8 character boundary.
[[nodiscard]] std::string_view cut(std::string_view text, std::size_t size);

/// Returns the text in lower case by the rules of the root locale.
[[nodiscard]] std::string lowerCased(std::string_view text);

/// Returns the text without white space (Unicode property White_Space) at both ends.
[[nodiscard]] std::string_view trimmed(std::string_view text);

/// Splits texts into words by the rules of a locale (ICU word boundaries, UAX #29).
///
/// Construction costs more than splitting a sentence: keep the object. One thread at a time.
class WordFinder {
public:
    /// `locale` is a name like "de_CH"; an invalid name selects the root locale.
    explicit WordFinder(const std::string& locale);
    ~WordFinder();
    /// Returns the words in order: runs of letters, digits or ideographs, without separators. Reads at most 1 MiB of
    /// the text. Returns nothing if ICU has no rules for the locale.
    [[nodiscard]] std::vector<std::string> wordsIn(std::string_view text);

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

/// A text that can be searched for parts by the comparison rules of a locale, ignoring case: "my résumé" contains
/// "RÉSUMÉ" but not "resume". A part matches whole characters: "é" doesn't contain "e".
///
/// One thread at a time.
class LocalizedSearch {
public:
    /// Keeps at most 1 MiB of the text. An invalid `locale` selects the root locale.
    LocalizedSearch(std::string_view text, const std::string& locale);
    ~LocalizedSearch();
    /// Returns true if the text contains `part`; false if `part` compares equal to the empty text.
    [[nodiscard]] bool contains(std::string_view part) const;

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
