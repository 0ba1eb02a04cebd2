#include "platform/device/ActivityScheduler.h"

#include <algorithm>
#include <cerrno>
#include <map>
#include <vector>

#include "platform/base/Log.h"
#include "platform/base/Mutex.h"
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

/// Delay of a deferred activity, and of one whose criteria don't hold.
constexpr Duration kSoon = 5min;
/// Keeps a repeating activity from occupying a worker all the time.
constexpr Duration kShortestInterval = 1s;
constexpr Duration kLongest = std::chrono::hours(24 * 366);
constexpr std::size_t kMaximumFile = 64u << 10;
/// The due time of an unregistered activity is removed this long after it.
constexpr Duration kForgottenAfter = std::chrono::hours(24 * 60);

ActivityCriteria sane(ActivityCriteria criteria)
{
    for (Duration* span : {&criteria.delay, &criteria.gracePeriod, &criteria.interval})
        *span = std::clamp(*span, Duration::zero(), kLongest);
    criteria.interval = std::max(criteria.interval, kShortestInterval);
    return criteria;
}

/// One call of a handler: the check-in, or one run. Calls `ended` when the run ends, at the latest on destruction.
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
        MutexLock lock(_mutex);
        return _state;
    }
    bool setState(ActivityState state) override
    {
        using enum ActivityState;
        Ended ended;
        {
            MutexLock lock(_mutex);
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
        if (dependOnUse(held)) _use.ask([](const DeviceUse&) {}); // updates `last` for the next call
        return !criteriaHold(held, _use.last());
    }
    void setCriteria(ActivityCriteria criteria) override
    {
        MutexLock lock(_mutex);
        if (_state == ActivityState::CheckIn) _criteria = criteria;
    }
    [[nodiscard]] ActivityCriteria criteria() const override
    {
        MutexLock lock(_mutex);
        return _criteria;
    }

private:
    const std::string _identifier;
    DeviceUseSource& _use;
    mutable Mutex _mutex;
    ActivityCriteria _criteria GUARDED_BY(_mutex);
    ActivityState _state GUARDED_BY(_mutex);
    Ended _ended GUARDED_BY(_mutex);
};

/// All non-const members are confined to `_queue`.
class Core : public std::enable_shared_from_this<Core> {
public:
    explicit Core(ActivityEnvironment environment)
        : _environment(std::move(environment)),
          _queue(Queue::make("activities", Queue::Kind::Serial, _environment.executor, _environment.clock, Rank::Root)),
          _handlers(Queue::make("activities.handlers", Queue::Kind::Concurrent, _environment.executor,
                                _environment.clock, Rank::Root)),
          _maintenance(Queue::make("activities.maintenance", Queue::Kind::Concurrent, _environment.executor,
                                   _environment.clock, Rank::Root, Priority::Background)),
          _time(_environment.clock)
    {}
    ~Core() { _environment.clock.cancel(_timer); }

    /// Runs `work` on the queue, unless the scheduler has been destroyed by then.
    template <class Work> void onQueue(Work work)
    {
        _queue->async([weak = weak_from_this(), work = std::move(work)]() mutable {
            if (auto self = weak.lock()) work(*self);
        });
    }

    void add(const std::string& identifier, const ActivityCriteria& criteria, ActivityScheduler::Handler handler);
    void remove(const std::string& identifier);
    [[nodiscard]] Value::Array description();

private:
    /// A registration. `_entries` is the only owner: a callback does nothing if `remove` or another registration of the
    /// name has destroyed its entry.
    struct Entry {
        const std::string identifier;
        ActivityCriteria criteria;
        const std::shared_ptr<const ActivityScheduler::Handler> handler;
        const Duration registered;
        enum class Stage { CheckingIn, Waiting, Asking, Running } stage = Stage::CheckingIn;
        Duration next{};           ///< due time in the stage Waiting
        Duration gracePeriod{};    ///< how much later it may run
        std::string_view putOffBy; ///< why it did not run when it was due; empty if it ran
    };
    using WeakEntry = std::weak_ptr<Entry>;

    void _checkedIn(Entry& entry, const ActivityCriteria& criteria);
    void _wait(Entry& entry, Duration until, Duration gracePeriod);
    void _setTimer();
    void _lookAtDue();
    void _lookAt(const std::shared_ptr<Entry>& entry);
    void _decide(const std::shared_ptr<Entry>& entry, const DeviceUse& use);
    void _run(const std::shared_ptr<Entry>& entry);
    void _ended(Entry& entry, ActivityState how);
    /// Runs `work` with the entry on the queue, unless either has been destroyed by then.
    template <class Work> void onQueue(WeakEntry entry, Work work)
    {
        onQueue([entry = std::move(entry), work = std::move(work)](Core& core) mutable {
            if (const auto held = entry.lock()) work(core, held);
        });
    }
    void _load();
    void _save();

    const ActivityEnvironment _environment;
    const std::shared_ptr<Queue> _queue;
    const std::shared_ptr<Queue> _handlers;
    const std::shared_ptr<Queue> _maintenance;

    bool _loaded = false;
    LivedTime _time;
    std::map<std::string, Duration> _kept; ///< due times on disk
    std::map<std::string, std::shared_ptr<Entry>> _entries;
    Clock::TimerId _timer = 0;
    std::optional<Duration> _timerDue;
};

