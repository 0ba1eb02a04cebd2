#pragma once

#include <functional>
#include <utility>

namespace platform {

namespace detail {
/// Reports a reply that was dropped, or answered twice. Aborts under test (`failOnReplyMisuse`), logs otherwise.
void replyMisused(const char* what);
} // namespace detail

/// From now on a forgotten or repeated answer aborts the process. Tests call it first thing.
void failOnReplyMisuse();

/// The one answer to a call: a move-only callback that is called once, or given up with `abandon()` if the call gets no
/// answer. Dropping a reply without either is a programming error: the caller would wait for ever.
///
/// Any thread, one at a time.
template <class... Args> class Reply {
public:
    using Function = std::move_only_function<void(Args...)>;

    Reply() = default;
    /// `answer` is called with the reply. `abandoned`, if given, is called instead if the reply is abandoned or
    /// dropped, so that whoever keeps a slot for it can free it.
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

    /// True while an answer is owed.
    explicit operator bool() const { return static_cast<bool>(_answer); }

    void operator()(Args... args)
    {
        if (!_answer) return detail::replyMisused("a reply was answered twice");
        _abandoned = {};
        std::exchange(_answer, {})(std::forward<Args>(args)...);
    }

    /// This reply with `then` after its answer; `then` is not called if the reply is abandoned. Leaves this reply
    /// empty.
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

    /// Gives the answer up: the caller gets none.
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
