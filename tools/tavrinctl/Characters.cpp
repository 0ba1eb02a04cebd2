#include "tools/tavrinctl/Characters.h"

#include <memory>

#include <unicode/brkiter.h>
#include <unicode/uchar.h>
#include <unicode/utext.h>
#include <unicode/utf8.h>

namespace tavrin::ctl {

namespace {

int columnsOfCodePoint(UChar32 c)
{
    const int category = u_charType(c);
    if (category == U_NON_SPACING_MARK || category == U_ENCLOSING_MARK || category == U_FORMAT_CHAR) return 0;
    const int width = u_getIntPropertyValue(c, UCHAR_EAST_ASIAN_WIDTH);
    const bool wide = width == U_EA_WIDE || width == U_EA_FULLWIDTH || u_hasBinaryProperty(c, UCHAR_EMOJI_PRESENTATION);
    return wide ? 2 : 1;
}

int columnsOfCharacter(std::string_view bytes)
{
    constexpr UChar32 kAsEmoji = 0xfe0f;
    int columns = 0;
    for (std::size_t at = 0; at < bytes.size();) {
        UChar32 c = 0;
        U8_NEXT_OR_FFFD(reinterpret_cast<const std::uint8_t*>(bytes.data()), at, bytes.size(), c);
        columns = c == kAsEmoji ? 2 : std::max(columns, columnsOfCodePoint(c));
    }
    return columns;
}

} // namespace

std::vector<Character> charactersOf(std::string_view text)
{
    UErrorCode status = U_ZERO_ERROR;
    std::unique_ptr<icu::BreakIterator> boundaries(
        icu::BreakIterator::createCharacterInstance(icu::Locale::getRoot(), status));
    UText view = UTEXT_INITIALIZER;
    utext_openUTF8(&view, text.data(), static_cast<std::int64_t>(text.size()), &status);
    if (U_SUCCESS(status)) boundaries->setText(&view, status);

    std::vector<Character> characters;
    if (U_SUCCESS(status)) {
        std::int32_t begin = boundaries->first();
        for (std::int32_t end = boundaries->next(); end != icu::BreakIterator::DONE;
             begin = end, end = boundaries->next()) {
            const auto bytes = text.substr(static_cast<std::size_t>(begin), static_cast<std::size_t>(end - begin));
            characters.push_back({bytes, columnsOfCharacter(bytes)});
        }
    }
    utext_close(&view);
    return characters;
}

int columnsOf(std::string_view text)
{
    int columns = 0;
    for (const Character& character : charactersOf(text)) columns += character.columns;
    return columns;
}

std::string clipped(std::string_view text, int columns)
{
    if (columnsOf(text) <= columns) return std::string(text);
    std::string result;
    int left = columns - 1; // the ellipsis takes one
    if (left < 0) return result;
    for (const Character& character : charactersOf(text)) {
        left -= character.columns;
        if (left < 0) break;
        result += character.bytes;
    }
    return result + "…";
}

std::string padded(std::string_view text, int columns)
{
    std::string result = clipped(text, columns);
    const int missing = columns - columnsOf(result);
    return result + std::string(static_cast<std::size_t>(std::max(missing, 0)), ' ');
}

} // namespace tavrin::ctl
