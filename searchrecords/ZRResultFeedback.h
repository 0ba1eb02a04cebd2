#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "searchrecords/ZREnums.h"
#include "searchrecords/ZRFeedback.h"
#include "searchrecords/ZRSearchResult.h"

/// Events of results, sections and suggestions: ranked, shown, engaged.
namespace tavrin {

/// Results came into view.
struct ZRVisibleResultsFeedback : platform::RecordOf<ZRVisibleResultsFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRVisibleResultsFeedback";
    VisibleResultsTrigger triggerEvent = VisibleResultsTrigger::Unknown;
    RecordArray<ZRSearchResult> results;
    static constexpr auto fields()
    {
        using Self = ZRVisibleResultsFeedback;
        return std::tuple{platform::field("triggerEvent", &Self::triggerEvent),
                          platform::field("results", &Self::results)};
    }
};

/// How one result was ranked; part of `ZRSectionRankingFeedback`.
struct ZRResultRankingFeedback : platform::RecordOf<ZRResultRankingFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRResultRankingFeedback";
    std::shared_ptr<ZRSearchResult> result;
    std::uint64_t localResultPosition = 0;                         ///< within the section, before the service's ranking
    std::vector<std::shared_ptr<ZRSearchResult>> hiddenResults;    ///< hidden in favour of this one
    std::vector<std::shared_ptr<ZRSearchResult>> duplicateResults; ///< the same result from other sources
    static constexpr auto fields()
    {
        using Self = ZRResultRankingFeedback;
        return std::tuple{platform::field("result", &Self::result),
                          platform::field("localResultPosition", &Self::localResultPosition),
                          platform::field("hiddenResults", &Self::hiddenResults),
                          platform::field("duplicateResults", &Self::duplicateResults)};
    }
};

/// How one section was ranked; part of `ZRRankingFeedback`.
struct ZRSectionRankingFeedback : platform::RecordOf<ZRSectionRankingFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRSectionRankingFeedback";
    std::shared_ptr<ZRResultSection> section;
    std::uint64_t localSectionPosition = 0; ///< before the service's ranking
    RecordArray<ZRResultRankingFeedback> results;
    static constexpr auto fields()
    {
        using Self = ZRSectionRankingFeedback;
        return std::tuple{platform::field("section", &Self::section),
                          platform::field("localSectionPosition", &Self::localSectionPosition),
                          platform::field("results", &Self::results)};
    }
};

/// Sections were ranked.
struct ZRRankingFeedback : platform::RecordOf<ZRRankingFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRRankingFeedback";
    RecordArray<ZRSectionRankingFeedback> sections;
    double blendingDuration = 0; ///< seconds that local and remote results took to blend
    static constexpr auto fields()
    {
        using Self = ZRRankingFeedback;
        return std::tuple{platform::field("sections", &Self::sections),
                          platform::field("blendingDuration", &Self::blendingDuration)};
    }
};

/// The user chose a result, or an action beside it.
struct ZRResultEngagementFeedback : platform::RecordOf<ZRResultEngagementFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRResultEngagementFeedback";
    std::shared_ptr<ZRSearchResult> result;
    ResultEngagementTrigger triggerEvent = ResultEngagementTrigger::Unknown;
    ResultEngagementDestination destination = ResultEngagementDestination::Unknown;
    std::shared_ptr<ZRActionItem> actionEngaged;                   ///< null for the result itself
    ResultActionTarget actionTarget = ResultActionTarget::Unknown; ///< what that action does
    static constexpr auto fields()
    {
        using Self = ZRResultEngagementFeedback;
        return std::tuple{
            platform::field("result", &Self::result), platform::field("triggerEvent", &Self::triggerEvent),
            platform::field("destination", &Self::destination), platform::field("actionEngaged", &Self::actionEngaged),
            platform::field("actionTarget", &Self::actionTarget)};
    }
};

/// Results came too late to be displayed.
struct ZRResultsReceivedAfterTimeoutFeedback : platform::RecordOf<ZRResultsReceivedAfterTimeoutFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRResultsReceivedAfterTimeoutFeedback";
    RecordArray<ZRSearchResult> results;
    static constexpr auto fields()
    {
        return std::tuple{platform::field("results", &ZRResultsReceivedAfterTimeoutFeedback::results)};
    }
};

/// Sections came late and were added below the others.
struct ZRLateSectionsAppendedFeedback : platform::RecordOf<ZRLateSectionsAppendedFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRLateSectionsAppendedFeedback";
    RecordArray<ZRResultSection> sections;
    static constexpr auto fields()
    {
        return std::tuple{platform::field("sections", &ZRLateSectionsAppendedFeedback::sections)};
    }
};

/// The user chose something in a section's header.
struct ZRSectionEngagementFeedback : platform::RecordOf<ZRSectionEngagementFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRSectionEngagementFeedback";
    std::shared_ptr<ZRResultSection> section;
    SectionEngagementTrigger triggerEvent = SectionEngagementTrigger::Unknown;
    static constexpr auto fields()
    {
        using Self = ZRSectionEngagementFeedback;
        return std::tuple{platform::field("section", &Self::section),
                          platform::field("triggerEvent", &Self::triggerEvent)};
    }
};

/// A section's header came into view.
struct ZRVisibleSectionHeaderFeedback : platform::RecordOf<ZRVisibleSectionHeaderFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRVisibleSectionHeaderFeedback";
    std::shared_ptr<ZRResultSection> section;
    SectionHeaderType headerType = SectionHeaderType::Unknown;
    static constexpr auto fields()
    {
        using Self = ZRVisibleSectionHeaderFeedback;
        return std::tuple{platform::field("section", &Self::section), platform::field("headerType", &Self::headerType)};
    }
};

/// Suggestions came into view.
struct ZRVisibleSuggestionsFeedback : platform::RecordOf<ZRVisibleSuggestionsFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRVisibleSuggestionsFeedback";
    RecordArray<ZRSearchSuggestion> suggestions;
    static constexpr auto fields()
    {
        return std::tuple{platform::field("suggestions", &ZRVisibleSuggestionsFeedback::suggestions)};
    }
};

/// The user chose a suggestion.
struct ZRSuggestionEngagementFeedback : platform::RecordOf<ZRSuggestionEngagementFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRSuggestionEngagementFeedback";
    std::shared_ptr<ZRSearchSuggestion> suggestion;
    static constexpr auto fields()
    {
        return std::tuple{platform::field("suggestion", &ZRSuggestionEngagementFeedback::suggestion)};
    }
};

} // namespace tavrin
