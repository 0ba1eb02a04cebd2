#include "platform/run/NotificationCenter.h"

#include <algorithm>
#include <mutex>
#include <vector>

namespace platform {

struct NotificationCenter::Token::Observer {
    std::string name;
    Callback callback;
    const void* sender;
    std::weak_ptr<State> state;
    /// Held while the callback runs, so that the token's destructor waits for it; recursive, so that the callback may
    /// destroy its own token.
    std::recursive_mutex running;
    bool removed = false; // under `running`
};

struct NotificationCenter::State {
    std::mutex mutex;
    std::vector<std::shared_ptr<Token::Observer>> observers;
};

NotificationCenter::NotificationCenter() : _state(std::make_shared<State>()) {}
NotificationCenter::~NotificationCenter() = default;

NotificationCenter::Token& NotificationCenter::Token::operator=(Token&& other) noexcept
{
    if (this != &other) {
        Token old = std::move(*this);
        _observer = std::move(other._observer);
    }
    return *this;
}

NotificationCenter::Token::~Token()
{
    if (!_observer) return;
    if (const auto state = _observer->state.lock()) {
        std::lock_guard lock(state->mutex);
        std::erase(state->observers, _observer);
    }
    std::lock_guard lock(_observer->running);
    _observer->removed = true;
}

NotificationCenter::Token NotificationCenter::observe(std::string_view name, Callback callback, const void* sender)
{
    auto observer = std::make_shared<Token::Observer>();
    observer->name = name;
    observer->callback = std::move(callback);
    observer->sender = sender;
    observer->state = _state;
    {
        std::lock_guard lock(_state->mutex);
        _state->observers.push_back(observer);
    }
    Token token;
    token._observer = std::move(observer);
    return token;
}

void NotificationCenter::post(const Notification& notification) const
{
    std::vector<std::shared_ptr<Token::Observer>> interested;
    {
        std::lock_guard lock(_state->mutex);
        std::ranges::copy_if(_state->observers, std::back_inserter(interested), [&](const auto& observer) {
            return observer->name == notification.name &&
                   (!observer->sender || observer->sender == notification.object);
        });
    }
    for (const auto& observer : interested) {
        std::lock_guard lock(observer->running);
        if (!observer->removed) observer->callback(notification);
    }
}

} // namespace platform
