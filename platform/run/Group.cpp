#include "platform/run/Group.h"

#include <utility>
#include <vector>

#include "platform/base/Mutex.h"

namespace platform {

struct Group::Member::State {
    Mutex mutex;
    std::size_t inside GUARDED_BY(mutex) = 0;
    std::vector<std::move_only_function<void()>> waiting GUARDED_BY(mutex);
};

Group::Member& Group::Member::operator=(Member&& other) noexcept
{
    leave();
    _state = std::move(other._state);
    return *this;
}

void Group::Member::leave()
{
    const auto state = std::exchange(_state, nullptr);
    if (!state) return;
    std::vector<std::move_only_function<void()>> ready;
    {
        const MutexLock lock(state->mutex);
        if (--state->inside == 0) ready.swap(state->waiting);
    }
    for (auto& done : ready) done();
}

Group::Group() : _state(std::make_shared<Member::State>()) {}

Group::Member Group::enter()
{
    const MutexLock lock(_state->mutex);
    ++_state->inside;
    return Member(_state);
}

void Group::notify(std::move_only_function<void()> done)
{
    {
        const MutexLock lock(_state->mutex);
        if (_state->inside > 0) return _state->waiting.push_back(std::move(done));
    }
    done();
}

} // namespace platform
