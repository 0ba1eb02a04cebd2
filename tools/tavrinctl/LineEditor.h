#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace tavrin::ctl {

/// A line that is typed into a terminal, byte by byte as the terminal sends it.
///
/// Takes UTF-8 and drops what is none. Knows Backspace, Delete, Left, Right, Home, End and their Ctrl- forms, Ctrl-U
/// (up to the cursor), Ctrl-K (from there) and Ctrl-W (a word back); what else a key may send is skipped whole.
class LineEditor {
public:
    /// Longer lines take no more.
    static constexpr std::size_t kLongest = 1000; // bytes

    /// What a byte led to. The line changed with `Edited` only.
    enum class Action { None, Edited, Moved, Enter, Up, Down, PageUp, PageDown, Redraw, Suspend, End };

    /// As if `text` had been typed.
    explicit LineEditor(std::string_view text = {});

    Action feed(char byte);

    [[nodiscard]] const std::string& text() const { return _text; }
    /// Where the next character goes: a count of bytes.
    [[nodiscard]] std::size_t cursor() const { return _cursor; }

private:
    enum class State { Ground, Escape, Sequence };

    Action control(unsigned char byte);
    Action sequence(char final);
    Action insert(std::string_view character);
    Action erase(std::size_t begin, std::size_t end);
    Action moveTo(std::size_t cursor);
    Action utf8(unsigned char byte);
    [[nodiscard]] std::size_t before() const; ///< where the character before the cursor begins
    [[nodiscard]] std::size_t after() const;  ///< where the one at the cursor ends
    [[nodiscard]] std::size_t wordBefore() const;

    std::string _text;
    std::size_t _cursor = 0;
    State _state = State::Ground;
    std::string _parameters; ///< of an escape sequence
    std::string _pending;    ///< the first bytes of a character
};

} // namespace tavrin::ctl
