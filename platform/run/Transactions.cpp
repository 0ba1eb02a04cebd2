#include "platform/run/Transactions.h"

#include <mutex>

namespace platform {

struct Transactions::State {
    std::mutex mutex;
    std::map<std::string, int> open;
};

Transactions::Transactions() : _state(std::make_shared<State>()) {}

Transactions::Token Transactions::begin(std::string name)
{
    {
        std::lock_guard lock(_state->mutex);
        ++_state->open[name];
    }
    Token token;
    token._end = std::shared_ptr<void>(nullptr, [state = _state, name = std::move(name)](void*) {
        std::lock_guard lock(state->mutex);
        const auto found = state->open.find(name);
        if (--found->second == 0) state->open.erase(found);
    });
    return token;
}

std::map<std::string, int> Transactions::open() const
{
    std::lock_guard lock(_state->mutex);
    return _state->open;
}

} // namespace platform
