#include "tavrind/ClientSessionManager.h"

#include <algorithm>
#include <initializer_list>
#include <optional>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/device/Device.h"
#include "platform/run/Clock.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/BackgroundActivitiesManager.h"
#include "tavrind/ClientSession.h"
#include "tavrind/ClientSessionShared.h"
#include "tavrind/FeedbackBooks.h"
#include "tavrind/FeedbackTypes.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinSessionFeedback.h"
#include "tavrind/TavrinUserGUIDController.h"

namespace tavrin {

using namespace std::chrono_literals;

/// The arguments of an event of the state machine.
struct ClientSessionManager::Occasion {
    std::shared_ptr<TavrinFeedback> feedback{};
    std::shared_ptr<void> call{};
    std::move_only_function<void()> callback{};
};

struct ClientSessionManager::Transition {
    SessionEvent event;
    std::initializer_list<SessionState> states; ///< the event is ignored in others
    void (ClientSessionManager::*action)(Occasion&);
    std::optional<SessionState> next; ///< nothing if the state stays
};

using enum SessionState;
constexpr std::initializer_list<SessionState> kAnyState{Open, SoftLimit, None};
constexpr std::initializer_list<SessionState> kInSession{Open, SoftLimit};
constexpr std::initializer_list<SessionState> kWhenOpen{Open};
constexpr std::initializer_list<SessionState> kAtSoftLimit{SoftLimit};
constexpr std::initializer_list<SessionState> kWithoutSession{None};

const ClientSessionManager::Transition ClientSessionManager::kTransitions[] = {
    // event                        acts in          action                                          next
    {SessionEvent::AddFeedback, kInSession, &ClientSessionManager::_add, {}},
    {SessionEvent::AddFeedback, kWithoutSession, &ClientSessionManager::_begin, Open},
    {SessionEvent::SoftLimit, kWhenOpen, &ClientSessionManager::_nothing, SoftLimit},
    {SessionEvent::MaxTime, kAtSoftLimit, &ClientSessionManager::_endMaxTime, None},
    {SessionEvent::ExternalFlush, kAnyState, &ClientSessionManager::_endExternal, None},
    {SessionEvent::MemoryWarning, kAnyState, &ClientSessionManager::_requestFlush, {}},
    {SessionEvent::CriticalMemory, kAnyState, &ClientSessionManager::_endCriticalMemory, None},
    {SessionEvent::MemoryNormal, kAnyState, &ClientSessionManager::_requestFlush, {}},
    {SessionEvent::Idle, kAtSoftLimit, &ClientSessionManager::_endIdleAndBegin, Open},
    {SessionEvent::GuidChanged, kInSession, &ClientSessionManager::_endGuidChangedAndBegin, Open},
    {SessionEvent::Engagement, kAtSoftLimit, &ClientSessionManager::_endEngagement, None},
};

ClientSessionManager::ClientSessionManager(Assembly& assembly, std::shared_ptr<TavrinUserGUIDController> guidController,
                                           std::string identifier)
    : _assembly(assembly), _guidController(std::move(guidController)), _identifier(std::move(identifier)),
      _sessionQueue(assembly.device.serialQueue("com.quorvane.tavrind.clientSessionManagerQueue", rank::kManager))
{
    if (assembly.sharedSession)
        log(kLogSession).log("Tavrin is using shared session for all clients {}", _identifier);
    else
        log(kLogSession).log("Tavrin is using individual session for clients {}", _identifier);
}

ClientSessionManager::~ClientSessionManager() = default;

void ClientSessionManager::addTavrinFeedback(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call)
{
    _sessionQueue->async([self = shared_from_this(), feedback = std::move(feedback), call = std::move(call)]() mutable {
        self->_takeFeedback(std::move(feedback), std::move(call));
    });
}

bool ClientSessionManager::_wantsFeedback(const TavrinFeedback& feedback) const
{
    const auto bag = _assembly.bagController ? _assembly.bagController->currentBag() : nullptr;
    return !bag || TAVBag(bag->rawBag(), feedback.userAgent).feedbackEnabled();
}

void ClientSessionManager::_takeFeedback(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call)
{
    if (!_wantsFeedback(*feedback)) return _assembly.feedbackBooks.record(FeedbackFate::FeedbackOff);
    const platform::Uuid guid = _guidController->currentUserGUID();
    feedback->userGuid = guid.string();

    const platform::Date now = _assembly.device.clock.wallNow();
    const EventType type = feedback->type();
    auto event = SessionEvent::AddFeedback;
    if (_session && _session->userGuid() != guid)
        event = SessionEvent::GuidChanged;
    else if (_currentState == SoftLimit && (type == EventType::ResultEngagement || type == EventType::CardEngagement))
        event = SessionEvent::Engagement;
    else if (_currentState == SoftLimit && _expirationTime <= now)
        event = SessionEvent::Idle;
    _updateState(event, {.feedback = std::move(feedback), .call = std::move(call)});
    _expirationTime = now + kSessionIdleTime;
}

void ClientSessionManager::_updateState(SessionEvent event, Occasion occasion)
{
    _sessionQueue->assertOnQueue();
    bool known = false;
    for (const Transition& transition : kTransitions) {
        if (transition.event != event) continue;
        known = true;
        if (std::ranges::find(transition.states, _currentState) == transition.states.end()) continue;
        (this->*transition.action)(occasion);
        if (transition.next) _currentState = *transition.next;
        return;
    }
    if (!known)
        log(kLogSession).debug("External event received {}", static_cast<unsigned>(event));
    else if (event == SessionEvent::AddFeedback)
        log(kLogSession).log("Avoided adding feedback in state {}", static_cast<unsigned>(_currentState));
}

void ClientSessionManager::_nothing(Occasion&) {}

void ClientSessionManager::_add(Occasion& occasion)
{
    _session->addFeedback(std::move(occasion.feedback), std::move(occasion.call));
}

void ClientSessionManager::_begin(Occasion& occasion)
{
    _setNewSession(occasion);
}

void ClientSessionManager::_endMaxTime(Occasion&)
{
    _flushSessionWithReason(SessionEndReason::MaxSessionTime, [this] {
        log(kLogSession).log("session flushed because max timer expired {}", _identifier);
    });
}

void ClientSessionManager::_endExternal(Occasion& occasion)
{
    _flushSessionWithReason(SessionEndReason::ExternalRequest, std::move(occasion.callback));
}

void ClientSessionManager::_requestFlush(Occasion&)
{
    if (_assembly.backgroundFlusher) _assembly.backgroundFlusher->insertFlushActivity({});
}

void ClientSessionManager::_endCriticalMemory(Occasion& occasion)
{
    _flushSessionWithReason(SessionEndReason::CriticalMemory,
                            [] { log(kLogSession).log("session flushed because of critical memory"); });
    _requestFlush(occasion);
}

void ClientSessionManager::_endIdleAndBegin(Occasion& occasion)
{
    _flushSessionWithReason(SessionEndReason::SessionIdle, [this] {
        log(kLogSession)
            .log("session flushed because soft limit reached and idle time was beyond {} {}", kSessionIdleTime.count(),
                 _identifier);
    });
    _guidController->reset();
    occasion.feedback->userGuid = _guidController->currentUserGUID().string();
    _setNewSession(occasion);
}

void ClientSessionManager::_endGuidChangedAndBegin(Occasion& occasion)
{
    _flushSessionWithReason(SessionEndReason::GuidChanged,
                            [this] { log(kLogSession).log("session flushed because guid changed {}", _identifier); });
    _setNewSession(occasion);
}

void ClientSessionManager::_endEngagement(Occasion& occasion)
{
    _session->addFeedback(std::move(occasion.feedback), std::move(occasion.call));
    _flushSessionWithReason(SessionEndReason::EngagementReceived, [] {
        log(kLogSession).log("session flushed because soft limit reached and sentinel feedback received");
    });
    _guidController->reset();
}

void ClientSessionManager::_setNewSession(Occasion& occasion)
{
    const std::uint64_t counter = ++_sessionCounter;
    const auto previousReason = static_cast<std::int64_t>(_flushReason);
    if (_assembly.sharedSession)
        _session = std::make_shared<ClientSessionShared>(_assembly, std::move(occasion.feedback), previousReason,
                                                         std::move(occasion.call));
    else
        _session = std::make_shared<ClientSession>(_assembly, std::move(occasion.feedback), previousReason,
                                                   std::move(occasion.call));
    log(kLogSession).log("new session id {} {}", counter, _identifier);

    _sessionQueue->after(kSessionSoftLimit, [weak = weak_from_this(), counter] {
        const auto self = weak.lock();
        if (!self) return;
        log(kLogSession)
            .debug("soft limit reached expected {} current {} {}", counter, self->_sessionCounter, self->_identifier);
        if (self->_sessionCounter == counter) self->_onUserGuidSoftLimitReached();
    });
}

void ClientSessionManager::_onUserGuidSoftLimitReached()
{
    if (!_session) return;
    _updateState(SessionEvent::SoftLimit, {});
    log(kLogSession).log("soft limit reached, maxtimer session id {} {}", _sessionCounter, _identifier);
    _sessionQueue->after(kFromSoftLimitToMaxTime, [weak = weak_from_this(), counter = _sessionCounter] {
        const auto self = weak.lock();
        if (!self) return;
        log(kLogSession).debug("max timer expired expected {} current {}", counter, self->_sessionCounter);
        if (self->_sessionCounter == counter && self->_session) self->_updateState(SessionEvent::MaxTime, {});
    });
}

void ClientSessionManager::_flushSessionWithReason(SessionEndReason reason, std::move_only_function<void()> callback)
{
    _sessionQueue->assertOnQueue();
    if (_session) {
        _flushReason = reason;
        const std::uint64_t now = _assembly.device.clock.hostTicks();
        std::exchange(_session, nullptr)->enumerateSessions([&](ClientSession& session, bool) {
            auto end = std::make_shared<TavrinSessionEndFeedback>(reason);
            end->timestamp = now;
            session.addFeedback(
                std::make_shared<TavrinFeedback>(std::move(end), 0, session.userGuid().string(), session.agent()));
            session.sessionComplete();
        });
    }
    if (callback) callback();
}

std::shared_ptr<Session> ClientSessionManager::session()
{
    return _sessionQueue->sync([this] { return _session; });
}

SessionState ClientSessionManager::currentState()
{
    return _sessionQueue->sync([this] { return _currentState; });
}

platform::Date ClientSessionManager::expirationTime()
{
    return _sessionQueue->sync([this] { return _expirationTime; });
}

void ClientSessionManager::externalEvent(SessionEvent event, std::move_only_function<void()> callback)
{
    _sessionQueue->async([self = shared_from_this(), event, callback = std::move(callback)]() mutable {
        self->_updateState(event, {.callback = std::move(callback)});
    });
}

void ClientSessionManager::flushSessionInvalidation(const std::string& userAgent,
                                                    std::move_only_function<void(bool)> callback)
{
    if (!_assembly.sharedSession) return flushSession([callback = std::move(callback)]() mutable { callback(true); });
    auto record = std::make_shared<TavrinConnectionInvalidated>();
    record->timestamp = _assembly.device.clock.hostTicks();
    addTavrinFeedback(std::make_shared<TavrinFeedback>(std::move(record), 0, "", userAgent));
    callback(false);
}

const std::string& ClientSessionManager::tavrindUserAgent()
{
    static const TAVSessionConfiguration configuration("tavrind", "tavrind/" TAVRIND_VERSION);
    return *configuration.userAgent;
}

std::shared_ptr<TavrinFeedback> ClientSessionManager::errorFeedback(const platform::Error& error, Assembly& assembly)
{
    std::string guid;
    if (assembly.guidController) guid = assembly.guidController->currentUserGUID().string();
    auto record = std::make_shared<ZRErrorFeedback>(error);
    record->timestamp = assembly.device.clock.hostTicks();
    return std::make_shared<TavrinFeedback>(std::move(record), 0, guid, tavrindUserAgent());
}

void ClientSessionManager::reportErrorAsTavrindFeedback(const platform::Error& error, Assembly& assembly)
{
    if (assembly.clientSessionManager) assembly.clientSessionManager->addTavrinFeedback(errorFeedback(error, assembly));
}

} // namespace tavrin
