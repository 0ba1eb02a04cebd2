#include "platform/device/ActivityScheduler.h"

#include <algorithm>
#include <cerrno>
#include <map>
#include <mutex>
#include <vector>

#include "platform/base/Log.h"
#include "platform/device/ActivityPolicy.h"
#include "platform/device/DeviceUse.h"
#include "platform/files/Files.h"
#include "platform/run/Clock.h"
#include "platform/run/LivedTime.h"
#include "platform/run/Queue.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"

namespace platform {

using namespace std::chrono_literals;

namespace {

/// A deferred activity, and one whose criteria don't hold, is looked at again after this.
constexpr Duration kSoon = 5min;
/// No repeating activity keeps a worker busy.
constexpr Duration kShortestInterval = 1s;
constexpr Duration kLongest = std::chrono::hours(24 * 366);
constexpr std::size_t kMaximumFile = 64u << 10;
/// What is kept of an activity that nobody registers any more goes this long after it was due.
constexpr Duration kForgottenAfter = std::chrono::hours(24 * 60);

ActivityCriteria sane(ActivityCriteria criteria)
{
    for (Duration* span : {&criteria.delay, &criteria.gracePeriod, &criteria.interval})
        *span = std::clamp(*span, Duration::zero(), kLongest);
    criteria.interval = std::max(criteria.interval, kShortestInterval);
    return criteria;
}

/// One call of a handler: the check-in, or one run. Told on when the run has ended, at the latest when nobody holds it
/// any more.
class Call final : public Activity {
public:
    using Ended = std::move_only_function<void(ActivityState)>;
    Call(std::string identifier, ActivityCriteria criteria, ActivityState state, DeviceUseSource& use, Ended ended)
        : _identifier(std::move(identifier)), _use(use), _criteria(criteria), _state(state), _ended(std::move(ended))
    {}
    ~Call() override
    {
        if (_state == ActivityState::Run || _state == ActivityState::Continue) (void)setState(ActivityState::Done);
    }

    [[nodiscard]] const std::string& identifier() const override { return _identifier; }
    [[nodiscard]] ActivityState state() const override
    {
        std::lock_guard lock(_mutex);
        return _state;
    }
    bool setState(ActivityState state) override
    {
        using enum ActivityState;
        Ended ended;
        {
            std::lock_guard lock(_mutex);
            const bool ends = state == Defer || state == Done;
            if (!(_state == Run && (ends || state == Continue)) && !(_state == Continue && ends)) return false;
            _state = state;
            if (ends) ended = std::move(_ended);
        }
        if (ended) ended(state);
        return true;
    }
    [[nodiscard]] bool shouldDefer() const override
    {
        const ActivityCriteria held = criteria();
        if (dependOnUse(held)) _use.ask([](const DeviceUse&) {}); // for whoever asks next
        return !criteriaHold(held, _use.last());
    }
    void setCriteria(ActivityCriteria criteria) override
    {
        std::lock_guard lock(_mutex);
        if (_state == ActivityState::CheckIn) _criteria = criteria;
    }
    [[nodiscard]] ActivityCriteria criteria() const override
    {
        std::lock_guard lock(_mutex);
        return _criteria;
    }

private:
    const std::string _identifier;
    DeviceUseSource& _use;
    mutable std::mutex _mutex;
    ActivityCriteria _criteria; // under the mutex, like the rest
    ActivityState _state;
    Ended _ended;
};

/// All of it belongs to `_queue`.
class Core : public std::enable_shared_from_this<Core> {
public:
    explicit Core(ActivityEnvironment environment)
        : _environment(std::move(environment)),
          _queue(Queue::make("activities", Queue::Kind::Serial, _environment.executor, _environment.clock)),
          _handlers(
              Queue::make("activities.handlers", Queue::Kind::Concurrent, _environment.executor, _environment.clock)),
          _maintenance(Queue::make("activities.maintenance", Queue::Kind::Concurrent, _environment.executor,
                                   _environment.clock, Priority::Background)),
          _time(_environment.clock)
    {}
    ~Core() { _environment.clock.cancel(_timer); }

    /// Runs `work` on the queue, if the scheduler is still there then.
    template <class Work> void onQueue(Work work)
    {
        _queue->async([weak = weak_from_this(), work = std::move(work)]() mutable {
            if (auto self = weak.lock()) work(*self);
        });
    }

