#include "tavrind/RequestKind.h"

#include <algorithm>

#include "CoreTavrin/TAVFeedback.h"
#include "CoreTavrin/TAVRequest.h"
#include "tavrind/FeedbackRecords.h"
#include "tavrind/TAVNetworkRequestFactory.h"

namespace tavrin {

namespace {

using platform::UrlRequest;
using StartRecord = std::shared_ptr<ZRStartNetworkSearchFeedback>;

/// Records the query of the earlier search as the input.
StartRecord startOfMoreResults(const TAVRequest& request, const UrlRequest& httpRequest, EndpointType endpoint)
{
    const auto& url = static_cast<const TAVMoreResultsRequest&>(request).moreResultsURL;
    return startNetworkSearchFeedback(url ? url->queryValue("q").value_or("") : "", httpRequest, request.triggerEvent,
                                      endpoint);
}

StartRecord startOfLookup(const TAVRequest& request, const UrlRequest& httpRequest, EndpointType endpoint)
{
    return std::make_shared<TAVLookupStartNetworkSearchFeedback>(
        request.queryString, httpRequest.url.string(), headerDictionary(httpRequest.headers), request.triggerEvent,
        endpoint, static_cast<const TAVLookupRequest&>(request).selectionType);
}

using Factory = TAVNetworkRequestFactory;

constexpr RequestKind flights(std::string_view className)
{
    return {.className = className,
            .logCategory = kLogFlight,
            .name = "flight query",
            .topic = "flights",
            .builder = &Factory::flightRequest};
}

constexpr RequestKind kKinds[]{
    {.className = TAVSearchRequest::kClass,
     .logCategory = kLogSearch,
     .name = "query",
     .topic = "search",
     .traceStart = kTraceSearchStart,
     .traceAnswer = kTraceSearchAnswer,
     .isSearch = true,
     .skipsWhenDisabled = true,
     .builder = &Factory::searchRequest},
    {.className = TAVMoreResultsRequest::kClass,
     .logCategory = kLogMoreResults,
     .name = "more results query",
     .needsBag = false,
     .retries = 3,
     .servedOnEndpoint = true,
     .builder = &Factory::moreResultsRequest,
     .startRecord = startOfMoreResults},
    {.className = TAVCardRequest::kClass,
     .logCategory = kLogCard,
     .name = "card query",
     .topic = "card",
     .endpoint = EndpointType::TavrinCard,
     .traceStart = kTraceCardStart,
     .traceAnswer = kTraceCardAnswer,
     .retries = 3,
     .servedOnEndpoint = true,
     .builder = &Factory::cardRequest},
    {.className = TAVZeroKeywordRequest::kClass,
     .logCategory = kLogZeroKeyword,
     .name = "zkw query",
     .topic = "zkw",
     .traceStart = kTraceZeroKeywordStart,
     .traceAnswer = kTraceZeroKeywordAnswer,
     .builder = &Factory::zeroKeywordRequest},
    {.className = TAVLookupRequest::kClass,
     .logCategory = kLogLookUp,
     .name = "lookup query",
     .topic = "lookup",
     .traceStart = kTraceLookupStart,
     .traceAnswer = kTraceLookupAnswer,
     .skipsWhenDisabled = true,
     .retries = 3,
     .expires = true,
     .builder = &Factory::lookupRequest,
     .startRecord = startOfLookup},
    flights(TAVFlightLookupRequest::kClass),
    flights(TAVFlightSearchRequest::kClass),
};

} // namespace

std::shared_ptr<ZRStartNetworkSearchFeedback> startRecordOf(const TAVRequest& request, const UrlRequest& httpRequest,
                                                            EndpointType endpoint)
{
    return startNetworkSearchFeedback(request.queryString, httpRequest, request.triggerEvent, endpoint);
}

const RequestKind* kindOf(const TAVRequest& request)
{
    const auto found = std::ranges::find(kKinds, request.className(), &RequestKind::className);
    return found == std::end(kKinds) ? nullptr : found;
}

} // namespace tavrin
