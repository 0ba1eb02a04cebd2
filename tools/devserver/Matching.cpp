#include "tools/devserver/Matching.h"

#include <algorithm>
#include <tuple>

namespace devserver {
namespace {

struct Query {
    explicit Query(std::string_view text) : lower(lowerCased(text)), folded(fold(text).text), words(wordsOf(folded)) {}

    [[nodiscard]] std::string_view word(std::size_t index) const
    {
        return std::string_view(folded).substr(words[index].begin, words[index].end - words[index].begin);
    }
    /// A blank after the last word means that the word is complete.
    [[nodiscard]] bool lastWordIsOpen() const { return !folded.empty() && folded.back() != ' '; }

    std::string lower;
    std::string folded;
    std::vector<Word> words;
};

/// Returns the title from folded position `from` to `to`, in lower case. If `from` splits a character ("ß" after its
/// first "s"), the rest of that character is in its folded form.
std::string titlePart(const Entry& entry, std::size_t from, std::size_t to)
{
    const Folded& title = entry.foldedTitle;
    std::string part;
    while (from > 0 && from < to && title.source[from] == title.source[from - 1]) part += title.text[from++];
    const std::string_view original = entry.title;
    return part + lowerCased(original.substr(title.source[from], title.source[to] - title.source[from]));
}

/// Matches if the title has the query's text at the start of one of its words.
std::optional<Match> matchRun(const Entry& entry, const Query& query)
{
    const std::string_view title = entry.foldedTitle.text;
    for (const Word& start : entry.titleWords) {
        if (!title.substr(start.begin).starts_with(query.folded)) continue;
        const std::size_t end = start.begin + query.folded.size();
        Match match{&entry, Quality::InsideTitle, {}, {}};
        if (start.begin == entry.titleWords.front().begin)
            match.quality = end == title.size() ? Quality::WholeTitle : Quality::TitleStart;
        // The word in which the query ends, or the next one if it ends between words.
        const auto last = std::ranges::find_if(entry.titleWords, [&](const Word& word) { return word.end >= end; });
        const std::size_t lastEnd = last == entry.titleWords.end() ? title.size() : last->end;
        match.completion = query.lower + titlePart(entry, end, lastEnd);
        if (end < title.size()) match.suggestion = query.lower + titlePart(entry, end, title.size());
        return match;
    }
    return std::nullopt;
}

/// Returns the rest of the entry's first word that starts with `prefix`.
std::optional<std::string> restOfWord(const Entry& entry, std::string_view prefix)
{
    for (const Word& word : entry.titleWords) {
        const std::string_view text =
            std::string_view(entry.foldedTitle.text).substr(word.begin, word.end - word.begin);
        if (text.starts_with(prefix)) return titlePart(entry, word.begin + prefix.size(), word.end);
    }
    for (const std::string& keyword : entry.foldedKeywords)
        if (keyword.starts_with(prefix)) return keyword.substr(prefix.size());
    return std::nullopt;
}

std::optional<Match> matchWords(const Entry& entry, const Query& query)
{
    Match match{&entry, Quality::Words, {}, {}};
    std::optional<std::string> rest;
    for (std::size_t i = 0; i < query.words.size(); ++i) {
        rest = restOfWord(entry, query.word(i));
        if (!rest) return std::nullopt;
    }
    if (!rest) return std::nullopt; // no words
    if (query.lastWordIsOpen()) match.completion = query.lower + *rest;
    return match;
}

std::optional<Match> matchQuery(const Entry& entry, const Query& query)
{
    if (query.folded.empty()) return std::nullopt;
    auto match = matchRun(entry, query);
    return match ? match : matchWords(entry, query);
}

} // namespace

std::vector<Match> findMatches(const Catalogue& catalogue, std::string_view text, const Section* section)
{
    const Query query(text);
    std::vector<Match> matches;
    for (const Entry& entry : catalogue.entries()) {
        if (section && entry.section != section) continue;
        if (auto match = matchQuery(entry, query)) matches.push_back(std::move(*match));
    }
    std::ranges::stable_sort(matches, [](const Match& a, const Match& b) {
        return std::tuple(b.quality, b.entry->popularity, std::string_view(a.entry->title)) <
               std::tuple(a.quality, a.entry->popularity, std::string_view(b.entry->title));
    });
    return matches;
}

} // namespace devserver
