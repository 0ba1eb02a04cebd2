#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/values/Record.h"

namespace tavrin {

/// The HTTP request of a verbose reply.
struct TAVHTTPRequest : platform::RecordOf<TAVHTTPRequest> {
    static constexpr std::string_view kClass = "TAVHTTPRequest";
    std::string url;
    std::string method;
    platform::Value headers; ///< dictionary of strings
    static constexpr auto fields()
    {
        return std::tuple{platform::field("url", &TAVHTTPRequest::url),
                          platform::field("method", &TAVHTTPRequest::method),
                          platform::field("headers", &TAVHTTPRequest::headers)};
    }
};

/// The HTTP response of a verbose reply.
struct TAVHTTPResponse : platform::RecordOf<TAVHTTPResponse> {
    static constexpr std::string_view kClass = "TAVHTTPResponse";
    std::string url; ///< the final one, after redirects
    std::int64_t statusCode = 0;
    platform::Value headers; ///< dictionary of strings
    static constexpr auto fields()
    {
        return std::tuple{platform::field("url", &TAVHTTPResponse::url),
                          platform::field("statusCode", &TAVHTTPResponse::statusCode),
                          platform::field("headers", &TAVHTTPResponse::headers)};
    }
};

/// The answer to a request.
struct TAVReply : platform::RecordOf<TAVReply> {
    static constexpr std::string_view kClass = "TAVReply";

    double scale = 0;                            ///< of the request
    std::shared_ptr<TAVHTTPRequest> httpRequest; ///< verbose replies only, like the response
    std::shared_ptr<TAVHTTPResponse> httpResponse;
    /// The service's unchanged answer: the JSON text of an array of result sets. Nothing if it was not JSON.
    std::optional<platform::Bytes> rawResponse;
    std::optional<std::string> geoSessionEntityString;

    static constexpr auto fields()
    {
        return std::tuple{platform::field("scale", &TAVReply::scale),
                          platform::field("httpRequest", &TAVReply::httpRequest),
                          platform::field("httpResponse", &TAVReply::httpResponse),
                          platform::field("rawResponse", &TAVReply::rawResponse),
                          platform::field("geoSessionEntityString", &TAVReply::geoSessionEntityString)};
    }
};

} // namespace tavrin
