#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "searchrecords/ZREnums.h"
#include "searchrecords/ZRFeedback.h"

/// Starts and ends of searches. An end has the `uuid` of its start.
namespace tavrin {

struct ZRStartSearchFeedback : platform::RecordOf<ZRStartSearchFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRStartSearchFeedback";

    std::optional<std::string> input; ///< what the user had typed
    StartSearchTrigger triggerEvent = StartSearchTrigger::Unknown;
    std::optional<std::string> uuid; ///< of this search, repeated in its end
    std::uint64_t queryId = 0;       ///< the client's own number of the query; 0 for none

    static constexpr auto fields()
    {
        using Self = ZRStartSearchFeedback;
        return std::tuple{platform::field("input", &Self::input), platform::field("triggerEvent", &Self::triggerEvent),
                          platform::field("uuid", &Self::uuid), platform::field("queryId", &Self::queryId)};
    }
};

struct ZREndSearchFeedback : platform::RecordOf<ZREndSearchFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZREndSearchFeedback";
    std::optional<std::string> uuid; ///< of the search that ends
    static constexpr auto fields() { return std::tuple{platform::field("uuid", &ZREndSearchFeedback::uuid)}; }
};

struct ZRStartLocalSearchFeedback : platform::RecordOf<ZRStartLocalSearchFeedback, ZRStartSearchFeedback> {
    static constexpr std::string_view kClass = "ZRStartLocalSearchFeedback";
    IndexType indexType = IndexType::Unknown;
    static constexpr auto fields()
    {
        return std::tuple{platform::field("indexType", &ZRStartLocalSearchFeedback::indexType)};
    }
};

struct ZREndLocalSearchFeedback : platform::RecordOf<ZREndLocalSearchFeedback, ZREndSearchFeedback> {
    static constexpr std::string_view kClass = "ZREndLocalSearchFeedback";
    static constexpr auto fields() { return std::tuple<>{}; }
};

} // namespace tavrin
