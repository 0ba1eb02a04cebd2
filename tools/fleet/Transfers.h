#pragma once

#include <map>
#include <optional>
#include <string>

#include "platform/net/BackgroundAgenda.h"
#include "platform/net/BackgroundSession.h"
#include "tools/fleet/Random.h"

namespace tavrin::fleet {

using platform::Duration;

/// A background session of one device: what `platform::BackgroundSession` decides, without its store and its loader. A
/// transfer takes no time.
class Transfers {
public:
    /// What an attempt met.
    struct Answer {
        int status = 0;         ///< 0: none, the attempt failed
        std::string retryAfter; ///< header field; empty if missing
    };

    explicit Transfers(const platform::BackgroundSessionConfiguration& configuration)
        : _configuration(configuration), _agenda(configuration.parallelTransfers)
    {}

    /// Adds a transfer, which starts within `window`. `what` belongs to the caller.
    void add(unsigned what, Duration now, Duration window, Random& random);
    void cancelAll();
    /// Ends the delays after failures: the network is there again, or the service.
    void retryNow(Duration now);

    [[nodiscard]] bool empty() const { return _tasks.empty(); }
    [[nodiscard]] std::size_t size() const { return _tasks.size(); }
    /// Returns true if an attempt failed and will be repeated.
    [[nodiscard]] bool waitsForRetry() const;
    /// Returns when to call `run` again; nothing if there are no transfers.
    [[nodiscard]] std::optional<Duration> nextDue() const { return _agenda.nextDue(); }

    /// Ends expired transfers with `expire(what)`. Then, if the network permits, starts those that are due:
    /// `attempt(what)` returns an `Answer`. `wall` is the device's date.
    template <class Attempt, class Expire>
    void run(Duration now, platform::Date wall, bool permitted, Random& random, Attempt attempt, Expire expire)
    {
        for (const auto identifier : _agenda.takeExpired(now)) {
            expire(_tasks.at(identifier).what);
            _tasks.erase(identifier);
        }
        while (permitted) {
            const auto identifier = _agenda.next(now);
            if (!identifier) return;
            finish(*identifier, attempt(_tasks.at(*identifier).what), now, wall, random);
        }
    }

private:
    struct Task {
        unsigned what;
        unsigned failures = 0;
        Duration notBefore{}, deadline{};
    };
    using TaskId = platform::BackgroundAgenda::TaskId;

    void schedule(TaskId identifier, const Task& task, Duration now);
    void finish(TaskId identifier, const Answer& answer, Duration now, platform::Date wall, Random& random);

    const platform::BackgroundSessionConfiguration& _configuration;
    platform::BackgroundAgenda _agenda;
    std::map<TaskId, Task> _tasks;
    TaskId _last = 0;
};

} // namespace tavrin::fleet