    void add(const std::string& identifier, const ActivityCriteria& criteria, ActivityScheduler::Handler handler);
    void remove(const std::string& identifier);

private:
    struct Entry {
        ActivityCriteria criteria;
        std::shared_ptr<const ActivityScheduler::Handler> handler;
        std::uint64_t generation = 0; ///< of the registration
        Duration registered{};
        enum class Stage { CheckingIn, Waiting, Asking, Running } stage = Stage::CheckingIn;
        Duration next{};        ///< when it is looked at, while it waits
        Duration gracePeriod{}; ///< how much later that may be
    };

    /// The entry, unless it was registered anew since.
    Entry* _find(const std::string& identifier, std::uint64_t generation)
    {
        const auto found = _entries.find(identifier);
        return found != _entries.end() && found->second.generation == generation ? &found->second : nullptr;
    }
    void _checkedIn(const std::string& identifier, std::uint64_t generation, const ActivityCriteria& criteria);
    void _wait(Entry& entry, Duration until, Duration gracePeriod);
    void _setTimer();
    void _lookAtDue();
    void _lookAt(const std::string& identifier, Entry& entry);
    void _decide(const std::string& identifier, std::uint64_t generation, const DeviceUse& use);
    void _run(const std::string& identifier, Entry& entry);
    void _ended(const std::string& identifier, std::uint64_t generation, ActivityState how);
    void _load();
    void _save();

    const ActivityEnvironment _environment;
    const std::shared_ptr<Queue> _queue;
    const std::shared_ptr<Queue> _handlers;
    const std::shared_ptr<Queue> _maintenance;

