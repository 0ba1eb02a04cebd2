#include "platform/run/Group.h"

#include <mutex>
#include <utility>
#include <vector>

namespace platform {

struct Group::Member::State {
    std::mutex mutex; // guards all below
    std::size_t inside = 0;
    std::vector<std::move_only_function<void()>> waiting;
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
        const std::lock_guard lock(state->mutex);
        if (--state->inside == 0) ready.swap(state->waiting);
    }
    for (auto& done : ready) done();
}

Group::Group() : _state(std::make_shared<Member::State>()) {}

Group::Member Group::enter()
{
    const std::lock_guard lock(_state->mutex);
    ++_state->inside;
    return Member(_state);
}

void Group::notify(std::move_only_function<void()> done)
{
    {
        const std::lock_guard lock(_state->mutex);
        if (_state->inside > 0) return _state->waiting.push_back(std::move(done));
    }
    done();
}

} // namespace platform
