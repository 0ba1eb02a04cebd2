#pragma once

#include <map>
#include <memory>
#include <string>

#include "platform/device/ActivityScheduler.h"
#include "platform/device/DeviceUse.h"
#include "platform/run/Executor.h"

namespace platform::test {

/// A scheduler whose activities a test runs by hand.
class FakeActivityScheduler final : public ActivityScheduler {
public:
    class Run final : public Activity {
    public:
        Run(std::string identifier, ActivityCriteria criteria, ActivityState state)
            : _identifier(std::move(identifier)), _criteria(criteria), _state(state)
        {}
        [[nodiscard]] const std::string& identifier() const override { return _identifier; }
        [[nodiscard]] ActivityState state() const override { return _state; }
        bool setState(ActivityState state) override
        {
            if (refuse) return false;
            _state = state;
            return true;
        }
        [[nodiscard]] bool shouldDefer() const override { return false; }
        void setCriteria(ActivityCriteria criteria) override { _criteria = criteria; }
        [[nodiscard]] ActivityCriteria criteria() const override { return _criteria; }

        bool refuse = false; ///< accepts no change of state

    private:
        std::string _identifier;
        ActivityCriteria _criteria;
        ActivityState _state;
    };

    void registerActivity(const std::string& identifier, ActivityCriteria criteria, Handler handler) override
    {
        auto checkIn = std::make_shared<Run>(identifier, criteria, ActivityState::CheckIn);
        handler(checkIn);
        registered[identifier] = {checkIn->criteria(), std::move(handler)};
    }
    void unregister(const std::string& identifier) override { registered.erase(identifier); }
    void describe(std::move_only_function<void(Value::Array)> callback) override { callback({}); }

    /// Calls the handler of an activity as the scheduler does when it is due.
    std::shared_ptr<Run> run(const std::string& identifier, bool refuse = false)
    {
        auto& [criteria, handler] = registered.at(identifier);
        auto activity = std::make_shared<Run>(identifier, criteria, ActivityState::Run);
        activity->refuse = refuse;
        handler(activity);
        return activity;
    }

    std::map<std::string, std::pair<ActivityCriteria, Handler>> registered;
};

/// A use of the device that a test sets.
struct FakeDeviceUse final : DeviceUseSource {
    explicit FakeDeviceUse(Executor& executor_) : executor(executor_) {}
    void ask(Answer answer) override
    {
        ++asked;
        executor.execute(Priority::Default, [this, answer = std::move(answer)]() mutable { answer(found = now); });
    }
    [[nodiscard]] DeviceUse last() override { return found; }

    Executor& executor;
    DeviceUse now;
    DeviceUse found;
    int asked = 0;
};

} // namespace platform::test