void Core::add(const std::string& identifier, const ActivityCriteria& criteria, ActivityScheduler::Handler handler)
{
    _load();
    const auto entry =
        std::make_shared<Entry>(identifier, sane(criteria),
                                std::make_shared<const ActivityScheduler::Handler>(std::move(handler)), _time.now());
    _entries[identifier] = entry;
    _setTimer();
    const auto call = std::make_shared<Call>(identifier, criteria, ActivityState::CheckIn, _environment.use, nullptr);
    _handlers->async([weak = weak_from_this(), handler = entry->handler, registered = WeakEntry(entry), call] {
        (*handler)(call);
        if (auto self = weak.lock())
            self->onQueue(registered, [call](Core& core, const std::shared_ptr<Entry>& held) {
                core._checkedIn(*held, call->criteria());
            });
    });
}

void Core::remove(const std::string& identifier)
{
    _load();
    _entries.erase(identifier);
    if (_kept.erase(identifier) > 0) _save();
    _setTimer();
}

void Core::_checkedIn(Entry& entry, const ActivityCriteria& criteria)
{
    entry.criteria = sane(criteria);
    const auto kept = _kept.find(entry.identifier);
    const auto due = kept == _kept.end() ? std::nullopt : std::optional(kept->second);
    _wait(entry, firstDue(entry.criteria, entry.registered, due), entry.criteria.gracePeriod);
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
        if (entry->stage == Entry::Stage::Waiting) windows.push_back({entry->next, entry->gracePeriod});
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
    for (const auto& [identifier, entry] : _entries)
        if (entry->stage == Entry::Stage::Waiting && entry->next <= now) _lookAt(entry);
    _setTimer();
}

void Core::_lookAt(const std::shared_ptr<Entry>& entry)
{
    if (!dependOnUse(entry->criteria)) return _run(entry);
    entry->stage = Entry::Stage::Asking;
    _environment.use.ask([weak = weak_from_this(), asking = WeakEntry(entry)](const DeviceUse& use) {
        if (const auto self = weak.lock())
            self->onQueue(asking, [use](Core& core, const std::shared_ptr<Entry>& held) { core._decide(held, use); });
    });
}

void Core::_decide(const std::shared_ptr<Entry>& entry, const DeviceUse& use)
{
    entry->putOffBy = unmetCriterion(entry->criteria, use);
    if (entry->putOffBy.empty()) return _run(entry);
    _wait(*entry, _time.now() + kSoon, entry->criteria.gracePeriod);
}

void Core::_run(const std::shared_ptr<Entry>& entry)
{
    entry->stage = Entry::Stage::Running;
    // Saved before the run: a run that a kill interrupts counts as one.
    if (entry->criteria.repeating)
        _kept[entry->identifier] = _time.now() + entry->criteria.interval;
    else
        _kept.erase(entry->identifier);
    _save();
    const auto call =
        std::make_shared<Call>(entry->identifier, entry->criteria, ActivityState::Run, _environment.use,
                               [weak = weak_from_this(), running = WeakEntry(entry)](ActivityState how) {
                                   if (const auto self = weak.lock())
                                       self->onQueue(running, [how](Core& core, const std::shared_ptr<Entry>& held) {
                                           core._ended(*held, how);
                                       });
                               });
    const auto& queue = entry->criteria.maintenance ? _maintenance : _handlers;
    queue->async([handler = entry->handler, call] {
        (*handler)(call);
        if (call->state() == ActivityState::Run) (void)call->setState(ActivityState::Done);
    });
}

void Core::_ended(Entry& entry, ActivityState how)
{
    entry.putOffBy = how == ActivityState::Defer ? "itself" : "";
    if (how == ActivityState::Defer) {
        _kept[entry.identifier] = _time.now() + kSoon;
        _save();
        _wait(entry, _kept[entry.identifier], entry.criteria.gracePeriod);
    } else if (entry.criteria.repeating) {
        _wait(entry, _kept[entry.identifier], entry.criteria.gracePeriod);
    } else {
        _entries.erase(entry.identifier);
    }
}

Value::Array Core::description()
{
    Value::Array all;
    for (const auto& [identifier, entry] : _entries) {
        const bool waits = entry->stage == Entry::Stage::Waiting;
        Dictionary activity{{"identifier", identifier},
                            {"state", waits                                   ? "waiting"
                                      : entry->stage == Entry::Stage::Running ? "running"
                                                                              : "starting"}};
        if (waits) activity.set("inSeconds", toSeconds(entry->next - _time.now()));
        if (!entry->putOffBy.empty()) activity.set("waitsFor", entry->putOffBy);
        all.emplace_back(std::move(activity));
    }
    return all;
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
    const std::string* text = contents ? (*contents)["time"].asString() : nullptr;
    const auto mark = text ? LivedTime::Mark::parse(*text) : std::nullopt;
    if (!mark)
        return defaultLog().error("due times of activities in {} are damaged and ignored", _environment.file.string());
    _time = LivedTime(_environment.clock, mark);
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
    const Dictionary contents{{"time", mark.text()}, {"due", std::move(due)}};
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
    void describe(std::move_only_function<void(Value::Array)> callback) override
    {
        _core->onQueue([callback = std::move(callback)](Core& core) mutable { callback(core.description()); });
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
