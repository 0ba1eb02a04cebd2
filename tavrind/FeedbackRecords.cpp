#include "tavrind/FeedbackRecords.h"

#include <algorithm>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "searchrecords/ZRNetworkFeedback.h"

namespace tavrin {

std::shared_ptr<ZRStartNetworkSearchFeedback> startNetworkSearchFeedback(std::string input,
                                                                         const platform::UrlRequest& request,
                                                                         StartSearchTrigger trigger,
                                                                         EndpointType endpoint)
{
    return std::make_shared<ZRStartNetworkSearchFeedback>(std::move(input), request.url.string(),
                                                          headerDictionary(request.headers), trigger, endpoint);
}

platform::Value headerDictionary(const platform::HttpHeaders& headers)
{
    platform::Dictionary dictionary;
    for (const auto& [name, value] : headers) dictionary.set(name, value);
    return dictionary;
}

platform::Duration requestTimeout(double seconds)
{
    return platform::durationFromSeconds(std::min(seconds, 86400.0));
}

std::string describe(const platform::HttpHeaders& headers)
{
    return platform::toJson(headerDictionary(headers));
}

} // namespace tavrin
