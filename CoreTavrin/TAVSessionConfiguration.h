#pragma once

#include <optional>
#include <string>

#include "platform/values/Record.h"

namespace tavrin {

/// A client's identity and preferences. A client sends it first.
struct TAVSessionConfiguration : platform::RecordOf<TAVSessionConfiguration> {
    static constexpr std::string_view kClass = "TAVSessionConfiguration";

    /// The client's session identifier, "com.quorvane.vistrel". Connections with the same one share cache and session.
    std::optional<std::string> identifier;
    /// A name/version token, "Vistrel/4.2". It is sent to the service and selects the client's view of the bag.
    std::optional<std::string> userAgent;
    /// Disables the prefetch of images in answers.
    bool dontPreloadImages = false;
    /// The time-out of requests, in seconds; 0 uses the bag's.
    double timeoutIntervalForRequest = 0;

    TAVSessionConfiguration() = default;
    TAVSessionConfiguration(std::string identifier_, std::string userAgent_)
        : identifier(std::move(identifier_)), userAgent(std::move(userAgent_))
    {}

    /// Maximum length of identifier and user agent, in bytes each. The daemon keeps both until it ends.
    static constexpr std::size_t kMaximumName = 1024;
    /// Returns why the daemon refuses a call with this record; nothing if the record is valid.
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
