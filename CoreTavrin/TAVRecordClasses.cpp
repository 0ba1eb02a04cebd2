#include "CoreTavrin/TAVRecordClasses.h"

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVFeedback.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "searchrecords/ZRRecords.h"

namespace tavrin {

const platform::RecordClasses& feedbackRecordClasses()
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

const platform::RecordClasses& coreRecordClasses()
{
    static const auto classes = [] {
        platform::RecordClasses all = feedbackRecordClasses();
        all.addAll(
            platform::RecordClasses::of<TAVSessionConfiguration, TAVRequest, TAVSearchRequest, TAVZeroKeywordRequest,
                                        TAVMoreResultsRequest, TAVCardRequest, TAVLookupRequest, TAVFlightLookupRequest,
                                        TAVFlightSearchRequest, TAVQueryItem, TAVReply, TAVHTTPRequest, TAVHTTPResponse,
                                        TAVBagRecord>());
        return all;
    }();
    return classes;
}

} // namespace tavrin
