#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

/// The length of a UTF-8 text in UTF-16 units. A byte that is no part of valid UTF-8 counts as one.
[[nodiscard]] std::size_t utf16Length(std::string_view text);

/// The first `size` bytes of a text, less where they would end within a character (UTF-8).
[[nodiscard]] std::string_view cut(std::string_view text, std::size_t size);

/// A text in lower case, by Unicode's rules without those of any one language.
[[nodiscard]] std::string lowerCased(std::string_view text);

/// The text without white space (Unicode's White_Space) at its ends.
[[nodiscard]] std::string_view trimmed(std::string_view text);

/// Divides texts into words, as `locale` ("de_CH") does, and keeps what it needs for that: making it costs more than
/// dividing a sentence. One thread at a time.
class WordFinder {
public:
    explicit WordFinder(const std::string& locale);
    ~WordFinder();
    WordFinder(WordFinder&&) noexcept;
    /// The words of a text, in order: letters, digits and ideographs, without what is between them. Texts beyond 1 MiB
    /// are cut off there.
    [[nodiscard]] std::vector<std::string> wordsIn(std::string_view text);

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

/// A text to look for others in, as `locale` compares them, without regard to case: "RÉSUMÉ" is in "my résumé", but
/// "resume" isn't. A part begins and ends where characters do: "e" is not in "é". Made to be asked often. One thread at
/// a time.
class LocalizedSearch {
public:
    /// Texts beyond 1 MiB are cut off there.
    LocalizedSearch(std::string_view text, const std::string& locale);
    ~LocalizedSearch();
    LocalizedSearch(LocalizedSearch&&) noexcept;
    /// Nothing that compares as empty is contained.
    [[nodiscard]] bool contains(std::string_view part) const;

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
