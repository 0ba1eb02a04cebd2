#pragma once

#include <memory>
#include <string>

#include "platform/net/Url.h"
#include "platform/net/UrlSession.h"
#include "searchrecords/ZREnums.h"

namespace tavrin {

struct ZRStartNetworkSearchFeedback;

/// The record of a request that is about to be sent.
[[nodiscard]] std::shared_ptr<ZRStartNetworkSearchFeedback>
startNetworkSearchFeedback(std::string input, const platform::UrlRequest& request, StartSearchTrigger trigger,
                           EndpointType endpoint);

/// Header fields as a dictionary of strings; of fields of one name the last counts.
[[nodiscard]] platform::Value headerDictionary(const platform::HttpHeaders& headers);

/// The time-out of a request from what a client or the bag asked for, in seconds above 0: a day at most.
[[nodiscard]] platform::Duration requestTimeout(double seconds);

/// Header fields for a log line.
[[nodiscard]] std::string describe(const platform::HttpHeaders& headers);

} // namespace tavrin
