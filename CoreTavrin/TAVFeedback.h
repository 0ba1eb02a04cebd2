#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "searchrecords/ZRNetworkFeedback.h"
#include "searchrecords/ZRResultFeedback.h"
#include "searchrecords/ZRSearchResult.h"

/// The records that this daemon and its service add to the search records.
namespace tavrin {

/// A request that was answered without the service, or not at all.
struct TAVSkipSearchFeedback : platform::RecordOf<TAVSkipSearchFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "TAVSkipSearchFeedback";

    std::optional<std::string> input; ///< what the user had typed
    SkipSearchTrigger triggerEvent = SkipSearchTrigger::Unknown;
    std::optional<std::string> uuid; ///< of the search whose answer was used again

    TAVSkipSearchFeedback() = default;
    TAVSkipSearchFeedback(std::optional<std::string> input_, SkipSearchTrigger reason,
                          std::optional<std::string> uuid_ = std::nullopt)
        : input(std::move(input_)), triggerEvent(reason), uuid(std::move(uuid_))
    {}

    static constexpr auto fields()
    {
        using Self = TAVSkipSearchFeedback;
        return std::tuple{platform::field("input", &Self::input), platform::field("triggerEvent", &Self::triggerEvent),
                          platform::field("uuid", &Self::uuid)};
    }
};

/// A lookup was sent.
struct TAVLookupStartNetworkSearchFeedback
    : platform::RecordOf<TAVLookupStartNetworkSearchFeedback, ZRStartNetworkSearchFeedback> {
    static constexpr std::string_view kClass = "TAVLookupStartNetworkSearchFeedback";

    LookupSelectionType selectionType = LookupSelectionType::Default;

    TAVLookupStartNetworkSearchFeedback() = default;
    /// Creates the record of a new lookup, with a new `uuid`.
    TAVLookupStartNetworkSearchFeedback(std::string input, std::string url, platform::Value headers,
                                        StartSearchTrigger triggerEvent, EndpointType endpoint,
                                        LookupSelectionType selectionType);

    static constexpr auto fields()
    {
        return std::tuple{platform::field("selectionType", &TAVLookupStartNetworkSearchFeedback::selectionType)};
    }
};

/// A request was answered by the service, which described its answer.
struct TAVEndNetworkSearchFeedback : platform::RecordOf<TAVEndNetworkSearchFeedback, ZREndNetworkSearchFeedback> {
    static constexpr std::string_view kClass = "TAVEndNetworkSearchFeedback";

    std::optional<std::string> tavrinStatus; ///< "OK", "ERROR"
    double tavrinDuration = 0;               ///< time that the service took, in its own unit
    std::optional<std::string> fbq;          ///< the service's opaque note on the query, returned to it in feedback
    std::optional<std::string> partialClientIp;

    TAVEndNetworkSearchFeedback() = default;
    /// Takes the `uuid` of `start`, which may be null.
    TAVEndNetworkSearchFeedback(const std::shared_ptr<ZRStartNetworkSearchFeedback>& start, std::size_t responseSize,
                                std::int64_t statusCode, std::optional<std::string> tavrinStatus, double tavrinDuration,
                                std::optional<std::string> fbq, std::optional<std::string> partialClientIp,
                                platform::Value networkTimingData);

    static constexpr auto fields()
    {
        using Self = TAVEndNetworkSearchFeedback;
        return std::tuple{platform::field("tavrinStatus", &Self::tavrinStatus),
                          platform::field("tavrinDuration", &Self::tavrinDuration), platform::field("fbq", &Self::fbq),
                          platform::field("partialClientIp", &Self::partialClientIp)};
    }
};

/// The client's ranker ran over an answer.
struct TAVRankerFeedback : platform::RecordOf<TAVRankerFeedback, ZRRankingFeedback> {
    static constexpr std::string_view kClass = "TAVRankerFeedback";
    bool timedOut = false;
    std::uint64_t resultCount = 0; ///< results ranked
    std::uint64_t duration = 0;    ///< in the client's own unit
    static constexpr auto fields()
    {
        using Self = TAVRankerFeedback;
        return std::tuple{platform::field("timedOut", &Self::timedOut),
                          platform::field("resultCount", &Self::resultCount),
                          platform::field("duration", &Self::duration)};
    }
};

/// The client answered a search from its own memory.
struct TAVCacheHitFeedback : platform::RecordOf<TAVCacheHitFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "TAVCacheHitFeedback";
    std::optional<std::string> uuid; ///< of the search whose answer was used again
    static constexpr auto fields() { return std::tuple{platform::field("uuid", &TAVCacheHitFeedback::uuid)}; }
};

/// A suggestion of the service.
struct TAVSearchSuggestion : platform::RecordOf<TAVSearchSuggestion, ZRSearchSuggestion> {
    static constexpr std::string_view kClass = "TAVSearchSuggestion";
    std::optional<std::string> fbr; ///< the service's opaque note, returned to it in feedback
    static constexpr auto fields() { return std::tuple{platform::field("fbr", &TAVSearchSuggestion::fbr)}; }
};

/// The custom properties of a result of the service.
struct TAVCustomSearchResult : platform::RecordOf<TAVCustomSearchResult> {
    static constexpr std::string_view kClass = "TAVCustomSearchResult";
    std::optional<std::string> fbr; ///< the service's opaque note, returned to it in feedback
    static constexpr auto fields() { return std::tuple{platform::field("fbr", &TAVCustomSearchResult::fbr)}; }
};

/// A destination in a card of the service.
struct TAVPunchout : platform::RecordOf<TAVPunchout, ZRPunchout> {
    static constexpr std::string_view kClass = "TAVPunchout";
    /// The service's name for the part of the card that leads there: "buy" (see `CardActionTarget`).
    std::optional<std::string> actionTarget;
    static constexpr auto fields() { return std::tuple{platform::field("actionTarget", &TAVPunchout::actionTarget)}; }
};

} // namespace tavrin
