#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "CoreTavrin/TAVClient.h"
#include "platform/values/Value.h"

namespace tavrin::replay {

enum class Kind {
    Cache,   ///< answered from memory
    Network, ///< answered by the service
    Empty,   ///< neither reply nor error: too short, disabled, or overtaken
    Failed,
};

/// One key's search.
struct Search {
    std::int64_t queryId = 0;
    std::string text;
    bool overtaken = false; ///< a later key was sent before the answer came
    bool tooShort = false;  ///< shorter than the bag's minimum, or the bag disables search
    double sent = 0;        ///< seconds on the monotonic clock
    double answered = 0;
};

[[nodiscard]] Kind kindOf(const platform::Result<TAVAnswer>& answer);

/// Counts the answers to one connection's verbose searches and finds answers that should not have been delivered. The
/// caller passes the times. Not thread-safe.
class Report {
public:
    /// Adds an answer. Call in the order of arrival.
    void add(const Search& search, const platform::Result<TAVAnswer>& answer);
    /// Adds a search without an answer.
    void addUnanswered(const Search& search);

    [[nodiscard]] std::uint64_t keys() const { return _keys; }
    [[nodiscard]] std::uint64_t hits() const { return static_cast<std::uint64_t>(_cache.size()); }
    /// Returns the number of searches that were sent to the service, including overtaken ones.
    [[nodiscard]] std::uint64_t requests() const { return _network.size() + _overtaken + _failed.size(); }
    /// Return one message for each stale and each failed answer.
    [[nodiscard]] const std::vector<std::string>& stale() const { return _stale; }
    [[nodiscard]] const std::vector<std::string>& failed() const { return _failed; }

    [[nodiscard]] platform::Value json() const;
    [[nodiscard]] std::string text() const;

private:
    void checkOrder(const Search& search);
    void checkCached(const Search& search, const TAVAnswer& answer, const platform::Value& sets);
    [[nodiscard]] double savedPercent() const;

    std::uint64_t _keys = 0;
    std::uint64_t _skipped = 0;
    std::uint64_t _overtaken = 0;
    std::vector<double> _cache; // latencies in seconds
    std::vector<double> _network;
    std::vector<std::string> _stale;
    std::vector<std::string> _failed;
    std::int64_t _newestAnswered = 0;
    std::map<std::string, double> _fetched; // arrival of the service's latest answer for a text, even if overtaken
};

/// Returns the smallest value that is not exceeded by `percent` of the values; 0 if there are none.
[[nodiscard]] double percentile(std::vector<double> values, double percent);

} // namespace tavrin::replay
