#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/base/Date.h"

namespace platform {

/// Decides which background tasks may start, which have expired, and when to ask again. Does no I/O and has no clock.
///
/// A task in the agenda waits (until a time, or for the end of its host's hold), is ready, or is in progress. Ready
/// tasks start in the order of their identifiers. All times are counts of one `LivedTime`; `now` must not decrease. One
/// thread at a time.
class BackgroundAgenda {
public:
    using TaskId = std::uint64_t;

    struct Plan {
        std::string host;     ///< the task waits while this host is on hold
        Duration notBefore{}; ///< start of the next attempt
        Duration deadline{};  ///< when the task expires, in progress or not
        bool underWay = false;
    };

    /// At most `maximumUnderWay` tasks are in progress at once.
    explicit BackgroundAgenda(unsigned maximumUnderWay) : _maximumUnderWay(maximumUnderWay) {}

    /// Adds the task, or replaces its plan.
    void put(TaskId task, Plan plan, Duration now);
    /// Does nothing if the task isn't in the agenda.
    void remove(TaskId task);
    /// Keeps tasks to that host from starting before `until`. Replaces an earlier hold.
    void hold(const std::string& host, Duration until) { _holds[host] = until; }

    /// Removes the tasks whose deadline has passed and returns them, the earliest deadline first.
    [[nodiscard]] std::vector<TaskId> takeExpired(Duration now);
    /// Returns the task to start next, or nothing if none is ready or the limit is reached. The caller reports the
    /// start with `put`.
    [[nodiscard]] std::optional<TaskId> next(Duration now);
    /// Returns when to call `takeExpired` and `next` again; nothing if the agenda is empty.
    [[nodiscard]] std::optional<Duration> nextDue() const;
    /// Returns when the hold of a host ends; the smallest duration if it has none.
    [[nodiscard]] Duration holdOf(const std::string& host, Duration now);

private:
    struct Entry {
        Plan plan;
        Duration due{}; ///< key in `_dues`
    };

    const unsigned _maximumUnderWay;
    unsigned _underWay = 0;
    std::map<TaskId, Entry> _entries;
    std::set<std::pair<Duration, TaskId>> _dues; // one for each task: the end of its wait, else its deadline
    std::set<TaskId> _ready;
    std::map<std::string, Duration> _holds;
};

} // namespace platform
