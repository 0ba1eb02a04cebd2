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

} // namespace
} // namespace devserver
