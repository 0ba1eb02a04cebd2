#include "platform/run/Transactions.h"

#include "platform/base/Mutex.h"

namespace platform {

struct Transactions::State {
    Mutex mutex;
    std::map<std::string, int> open GUARDED_BY(mutex);
};

Transactions::Transactions() : _state(std::make_shared<State>()) {}

Transactions::Token Transactions::begin(std::string name)
{
    {
        MutexLock lock(_state->mutex);
        ++_state->open[name];
    }
    Token token;
    token._end = std::shared_ptr<void>(nullptr, [state = _state, name = std::move(name)](void*) {
        MutexLock lock(state->mutex);
        const auto found = state->open.find(name);
        if (--found->second == 0) state->open.erase(found);
    });
    return token;
}

std::map<std::string, int> Transactions::open() const
{
    MutexLock lock(_state->mutex);
    return _state->open;
}

} // namespace platform
