#include "tools/devserver/Fold.h"

#include <memory>
#include <stdexcept>

#include <unicode/brkiter.h>
#include <unicode/normalizer2.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>
#include <unicode/utext.h>
#include <unicode/utf8.h>

namespace devserver {
namespace {

void check(UErrorCode status)
{
    if (U_FAILURE(status)) throw std::runtime_error(std::string("ICU: ") + u_errorName(status));
}

bool isMark(UChar32 c)
{
    return (U_GET_GC_MASK(c) & U_GC_M_MASK) != 0;
}

std::string foldCharacter(UChar32 c, const icu::Normalizer2& decomposition)
{
    UErrorCode status = U_ZERO_ERROR;
    const icu::UnicodeString parts = decomposition.normalize(icu::UnicodeString(c).foldCase(), status);
    check(status);
    icu::UnicodeString kept;
    for (int32_t i = 0; i < parts.length(); i = parts.moveIndex32(i, 1))
        if (!isMark(parts.char32At(i))) kept.append(parts.char32At(i));
    std::string folded;
    return kept.toUTF8String(folded);
}

} // namespace

Folded fold(std::string_view text)
{
    UErrorCode status = U_ZERO_ERROR;
    const icu::Normalizer2* decomposition = icu::Normalizer2::getNFKDInstance(status);
    check(status);
    Folded result;
    const auto append = [&](std::string_view piece, std::size_t origin) {
        result.text += piece;
        result.source.insert(result.source.end(), piece.size(), static_cast<std::uint32_t>(origin));
    };
    const auto length = static_cast<int32_t>(text.size());
    for (int32_t i = 0; i < length;) {
        const auto origin = static_cast<std::size_t>(i);
        UChar32 c = 0;
        U8_NEXT_OR_FFFD(text.data(), i, length, c);
        if (!u_isUWhiteSpace(c))
            append(foldCharacter(c, *decomposition), origin);
        else if (!result.text.empty() && result.text.back() != ' ')
            append(" ", origin);
    }
    result.source.push_back(static_cast<std::uint32_t>(text.size()));
    return result;
}

std::vector<Word> wordsOf(std::string_view folded)
{
    UErrorCode status = U_ZERO_ERROR;
    const std::unique_ptr<icu::BreakIterator> breaks(
        icu::BreakIterator::createWordInstance(icu::Locale::getRoot(), status));
    UText* text = utext_openUTF8(nullptr, folded.data(), static_cast<int64_t>(folded.size()), &status);
    check(status);
    const std::unique_ptr<UText, decltype(&utext_close)> owner(text, utext_close);
    breaks->setText(text, status);
    check(status);
    std::vector<Word> words;
    for (int32_t begin = breaks->first(), end = breaks->next(); end != icu::BreakIterator::DONE;
         begin = end, end = breaks->next()) {
        UChar32 c = 0;
        U8_GET_OR_FFFD(reinterpret_cast<const std::uint8_t*>(folded.data()), 0, begin,
                       static_cast<int32_t>(folded.size()), c);
        if (!u_isUWhiteSpace(c) && !u_ispunct(c))
            words.push_back({static_cast<std::size_t>(begin), static_cast<std::size_t>(end)});
    }
    return words;
}

std::string lowerCased(std::string_view text)
{
    std::string result;
    return icu::UnicodeString::fromUTF8(icu::StringPiece(text.data(), static_cast<int32_t>(text.size())))
        .toLower(icu::Locale::getRoot())
        .toUTF8String(result);
}

} // namespace devserver
