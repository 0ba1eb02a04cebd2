#pragma once

#include <string>

#include <curl/curl.h>

#include "platform/values/Error.h"

namespace platform {

/// Error in kUrlErrorDomain.
[[nodiscard]] Error urlError(std::int64_t code, std::string reason);
/// libcurl's result as such an error; `detail` is its error text, if it left one.
[[nodiscard]] Error urlErrorFromCurl(CURLcode code, const char* detail);

/// False for loopback, link-local and private addresses (RFC 1918, 4193, 6598) in text form, also where an IPv6 address
/// stands for such an IPv4 one, and for texts that are none.
[[nodiscard]] bool isPublicAddress(const std::string& address);

/// A peer's address in the byte form that timing data has (docs/timing.md); empty for text that is no address.
[[nodiscard]] std::string socketAddress(const std::string& ip, long port);

/// Seconds on the monotonic clock, the loader's clock.
[[nodiscard]] double monotonicSeconds();
/// libcurl's marks of a transfer: seconds from the start of a hop to the end of a stage, summed over the hops. The
/// connections made are counted.
struct TransferMarks {
    double lookup = 0;
    double connected = 0;
    double secured = 0;
    double ready = 0;
    double firstByte = 0;
    long connections = 0;
};
[[nodiscard]] TransferMarks transferMarks(CURL* easy);

/// When the stages of a finished transfer's last hop began and ended; docs/timing.md lists the keys. `start` is when
/// the transfer was begun, `earlierHops` what the marks were before the last hop.
[[nodiscard]] Value timingDataOf(CURL* easy, double start, const TransferMarks& earlierHops);

} // namespace platform
