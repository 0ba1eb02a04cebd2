#include "tools/tavrinctl/SearchScreen.h"

#include <algorithm>
#include <span>

#include <fmt/format.h>

#include "tools/tavrinctl/Characters.h"
#include "tools/tavrinctl/Results.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

namespace {

using Style = ScreenLine::Style;

constexpr std::string_view kPrompt = "Search: ";
constexpr std::string_view kHelp = "Ctrl-C ends, Ctrl-U clears, arrows move and scroll";
constexpr int kMostKeys = 6;
constexpr int kWidestQuery = 24;
constexpr int kOutcomeColumns = 23; // with the blanks before it
constexpr int kFewestDetails = 8;   // columns; fewer say nothing

/// The number of rows of each part, from top to bottom.
struct Rows {
    int gap = 0; ///< below the typed line
    int answer = 0;
    int keys = 0;
    bool help = false;
};

Rows share(int rows, std::size_t keys)
{
    Rows result;
    int left = rows - 1; // the typed line
    result.help = left >= 6;
    if (result.help) --left;
    const int most = std::min(kMostKeys, left / 3);
    result.keys = std::min(most, static_cast<int>(std::min<std::size_t>(keys, kMostKeys)));
    if (result.keys > 0) left -= result.keys + 1; // a blank line above them
    result.gap = left > 3 ? 1 : 0;
    result.answer = left - result.gap;
    return result;
}

/// The part of the text around the cursor that fits.
struct Part {
    std::string text;
    int cursorColumn;
};
Part aroundCursor(std::string_view text, std::size_t cursor, int columns)
{
    const int wanted = columnsOf(text.substr(0, cursor));
    int skipped = 0;
    std::size_t begin = 0;
    for (const Character& character : charactersOf(text)) {
        if (wanted - skipped < columns) break; // leaves a column for the cursor
        skipped += character.columns;
        begin += character.bytes.size();
    }
    std::string part;
    int left = columns;
    for (const Character& character : charactersOf(text.substr(begin))) {
        left -= character.columns;
        if (left < 0) break;
        part += character.bytes;
    }
    return {part, std::max(wanted - skipped, 0)};
}

std::string keyText(const KeyLine& key, int queryColumns, int columns)
{
    const std::string line = fmt::format("{}  {}", padded(key.query, queryColumns), key.outcome);
    return columnsOf(line) + kFewestDetails > columns ? line : line + "  " + key.details;
}

} // namespace

std::size_t answerRows(std::size_t keys, ScreenSize size)
{
    return static_cast<std::size_t>(share(size.rows, keys).answer);
}

ScreenFrame layOut(const SearchView& view, ScreenSize size)
{
    const int columns = std::max(size.columns, 1);
    const Rows rows = share(std::max(size.rows, 1), view.keys.size());
    ScreenFrame frame;

    const int promptColumns = columns > 2 * static_cast<int>(kPrompt.size()) ? static_cast<int>(kPrompt.size()) : 0;
    const Part typed = aroundCursor(view.text, view.cursor, columns - promptColumns);
    frame.lines.push_back(
        {std::string(kPrompt.substr(0, static_cast<std::size_t>(promptColumns))) + typed.text, Style::Bold});
    frame.cursorColumn = promptColumns + typed.cursorColumn;

    const auto add = [&](std::string_view text, Style style = Style::Plain) {
        frame.lines.push_back({clipped(text, columns), style});
    };
    const auto fillTo = [&](int row) {
        while (static_cast<int>(frame.lines.size()) < row) frame.lines.emplace_back();
    };
    fillTo(1 + rows.gap);
    if (rows.answer > 0) {
        const auto room = static_cast<std::size_t>(rows.answer);
        const std::size_t begin = std::min(view.scrolled, view.answer.size());
        const std::size_t end = std::min(begin + room, view.answer.size());
        const bool more = end < view.answer.size();
        for (std::size_t i = begin; i < end - (more ? 1 : 0); ++i) add(view.answer[i].text, view.answer[i].style);
        if (more) add(fmt::format("  … {} more lines", view.answer.size() - end + 1), Style::Dim);
    }
    const int below = rows.keys + (rows.keys > 0 ? 1 : 0) + (rows.help ? 1 : 0);
    fillTo(std::max(size.rows, 1) - below);
    if (rows.keys > 0) {
        add("");
        const int queryColumns = std::clamp(columns - kOutcomeColumns, 6, kWidestQuery);
        for (const KeyLine& key : std::span(view.keys).last(static_cast<std::size_t>(rows.keys)))
            add(keyText(key, queryColumns, columns));
    }
    if (rows.help) add(kHelp, Style::Dim);
    return frame;
}

std::string drawn(const ScreenFrame& frame, bool colours)
{
    std::string bytes = "\033[?25l"; // hides the cursor while it moves
    for (std::size_t row = 0; row < frame.lines.size(); ++row) {
        const ScreenLine& line = frame.lines[row];
        const char* style = line.style == Style::Bold ? "\033[1m" : line.style == Style::Dim ? "\033[2m" : "";
        // Clears first: after a full line the cursor is still on its last character.
        bytes += fmt::format("\033[{};1H\033[K", row + 1);
        bytes += colours && *style ? style + line.text + "\033[0m" : line.text;
    }
    return bytes + fmt::format("\033[1;{}H\033[?25h", frame.cursorColumn + 1);
}

std::vector<ScreenLine> answerLines(const Exchange& exchange)
{
    if (exchange.outcome() != Outcome::Answered) return {{explanation(exchange), Style::Dim}};
    std::vector<ScreenLine> lines;
    const platform::Value raw = rawResponse(exchange);
    std::string section;
    for (const ListedResult& result : resultsIn(raw)) {
        if (result.section != section) lines.push_back({printable(section = result.section), Style::Bold});
        std::string text = "  " + printable(result.title);
        if (!result.description.empty()) text += " – " + printable(result.description);
        lines.push_back({std::move(text)});
    }
    std::string suggestions;
    for (const std::string& suggestion : suggestionsIn(raw))
        suggestions += (suggestions.empty() ? "" : " · ") + printable(suggestion);
    if (!suggestions.empty()) {
        lines.push_back({"Suggestions", Style::Bold});
        lines.push_back({"  " + suggestions});
    }
    if (lines.empty()) lines.push_back({"no results", Style::Dim});
    return lines;
}

KeyLine keyLine(const Exchange& exchange)
{
    const std::string query = "\"" + printable(exchange.query) + "\"";
    if (exchange.waiting()) return {query, "…", ""};
    return {query, fmt::format("{:<9} {:>8.1f} ms", mark(exchange), exchange.latency), explanation(exchange)};
}

} // namespace tavrin::ctl
