#include "CoreTavrin/TAVRecordClasses.h"

#include "CoreTavrin/TAVFeedback.h"
#include "searchrecords/ZRRecords.h"

namespace tavrin {

const platform::RecordClasses& coreRecordClasses()
{
    static const auto classes = [] {
        platform::RecordClasses all = searchRecordClasses();
        all.addAll(platform::RecordClasses::of<TAVSkipSearchFeedback, TAVLookupStartNetworkSearchFeedback,
                                               TAVEndNetworkSearchFeedback, TAVRankerFeedback, TAVCacheHitFeedback,
                                               TAVSearchSuggestion, TAVCustomSearchResult, TAVPunchout>());
        return all;
    }();
    return classes;
}

} // namespace tavrin
