#pragma once

#include <optional>
#include <string>

#include "platform/values/Record.h"

namespace tavrin {

/// Who a client is and how to serve it; a client sends it first.
struct TAVSessionConfiguration : platform::RecordOf<TAVSessionConfiguration> {
    static constexpr std::string_view kClass = "TAVSessionConfiguration";

    /// The client's session identifier, "com.quorvane.vistrel". Connections with the same one share cache and session.
    std::optional<std::string> identifier;
    /// A name/version token, "Vistrel/4.2". It goes to the service and selects the client's view of the bag.
    std::optional<std::string> userAgent;
    /// Don't fetch the images of answers ahead.
    bool dontPreloadImages = false;
    /// Seconds that a request may go without an answer; 0 leaves it to the bag.
    double timeoutIntervalForRequest = 0;

    TAVSessionConfiguration() = default;
    TAVSessionConfiguration(std::string identifier_, std::string userAgent_)
        : identifier(std::move(identifier_)), userAgent(std::move(userAgent_))
    {}

    /// Longest identifier and user agent, in bytes: the daemon keeps both for its life.
    static constexpr std::size_t kMaximumName = 1024;
    /// Why the daemon refuses the call that brings this record; none if it doesn't.
    [[nodiscard]] std::optional<std::string> problem() const
    {
        if (identifier.value_or("").size() <= kMaximumName && userAgent.value_or("").size() <= kMaximumName) return {};
        return "identifier and userAgent may have " + std::to_string(kMaximumName) + " bytes each";
    }

    static constexpr auto fields()
    {
        using Self = TAVSessionConfiguration;
        return std::tuple{platform::field("identifier", &Self::identifier),
                          platform::field("userAgent", &Self::userAgent),
                          platform::field("dontPreloadImages", &Self::dontPreloadImages),
                          platform::field("timeoutIntervalForRequest", &Self::timeoutIntervalForRequest)};
    }
};

} // namespace tavrin
