#pragma once

#include <string>
#include <vector>

namespace tavrin::ctl {

struct Exchange;

/// A line on the screen, in one style.
struct ScreenLine {
    enum class Style { Plain, Bold, Dim };
    std::string text;
    Style style = Style::Plain;
    bool operator==(const ScreenLine&) const = default;
};

struct ScreenSize {
    int columns = 80;
    int rows = 24;
};

/// What a search as one types shows: the line that is typed, the results of the newest answer, and what became of the
/// latest keys, the newest last.
struct SearchView {
    std::string text;       ///< printable
    std::size_t cursor = 0; ///< bytes of the text before it
    std::vector<ScreenLine> answer;
    std::size_t scrolled = 0; ///< lines of the answer that are above the screen
    std::vector<std::string> keys;
};

/// What is drawn: no line is wider than the screen, and there are no more of them than it has rows.
struct ScreenFrame {
    std::vector<ScreenLine> lines;
    int cursorColumn = 0; ///< in the first line; the first is 0
};

/// Lays the view out. What doesn't fit is left out: keys first, then results; the line that is typed is always there,
/// the part around the cursor where it is too long.
[[nodiscard]] ScreenFrame layOut(const SearchView& view, ScreenSize size);
/// How many lines of the answer there is room for.
[[nodiscard]] std::size_t answerRows(std::size_t keys, ScreenSize size);

/// What a terminal is sent to show the frame in place of what it shows; `colours` says whether styles are.
[[nodiscard]] std::string drawn(const ScreenFrame& frame, bool colours);

/// The lines of an answer: results by section, suggestions. What it is where it has none.
[[nodiscard]] std::vector<ScreenLine> answerLines(const Exchange& exchange);
/// The line of a key: the query, network, cache or skipped, the latency, and what came.
[[nodiscard]] std::string keyLine(const Exchange& exchange);

} // namespace tavrin::ctl
