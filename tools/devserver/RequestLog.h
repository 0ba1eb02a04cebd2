#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <map>
#include <string>
#include <string_view>

#include "platform/base/Mutex.h"
#include "platform/values/Value.h"
#include "tools/devserver/Http.h"

namespace devserver {

/// The received requests in order of arrival, and their number by endpoint. Control calls aren't logged. Any thread.
class RequestLog {
public:
    static constexpr std::size_t kKept = 1000;

    /// Logs a request on arrival, before any delay; returns its number.
    std::uint64_t add(std::string_view endpoint, const Request& request);
    /// Adds the answer to the request with that number, unless the request was removed.
    void finish(std::uint64_t number, const Answer& answer, const std::string& faults,
                std::chrono::duration<double, std::milli> duration);
    /// Returns the last `count` requests of an endpoint ("" for all) with a number above `since`: {"requests":
    /// [{"number", "time", "endpoint", "method", "path", "query", "secure", "headers", "status", "size", "duration",
    /// "faults"}], "last": N}. The last four are null until the request is answered; "duration" is in milliseconds.
    [[nodiscard]] platform::Value list(std::string_view endpoint, std::uint64_t since, std::size_t count) const;
    /// Returns {"requests": […], "first": N}: the requests that were added or answered since `mark`, which advances (0:
    /// all), and the number of the oldest one that the log has. Returns null if nothing has changed.
    [[nodiscard]] platform::Value changesSince(std::uint64_t& mark) const;
    [[nodiscard]] std::uint64_t total() const;
    /// Returns {"search": 3, …}: the number of requests by endpoint, without zeros.
    [[nodiscard]] platform::Value byEndpoint() const;
    /// Removes requests and counts. Numbers continue.
    void clear();

private:
    struct Kept {
        std::uint64_t number;
        std::uint64_t changed; // the value of `_changes` after the last change
        std::string endpoint;
        platform::Value value;
    };
    mutable platform::Mutex _mutex;
    std::uint64_t _lastNumber GUARDED_BY(_mutex) = 0;
    std::uint64_t _changes GUARDED_BY(_mutex) = 0;
    std::uint64_t _total GUARDED_BY(_mutex) = 0;
    std::map<std::string, std::uint64_t, std::less<>> _counts GUARDED_BY(_mutex);
    std::deque<Kept> _kept GUARDED_BY(_mutex);
};

} // namespace devserver
