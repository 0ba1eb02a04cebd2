#include "platform/text/Text.h"

#include <algorithm>

#include <unicode/brkiter.h>
#include <unicode/bytestream.h>
#include <unicode/casemap.h>
#include <unicode/coll.h>
#include <unicode/stsearch.h>
#include <unicode/tblcoll.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>
#include <unicode/utf8.h>

namespace platform {

std::size_t utf16Length(std::string_view text)
{
    std::size_t units = 0;
    for (std::size_t i = 0; i < text.size();) {
        const auto lead = static_cast<unsigned char>(text[i]);
        const std::size_t length = lead < 0x80   ? 1
                                   : lead < 0xc2 ? 0
                                   : lead < 0xe0 ? 2
                                   : lead < 0xf0 ? 3
                                   : lead < 0xf5 ? 4
                                                 : 0;
        bool valid = length > 0 && i + length <= text.size();
        for (std::size_t k = 1; valid && k < length; ++k)
            valid = (static_cast<unsigned char>(text[i + k]) & 0xc0) == 0x80;
        units += valid && length == 4 ? 2 : 1;
        i += valid ? length : 1;
    }
    return units;
}

std::string_view cut(std::string_view text, std::size_t size)
{
    if (text.size() <= size) return text;
    while (size > 0 && (static_cast<unsigned char>(text[size]) & 0xc0) == 0x80) --size;
    return text.substr(0, size);
}

std::string lowerCased(std::string_view text)
{
    std::string result;
    result.reserve(text.size());
    if (std::ranges::all_of(text, [](char c) { return static_cast<unsigned char>(c) < 0x80; })) {
        for (const char c : text) result += c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
        return result;
    }
    icu::StringByteSink<std::string> sink(&result);
    UErrorCode status = U_ZERO_ERROR;
    icu::CaseMap::utf8ToLower("", 0, icu::StringPiece(text.data(), static_cast<int32_t>(text.size())), sink, nullptr,
                              status);
    return result;
}

namespace {

constexpr std::size_t kMaximumLength = 1u << 20; // bytes

icu::UnicodeString unicode(std::string_view text)
{
    text = text.substr(0, kMaximumLength);
    return icu::UnicodeString::fromUTF8(icu::StringPiece(text.data(), static_cast<int32_t>(text.size())));
}

/// An invalid locale name falls back to the root locale.
icu::Locale localeOf(const std::string& name)
{
    const icu::Locale locale(name.c_str());
    return locale.isBogus() ? icu::Locale::getRoot() : locale;
}

} // namespace

std::string_view trimmed(std::string_view text)
{
    const char* bytes = text.data();
    auto end = static_cast<int32_t>(std::min<std::size_t>(text.size(), INT32_MAX));
    int32_t begin = 0;
    UChar32 c = 0;
    for (int32_t next = 0; next < end; begin = next) {
        U8_NEXT(bytes, next, end, c);
        if (!u_isUWhiteSpace(c)) break;
    }
    for (int32_t before = end; before > begin; end = before) {
        U8_PREV(bytes, begin, before, c);
        if (!u_isUWhiteSpace(c)) break;
    }
    return text.substr(static_cast<std::size_t>(begin), static_cast<std::size_t>(end - begin));
}

struct WordFinder::Impl {
    std::unique_ptr<icu::BreakIterator> iterator; // null if ICU could not create one
};

WordFinder::WordFinder(const std::string& locale) : _impl(std::make_unique<Impl>())
{
    UErrorCode status = U_ZERO_ERROR;
    _impl->iterator.reset(icu::BreakIterator::createWordInstance(localeOf(locale), status));
}

WordFinder::~WordFinder() = default;

std::vector<std::string> WordFinder::wordsIn(std::string_view text)
{
    icu::BreakIterator* iterator = _impl->iterator.get();
    if (!iterator) return {};
    const icu::UnicodeString whole = unicode(text);
    std::string utf8;
    whole.toUTF8String(utf8);
    std::size_t byte = 0;
    int32_t unit = 0;
    const auto byteOf = [&](int32_t end) { // `end` must not decrease from call to call
        for (; unit < end; byte += static_cast<std::size_t>(U8_COUNT_TRAIL_BYTES(utf8[byte])) + 1)
            unit += static_cast<unsigned char>(utf8[byte]) < 0xf0 ? 1 : 2;
        return byte;
    };
    iterator->setText(whole);
    std::vector<std::string> words;
    int32_t begin = iterator->first();
    for (int32_t end = iterator->next(); end != icu::BreakIterator::DONE; begin = end, end = iterator->next()) {
        if (iterator->getRuleStatus() < UBRK_WORD_NONE_LIMIT) continue;
        const std::size_t first = byteOf(begin);
        words.emplace_back(utf8, first, byteOf(end) - first);
    }
    return words;
}

struct LocalizedSearch::Impl {
    icu::UnicodeString text;
    std::unique_ptr<icu::RuleBasedCollator> collator; // null if ICU could not create one
};

LocalizedSearch::LocalizedSearch(std::string_view text, const std::string& locale)
    : _impl(std::make_unique<Impl>(unicode(text)))
{
    UErrorCode status = U_ZERO_ERROR;
    std::unique_ptr<icu::Collator> collator(icu::Collator::createInstance(localeOf(locale), status));
    if (U_FAILURE(status) || !dynamic_cast<icu::RuleBasedCollator*>(collator.get())) return;
    _impl->collator.reset(static_cast<icu::RuleBasedCollator*>(collator.release()));
    _impl->collator->setStrength(icu::Collator::SECONDARY); // compares accents, ignores case
}

LocalizedSearch::~LocalizedSearch() = default;

bool LocalizedSearch::contains(std::string_view part) const
{
    const icu::UnicodeString pattern = unicode(part);
    UErrorCode status = U_ZERO_ERROR;
    if (!_impl->collator || _impl->text.isEmpty()) return false;
    if (_impl->collator->compare(pattern, icu::UnicodeString(), status) == UCOL_EQUAL) return false;
    icu::StringSearch search(pattern, _impl->text, _impl->collator.get(), nullptr, status);
    const int32_t found = search.first(status);
    return U_SUCCESS(status) && found != USEARCH_DONE;
}

} // namespace platform
