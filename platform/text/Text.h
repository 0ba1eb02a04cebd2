#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

/// Counts the UTF-16 units of a UTF-8 text. Every byte that is not part of valid UTF-8 counts as one unit.
[[nodiscard]] std::size_t utf16Length(std::string_view text);

/// Returns the longest prefix of at most `size` bytes that ends between two characters (UTF-8).
[[nodiscard]] std::string_view cut(std::string_view text, std::size_t size);

/// Returns the text in lower case, by Unicode's rules without those of any one language.
[[nodiscard]] std::string lowerCased(std::string_view text);

/// Returns the text without the white space (Unicode's White_Space) at both ends.
[[nodiscard]] std::string_view trimmed(std::string_view text);

/// Divides texts into words by the rules of a locale.
///
/// Construction costs more than dividing a sentence: keep the object. One thread at a time.
class WordFinder {
public:
    /// `locale` is "de_CH" or the like; an invalid name means the root locale.
    explicit WordFinder(const std::string& locale);
    ~WordFinder();
    WordFinder(WordFinder&&) noexcept;
    /// Returns the words in order: runs of letters, digits or ideographs, without what separates them. Reads at most
    /// 1 MiB of the text.
    [[nodiscard]] std::vector<std::string> wordsIn(std::string_view text);

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

/// A text that is searched for parts, as a locale compares texts and regardless of case: "my résumé" contains "RÉSUMÉ"
/// but not "resume". Parts match whole characters: "é" doesn't contain "e".
///
/// One thread at a time.
class LocalizedSearch {
public:
    /// Keeps at most 1 MiB of the text. An invalid `locale` means the root locale.
    LocalizedSearch(std::string_view text, const std::string& locale);
    ~LocalizedSearch();
    LocalizedSearch(LocalizedSearch&&) noexcept;
    /// Returns false for a part that compares as empty.
    [[nodiscard]] bool contains(std::string_view part) const;

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
