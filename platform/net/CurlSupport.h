#pragma once

#include <optional>
#include <string>

#include <curl/curl.h>

#include "platform/base/Date.h"
#include "platform/values/Error.h"

namespace platform {

struct UrlSessionConfiguration;

// Helpers of the loader. Any thread, except for `timingDataOf`.

/// Maps libcurl's result to an error in kUrlErrorDomain. `detail` is libcurl's error text; null or empty if none.
[[nodiscard]] Error urlErrorFromCurl(CURLcode code, const char* detail);

/// Returns how long a connection may be idle and still be reused, in the network's current state; nullopt selects
/// libcurl's default.
[[nodiscard]] std::optional<Duration> connectionPurgeTimeout(const UrlSessionConfiguration& configuration);

/// Returns a peer's address in the binary form of timing data (docs/timing.md); empty if `ip` isn't an IP address.
[[nodiscard]] std::string socketAddress(const std::string& ip, long port);

/// Returns the seconds of the monotonic clock.
[[nodiscard]] double monotonicSeconds();

/// Start times of the parts of a load, in `monotonicSeconds`.
struct LoadMarks {
    double start = 0;
    double redirectEnd = 0; ///< 0 if there was no redirect
    double hop = 0;         ///< of the last request, after redirects and after a retry on a new connection
};
/// Returns the timing data of a finished load; docs/timing.md lists the keys. `easy` must be the handle of its last
/// request. Loader's thread.
[[nodiscard]] Value timingDataOf(CURL* easy, const LoadMarks& marks);

} // namespace platform
