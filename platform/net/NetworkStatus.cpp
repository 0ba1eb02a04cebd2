#include "platform/net/NetworkStatus.h"

#include <utility>

namespace platform {

std::optional<NetworkState> NetworkStatus::current()
{
    ask();
    MutexLock lock(_mutex);
    return _state;
}

NetworkStatus::Token NetworkStatus::observe(Handler handler)
{
    ask();
    auto token = std::make_shared<const Handler>(std::move(handler));
    MutexLock lock(_mutex);
    _observers.push_back(token);
    return token;
}

void NetworkStatus::set(const NetworkState& state)
{
    std::vector<Token> told;
    {
        MutexLock lock(_mutex);
        if (std::exchange(_state, state) == state) return;
        std::erase_if(_observers, [](const auto& observer) { return observer.expired(); });
        for (const auto& observer : _observers) told.push_back(observer.lock());
    }
    for (const Token& handler : told)
        if (handler) (*handler)(state);
}

void NetworkStatus::ask()
{
    std::call_once(_asked, [this] {
        if (_begin) _begin();
    });
}

} // namespace platform
