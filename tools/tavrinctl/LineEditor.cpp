#include "tools/tavrinctl/LineEditor.h"

#include <utility>

#include <unicode/utf8.h>

#include "tools/tavrinctl/Characters.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

namespace {

constexpr unsigned char ctrl(char letter)
{
    return static_cast<unsigned char>(letter & 0x1f);
}

constexpr unsigned char kEscape = 0x1b;
constexpr unsigned char kDelete = 0x7f;
constexpr std::size_t kLongestSequence = 32;

} // namespace

LineEditor::LineEditor(std::string_view text)
{
    for (const char byte : printable(text)) feed(byte);
}

LineEditor::Action LineEditor::feed(char c)
{
    const auto byte = static_cast<unsigned char>(c);
    if (byte == kEscape) {
        _pending.clear();
        _state = State::Escape;
        return Action::None;
    }
    if (_state == State::Escape) {
        _state = State::Ground;
        if (c == '[' || c == 'O') {
            _state = State::Sequence;
            _parameters.clear();
            return Action::None;
        }
    }
    if (_state == State::Sequence) {
        if (byte >= 0x20 && byte < 0x40 && _parameters.size() < kLongestSequence) {
            _parameters += c;
            return Action::None;
        }
        _state = State::Ground;
        if (byte >= 0x40 && byte < 0x7f) return sequence(c);
    }
    if (byte < 0x20 || byte == kDelete) {
        _pending.clear();
        return control(byte);
    }
    return utf8(byte);
}

LineEditor::Action LineEditor::control(unsigned char byte)
{
    switch (byte) {
    case ctrl('C'):
    case ctrl('D'): return Action::End;
    case ctrl('Z'): return Action::Suspend;
    case ctrl('L'): return Action::Redraw;
    case ctrl('M'):
    case ctrl('J'): return Action::Enter;
    case ctrl('H'):
    case kDelete: return erase(before(), _cursor);
    case ctrl('U'): return erase(0, _cursor);
    case ctrl('K'): return erase(_cursor, _text.size());
    case ctrl('W'): return erase(wordBefore(), _cursor);
    case ctrl('A'): return moveTo(0);
    case ctrl('E'): return moveTo(_text.size());
    case ctrl('B'): return moveTo(before());
    case ctrl('F'): return moveTo(after());
    case ctrl('P'): return Action::Up;
    case ctrl('N'): return Action::Down;
    case ctrl('I'): return insert(" ");
    default: return Action::None;
    }
}

LineEditor::Action LineEditor::sequence(char final)
{
    switch (final) {
    case 'A': return Action::Up;
    case 'B': return Action::Down;
    case 'C': return moveTo(after());
    case 'D': return moveTo(before());
    case 'H': return moveTo(0);
    case 'F': return moveTo(_text.size());
    case '~':
        if (_parameters == "1" || _parameters == "7") return moveTo(0);
        if (_parameters == "4" || _parameters == "8") return moveTo(_text.size());
        if (_parameters == "3") return erase(_cursor, after());
        if (_parameters == "5") return Action::PageUp;
        if (_parameters == "6") return Action::PageDown;
        return Action::None;
    default: return Action::None;
    }
}

/// Collects the bytes of a character and inserts it once it is complete. Drops an invalid one.
LineEditor::Action LineEditor::utf8(unsigned char byte)
{
    if (byte < 0x80 || U8_IS_LEAD(byte))
        _pending.clear();
    else if (_pending.empty())
        return Action::None;
    _pending += static_cast<char>(byte);

    const auto* bytes = reinterpret_cast<const std::uint8_t*>(_pending.data());
    const auto length = static_cast<std::int32_t>(_pending.size());
    const int expected = U8_COUNT_TRAIL_BYTES(bytes[0]) + 1;
    if (length < expected) return Action::None;
    UChar32 c = 0;
    std::int32_t at = 0;
    U8_NEXT(bytes, at, length, c);
    const std::string character = std::exchange(_pending, {});
    const bool isControl = c >= 0x80 && c < 0xa0;
    return c < 0 || isControl ? Action::None : insert(character);
}

LineEditor::Action LineEditor::insert(std::string_view character)
{
    if (_text.size() + character.size() > kLongest) return Action::None;
    _text.insert(_cursor, character);
    _cursor += character.size();
    return Action::Edited;
}

LineEditor::Action LineEditor::erase(std::size_t begin, std::size_t end)
{
    if (begin == end) return Action::None;
    _text.erase(begin, end - begin);
    _cursor = begin;
    return Action::Edited;
}

LineEditor::Action LineEditor::moveTo(std::size_t cursor)
{
    if (cursor == _cursor) return Action::None;
    _cursor = cursor;
    return Action::Moved;
}

std::size_t LineEditor::before() const
{
    std::size_t begin = 0;
    std::size_t end = 0;
    for (const Character& character : charactersOf(_text)) {
        if (end >= _cursor) break;
        begin = end;
        end += character.bytes.size();
    }
    return begin;
}

std::size_t LineEditor::after() const
{
    std::size_t end = 0;
    for (const Character& character : charactersOf(_text)) {
        end += character.bytes.size();
        if (end > _cursor) break;
    }
    return end;
}

std::size_t LineEditor::wordBefore() const
{
    std::size_t begin = _cursor;
    while (begin > 0 && _text[begin - 1] == ' ') --begin;
    while (begin > 0 && _text[begin - 1] != ' ') --begin;
    return begin;
}

} // namespace tavrin::ctl
