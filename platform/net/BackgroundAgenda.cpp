#include "platform/net/BackgroundAgenda.h"

#include <algorithm>

namespace platform {

void BackgroundAgenda::put(TaskId task, Plan plan, Duration now)
{
    remove(task);
    const Duration mayBegin = std::max(plan.notBefore, holdOf(plan.host, now));
    const bool waits = !plan.underWay && mayBegin > now;
    const Duration due = waits ? std::min(mayBegin, plan.deadline) : plan.deadline;
    if (plan.underWay)
        ++_underWay;
    else if (!waits)
        _ready.insert(task);
    _dues.emplace(due, task);
    _entries.emplace(task, Entry{std::move(plan), due});
}

void BackgroundAgenda::remove(TaskId task)
{
    const auto found = _entries.find(task);
    if (found == _entries.end()) return;
    if (found->second.plan.underWay) --_underWay;
    _ready.erase(task);
    _dues.erase({found->second.due, task});
    _entries.erase(found);
}

std::vector<BackgroundAgenda::TaskId> BackgroundAgenda::takeExpired(Duration now)
{
    std::vector<TaskId> expired;
    while (!_dues.empty() && _dues.begin()->first <= now) {
        const TaskId task = _dues.begin()->second;
        Plan plan = _entries.at(task).plan;
        if (plan.deadline <= now) {
            expired.push_back(task);
            remove(task);
        } else {
            put(task, std::move(plan), now);
        }
    }
    return expired;
}

std::optional<BackgroundAgenda::TaskId> BackgroundAgenda::next(Duration now)
{
    while (_underWay < _maximumUnderWay && !_ready.empty()) {
        const TaskId task = *_ready.begin();
        Plan plan = _entries.at(task).plan;
        if (holdOf(plan.host, now) <= now) return task;
        put(task, std::move(plan), now); // the hold began after the task was ready
    }
    return std::nullopt;
}

std::optional<Duration> BackgroundAgenda::nextDue() const
{
    return _dues.empty() ? std::nullopt : std::optional(_dues.begin()->first);
}

Duration BackgroundAgenda::holdOf(const std::string& host, Duration now)
{
    const auto found = _holds.find(host);
    if (found == _holds.end()) return Duration::min();
    if (found->second > now) return found->second;
    _holds.erase(found);
    return Duration::min();
}

} // namespace platform
