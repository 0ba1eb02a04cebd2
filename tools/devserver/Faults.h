#pragma once

#include <cstdint>
#include <deque>
#include <expected>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Mutex.h"
#include "platform/values/Value.h"
#include "tools/devserver/Http.h"

namespace devserver {

/// A fault that is applied to one request.
struct Fault {
    enum class Kind {
        Delay,
        Hang,
        Status,
        Cut,
        Half,
        Endless,
        Empty,
        NotJson,
        WrongType,
        WrongValues,
        Huge,
        Deep,
        Redirect,
        Elsewhere,
        GzipBomb,
        RetryAfter
    };
    Kind kind = Kind::Delay;
    std::uint64_t number = 0; ///< milliseconds, status code, bytes, depth or seconds; 0 if the kind has none

    friend bool operator==(const Fault&, const Fault&) = default;
};

/// Parses a list like "delay:200,status:503". The error says what is allowed.
[[nodiscard]] std::expected<std::vector<Fault>, std::string> parseFaults(std::string_view text);

/// Returns the list as `parseFaults` reads it.
[[nodiscard]] std::string textOf(const std::vector<Fault>& faults);

/// Applies a fault to a finished answer. Delay, Hang and Endless change nothing here.
void spoil(Answer& answer, const Fault& fault, const Request& request);

/// Returns the names of the endpoints that faults, the log and the counters use.
[[nodiscard]] const std::vector<std::string_view>& endpointNames();

/// The rules that assign faults to requests, in the order of their addition. Any thread.
class Faults {
public:
    static constexpr std::size_t kMaximumCount = 100;

    /// Adds a rule for the next `count` requests of an endpoint: one of `endpointNames()`, or "*" for all. With a count
    /// of 0 the rule applies until `clear`. The error says what is allowed.
    std::expected<void, std::string> add(std::string_view endpoint, std::string_view fault, std::uint64_t count);
    /// Returns the faults of the first rule that matches the endpoint, and counts the rule down.
    [[nodiscard]] std::vector<Fault> take(std::string_view endpoint);
    void clear();
    /// Returns [{"endpoint", "fault", "left"}]; a "left" of 0 means until cleared.
    [[nodiscard]] platform::Value list() const;
    [[nodiscard]] std::size_t count() const;

private:
    struct Rule {
        std::string endpoint;
        std::string text;
        std::vector<Fault> faults;
        std::uint64_t left;
    };
    mutable platform::Mutex _mutex;
    std::deque<Rule> _rules GUARDED_BY(_mutex);
};

} // namespace devserver
