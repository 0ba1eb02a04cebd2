#pragma once

#include <optional>
#include <string>

#include "platform/values/Record.h"

namespace tavrin {

/// The header of a session file: what an upload contains besides the events.
struct ClientSessionHeader : platform::RecordOf<ClientSessionHeader> {
    static constexpr std::string_view kClass = "ClientSession";

    std::string agent; ///< the client's user agent
    platform::Uuid userGuid;
    platform::Value resourceVersions;       ///< dictionary of resource identifiers to versions, or null
    std::optional<platform::Date> baseTime; ///< when the session began
    std::int64_t previousSessionEndReason = 0;
    bool firstUse = false;         ///< the client's first session of the day
    bool removeTimestamps = false; ///< the upload must not reveal when the session began

    static constexpr auto fields()
    {
        using Self = ClientSessionHeader;
        return std::tuple{platform::field("agent", &Self::agent),
                          platform::field("user_guid", &Self::userGuid),
                          platform::field("resource_versions", &Self::resourceVersions),
                          platform::field("base_time", &Self::baseTime),
                          platform::field("previous_session_end_reason", &Self::previousSessionEndReason),
                          platform::field("first_use", &Self::firstUse),
                          platform::field("remove_timestamps", &Self::removeTimestamps)};
    }
};

} // namespace tavrin
