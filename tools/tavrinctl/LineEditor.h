#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace tavrin::ctl {

/// A line editor that is fed the bytes of a terminal one by one and reports after each if the text changed.
///
/// Accepts UTF-8 and drops invalid bytes. Handles Backspace, Delete, Left, Right, Home, End and their Ctrl- forms,
/// Ctrl-U (delete to the start), Ctrl-K (delete to the end) and Ctrl-W (delete a word). Skips any other escape sequence
/// as a whole. Draws nothing and deletes whole grapheme clusters: libedit draws on the terminal itself and edits code
/// points.
class LineEditor {
public:
    /// Maximum length of a line in bytes; further input is ignored.
    static constexpr std::size_t kLongest = 1000;

    /// The effect of a byte. Only `Edited` means that the text changed.
    enum class Action { None, Edited, Moved, Enter, Up, Down, PageUp, PageDown, Redraw, Suspend, End };

    /// Starts with `text` as if it had been typed.
    explicit LineEditor(std::string_view text = {});

    Action feed(char byte);

    [[nodiscard]] const std::string& text() const { return _text; }
    /// Returns the cursor as a byte offset into `text()`.
    [[nodiscard]] std::size_t cursor() const { return _cursor; }

private:
    enum class State { Ground, Escape, Sequence };

    Action control(unsigned char byte);
    Action sequence(char final);
    Action insert(std::string_view character);
    Action erase(std::size_t begin, std::size_t end);
    Action moveTo(std::size_t cursor);
    Action utf8(unsigned char byte);
    [[nodiscard]] std::size_t before() const; ///< start of the character before the cursor
    [[nodiscard]] std::size_t after() const;  ///< end of the character at the cursor
    [[nodiscard]] std::size_t wordBefore() const;

    std::string _text;
    std::size_t _cursor = 0;
    State _state = State::Ground;
    std::string _parameters; ///< of an escape sequence
    std::string _pending;    ///< the first bytes of an incomplete character
};

} // namespace tavrin::ctl
