#include "tools/devserver/Catalogue.h"

#include <map>
#include <set>

#include <gtest/gtest.h>

#include "platform/net/Url.h"

namespace devserver {
namespace {

TEST(Catalogue, EntriesAreWholeAndTheirIdentifiersUnique)
{
    const Catalogue catalogue;
    EXPECT_GE(catalogue.entries().size(), 300u);
    std::set<std::string> identifiers;
    std::map<const Section*, int> perSection;
    for (const Entry& entry : catalogue.entries()) {
        SCOPED_TRACE(entry.title);
        EXPECT_TRUE(identifiers.insert(entry.identifier).second);
        EXPECT_EQ(catalogue.find(entry.identifier), &entry);
        const auto url = platform::Url::parse(entry.url);
        ASSERT_TRUE(url);
        EXPECT_EQ(url->string(), entry.url) << "written as it goes on the wire";
        EXPECT_TRUE(url->host().ends_with(".example"));
        EXPECT_FALSE(entry.titleWords.empty());
        EXPECT_FALSE(entry.description.empty());
        ++perSection[entry.section];
    }
    for (const Section& section : sections()) EXPECT_GE(perSection[&section], 20) << section.key;
    EXPECT_EQ(catalogue.find("places.00000000"), nullptr);
}

TEST(Fold, CaseMarksWidthAndBlanksMakeNoDifference)
{
    const std::pair<const char*, const char*> cases[] = {
        {"Zürich", "zurich"},
        {"STRAẞE Straße", "strasse strasse"},
        {"Ἀθῆναι", "αθηναι"},
        {"İstanbul", "istanbul"},
        {"Ｔｏｋｙｏ", "tokyo"},
        {"  a \t b", "a b"},
        {"Zu\xCC\x88rich", "zurich"},
        {"☀️", "☀"},
        {"a\xFFz", "a\uFFFDz"},
        {"Weather ", "weather "},
        {"", ""},
    };
    for (const auto& [text, folded] : cases) {
        const Folded result = fold(text);
        EXPECT_EQ(result.text, folded) << text;
        ASSERT_EQ(result.source.size(), result.text.size() + 1) << text;
        EXPECT_EQ(result.source.back(), std::string_view(text).size()) << text;
    }
}

TEST(Fold, SourceNamesTheCharacterThatAByteCameFrom)
{
    const Folded folded = fold("aßü!"); // bytes: a 0, ß 1, ü 3, ! 5
    EXPECT_EQ(folded.text, "assu!");
    EXPECT_EQ(folded.source, (std::vector<std::uint32_t>{0, 1, 1, 3, 5, 6}));
}

TEST(Fold, WordsAreFoundInEveryScript)
{
    const std::pair<const char*, std::vector<std::string>> cases[] = {
        {"shepherd's pie, twice", {"shepherd's", "pie", "twice"}},
        {"東京の朝", {"東京", "の", "朝"}},
        {"برج القاهرة", {"برج", "القاهرة"}},
        {"🎧 mixdesk", {"🎧", "mixdesk"}},
        {" – ", {}},
    };
    for (const auto& [text, expected] : cases) {
        std::vector<std::string> words;
        for (const Word& word : wordsOf(text)) words.emplace_back(text + word.begin, text + word.end);
        EXPECT_EQ(words, expected) << text;
    }
}

} // namespace
} // namespace devserver
