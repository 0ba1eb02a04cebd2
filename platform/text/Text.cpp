#include "platform/text/Text.h"

#include <algorithm>
#include <bit>
#include <cstdint>
#include <utility>

#include <unicode/brkiter.h>
#include <unicode/bytestream.h>
#include <unicode/casemap.h>
#include <unicode/coleitr.h>
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

/// A name that is none stands for no language at all.
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
    std::unique_ptr<icu::BreakIterator> iterator; // null where ICU has none
};

WordFinder::WordFinder(const std::string& locale) : _impl(std::make_unique<Impl>())
{
    UErrorCode status = U_ZERO_ERROR;
    _impl->iterator.reset(icu::BreakIterator::createWordInstance(localeOf(locale), status));
}

WordFinder::~WordFinder() = default;
WordFinder::WordFinder(WordFinder&&) noexcept = default;

std::vector<std::string> WordFinder::wordsIn(std::string_view text)
{
    icu::BreakIterator* iterator = _impl->iterator.get();
    if (!iterator) return {};
    const icu::UnicodeString whole = unicode(text);
    std::string utf8;
    whole.toUTF8String(utf8);
    std::size_t byte = 0;
    int32_t unit = 0;
    const auto byteOf = [&](int32_t end) { // of a place that isn't before the last one
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

namespace {

constexpr std::uint32_t kNoElement = UINT32_MAX;

/// What a text compares as: a weight, of the characters in [begin, end). The second and later weights of a character
/// are of no characters.
struct Element {
    std::uint32_t weight;
    int32_t begin, end;
    std::uint32_t next = kNoElement; // in the same bucket
};

/// Of the orders that ICU's iterators give, what counts: accents do, case doesn't. 0 of what counts for nothing.
std::uint32_t weightOf(int32_t order)
{
    return static_cast<std::uint32_t>(order) & 0xffffff00;
}

/// Whether a user takes what is before `at` and what is behind it for different characters. False where that would need
/// looking into: below U+0300 nothing combines.
bool surelyBetweenCharacters(const icu::UnicodeString& text, int32_t at)
{
    constexpr char16_t kFirstCombining = 0x300;
    if (at == 0 || at == text.length()) return true;
    return text[at - 1] < kFirstCombining && text[at] < kFirstCombining && text[at] != u'\n';
}

} // namespace

/// Looking for a part with ICU's search takes longer than all else that a caller does with it, as it goes through the
/// text's weights each time. Here they are kept in an index, and ICU's search decides where it isn't clear from them.
struct LocalizedSearch::Impl {
    icu::UnicodeString text;
    std::unique_ptr<icu::RuleBasedCollator> collator;            // null where ICU has none
    std::vector<Element> elements;                               // of the text
    std::vector<std::uint32_t> buckets;                          // first elements, by weight and next weight
    std::unique_ptr<icu::CollationElementIterator> partIterator; // null where the index isn't used
    std::vector<std::uint32_t> part;

    Impl(std::string_view text_, const std::string& locale) : text(unicode(text_))
    {
        UErrorCode status = U_ZERO_ERROR;
        std::unique_ptr<icu::Collator> any(icu::Collator::createInstance(localeOf(locale), status));
        if (U_FAILURE(status) || !dynamic_cast<icu::RuleBasedCollator*>(any.get())) return;
        collator.reset(static_cast<icu::RuleBasedCollator*>(any.release()));
        collator->setStrength(icu::Collator::SECONDARY);
        // Where punctuation counts for nothing, that depends on what follows it.
        if (collator->getAttribute(UCOL_ALTERNATE_HANDLING, status) != UCOL_NON_IGNORABLE || U_FAILURE(status)) return;
        index();
    }

    void index()
    {
        const std::unique_ptr<icu::CollationElementIterator> iterator(collator->createCollationElementIterator(text));
        partIterator.reset(collator->createCollationElementIterator(icu::UnicodeString()));
        if (!iterator || !partIterator) return partIterator.reset();
        UErrorCode status = U_ZERO_ERROR;
        int32_t begin = 0;
        for (int32_t order; (order = iterator->next(status)) != icu::CollationElementIterator::NULLORDER;) {
            if (U_FAILURE(status)) return partIterator.reset();
            const int32_t end = iterator->getOffset();
            if (const std::uint32_t weight = weightOf(order)) elements.push_back({weight, begin, end});
            begin = end;
        }
        buckets.resize(std::bit_ceil(elements.size() + 1), kNoElement);
        for (std::size_t i = elements.size(); i-- > 1;) {
            std::uint32_t& first = buckets[bucketOf(elements[i - 1].weight, elements[i].weight)];
            elements[i - 1].next = std::exchange(first, static_cast<std::uint32_t>(i - 1));
        }
    }

    [[nodiscard]] std::size_t bucketOf(std::uint32_t weight, std::uint32_t next) const
    {
        constexpr std::uint64_t kMix = 0x9e3779b97f4a7c15;
        return ((weight * kMix ^ next) * kMix >> 32) & (buckets.size() - 1);
    }

    enum class Found { No, Yes, Perhaps };

    Found find(const icu::UnicodeString& pattern)
    {
        UErrorCode status = U_ZERO_ERROR;
        partIterator->setText(pattern, status);
        part.clear();
        for (int32_t order; (order = partIterator->next(status)) != icu::CollationElementIterator::NULLORDER;) {
            if (U_FAILURE(status)) return Found::Perhaps;
            if (const std::uint32_t weight = weightOf(order)) part.push_back(weight);
        }
        if (part.empty()) return Found::No;
        const bool single = part.size() == 1; // rare
        Found found = Found::No;
        for (std::size_t place = single ? 0 : buckets[bucketOf(part[0], part[1])]; place < elements.size();
             place = single ? place + 1 : elements[place].next) {
            if (elements.size() - place < part.size()) continue;
            const auto begin = elements.begin() + static_cast<std::ptrdiff_t>(place),
                       end = begin + static_cast<std::ptrdiff_t>(part.size());
            if (!std::equal(part.begin(), part.end(), begin, [](auto weight, auto& e) { return weight == e.weight; }))
                continue;
            const bool whole = begin->begin < begin->end && (end == elements.end() || end->begin < end->end);
            if (whole && surelyBetweenCharacters(text, begin->begin) && surelyBetweenCharacters(text, (end - 1)->end))
                return Found::Yes;
            found = Found::Perhaps;
        }
        return found;
    }

    [[nodiscard]] bool search(const icu::UnicodeString& pattern) const
    {
        UErrorCode status = U_ZERO_ERROR;
        if (collator->compare(pattern, icu::UnicodeString(), status) == UCOL_EQUAL) return false;
        icu::StringSearch search(pattern, text, collator.get(), nullptr, status);
        const int32_t found = search.first(status);
        return U_SUCCESS(status) && found != USEARCH_DONE;
    }
};

LocalizedSearch::LocalizedSearch(std::string_view text, const std::string& locale)
    : _impl(std::make_unique<Impl>(text, locale))
{}

LocalizedSearch::~LocalizedSearch() = default;
LocalizedSearch::LocalizedSearch(LocalizedSearch&&) noexcept = default;

bool LocalizedSearch::contains(std::string_view part) const
{
    const icu::UnicodeString pattern = unicode(part);
    if (!_impl->collator || pattern.isEmpty() || _impl->text.isEmpty()) return false;
    const auto found = _impl->partIterator ? _impl->find(pattern) : Impl::Found::Perhaps;
    return found == Impl::Found::Perhaps ? _impl->search(pattern) : found == Impl::Found::Yes;
}

} // namespace platform
