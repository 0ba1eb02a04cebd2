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

/// A request with its retry policy for transport errors.
struct TAVRetryableNetworkRequest {
    platform::UrlRequest httpRequest; ///< sent on every attempt, unchanged
    /// A failure after this moment is final. Without a moment, every failure is final.
    std::optional<platform::Date> expire;
    bool delayOnFail = false; ///< wait 1.5 s before each repetition; the delay does not grow
    /// Called for each failed attempt that will be repeated, on the session's delegate queue; may be null.
    std::function<void(const platform::Error&)> failed = {};
};

/// Returns the delay before a failed request is repeated; nothing if the failure is final. The first two parameters are
/// those of `TAVRetryableNetworkRequest`.
[[nodiscard]] std::optional<platform::Duration> delayBeforeRetry(std::optional<platform::Date> expire, bool delayOnFail,
                                                                 unsigned retriesLeft, platform::Date now);

/// Called once, for the last attempt, on the session's delegate queue, with that attempt's timing data.
using RetryCompletion =
    std::move_only_function<void(std::optional<platform::Bytes> data, std::optional<platform::UrlResponse> response,
                                 std::optional<platform::Error> error, platform::Value timingData)>;

/// Returns the task of the first attempt, suspended; later attempts are created and resumed here, `retriesLeft` at
/// most. Only a transport error is repeated: an HTTP error status counts as success. Cancelling the returned task ends
/// the first attempt only. Any thread.
[[nodiscard]] std::shared_ptr<platform::UrlTask>
dataTaskWithRetryableRequest(platform::Device& device, std::shared_ptr<platform::UrlSession> session,
                             TAVRetryableNetworkRequest request, unsigned attempt, unsigned retriesLeft,
                             RetryCompletion completion);

} // namespace tavrin
