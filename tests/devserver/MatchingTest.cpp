#include "tools/devserver/Matching.h"

#include <gtest/gtest.h>

#include "tools/devserver/SearchAnswers.h"

namespace devserver {
namespace {

Entry entryOf(std::string title, unsigned popularity = 500, std::string keyword = "")
{
    Entry entry;
    entry.section = &sections().front();
    entry.title = std::move(title);
    entry.popularity = popularity;
    entry.foldedTitle = fold(entry.title);
    entry.titleWords = wordsOf(entry.foldedTitle.text);
    if (!keyword.empty()) entry.foldedKeywords.push_back(fold(keyword).text);
    return entry;
}

struct Case {
    const char* title;
    const char* query;
    std::optional<Quality> quality;
    const char* completion = nullptr;
    const char* suggestion = nullptr;
};

TEST(Matching, QualityAndCompletion)
{
    const Case cases[] = {
        {"Weather Zürich", "weat", Quality::TitleStart, "weather", "weather zürich"},
        {"Weather Zürich", "WEATHER", Quality::TitleStart, "weather", "weather zürich"},
        {"Weather Zürich", "weather ", Quality::TitleStart, "weather zürich", "weather zürich"},
        {"Weather Zürich", "weather zur", Quality::TitleStart, "weather zurich", "weather zurich"},
        {"Weather Zürich", "Weather Zürich", Quality::WholeTitle, "weather zürich"},
        {"Weather Zürich", "zü", Quality::InsideTitle, "zürich", "zürich"},
        {"Weather Zürich", "zürich wea", Quality::Words, "zürich weather"},
        {"Weather Zürich", "zürich ", Quality::Words},
        {"Weather Zürich", "eather", std::nullopt},
        {"Weather Zürich", "weather lisboa", std::nullopt},
        {"Weather Zürich", "forec", Quality::Words, "forecast"},
        {"Weather Zürich", "", std::nullopt},
        {"Weather Zürich", "   ", std::nullopt},
        {"Weather Zürich", "–", std::nullopt},
        {"Große Straße", "gros", Quality::TitleStart, "grosse", "grosse straße"},
        {"東京の朝", "東", Quality::TitleStart, "東京", "東京の朝"},
        {"東京の朝", "東京の", Quality::TitleStart, "東京の", "東京の朝"},
        {"東京の朝", "朝", Quality::InsideTitle, "朝"},
        {"Ακρόπολη", "ΑΚΡΟ", Quality::TitleStart, "ακροπολη", "ακροπολη"},
        {"🎧 Mixdesk", "🎧", Quality::TitleStart, "🎧", "🎧 mixdesk"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.title) + " / " + c.query);
        const Entry entry = entryOf(c.title, 500, "forecast");
        const auto match = matchEntry(entry, c.query);
        ASSERT_EQ(match.has_value(), c.quality.has_value());
        if (!match) continue;
        EXPECT_EQ(match->quality, *c.quality);
        EXPECT_EQ(match->completion, c.completion ? std::optional<std::string>(c.completion) : std::nullopt);
        EXPECT_EQ(match->suggestion, c.suggestion ? std::optional<std::string>(c.suggestion) : std::nullopt);
    }
}

TEST(Matching, RankIsByQualityThenPopularity)
{
    const Catalogue catalogue;
    const auto matches = findMatches(catalogue, "Zür");
    ASSERT_GT(matches.size(), 5u);
    for (std::size_t i = 1; i < matches.size(); ++i) {
        const Match &before = matches[i - 1], &after = matches[i];
        EXPECT_GE(before.quality, after.quality);
        if (before.quality == after.quality) {
            EXPECT_GE(before.entry->popularity, after.entry->popularity);
        }
    }
    const Section* flights = findSection("flights");
    for (const Match& match : findMatches(catalogue, "Zür", flights)) EXPECT_EQ(match.entry->section, flights);
}

// ---- Answers made of matches

class Answers : public testing::Test {
protected:
    const Catalogue catalogue;
    const SearchAnswers answers{catalogue, "https://127.0.0.1:8443"};
};

TEST_F(Answers, EverySetIsFoundAgainByWhatWasTyped)
{
    // Sets are cached under "query" for inputs that it begins with: one that doesn't begin with the input is never
    // found.
    for (const char* typed : {"We", "weather", "zur", "ZÜR", "東", "ακρ", "برج", "weather l", " we"}) {
        SCOPED_TRACE(typed);
        const auto sets = answers.search(typed);
        ASSERT_GT(sets.count(), 0u);
        for (const auto& set : *sets.asArray()) {
            ASSERT_TRUE(set["query"].asString());
            EXPECT_TRUE(set["query"].asString()->starts_with(lowerCased(typed))) << *set["query"].asString();
            EXPECT_GT(set["completion_score"].asDouble().value_or(0), 0);
        }
    }
}

} // namespace
} // namespace devserver
