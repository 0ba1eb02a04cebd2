#include "platform/text/Text.h"

#include <random>

#include <gtest/gtest.h>
#include <unicode/coll.h>
#include <unicode/stsearch.h>
#include <unicode/tblcoll.h>
#include <unicode/unistr.h>

namespace platform {
namespace {

TEST(Text, TrimsWhiteSpaceOfUnicode)
{
    for (const auto& [text, trimmedText] : {std::pair("", ""),
                                            {" ", ""},
                                            {"\u00a0\u2003\n", ""},
                                            {"\u3000 a b \u2028", "a b"},
                                            {"a", "a"},
                                            {" \xff ", "\xff"},
                                            {"\u200b", "\u200b"}})
        EXPECT_EQ(trimmed(text), trimmedText);
}

TEST(Text, IsCutBetweenCharacters)
{
    for (const auto& [size, start] :
         {std::pair(0u, ""), {1u, "a"}, {2u, "a"}, {3u, "aé"}, {6u, "aé"}, {7u, "aé😀"}, {9u, "aé😀"}})
        EXPECT_EQ(cut("aé😀", size), start) << size;
}

TEST(Text, DividesIntoWordsAsTheLocaleDoes)
{
    using Words = std::vector<std::string>;
    const struct {
        const char* text;
        const char* locale;
        Words words;
    } cases[]{
        {"The café's 3.5 stars – open!", "en_US", {"The", "café's", "3.5", "stars", "open"}},
        {"", "de_CH", {}},
        {" .,;! ", "de_CH", {}},
        {"one one", "", {"one", "one"}},
        {"東京都", "ja_JP", {"東京", "都"}},
        {"a\xff"
         "b",
         "en_US",
         {"a", "b"}},
    };
    for (const auto& c : cases) {
        WordFinder finder(c.locale);
        EXPECT_EQ(finder.wordsIn(c.text), c.words) << c.text;
        EXPECT_EQ(finder.wordsIn("used again"), (Words{"used", "again"}));
    }
}

TEST(Text, SearchesWithoutRegardToCaseAsTheLocaleCompares)
{
    const struct {
        const char* text;
        const char* part;
        const char* locale;
        bool contained;
    } cases[]{
        {"die STRASSE", "straße", "de_CH", false},
        {"résumé", "RÉSUMÉ", "fr_FR", true},
        {"résumé", "resume", "fr_FR", false},
        {"re\u0301sume\u0301", "résumé", "fr_FR", true}, // composed otherwise
        {"ISPARTA", "ısparta", "tr_TR", true},
        {"ISPARTA", "isparta", "tr_TR", false},
        {"ISPARTA", "isparta", "en_US", true},
        {"abc", "bc", "en_US", true},
        {"abc", "abcd", "en_US", false},
        {"abc", "", "en_US", false},
        {"abc", "\u200b", "en_US", false},
        {"", "a", "en_US", false},
        {"abc", "b", "no such locale", true},
    };
    for (const auto& c : cases)
        EXPECT_EQ(LocalizedSearch(c.text, c.locale).contains(c.part), c.contained) << c.text << " " << c.part;
}

/// What is found with the index is what ICU's own search finds, for texts of characters that combine, expand, contract
/// and count for nothing.
TEST(Text, SearchesAsIcuDoes)
{
    const std::vector<std::u16string> characters{
        u"a",      u"A",      u"b",      u"c",      u"h",      u"s", u"ss",    u"\u00df", u"\u00e9",
        u"e",      u"\u0301", u"\u0308", u"u",      u"\u00fc", u" ", u".",     u"-",      u"\u00ad",
        u"\r",     u"\n",     u"\u4eac", u"\u0e40", u"\u0e01", u"i", u"I",     u"\u0131", u"\u200d",
        u"\u1100", u"\u1161", u"l",      u"\u00b7", u"\u0600", u"1", u"\u00bd"};
    std::mt19937 random(20260301);
    const auto below = [&](std::size_t limit) { return random() % limit; };
    const auto some = [&](std::size_t most) {
        std::u16string text;
        for (std::size_t length = 1 + below(most); length > 0; --length) text += characters[below(characters.size())];
        return icu::UnicodeString(text.data(), static_cast<int32_t>(text.size()));
    };
    int found = 0, missed = 0;
    for (const char* locale : {"en_US", "de_CH", "sk_SK", "th_TH", "ca_ES", "tr_TR", "ja_JP", "vi_VN"}) {
        UErrorCode status = U_ZERO_ERROR;
        const std::unique_ptr<icu::Collator> collator(icu::Collator::createInstance(icu::Locale(locale), status));
        collator->setStrength(icu::Collator::SECONDARY);
        for (int round = 0; round < 300; ++round) {
            const icu::UnicodeString text = some(12);
            std::string utf8;
            const LocalizedSearch search(text.toUTF8String(utf8), locale);
            for (int tried = 0; tried < 12; ++tried) {
                const icu::UnicodeString part =
                    tried % 2 ? some(3) : icu::UnicodeString(text, static_cast<int32_t>(below(12)), 1 + tried / 4);
                std::string partUtf8;
                part.toUTF8String(partUtf8);
                const bool empty = collator->compare(part, icu::UnicodeString(), status) == UCOL_EQUAL;
                bool expected = false;
                if (!empty) {
                    icu::StringSearch reference(part, text, dynamic_cast<icu::RuleBasedCollator*>(collator.get()),
                                                nullptr, status);
                    expected = reference.first(status) != USEARCH_DONE;
                }
                ASSERT_TRUE(U_SUCCESS(status));
                ASSERT_EQ(search.contains(partUtf8), expected) << locale << " '" << utf8 << "' '" << partUtf8 << "'";
                ++(expected ? found : missed);
            }
        }
    }
    EXPECT_GT(found, 2000);
    EXPECT_GT(missed, 2000);
}

} // namespace
} // namespace platform
