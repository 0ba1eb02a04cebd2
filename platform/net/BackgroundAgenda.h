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

/// Decides which background tasks may begin, which have run out of time, and when to look again. Pure: no I/O and no
/// clock of its own.
///
/// A task in the agenda waits (for a moment, or for its host's hold to end), is ready, or is under way. Ready tasks
/// begin in the order of their identifiers. All times are counts of one `LivedTime`; `now` must not go back. One thread
/// at a time.
class BackgroundAgenda {
public:
    using TaskId = std::uint64_t;

    struct Plan {
        std::string host;     ///< the task waits while this host is on hold
        Duration notBefore{}; ///< start of the next attempt
        Duration deadline{};  ///< end of the task, under way or not
        bool underWay = false;
    };

    /// At most `maximumUnderWay` tasks are under way at once.
    explicit BackgroundAgenda(unsigned maximumUnderWay) : _maximumUnderWay(maximumUnderWay) {}

    /// Adds the task, or replaces its plan.
    void put(TaskId task, Plan plan, Duration now);
    /// Does nothing if the task isn't in the agenda.
    void remove(TaskId task);
    /// Lets no task to that host begin before `until`. Replaces an earlier hold.
    void hold(const std::string& host, Duration until) { _holds[host] = until; }

    /// Removes the tasks whose deadline has come and returns them, the earliest deadline first.
    [[nodiscard]] std::vector<TaskId> takeExpired(Duration now);
    /// Returns the task to begin next, or nothing if none is ready or the limit is reached. The caller reports the
    /// begin by `put`.
    [[nodiscard]] std::optional<TaskId> next(Duration now);
    /// When `takeExpired` and `next` must be asked again; nothing while the agenda is empty.
    [[nodiscard]] std::optional<Duration> nextDue() const;

private:
    struct Entry {
        Plan plan;
        Duration due{}; ///< key in `_dues`
    };
    [[nodiscard]] Duration holdOf(const std::string& host, Duration now);

    const unsigned _maximumUnderWay;
    unsigned _underWay = 0;
    std::map<TaskId, Entry> _entries;
    std::set<std::pair<Duration, TaskId>> _dues; // each task once: the end of its wait, or else its deadline
    std::set<TaskId> _ready;
    std::map<std::string, Duration> _holds;
};

} // namespace platform
