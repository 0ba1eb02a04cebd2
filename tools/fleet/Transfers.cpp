#include "tools/fleet/Transfers.h"

#include <algorithm>

#include "platform/net/BackgroundPolicy.h"

namespace tavrin::fleet {

namespace {

const std::string kHost = "service.example";

} // namespace

void Transfers::add(unsigned what, Duration now, Duration window, Random& random)
{
    Task task{.what = what, .deadline = now + _configuration.resourceTimeout};
    if (window > Duration::zero()) task.notBefore = now + platform::startDelay(window, random.uniform());
    schedule(_tasks.emplace(++_last, task).first->first, task, now);
}

void Transfers::cancelAll()
{
    for (const auto& [identifier, task] : _tasks) _agenda.remove(identifier);
    _tasks.clear();
}

void Transfers::retryNow(Duration now)
{
    for (auto& [identifier, task] : _tasks) {
        if (task.failures == 0 || task.notBefore == Duration::zero()) continue;
        task.notBefore = Duration::zero();
        task.failures = 0;
        schedule(identifier, task, now);
    }
}

bool Transfers::waitsForRetry() const
{
    return std::ranges::any_of(_tasks, [](const auto& entry) { return entry.second.failures > 0; });
}

void Transfers::schedule(TaskId identifier, const Task& task, Duration now)
{
    _agenda.put(identifier, {.host = kHost, .notBefore = task.notBefore, .deadline = task.deadline}, now);
}

void Transfers::finish(TaskId identifier, const Answer& answer, Duration now, platform::Date wall, Random& random)
{
    if (answer.status == 0) {
        Task& task = _tasks.at(identifier);
        task.notBefore = now + platform::retryDelay(++task.failures, random.uniform());
        return schedule(identifier, task, now);
    }
    if (const auto wait = platform::retryAfter(answer.retryAfter, wall, random.uniform());
        wait && *wait > Duration::zero())
        _agenda.hold(kHost, now + *wait);
    _agenda.remove(identifier);
    _tasks.erase(identifier);
    if (answer.status < 400) retryNow(now);
}

} // namespace tavrin::fleet
