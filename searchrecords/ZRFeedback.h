#pragma once

#include <cstdint>

#include "platform/values/Record.h"

namespace tavrin {

/// Something that happened in a client's search; the base of every event record. On its own it says that and no more.
struct ZRFeedback : platform::RecordOf<ZRFeedback> {
    static constexpr std::string_view kClass = "ZRFeedback";

    /// When it happened, in `Clock::hostTicks()` of this boot; 0 for a client that doesn't stamp its records.
    std::uint64_t timestamp = 0;

    static constexpr auto fields() { return std::tuple{platform::field("timestamp", &ZRFeedback::timestamp)}; }
};

} // namespace tavrin
