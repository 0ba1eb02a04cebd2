#pragma once

#include <cstddef>
#include <memory>

#include "searchrecords/ZRSearchFeedback.h"

/// Requests to a service on the network.
namespace tavrin {

/// A request was sent.
struct ZRStartNetworkSearchFeedback : platform::RecordOf<ZRStartNetworkSearchFeedback, ZRStartSearchFeedback> {
    static constexpr std::string_view kClass = "ZRStartNetworkSearchFeedback";

    std::optional<std::string> url;
    platform::Value headers; ///< dictionary of strings, or null
    EndpointType endpoint = EndpointType::Unknown;

    ZRStartNetworkSearchFeedback() = default;
    /// Creates the record of a new request, with a new `uuid`.
    ZRStartNetworkSearchFeedback(std::string input_, std::string url_, platform::Value headers_,
                                 StartSearchTrigger triggerEvent_, EndpointType endpoint_);

    static constexpr auto fields()
    {
        using Self = ZRStartNetworkSearchFeedback;
        return std::tuple{platform::field("url", &Self::url), platform::field("headers", &Self::headers),
                          platform::field("endpoint", &Self::endpoint)};
    }
};

/// A request was answered or failed.
struct ZREndNetworkSearchFeedback : platform::RecordOf<ZREndNetworkSearchFeedback, ZREndSearchFeedback> {
    static constexpr std::string_view kClass = "ZREndNetworkSearchFeedback";

    std::int64_t responseSize = 0;     ///< bytes of the body
    std::int64_t statusCode = 0;       ///< 0 without a response
    platform::Value networkTimingData; ///< as `UrlTask::timingData()` returns it, or null

    ZREndNetworkSearchFeedback() = default;
    /// Takes the `uuid` of `start`, which may be null.
    ZREndNetworkSearchFeedback(const std::shared_ptr<ZRStartNetworkSearchFeedback>& start, std::size_t responseSize_,
                               std::int64_t statusCode_, platform::Value networkTimingData_);

    static constexpr auto fields()
    {
        using Self = ZREndNetworkSearchFeedback;
        return std::tuple{platform::field("responseSize", &Self::responseSize),
                          platform::field("statusCode", &Self::statusCode),
                          platform::field("networkTimingData", &Self::networkTimingData)};
    }
};

} // namespace tavrin
