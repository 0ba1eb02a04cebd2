#pragma once

#include <any>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>

namespace platform {

/// A named event.
struct Notification {
    std::string name;
    const void* object = nullptr; ///< the sender; compared only, never dereferenced
    std::map<std::string, std::any, std::less<>> userInfo;

    /// Returns the entry under `key` if it is exactly a `T`, otherwise a default `T` (null for pointers).
    template <class T> [[nodiscard]] T get(std::string_view key) const
    {
        auto found = userInfo.find(key);
        if (found == userInfo.end()) return T{};
        const T* value = std::any_cast<T>(&found->second);
        return value ? *value : T{};
    }
};

/// In-process notifications. Any thread.
///
/// `post` calls the observers on the posting thread, in the order of their registration, from a snapshot and without a
/// lock: observers may register, unregister and post. A token's destructor does not wait. It prevents further calls of
/// the callback, but a call on another thread may end later, so callbacks hold their owner weakly. A token may be
/// destroyed inside its own callback.
class NotificationCenter {
public:
    using Callback = std::function<void(const Notification&)>;

    /// Unregisters its observer when destroyed.
    class Token {
    public:
        Token() = default;
        Token(Token&&) noexcept = default;
        Token& operator=(Token&& other) noexcept;
        ~Token();
        [[nodiscard]] explicit operator bool() const { return _observer != nullptr; }

    private:
        friend class NotificationCenter;
        struct Observer;
        std::shared_ptr<Observer> _observer;
    };

    NotificationCenter();
    ~NotificationCenter();

    /// Calls `callback` for every notification `name`; if `sender` is not null, only for those with that object. The
    /// token may outlive the centre.
    [[nodiscard]] Token observe(std::string_view name, Callback callback, const void* sender = nullptr);

    /// Returns after all observers have been called.
    void post(const Notification& notification) const;

private:
    struct State;
    std::shared_ptr<State> _state;
};

} // namespace platform
