#include "CoreTavrin/TAVFeedback.h"

#include <utility>

namespace tavrin {

TAVLookupStartNetworkSearchFeedback::TAVLookupStartNetworkSearchFeedback(std::string input_, std::string url_,
                                                                         platform::Value headers_,
                                                                         StartSearchTrigger triggerEvent_,
                                                                         EndpointType endpoint_,
                                                                         LookupSelectionType selectionType_)
    : RecordOf(std::move(input_), std::move(url_), std::move(headers_), triggerEvent_, endpoint_),
      selectionType(selectionType_)
{}

TAVEndNetworkSearchFeedback::TAVEndNetworkSearchFeedback(const std::shared_ptr<ZRStartNetworkSearchFeedback>& start,
                                                         std::size_t responseSize_, std::int64_t statusCode_,
                                                         std::optional<std::string> tavrinStatus_,
                                                         double tavrinDuration_, std::optional<std::string> fbq_,
                                                         std::optional<std::string> partialClientIp_,
                                                         platform::Value networkTimingData_)
    : RecordOf(start, responseSize_, statusCode_, std::move(networkTimingData_)),
      tavrinStatus(std::move(tavrinStatus_)), tavrinDuration(tavrinDuration_), fbq(std::move(fbq_)),
      partialClientIp(std::move(partialClientIp_))
{}

} // namespace tavrin
