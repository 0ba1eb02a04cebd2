#include "tools/replay/Corpus.h"

#include <charconv>

#include <fmt/format.h>

namespace tavrin::replay {

namespace {

constexpr int kLongestPause = 3'600'000;   // milliseconds
constexpr std::size_t kLongestText = 1000; // bytes

/// Removes and returns the part of `text` before the first `end`, or all of it if there is no `end`.
std::string_view takeUpTo(char end, std::string_view& text)
{
    const auto at = std::min(text.find(end), text.size());
    const std::string_view part = text.substr(0, at);
    text.remove_prefix(std::min(at + 1, text.size()));
    return part;
}

void removeLastCharacter(std::string& text)
{
    while (!text.empty() && (static_cast<unsigned char>(text.back()) & 0xc0) == 0x80) text.pop_back();
    if (!text.empty()) text.pop_back();
}

/// Returns true if the text is as long as its first UTF-8 byte says.
bool isOneCharacter(std::string_view text)
{
    const auto first = text.empty() ? 0 : static_cast<unsigned char>(text[0]);
    const std::size_t length = first < 0x80 ? 1 : first < 0xc0 ? 0 : first < 0xe0 ? 2 : first < 0xf0 ? 3 : 4;
    return length > 0 && text.size() == length;
}

/// Adds a key to the query. Returns what is wrong with it, or an empty string.
std::string addKey(std::string_view token, TypedQuery& query)
{
    int pause = 0;
    const auto [end, error] = std::from_chars(token.data(), token.data() + token.size(), pause);
    const auto digits = static_cast<std::size_t>(end - token.data());
    if (error != std::errc() || pause < 0 || pause > kLongestPause || !token.substr(digits).starts_with(':'))
        return fmt::format("\"{}\" is not PAUSE:KEY", token);
    const std::string_view key = token.substr(digits + 1);
    std::string text = query.keys.empty() ? "" : query.keys.back().text;
    if (key == "⌫")
        removeLastCharacter(text);
    else if (key == "␣")
        text += ' ';
    else if (isOneCharacter(key))
        text += key;
    else
        return fmt::format("\"{}\" is not a key", key);
    if (text.size() > kLongestText) return fmt::format("the typed text is longer than {} bytes", kLongestText);
    query.keys.push_back({std::chrono::milliseconds(pause), std::move(text)});
    return {};
}

} // namespace

platform::Result<std::vector<TypedQuery>> parseCorpus(std::string_view text)
{
    std::vector<TypedQuery> queries;
    for (int number = 1; !text.empty(); ++number) {
        std::string_view line = takeUpTo('\n', text);
        if (line.empty() || line.starts_with('#')) continue;
        TypedQuery query{std::string(takeUpTo('\t', line)), {}};
        std::string problem = line.empty() ? "no keys after a tab" : "";
        while (problem.empty() && !line.empty()) problem = addKey(takeUpTo(' ', line), query);
        if (!problem.empty())
            return std::unexpected(platform::Error::posix(EINVAL, fmt::format("line {}: {}", number, problem)));
        queries.push_back(std::move(query));
    }
    return queries;
}

} // namespace tavrin::replay
