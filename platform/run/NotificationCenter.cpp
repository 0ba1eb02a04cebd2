#include "platform/run/NotificationCenter.h"

#include <algorithm>
#include <atomic>
#include <vector>

#include "platform/base/Mutex.h"

namespace platform {

struct NotificationCenter::Token::Observer {
    std::string name;
    Callback callback;
    const void* sender;
    std::weak_ptr<State> state;
    std::atomic<bool> removed = false;
};

struct NotificationCenter::State {
    Mutex mutex;
    std::vector<std::shared_ptr<Token::Observer>> observers GUARDED_BY(mutex);
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
    _observer->removed = true;
    if (const auto state = _observer->state.lock()) {
        MutexLock lock(state->mutex);
        std::erase(state->observers, _observer);
    }
}

NotificationCenter::Token NotificationCenter::observe(std::string_view name, Callback callback, const void* sender)
{
    auto observer = std::make_shared<Token::Observer>();
    observer->name = name;
    observer->callback = std::move(callback);
    observer->sender = sender;
    observer->state = _state;
    {
        MutexLock lock(_state->mutex);
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
        MutexLock lock(_state->mutex);
        std::ranges::copy_if(_state->observers, std::back_inserter(interested), [&](const auto& observer) {
            return observer->name == notification.name &&
                   (!observer->sender || observer->sender == notification.object);
        });
    }
    for (const auto& observer : interested)
        if (!observer->removed) observer->callback(notification);
}

} // namespace platform
