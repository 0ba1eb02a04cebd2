#pragma once

#include <optional>

#include "searchrecords/ZRFeedback.h"

namespace tavrin {

/// Something failed.
struct ZRErrorFeedback : platform::RecordOf<ZRErrorFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRErrorFeedback";

    std::optional<platform::Error> error;

    ZRErrorFeedback() = default;
    explicit ZRErrorFeedback(std::optional<platform::Error> error_) : error(std::move(error_)) {}

    static constexpr auto fields() { return std::tuple{platform::field("error", &ZRErrorFeedback::error)}; }
};

} // namespace tavrin
