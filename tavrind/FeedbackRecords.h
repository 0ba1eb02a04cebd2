#pragma once

#include <memory>
#include <string>

#include "platform/net/Url.h"
#include "platform/net/UrlSession.h"
#include "searchrecords/ZREnums.h"

namespace tavrin {

struct ZRStartNetworkSearchFeedback;

/// Creates the record of a request that is about to be sent.
[[nodiscard]] std::shared_ptr<ZRStartNetworkSearchFeedback>
startNetworkSearchFeedback(std::string input, const platform::UrlRequest& request, StartSearchTrigger trigger,
                           EndpointType endpoint);

/// Returns header fields as a dictionary of strings. If a name occurs twice, the last value counts.
[[nodiscard]] platform::Value headerDictionary(const platform::HttpHeaders& headers);

/// Converts a time-out that a client or the bag asks for, in seconds above 0. The result is a day at most.
[[nodiscard]] platform::Duration requestTimeout(double seconds);

/// Returns header fields as JSON text for a log line.
[[nodiscard]] std::string describe(const platform::HttpHeaders& headers);

} // namespace tavrin
