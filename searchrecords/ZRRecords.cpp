#include "searchrecords/ZRRecords.h"

namespace tavrin {

const platform::RecordClasses& searchRecordClasses()
{
    static const auto classes = platform::RecordClasses::of<
        ZRText, ZRPunchout, ZRActionItem, ZRSearchResult, ZRResultSection, ZRSearchSuggestion, ZRCardSection,
        ZRDescriptionCardSection, //
        ZRFeedback, ZRStartSearchFeedback, ZREndSearchFeedback, ZRStartLocalSearchFeedback, ZREndLocalSearchFeedback,
        ZRStartNetworkSearchFeedback, ZREndNetworkSearchFeedback, ZRErrorFeedback, //
        ZRVisibleResultsFeedback, ZRResultRankingFeedback, ZRSectionRankingFeedback, ZRRankingFeedback,
        ZRResultEngagementFeedback, ZRResultsReceivedAfterTimeoutFeedback, ZRLateSectionsAppendedFeedback,
        ZRSectionEngagementFeedback, ZRVisibleSectionHeaderFeedback, ZRVisibleSuggestionsFeedback,
        ZRSuggestionEngagementFeedback, //
        ZRCardSectionEngagementFeedback, ZRMapsCardSectionEngagementFeedback, ZRStoreCardSectionEngagementFeedback,
        ZRCardViewDisappearFeedback, //
        ZRSearchViewAppearFeedback, ZRSearchViewDisappearFeedback, ZRClearInputFeedback, ZRDidGoToSiteFeedback,
        ZRCustomFeedback>();
    return classes;
}

} // namespace tavrin
