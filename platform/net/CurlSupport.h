#pragma once

#include <optional>
#include <string>

#include <curl/curl.h>

#include "platform/base/Date.h"
#include "platform/values/Error.h"

namespace platform {

struct UrlSessionConfiguration;

/// Makes an error in kUrlErrorDomain.
[[nodiscard]] Error urlError(std::int64_t code, std::string reason);
/// Maps libcurl's result to an error in kUrlErrorDomain. `detail` is libcurl's error text; null or empty if none.
[[nodiscard]] Error urlErrorFromCurl(CURLcode code, const char* detail);

/// How long a connection may be idle and still be reused, in the network's present state; nullopt is libcurl's default.
[[nodiscard]] std::optional<Duration> connectionPurgeTimeout(const UrlSessionConfiguration& configuration);

/// A peer's address in the binary form of timing data (docs/timing.md); empty if `ip` isn't an IP address.
[[nodiscard]] std::string socketAddress(const std::string& ip, long port);

/// Seconds of the monotonic clock.
[[nodiscard]] double monotonicSeconds();

/// When parts of a load began, in `monotonicSeconds`.
struct LoadMarks {
    double start = 0;
    double redirectEnd = 0; ///< 0 if there was no redirect
    double hop = 0;         ///< the last request: after redirects, and after one lost on a dead connection
};
/// The timing data of a finished load; docs/timing.md lists the keys. `easy` must be the handle of its last request.
[[nodiscard]] Value timingDataOf(CURL* easy, const LoadMarks& marks);

} // namespace platform
