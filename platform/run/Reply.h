#pragma once

#include <functional>
#include <utility>

namespace platform {

namespace detail {
/// Reports a reply that was dropped, or called twice. Aborts in tests (`failOnReplyMisuse`), logs a fault otherwise.
void replyMisused(const char* what);
} // namespace detail

/// Makes `replyMisused` abort the process from now on. Tests call it at their start.
void failOnReplyMisuse();

/// The reply to one call: a move-only callback that must be called once, or abandoned with `abandon()` if the call gets
/// no reply. Dropping it without either is a programming error: the caller would wait for ever.
///
/// Any thread, one at a time.
template <class... Args> class Reply {
public:
    using Function = std::move_only_function<void(Args...)>;

    Reply() = default;
    /// The call operator calls `answer`. If the reply is abandoned or dropped, `abandoned` is called instead, so that
    /// the owner of a pending call can free it.
    explicit Reply(Function answer, std::move_only_function<void()> abandoned = {})
        : _answer(std::move(answer)), _abandoned(std::move(abandoned))
    {}
    Reply(Reply&& other) noexcept
        : _answer(std::exchange(other._answer, {})), _abandoned(std::exchange(other._abandoned, {}))
    {}
    Reply& operator=(Reply&& other) noexcept
    {
        if (this != &other) {
            drop();
            _answer = std::exchange(other._answer, {});
            _abandoned = std::exchange(other._abandoned, {});
        }
        return *this;
    }
    ~Reply() { drop(); }

    /// Returns true if the reply must still be called or abandoned.
    explicit operator bool() const { return static_cast<bool>(_answer); }

    void operator()(Args... args)
    {
        if (!_answer) return detail::replyMisused("a reply was answered twice");
        _abandoned = {};
        std::exchange(_answer, {})(std::forward<Args>(args)...);
    }

    /// Returns a reply that calls this one and then `then`; `then` is not called if the reply is abandoned. Leaves this
    /// reply empty.
    [[nodiscard]] Reply andThen(std::move_only_function<void()> then) &&
    {
        Reply result;
        if (!_answer) return result;
        result._abandoned = std::exchange(_abandoned, {});
        result._answer = [answer = std::exchange(_answer, {}), then = std::move(then)](Args... args) mutable {
            answer(std::forward<Args>(args)...);
            then();
        };
        return result;
    }

    /// Ends the call without a reply.
    void abandon()
    {
        _answer = {};
        if (auto abandoned = std::exchange(_abandoned, {})) abandoned();
    }

private:
    void drop()
    {
        if (!_answer) return;
        detail::replyMisused("a reply was dropped without an answer");
        abandon();
    }

    Function _answer;
    std::move_only_function<void()> _abandoned;
};

} // namespace platform
