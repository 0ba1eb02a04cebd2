#include <algorithm>
#include <cctype>
#include <regex>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>

#include "tavrind/FeedbackEnumerations.h"
#include "tests/records/FeedbackExamples.h"

namespace tavrin {
namespace {

/// The compiler's text for a value: "…kValue = tavrin::CardType::Maps;…", or a number where no enumerator has it.
template <auto kValue> std::string enumeratorName()
{
    std::string text = __PRETTY_FUNCTION__;
    text.erase(0, text.find("kValue = ") + 9);
    text.erase(text.find_first_of(";]"));
    return text.starts_with('(') ? "" : text.substr(text.rfind(':') + 1);
}

/// The enumerators of E by value, from 0 up to the first value that none has.
template <class E> std::vector<std::string> enumerators()
{
    constexpr std::size_t kMore = 64;
    std::vector<std::string> names = []<std::size_t... i>(std::index_sequence<i...>) {
        return std::vector{enumeratorName<static_cast<E>(i)>()...};
    }(std::make_index_sequence<kMore>());
    names.erase(std::ranges::find(names, ""), names.end());
    return names;
}

/// "swipe_down" and "SwipeDown" alike.
std::string plain(std::string name)
{
    std::erase(name, '_');
    std::ranges::transform(name, name.begin(), [](unsigned char c) { return std::tolower(c); });
    return name;
}

/// The strings that the page has for an enumeration: "| `NAME` | "a", "b" |".
std::vector<std::string> documentedStrings(const std::string& name)
{
    static const std::string kPage = feedbackPage();
    const std::size_t start = kPage.find("| `" + name + "` |");
    if (start == std::string::npos) return {};
    const std::string row = kPage.substr(start, kPage.find('\n', start) - start);
    static const std::regex kString("\"([^\"]*)\"");
    std::vector<std::string> strings;
    for (std::sregex_iterator match(row.begin(), row.end(), kString), end; match != end; ++match)
        strings.push_back((*match)[1]);
    return strings;
}

/// Checks that the enumerators of E, their strings and the page agree. A string may begin with more than the enumerator
/// has: "tophit_no" is No.
template <class E, class ToString> void expectStrings(const std::string& name, const ToString& toString)
{
    SCOPED_TRACE(name);
    const std::vector<std::string> documented = documentedStrings(name);
    const std::vector<std::string> names = enumerators<E>();
    ASSERT_FALSE(documented.empty());
    ASSERT_EQ(names.size(), documented.size());
    ASSERT_EQ(kTexts<E>.size(), documented.size());
    for (std::size_t i = 0; i < names.size(); ++i) {
        EXPECT_EQ(toString(static_cast<E>(i)), documented[i]);
        EXPECT_TRUE(plain(documented[i]).ends_with(plain(names[i]))) << names[i] << " stands for " << documented[i];
    }
    for (const std::int64_t beyond : {static_cast<std::int64_t>(names.size()), std::int64_t{-1}, INT64_MIN, INT64_MAX})
        EXPECT_EQ(toString(static_cast<E>(beyond)), std::nullopt) << beyond;
}

TEST(Enumerations, HaveTheStringsThatTheServiceReads)
{
    expectStrings<SearchViewAppearTrigger>("SearchViewAppearTrigger", appearEventEnumToString);
    expectStrings<SearchViewDisappearTrigger>("SearchViewDisappearTrigger", disappearEventEnumToString);
    expectStrings<CardViewDisappearTrigger>("CardViewDisappearTrigger", disappearEventEnumToString);
    expectStrings<StartSearchTrigger>("StartSearchTrigger", triggerEventEnumToString);
    expectStrings<EndpointType>("EndpointType", endpointTypeEnumToString);
    expectStrings<LookupSelectionType>("LookupSelectionType", lookupSelectionTypeEnumToString);
    expectStrings<IndexType>("IndexType", indexTypeEnumToString);
    expectStrings<ResultType>("ResultType", searchResultTypeEnumToString);
    expectStrings<TopHit>("TopHit", topHitEnumToString);
    expectStrings<VisibleResultsTrigger>("VisibleResultsTrigger", triggerEventEnumToString);
    expectStrings<ResultEngagementTrigger>("ResultEngagementTrigger", triggerEventEnumToString);
    expectStrings<ResultEngagementDestination>("ResultEngagementDestination", destinationTypeEnumToString);
    expectStrings<ResultActionTarget>("ResultActionTarget", actionTargetTypeEnumToString);
    expectStrings<CardEngagementTrigger>("CardEngagementTrigger", triggerEventEnumToString);
    expectStrings<CardType>("CardType", cardTypeEnumToString);
    expectStrings<CardActionTarget>("CardActionTarget", actionTargetTypeEnumToString);
    expectStrings<MapsCardFeedback>("MapsCardFeedback", feedbackTypeEnumToString);
    expectStrings<ProductPageResult>("ProductPageResult", productPageResultEnumToString);
    expectStrings<SuggestionType>("SuggestionType", suggestionTypeEnumToString);
    expectStrings<ClearInputTrigger>("ClearInputTrigger", triggerEventEnumToString);
    expectStrings<SkipSearchTrigger>("SkipSearchTrigger", triggerEventEnumToString);
    expectStrings<SectionEngagementTrigger>("SectionEngagementTrigger", triggerEventEnumToString);
    expectStrings<SectionHeaderType>("SectionHeaderType", headerTypeEnumToString);
    EXPECT_THAT(enumerators<CustomFeedbackType>(),
                testing::ElementsAre("Unknown", "WendralAutofill", "Crowdsourcing", "VistrelResultFeatures"));
}

} // namespace
} // namespace tavrin
