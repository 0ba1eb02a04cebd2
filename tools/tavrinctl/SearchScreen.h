#pragma once

#include <string>
#include <vector>

namespace tavrin::ctl {

struct Exchange;

/// A line on the screen with one style.
struct ScreenLine {
    enum class Style { Plain, Bold, Dim };
    std::string text;
    Style style = Style::Plain;
    bool operator==(const ScreenLine&) const = default;
};

/// The line of a key. In a narrow window its query is cut first, its details next, and its outcome last.
struct KeyLine {
    std::string query;
    std::string outcome; ///< its source or outcome, and the latency
    std::string details;
};

struct ScreenSize {
    int columns = 80;
    int rows = 24;
};

/// The contents of the screen: the typed line, the results of the newest answer, and the outcomes of the latest keys,
/// the newest last.
struct SearchView {
    std::string text;       ///< printable
    std::size_t cursor = 0; ///< bytes of the text before it
    std::vector<ScreenLine> answer;
    std::size_t scrolled = 0; ///< lines of the answer that are above the screen
    std::vector<KeyLine> keys;
};

/// The lines to draw: at most as many as the screen has rows, none wider than the screen.
struct ScreenFrame {
    std::vector<ScreenLine> lines;
    int cursorColumn = 0; ///< in the first line; the first is 0
};

/// Lays out the view. Drops what does not fit, keys first, then results. The typed line is always shown, clipped around
/// the cursor.
[[nodiscard]] ScreenFrame layOut(const SearchView& view, ScreenSize size);
/// Returns the number of rows for the answer.
[[nodiscard]] std::size_t answerRows(std::size_t keys, ScreenSize size);

/// Returns the bytes that make a terminal show the frame; with styles if `colours` is set.
[[nodiscard]] std::string drawn(const ScreenFrame& frame, bool colours);

/// Returns the lines of an answer: results by section and suggestions, or the reason for having none.
[[nodiscard]] std::vector<ScreenLine> answerLines(const Exchange& exchange);
/// Returns the line of a key: the query, its source or outcome, the latency and the number of results.
[[nodiscard]] KeyLine keyLine(const Exchange& exchange);

} // namespace tavrin::ctl
