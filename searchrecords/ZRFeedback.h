#pragma once

#include <cstdint>

#include "platform/values/Record.h"

namespace tavrin {

/// The base of every event record: something happened in a client's search.
struct ZRFeedback : platform::RecordOf<ZRFeedback> {
    static constexpr std::string_view kClass = "ZRFeedback";

    /// When it happened, in `Clock::hostTicks()` of this boot; 0 if the client doesn't stamp its records.
    std::uint64_t timestamp = 0;

    static constexpr auto fields() { return std::tuple{platform::field("timestamp", &ZRFeedback::timestamp)}; }
};

} // namespace tavrin
