#include "searchrecords/ZRNetworkFeedback.h"

namespace tavrin {

ZRStartNetworkSearchFeedback::ZRStartNetworkSearchFeedback(std::string input_, std::string url_,
                                                           platform::Value headers_, StartSearchTrigger triggerEvent_,
                                                           EndpointType endpoint_)
    : url(std::move(url_)), headers(std::move(headers_)), endpoint(endpoint_)
{
    input = std::move(input_);
    triggerEvent = triggerEvent_;
    uuid = platform::Uuid::random().string();
}

ZREndNetworkSearchFeedback::ZREndNetworkSearchFeedback(const std::shared_ptr<ZRStartNetworkSearchFeedback>& start,
                                                       std::size_t responseSize_, std::int64_t statusCode_,
                                                       platform::Value networkTimingData_)
    : responseSize(static_cast<std::int64_t>(responseSize_)), statusCode(statusCode_),
      networkTimingData(std::move(networkTimingData_))
{
    if (start) uuid = start->uuid;
}

} // namespace tavrin
