#pragma once

#include <cstdint>
#include <deque>
#include <expected>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/values/Value.h"
#include "tools/devserver/Http.h"

namespace devserver {

/// What goes wrong on demand, of one request.
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
    std::uint64_t number = 0; ///< milliseconds, status code, bytes, depth or seconds; 0 where the kind takes none

    friend bool operator==(const Fault&, const Fault&) = default;
};

/// Reads "delay:200,status:503". The error says what is allowed.
[[nodiscard]] std::expected<std::vector<Fault>, std::string> parseFaults(std::string_view text);

/// Spoils an answer that was ready to go. Delays, hangs and bodies without an end change nothing here.
void spoil(Answer& answer, const Fault& fault, const Request& request);

/// The names of endpoints that faults, the log and the counters use.
[[nodiscard]] const std::vector<std::string_view>& endpointNames();

/// The faults that were asked for, in the order in which they came. Any thread.
class Faults {
public:
    static constexpr std::size_t kMaximumCount = 100;

    /// `endpoint` is one of `endpointNames()` or "*". A count of 0 is until cleared. The error says what is allowed.
    std::expected<void, std::string> add(std::string_view endpoint, std::string_view fault, std::uint64_t count);
    /// The faults of the next request of an endpoint: those of the first rule that fits. Counts them down.
    [[nodiscard]] std::vector<Fault> take(std::string_view endpoint);
    void clear();
    /// [{"endpoint", "fault", "left"}]; "left" 0 is until cleared.
    [[nodiscard]] platform::Value list() const;
    [[nodiscard]] std::size_t count() const;

private:
    struct Rule {
        std::string endpoint;
        std::string text;
        std::vector<Fault> faults;
        std::uint64_t left;
    };
    mutable std::mutex _mutex;
    std::deque<Rule> _rules;
};

} // namespace devserver
