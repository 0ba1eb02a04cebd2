#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>

#include "platform/net/UrlSession.h"

namespace platform {
struct Device;
}

namespace tavrin {

/// A request and until when, and how, it is tried again after a transport error.
struct TAVRetryableNetworkRequest {
    platform::UrlRequest httpRequest; ///< sent on every attempt, unchanged
    /// After this moment a failure is final. None counts as a moment long past: such a request is never repeated.
    std::optional<platform::Date> expire;
    bool delayOnFail = false; ///< wait 1.5 s before a repetition
};

/// Called once, by the last attempt, on the session's delegate queue, with that attempt's timing data.
using RetryCompletion =
    std::move_only_function<void(std::optional<platform::Bytes> data, std::optional<platform::UrlResponse> response,
                                 std::optional<platform::Error> error, platform::Value timingData)>;

/// The first attempt's task, which the caller resumes; repetitions are made and resumed here. An HTTP error status is
/// no failure. Any thread.
[[nodiscard]] std::shared_ptr<platform::UrlTask>
dataTaskWithRetryableRequest(platform::Device& device, std::shared_ptr<platform::UrlSession> session,
                             TAVRetryableNetworkRequest request, unsigned attempt, unsigned retriesLeft,
                             RetryCompletion completion);

} // namespace tavrin
