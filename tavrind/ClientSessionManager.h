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
    SoftLimit, ///< open for ten minutes: it ends at the next good moment
    None,      ///< there is no session
};

/// What moves a session on. The numbers are known outside; there is no 4.
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
/// A session that another GUID or idleness ended is followed at once by the next, which begins with the feedback at
/// hand. Ended by idleness or an engagement, the GUID is rolled. Every session knows why the one before it ended.
///
/// All of it happens on one queue, on which the timers fire and the callbacks run. Any thread.
class ClientSessionManager : public std::enable_shared_from_this<ClientSessionManager> {
public:
    /// `identifier` is used in log lines.
    ClientSessionManager(Assembly& assembly, std::shared_ptr<TavrinUserGUIDController> guidController,
                         std::string identifier);
    virtual ~ClientSessionManager();

    /// Takes an event, soon, and stamps it with the current GUID. Dropped where the bag wants no feedback.
    virtual void addTavrinFeedback(std::shared_ptr<TavrinFeedback> feedback);
    /// The current session; null for none. Waits for the queue.
    [[nodiscard]] std::shared_ptr<Session> session();
    /// Moves the session on, soon, by an event that needs no feedback: those of memory pressure have no source here,
    /// and a number that is none is logged and ignored. An external flush calls back once it is done.
    void externalEvent(SessionEvent event, std::move_only_function<void()> callback = {});
    /// Ends the session, soon, then calls back.
    void flushSession(std::move_only_function<void()> callback)
    {
        externalEvent(SessionEvent::ExternalFlush, std::move(callback));
    }
    /// A connection has gone. With a shared session that is an event like others, and the callback gets false; else the
    /// session is flushed, then it gets true.
    void flushSessionInvalidation(const std::string& userAgent, std::move_only_function<void(bool flushed)> callback);

    // For diagnostics and tests; they wait for the queue.
    [[nodiscard]] SessionState currentState();
    [[nodiscard]] platform::Date expirationTime();

    [[nodiscard]] const std::string& identifier() const { return _identifier; }
    [[nodiscard]] const std::shared_ptr<TavrinUserGUIDController>& guidController() const { return _guidController; }
    [[nodiscard]] const std::shared_ptr<platform::Queue>& sessionQueue() const { return _sessionQueue; }

    /// The daemon's own user agent, "tavrind/VERSION".
    [[nodiscard]] static const std::string& tavrindUserAgent();
    /// An error of the daemon's as a feedback record of the current user.
    [[nodiscard]] static std::shared_ptr<TavrinFeedback> errorFeedback(const platform::Error& error,
                                                                       Assembly& assembly);
    /// Hands that record to the assembly's session manager, if there is one yet.
    static void reportErrorAsTavrindFeedback(const platform::Error& error, Assembly& assembly);

private:
    struct Occasion;
    struct Transition;
    static const Transition kTransitions[];

    [[nodiscard]] bool _wantsFeedback(const TavrinFeedback& feedback) const;
    void _takeFeedback(std::shared_ptr<TavrinFeedback> feedback);
    void _updateState(std::shared_ptr<TavrinFeedback> feedback, SessionEvent event,
                      std::move_only_function<void()> callback = {});
    void _setNewSession(std::shared_ptr<TavrinFeedback> feedback);
    void _onUserGuidSoftLimitReached();
    void _flushSessionWithReason(SessionEndReason reason, std::move_only_function<void()> callback);

    // What transitions do.
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
    std::uint64_t _sessionCounter = 0; ///< sessions begun; timers of an earlier session know it by this
    SessionEndReason _flushReason{};   ///< of the last session
    platform::Date _expirationTime;    ///< when the session counts as idle
};

} // namespace tavrin
