#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/values/Value.h"

namespace tavrin::ctl {

/// The readable part of a session file. Each record is its length, 8 bytes in native order, and an archive. The first
/// record is the version of the daemon that wrote the file, the second the session, each further one an event.
struct SessionFile {
    struct Event {
        std::size_t offset = 0; ///< of the record in the file
        std::size_t size = 0;   ///< of the record, its length field included
        platform::Value value;  ///< a record of class "TavrinFeedback"
    };
    /// The first unreadable record. The daemon also stops reading here.
    struct Damage {
        std::size_t offset = 0;
        std::string reason;
    };

    std::optional<std::string> version;
    platform::Value session; ///< a record of class "ClientSession"; null if it can't be read
    std::vector<Event> events;
    std::optional<Damage> damage;
};

/// Reads a session file up to its first unreadable record.
[[nodiscard]] SessionFile readSessionFile(std::string_view bytes);

} // namespace tavrin::ctl