    bool _loaded = false;
    LivedTime _time;
    std::map<std::string, Duration> _kept; ///< due times on disk
    std::map<std::string, Entry> _entries;
    std::uint64_t _lastGeneration = 0;
    Clock::TimerId _timer = 0;
    std::optional<Duration> _timerDue;
};

void Core::add(const std::string& identifier, const ActivityCriteria& criteria, ActivityScheduler::Handler handler)
{
    _load();
    Entry& entry =
        _entries[identifier] = {.criteria = sane(criteria),
                                .handler = std::make_shared<const ActivityScheduler::Handler>(std::move(handler)),
                                .generation = ++_lastGeneration,
                                .registered = _time.now()};
    _setTimer();
    const auto call = std::make_shared<Call>(identifier, criteria, ActivityState::CheckIn, _environment.use, nullptr);
    _handlers->async([weak = weak_from_this(), handler = entry.handler, generation = entry.generation, call] {
        (*handler)(call);
        if (auto self = weak.lock())
            self->onQueue(
                [call, generation](Core& core) { core._checkedIn(call->identifier(), generation, call->criteria()); });
    });
}

void Core::remove(const std::string& identifier)
{
    _load();
    _entries.erase(identifier);
    if (_kept.erase(identifier) > 0) _save();
    _setTimer();
}

void Core::_checkedIn(const std::string& identifier, std::uint64_t generation, const ActivityCriteria& criteria)
{
    Entry* entry = _find(identifier, generation);
    if (!entry) return;
    entry->criteria = sane(criteria);
    const auto kept = _kept.find(identifier);
    _wait(
        *entry,
        firstDue(entry->criteria, entry->registered, kept == _kept.end() ? std::nullopt : std::optional(kept->second)),
        entry->criteria.gracePeriod);
}

void Core::_wait(Entry& entry, Duration until, Duration gracePeriod)
{
    entry.stage = Entry::Stage::Waiting;
    entry.next = until;
    entry.gracePeriod = gracePeriod;
    _setTimer();
}

void Core::_setTimer()
{
    std::vector<ActivityWindow> windows;
    for (const auto& [identifier, entry] : _entries)
        if (entry.stage == Entry::Stage::Waiting) windows.push_back({entry.next, entry.gracePeriod});
    const auto due = wakeTime(windows);
    if (due == _timerDue) return;
    _environment.clock.cancel(std::exchange(_timer, 0));
    _timerDue = due;
    if (!due) return;
    _timer = _environment.clock.after(*due - _time.now(), [weak = weak_from_this(), queue = _queue] {
        queue->async([weak] {
            if (auto self = weak.lock()) self->_lookAtDue();
        });
    });
}

void Core::_lookAtDue()
{
    _timerDue.reset();
    const Duration now = _time.now();
    for (auto& [identifier, entry] : _entries)
        if (entry.stage == Entry::Stage::Waiting && entry.next <= now) _lookAt(identifier, entry);
    _setTimer();
}

void Core::_lookAt(const std::string& identifier, Entry& entry)
{
    if (!dependOnUse(entry.criteria)) return _run(identifier, entry);
    entry.stage = Entry::Stage::Asking;
    _environment.use.ask(
        [weak = weak_from_this(), queue = _queue, identifier, generation = entry.generation](const DeviceUse& use) {
            queue->async([weak, identifier, generation, use] {
                if (auto self = weak.lock()) self->_decide(identifier, generation, use);
            });
        });
}

void Core::_decide(const std::string& identifier, std::uint64_t generation, const DeviceUse& use)
{
    Entry* entry = _find(identifier, generation);
    if (!entry) return;
    if (criteriaHold(entry->criteria, use)) return _run(identifier, *entry);
    _wait(*entry, _time.now() + kSoon, entry->criteria.gracePeriod);
}

void Core::_run(const std::string& identifier, Entry& entry)
{
    entry.stage = Entry::Stage::Running;
    // On disk first: a run that the process doesn't survive has been one.
    if (entry.criteria.repeating)
        _kept[identifier] = _time.now() + entry.criteria.interval;
    else
        _kept.erase(identifier);
    _save();
    const auto call =
        std::make_shared<Call>(identifier, entry.criteria, ActivityState::Run, _environment.use,
                               [weak = weak_from_this(), identifier, generation = entry.generation](ActivityState how) {
                                   if (auto self = weak.lock())
                                       self->onQueue([=](Core& core) { core._ended(identifier, generation, how); });
                               });
    const auto& queue = entry.criteria.maintenance ? _maintenance : _handlers;
    queue->async([handler = entry.handler, call] {
        (*handler)(call);
        if (call->state() == ActivityState::Run) (void)call->setState(ActivityState::Done);
    });
}

void Core::_ended(const std::string& identifier, std::uint64_t generation, ActivityState how)
{
    Entry* entry = _find(identifier, generation);
    if (!entry) return;
    if (how == ActivityState::Defer) {
        _kept[identifier] = _time.now() + kSoon;
        _save();
        _wait(*entry, _kept[identifier], entry->criteria.gracePeriod);
    } else if (entry->criteria.repeating) {
        _wait(*entry, _kept[identifier], entry->criteria.gracePeriod);
    } else {
        _entries.erase(identifier);
    }
}

// ---- the file ----

void Core::_load()
{
    if (std::exchange(_loaded, true)) return;
    const auto bytes = _environment.files.read(_environment.file, kMaximumFile);
    if (!bytes) {
        if (bytes.error().code != ENOENT)
            defaultLog().error("due times of activities can't be read: {}", bytes.error().description());
        return;
    }
    const auto contents = parseJson(bytes->view(), kMaximumFile);
    const auto lived = contents ? (*contents)["lived"].asInt() : std::nullopt;
    const auto wall = contents ? (*contents)["wall"].asInt() : std::nullopt;
    if (!lived || !wall)
        return defaultLog().error("due times of activities in {} are broken and forgotten", _environment.file.string());
    _time = LivedTime(_environment.clock, LivedTime::Mark{Duration(*lived), Date(Duration(*wall))});
    if (const Dictionary* due = (*contents)["due"].asDictionary())
        for (const auto& [identifier, when] : *due)
            if (const auto span = when.asInt()) _kept[identifier] = Duration(*span);
}

void Core::_save()
{
    const LivedTime::Mark mark = _time.mark();
    std::erase_if(_kept, [&](const auto& kept) {
        return !_entries.contains(kept.first) && kept.second < mark.lived - kForgottenAfter;
    });
    Dictionary due;
    for (const auto& [identifier, when] : _kept) due.set(identifier, when.count());
    const Dictionary contents{
        {"lived", mark.lived.count()}, {"wall", mark.wall.time_since_epoch().count()}, {"due", std::move(due)}};
    auto done = _environment.files.createDirectories(_environment.file.parent_path());
    if (done) done = _environment.files.writeAtomically(_environment.file, toJson(contents));
    if (!done) defaultLog().error("due times of activities can't be saved: {}", done.error().description());
}

class Scheduler final : public ActivityScheduler {
public:
    explicit Scheduler(ActivityEnvironment environment) : _core(std::make_shared<Core>(std::move(environment))) {}
    void registerActivity(const std::string& identifier, ActivityCriteria criteria, Handler handler) override
    {
        _core->onQueue([identifier, criteria, handler = std::move(handler)](Core& core) mutable {
            core.add(identifier, criteria, std::move(handler));
        });
    }
    void unregister(const std::string& identifier) override
    {
        _core->onQueue([identifier](Core& core) { core.remove(identifier); });
    }

private:
    const std::shared_ptr<Core> _core;
};

} // namespace

std::unique_ptr<ActivityScheduler> makeActivityScheduler(ActivityEnvironment environment)
{
    return std::make_unique<Scheduler>(std::move(environment));
}

} // namespace platform
