#pragma once

#include <string>

#include <curl/curl.h>

#include "platform/Error.h"

namespace platform {

/// Error in kUrlErrorDomain.
[[nodiscard]] Error urlError(std::int64_t code, std::string reason);
/// libcurl's result as such an error; `detail` is its error text, if it left one.
[[nodiscard]] Error urlErrorFromCurl(CURLcode code, const char* detail);

/// False for loopback, link-local and private addresses (RFC 1918, 4193, 6598) in text form, and for texts that are none.
[[nodiscard]] bool isPublicAddress(const std::string& address);

/// Seconds on the monotonic clock, the loader's clock.
[[nodiscard]] double monotonicSeconds();
/// When the stages of a finished transfer began and ended; docs/timing.md lists the keys. `start` is when it was begun.
[[nodiscard]] Value timingDataOf(CURL* easy, double start);

} // namespace platform
