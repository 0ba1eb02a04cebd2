#include "tavrind/FeedbackTypes.h"

namespace tavrin {

const std::unordered_set<std::string_view>& sharedKeySet()
{
    static const auto keys = [] {
        std::unordered_set<std::string_view> all{"type",
                                                 "id",
                                                 "name",
                                                 "query_id",
                                                 "client_query_id",
                                                 "timestamp",
                                                 "input",
                                                 "reason",
                                                 "trigger_event",
                                                 "headers",
                                                 "url",
                                                 "provider",
                                                 "response_size",
                                                 "status_code",
                                                 "network_timing_data",
                                                 "connection_reused",
                                                 "interface",
                                                 "peer_address",
                                                 "uuid",
                                                 "sections",
                                                 "results",
                                                 "result",
                                                 "ranking_score",
                                                 "top_hit",
                                                 "endpoint_type",
                                                 "blending_duration",
                                                 "local_section_position",
                                                 "local_result_position",
                                                 "fbr",
                                                 "hidden_results",
                                                 "duplicate_results",
                                                 "action_destination",
                                                 "code",
                                                 "domain",
                                                 "underlying_error",
                                                 "card_type",
                                                 "destination",
                                                 "bundle_id",
                                                 "action_target",
                                                 "suggestions",
                                                 "query",
                                                 "suggestion",
                                                 "score",
                                                 "index_type",
                                                 "on_lock_screen",
                                                 "is_over_app",
                                                 "section_bundle_id",
                                                 "tavrin_status",
                                                 "tavrin_duration",
                                                 "tavrin_partial_client_ip",
                                                 "corrected_query",
                                                 "static_correction",
                                                 "section_header_type",
                                                 "fbq",
                                                 "section_id",
                                                 "result_type",
                                                 "suggestion_type",
                                                 "suggestion_query",
                                                 "third_party_suggestion",
                                                 "ranker_did_rank",
                                                 "ranker_timeout",
                                                 "ranker_duration",
                                                 "ranker_results",
                                                 "publicly_indexable",
                                                 "local_features",
                                                 "tavrin"};
        all.insert(kTexts<EventType>.begin(), kTexts<EventType>.end());
        return all;
    }();
    return keys;
}

std::string_view eventTypeToString(EventType type)
{
    return kTexts<EventType>[static_cast<std::size_t>(type)];
}

bool requiresQueryId(EventType type)
{
    using enum EventType;
    switch (type) {
    case NetworkSearchEnd:
    case LocalSearchEnd:
    case CustomVistrelResultFeatures:
    case SessionEnd:
    case SessionMissingResults:
    case SessionMissingSuggestions:
    case ConnectionInvalidated: return false;
    default: return true;
    }
}

} // namespace tavrin
