#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "platform/base/Date.h"

namespace platform {
class Queue;
struct Error;
} // namespace platform

namespace tavrin {

struct Assembly;
struct TavrinFeedback;
class Session;
class TavrinUserGUIDController;
enum class SessionEndReason : std::int64_t;

enum class SessionState : unsigned {
    Open,
    SoftLimit, ///< open for ten minutes; the next engagement, idleness or five more minutes end it
    None,      ///< no session exists
};

/// From the beginning of a session to its soft limit, and from there to its end.
inline constexpr platform::Duration kSessionSoftLimit = std::chrono::minutes(10);
inline constexpr platform::Duration kFromSoftLimitToMaxTime = std::chrono::minutes(5);
/// How long after its last event a session at its soft limit counts as idle.
inline constexpr std::chrono::seconds kSessionIdleTime{180};

/// An event that may change a session's state. The numbers are fixed; 4 is unused.
enum class SessionEvent : unsigned {
    AddFeedback = 0,
    SoftLimit = 1,
    MaxTime = 2,
    ExternalFlush = 3,
    MemoryWarning = 5,
    CriticalMemory = 6,
    MemoryNormal = 7,
    Idle = 8,
    GuidChanged = 9,
    Engagement = 10,
};

/// Decides when a session begins and ends.
///
///            feedback                10 minutes
///     None ───────────► Open ───────────────────────► SoftLimit
///      ▲                  │ external flush,              │ engagement, 180 s without feedback,
///      │                  │ another GUID                 │ 5 more minutes, and as on the left
///      └──────────────────┴──────────────────────────────┘
///
/// After an end because of another GUID or idleness, the next session begins at once with the current feedback.
/// Idleness and engagements also reset the GUID. Every session stores why the previous one ended.
///
/// State is confined to one queue; timers and callbacks run there. Any thread.
class ClientSessionManager : public std::enable_shared_from_this<ClientSessionManager> {
public:
    /// `identifier` is for log lines.
    ClientSessionManager(Assembly& assembly, std::shared_ptr<TavrinUserGUIDController> guidController,
                         std::string identifier);
    virtual ~ClientSessionManager();

    /// Adds an event to the session, asynchronously, and stamps it with the current GUID. Drops it if the bag disables
    /// feedback. `call` (may be null) is released once the event is written or dropped.
    virtual void addTavrinFeedback(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call = {});
    /// Returns the current session, or null. Blocks on the queue.
    [[nodiscard]] std::shared_ptr<Session> session();
    /// Applies an event without feedback, asynchronously. Nothing sends the events of memory pressure yet. Unknown
    /// numbers are logged and ignored. `callback` is called after an external flush, and not for any other event.
    void externalEvent(SessionEvent event, std::move_only_function<void()> callback = {});
    /// Ends the session, asynchronously, then calls back.
    void flushSession(std::move_only_function<void()> callback)
    {
        externalEvent(SessionEvent::ExternalFlush, std::move(callback));
    }
    /// Handles the end of a connection. A shared session records an event, and the callback gets false. Any other
    /// session is flushed, then the callback gets true.
    void flushSessionInvalidation(const std::string& userAgent, std::move_only_function<void(bool flushed)> callback);

    // For diagnostics and tests; these block on the queue.
    [[nodiscard]] SessionState currentState();
    [[nodiscard]] platform::Date expirationTime();

    [[nodiscard]] const std::string& identifier() const { return _identifier; }
    [[nodiscard]] const std::shared_ptr<TavrinUserGUIDController>& guidController() const { return _guidController; }
    [[nodiscard]] const std::shared_ptr<platform::Queue>& sessionQueue() const { return _sessionQueue; }

    /// Returns the daemon's own user agent, "tavrind/VERSION".
    [[nodiscard]] static const std::string& tavrindUserAgent();
    /// Wraps an error of the daemon as feedback of the current user.
    [[nodiscard]] static std::shared_ptr<TavrinFeedback> errorFeedback(const platform::Error& error,
                                                                       Assembly& assembly);
    /// Adds that record to the assembly's session manager, if it exists yet.
    static void reportErrorAsTavrindFeedback(const platform::Error& error, Assembly& assembly);

private:
    struct Occasion;
    struct Transition;
    static const Transition kTransitions[];

    [[nodiscard]] bool _wantsFeedback(const TavrinFeedback& feedback) const;
    void _takeFeedback(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call);
    void _updateState(SessionEvent event, Occasion occasion);
    void _setNewSession(Occasion& occasion);
    void _onUserGuidSoftLimitReached();
    void _flushSessionWithReason(SessionEndReason reason, std::move_only_function<void()> callback);

    // The actions of transitions.
    void _add(Occasion& occasion);
    void _begin(Occasion& occasion);
    void _nothing(Occasion& occasion);
    void _endMaxTime(Occasion& occasion);
    void _endExternal(Occasion& occasion);
    void _endCriticalMemory(Occasion& occasion);
    void _requestFlush(Occasion& occasion);
    void _endIdleAndBegin(Occasion& occasion);
    void _endGuidChangedAndBegin(Occasion& occasion);
    void _endEngagement(Occasion& occasion);

    Assembly& _assembly;
    const std::shared_ptr<TavrinUserGUIDController> _guidController;
    const std::string _identifier;
    std::shared_ptr<platform::Queue> _sessionQueue; // guards all below
    std::shared_ptr<Session> _session;
    SessionState _currentState = SessionState::None;
    std::uint64_t _sessionCounter = 0; ///< sessions begun; identifies the session of a timer
    SessionEndReason _flushReason{};   ///< of the last session
    platform::Date _expirationTime;    ///< when the session counts as idle
};

} // namespace tavrin
