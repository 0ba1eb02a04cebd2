#include "platform/Text.h"

#include <algorithm>
#include <cstdint>
#include <numeric>

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
        const std::size_t length = lead < 0x80 ? 1 : lead < 0xc2 ? 0 : lead < 0xe0 ? 2 : lead < 0xf0 ? 3 : lead < 0xf5 ? 4 : 0;
        bool valid = length > 0 && i + length <= text.size();
        for (std::size_t k = 1; valid && k < length; ++k) valid = (static_cast<unsigned char>(text[i + k]) & 0xc0) == 0x80;
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
    icu::CaseMap::utf8ToLower("", 0, icu::StringPiece(text.data(), static_cast<int32_t>(text.size())), sink, nullptr, status);
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
    iterator->setText(whole);
    std::vector<std::string> words;
    int32_t begin = iterator->first();
    for (int32_t end = iterator->next(); end != icu::BreakIterator::DONE; begin = end, end = iterator->next())
        if (iterator->getRuleStatus() >= UBRK_WORD_NONE_LIMIT)
            whole.tempSubStringBetween(begin, end).toUTF8String(words.emplace_back());
    return words;
}

namespace {

/// What a text compares as: a weight, of the characters in [begin, end). The second and later weights of a character
/// are of no characters.
struct Element {
    std::uint32_t weight;
    int32_t begin, end;
};

/// Accents count, case doesn't: the primary and secondary bits of ICU's weights.
constexpr std::uint32_t kCounts = 0xffffff00;

template <class Take> void eachElement(icu::CollationElementIterator& iterator, Take take)
{
    UErrorCode status = U_ZERO_ERROR;
    for (int32_t begin = iterator.getOffset();; begin = iterator.getOffset()) {
        const int32_t order = iterator.next(status);
        if (U_FAILURE(status) || order == icu::CollationElementIterator::NULLORDER) return;
        const std::uint32_t weight = static_cast<std::uint32_t>(order) & kCounts;
        if (weight != 0) take(Element{weight, begin, iterator.getOffset()});
    }
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
    std::vector<std::uint32_t> places;                           // in `elements`, by weight
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
        eachElement(*iterator, [this](const Element& element) { elements.push_back(element); });
        places.resize(elements.size());
        std::iota(places.begin(), places.end(), 0u);
        std::ranges::stable_sort(places, {}, [this](std::uint32_t place) { return elements[place].weight; });
    }

    enum class Found { No, Yes, Perhaps };

    Found find(const icu::UnicodeString& pattern)
    {
        UErrorCode status = U_ZERO_ERROR;
        partIterator->setText(pattern, status);
        part.clear();
        eachElement(*partIterator, [this](const Element& element) { part.push_back(element.weight); });
        if (U_FAILURE(status)) return Found::Perhaps;
        if (part.empty()) return Found::No;
        Found found = Found::No;
        for (const std::uint32_t place :
             std::ranges::equal_range(places, part[0], {}, [this](std::uint32_t p) { return elements[p].weight; })) {
            if (elements.size() - place < part.size()) continue;
            const auto begin = elements.begin() + place, end = begin + static_cast<std::ptrdiff_t>(part.size());
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
