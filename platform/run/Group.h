#pragma once

#include <functional>
#include <memory>

namespace platform {

/// Calls back after all members have left.
///
///     platform::Group group;
///     for (auto& file : files) file.flush([member = group.enter()] {});
///     group.notify([] { done(); });
///
/// A member leaves when it is destroyed, so that dropped work leaves too. The group may be destroyed before its
/// members; the callbacks still run. Any thread.
class Group {
public:
    /// One piece of work inside the group.
    class [[nodiscard]] Member {
    public:
        Member(Member&&) noexcept = default;
        Member& operator=(Member&& other) noexcept;
        ~Member() { leave(); }
        /// Leaves the group; a second call does nothing.
        void leave();

    private:
        friend class Group;
        struct State;
        explicit Member(std::shared_ptr<State> state) : _state(std::move(state)) {}
        std::shared_ptr<State> _state; // null once it has left
    };

    Group();
    Member enter();
    /// Calls `done` once the group has no members: inside this call, or on the thread of the last member that leaves.
    void notify(std::move_only_function<void()> done);

private:
    std::shared_ptr<Member::State> _state;
};

} // namespace platform
