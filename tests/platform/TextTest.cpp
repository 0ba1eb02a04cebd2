#include "platform/text/Text.h"

#include <gtest/gtest.h>

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
        {"abc \u200b", "\u200b", "en_US", false},
        {"é", "e", "en_US", false},
        {"e\u0301", "e", "en_US", false},
        {"", "a", "en_US", false},
        {"abc", "b", "no such locale", true},
    };
    for (const auto& c : cases)
        EXPECT_EQ(LocalizedSearch(c.text, c.locale).contains(c.part), c.contained) << c.text << " " << c.part;
}

} // namespace
} // namespace platform
