#include "tavrind/ClientConnection.h"

#include <algorithm>
#include <array>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/device/Device.h"
#include "platform/device/DeviceProfile.h"
#include "platform/device/LocaleSource.h"
#include "platform/run/Clock.h"
#include "platform/values/Json.h"
#include "platform/values/ValueCoder.h"
#include "searchrecords/ZRRecords.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSession.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/ClientState.h"
#include "tavrind/ClientStateManager.h"
#include "tavrind/DownloadManager.h"
#include "tavrind/FeedbackClasses.h"
#include "tavrind/RequestKind.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinFeedbackFlusher.h"
#include "tavrind/TavrinFlusherXPC.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TAVTracing.h"

namespace tavrin {

namespace {

/// The appearances of the search view after which a search is likely.
constexpr std::array kWarmingEvents{
    SearchViewAppearTrigger::TodayView,          SearchViewAppearTrigger::KeyboardShortcut,
    SearchViewAppearTrigger::MouseClickOnMenu,   SearchViewAppearTrigger::TapToInput,
    SearchViewAppearTrigger::NewWindow,          SearchViewAppearTrigger::Click,
    SearchViewAppearTrigger::PullDownHomeScreen, SearchViewAppearTrigger::NotificationCenter,
    SearchViewAppearTrigger::PartialPullDown,
};

} // namespace

ClientConnection::ClientConnection(Assembly& assembly, std::shared_ptr<TAVClientXPC> remoteObject,
                                   std::shared_ptr<platform::ipc::Connection> connection)
    : _assembly(assembly), _clientStateManager(assembly.clientStateManager), _remoteObject(std::move(remoteObject)),
      _connection(std::move(connection)), _flusherListener(assembly.flusherXPCListener)
{}

ClientConnection::~ClientConnection() = default;

std::shared_ptr<ClientState> ClientConnection::_boundState() const
{
    platform::MutexLock lock(_mutex);
    return _state;
}

std::string ClientConnection::userAgent() const
{
    platform::MutexLock lock(_mutex);
    return _configuration ? _configuration->userAgent.value_or("") : "";
}

std::optional<std::string> ClientConnection::clientShortName() const
{
    const auto state = _boundState();
    return state ? state->clientShortName() : std::nullopt;
}

std::shared_ptr<ClientState> ClientConnection::_ensureState()
{
    const platform::Log& log = tavrin::log(kLogSession);
    std::shared_ptr<TAVSessionConfiguration> configuration;
    std::shared_ptr<ClientState> state;
    {
        platform::MutexLock lock(_mutex);
        configuration = _configuration;
        state = _state;
    }
    if (!configuration) {
        log.fault("configuration must not be nil");
    } else if (!configuration->identifier || !configuration->userAgent) {
        log.fault("configuration requires identifier and agent");
    } else if (state) {
        if (state->identifier() != *configuration->identifier) log.fault("session identifier must match");
    } else if ((state = _clientStateManager->stateForClientIdentifier(configuration->identifier))) {
        state->setConfiguration(configuration);
        platform::MutexLock lock(_mutex);
        _state = state;
    }
    return state;
}

void ClientConnection::configure(std::shared_ptr<TAVSessionConfiguration> configuration,
                                 platform::Reply<std::string> reply)
{
    log(kLogConnection)
        .log("client configuration {}", configuration ? platform::toJson(platform::toValue(*configuration)) : "none");
    {
        platform::MutexLock lock(_mutex);
        _configuration = std::move(configuration);
    }
    const auto state = _ensureState();
    if (!state) {
        ClientSessionManager::reportErrorAsTavrindFeedback(
            makeTAVError(TAVErrorInvalidResponse, "invalid configuration"), _assembly);
        log(kLogSession).fault("invalid configuration, closing connection");
        _connection->invalidate();
        return reply.abandon();
    }

    const std::string userAgent = this->userAgent();
    state->bag(
        userAgent,
        BagReply([weak = weak_from_this(), userAgent](std::shared_ptr<const TAVBag> bag, const OptionalError& error) {
            auto self = weak.lock();
            if (!self) return;
            if (bag && !bag->feedbackEnabled())
                log(kLogFeedback).info("feedback collection disabled in bag for user agent {}", userAgent);
            log(kLogBag).info("sending bag with version: {} to client: {} error: {}", bag ? bag->version() : "none",
                              userAgent, error ? error->description() : "none");
            self->_remoteObject->bagDidLoad(bag, error);
            self->_bagObserver = self->_assembly.notificationCenter.observe(
                TAVBagChangeNotification, [weak](const platform::Notification& notification) {
                    if (auto connection = weak.lock())
                        connection->bagChangeNotification(notification.get<std::shared_ptr<const TAVBag>>("bag"));
                });
            // A bag that arrived between the reply and the observer would otherwise never be pushed.
            const auto newest = self->_assembly.bagController->inMemoryBag();
            if (!userAgent.empty() && newest && (!bag || newest->rawBag() != bag->rawBag()))
                self->_remoteObject->bagDidLoad(newest, {});
            self->_clientStateManager->saveState();
        }));
    reply(_clientStateManager->endpoint());
}

/// Called inside the bag controller's barrier, so the push is queued on the connection's queue.
void ClientConnection::bagChangeNotification(std::shared_ptr<const TAVBag> bag)
{
    log(kLogBag).info("bag change notification: {}", bag ? bag->version() : "none");
    if (!bag) return;
    _connection->queue()->async([weak = weak_from_this(), bag = std::move(bag)] {
        if (auto self = weak.lock()) self->_remoteObject->bagDidLoad(bag, {});
    });
}

void ClientConnection::bag(BagReply reply)
{
    const auto state = _ensureState();
    if (!state) return reply(nullptr, makeTAVError(TAVErrorInvalidResponse, "client state nil"));
    state->bag(userAgent(), std::move(reply));
}

void ClientConnection::completeDefaults(TAVRequest& request, platform::Device& device)
{
    const platform::Log& log = tavrin::log(kLogRequest);
    if (request.keyboardInputMode.value_or("").empty()) {
        std::string mode = device.locale.keyboardInputMode();
        if (mode.empty()) mode = device.locale.defaultInputMode();
        log.error("keyboardInputMode property not set, using {}", mode);
        request.keyboardInputMode = std::move(mode);
    }
    if (request.scale == 0.0) {
        request.scale = device.profile.profile().screenScale;
        log.error("request scale property not set, using {:f}", request.scale);
    }
}

void ClientConnection::request(std::shared_ptr<TAVRequest> request, RequestReply reply)
{
    const auto state = _ensureState();
    const RequestKind* kind = kindOf(*request);
    if (!kind) return reply.abandon();
    if (!state) return reply(request->queryId, nullptr, makeTAVError(TAVErrorInvalidResponse, "client state nil"));
    completeDefaults(*request, _assembly.device);

    const auto queryId = static_cast<std::uint64_t>(request->queryId);
    TAVTrace(kind->traceStart, queryId);
    if (kind->traceAnswer != kTraceNone)
        reply = std::move(reply).andThen([kind, queryId] { TAVTrace(kind->traceAnswer, queryId); });
    if (kind->isSearch) return search(*state, *kind, std::move(request), std::move(reply));
    state->perform(*kind, std::move(request), std::move(reply));
}

/// Only the newest query counts. A query whose id is not above the highest accepted one gets an empty reply at once. If
/// a newer query is accepted before an answer arrives, that answer is delivered empty.
void ClientConnection::search(ClientState& state, const RequestKind& kind, std::shared_ptr<TAVRequest> request,
                              RequestReply reply)
{
    const std::int64_t queryId = request->queryId;
    const bool accepted = [&] {
        platform::MutexLock order(_orderMutex);
        std::int64_t current = _currentQueryId;
        return queryId > current && _currentQueryId.compare_exchange_strong(current, queryId);
    }();
    if (!accepted) return reply(queryId, nullptr, {});

    RequestReply ordered([weak = weak_from_this(), queryId, reply = std::move(reply)](
                             std::int64_t, std::shared_ptr<TAVReply> record, OptionalError error) mutable {
        const auto self = weak.lock();
        if (!self) return reply.abandon();
        platform::MutexLock order(self->_orderMutex);
        if (self->_currentQueryId > queryId) return reply(queryId, nullptr, {});
        reply(queryId, std::move(record), std::move(error));
    });
    state.perform(kind, std::move(request), std::move(ordered));
}

void ClientConnection::_reportOneOff(const platform::Error& error) const
{
    ClientSession::createFeedbackSessionFromError(error, _assembly)->sessionComplete();
}

void ClientConnection::reportEvent(const std::string&, std::int64_t queryId, std::shared_ptr<ZRFeedback> feedback,
                                   std::shared_ptr<void> call)
{
    if (feedback->timestamp == 0) feedback->timestamp = _assembly.device.clock.hostTicks();
    reportEvent(std::move(feedback), queryId, std::move(call));
}

void ClientConnection::reportEvent(std::shared_ptr<ZRFeedback> feedback, std::int64_t queryId,
                                   std::shared_ptr<void> call)
{
    const auto state = _boundState();
    if (!state) {
        if (!_reportedNoState.exchange(true)) _reportOneOff(makeTAVError(TAVErrorInvalidResponse, "client state nil"));
        return log(kLogFeedback).error("state must not be nil");
    }
    if (auto custom = std::dynamic_pointer_cast<ZRCustomFeedback>(feedback)) {
        return handleCustomFeedback(std::move(custom), queryId, std::move(call));
    }
    if (const auto* appear = dynamic_cast<const ZRSearchViewAppearFeedback*>(feedback.get())) {
        if (!appear->isOnLockScreen &&
            std::ranges::find(kWarmingEvents, appear->viewAppearEvent) != kWarmingEvents.end())
            state->warm();
    }
    const auto manager = state->sessionManager();
    if (!manager) {
        _reportOneOff(makeTAVError(TAVErrorInvalidResponse, "session manager nil"));
        return log(kLogFeedback).error("session manager nil");
    }
    const std::uint64_t clientQueryId = feedbackClassOf(*feedback).clientQueryId(*feedback);

    const auto& shortName = state->clientShortName();
    const auto* engagement = dynamic_cast<const ZRResultEngagementFeedback*>(feedback.get());
    if (engagement && engagement->result && shortName) {
        if (engagement->result->topHit != TopHit::No)
            _assembly.diagnosticData.addValue(1, createCounterKey(*shortName, "tophit.engagements"));
        if (engagement->result->type == ResultType::Tavrin)
            _assembly.diagnosticData.addValue(1, createCounterKey(*shortName, "tavrin.engagements"));
    }
    manager->addTavrinFeedback(
        std::make_shared<TavrinFeedback>(std::move(feedback), queryId, "", userAgent(), clientQueryId),
        std::move(call));
}

void ClientConnection::handleCustomFeedback(std::shared_ptr<ZRCustomFeedback> feedback, std::int64_t queryId,
                                            std::shared_ptr<void> call)
{
    // The callback keeps the call, so that the record counts as a message of its client until it is in the buffer.
    const auto callback = [call] { log(kLogFlusher).log("flushed custom feedback"); };
    switch (feedback->feedbackType) {
    case CustomFeedbackType::WendralAutofill:
    case CustomFeedbackType::VistrelResultFeatures:
        ClientSession(_assembly, std::make_shared<TavrinFeedback>(std::move(feedback), queryId, "", userAgent()),
                      std::move(call))
            .sessionComplete();
        return callback();
    case CustomFeedbackType::Crowdsourcing:
        _assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.dp.submit");
        return _assembly.crowdsourcingFeedbackFlusher->flush(std::move(feedback), callback);
    default:
        log(kLogFeedback)
            .info("custom feedback of type {} is not served", static_cast<std::int64_t>(feedback->feedbackType));
    }
}

void ClientConnection::feedback(const std::string&, platform::Reply<platform::Value::Array, OptionalError> reply)
{
    TAVTrace(kTraceFeedbackStart, 0);
    const auto state = _ensureState();
    if (!state) {
        reply({}, makeTAVError(TAVErrorInvalidResponse, "client state nil"));
    } else {
        const auto manager = state->sessionManager();
        const auto session = manager ? manager->session() : nullptr;
        reply(session ? session->feedbacksWithRelativeTimestamp() : platform::Value::Array(), {});
    }
    TAVTrace(kTraceFeedbackAnswer, 0);
}

void ClientConnection::listenToFlusher(platform::Reply<std::string> reply)
{
    _ensureState();
    reply(_flusherListener->endpoint());
}

void ClientConnection::listSessions(platform::Reply<platform::Value::Array> reply)
{
    _ensureState();
    reply(_clientStateManager->sessions());
}

void ClientConnection::fileHandleAndAttributesForResource(const std::string& resource, ResourceReply reply)
{
    _ensureState();
    try {
        auto found = _assembly.downloadManager->fileHandleForResource(resource);
        if (found) return reply(std::move(found->file), std::move(found->attributes), {});
        reply({}, {}, std::move(found.error()));
    } catch (const std::exception& exception) { // out of memory, or a fault of a library
        log(kLogConnection).fault("identifier: {} exception: {}", resource, exception.what());
        if (reply) reply({}, {}, makeTAVError(TAVErrorInvalidResponse, exception.what()));
    }
}

void ClientConnection::flushSession(std::move_only_function<void()> callback)
{
    const auto state = _boundState();
    const auto manager = state ? state->sessionManager() : nullptr;
    if (!manager) return callback();
    manager->flushSession(std::move(callback));
}

void ClientConnection::flushSessionInvalidation(std::move_only_function<void(bool)> callback)
{
    const auto state = _boundState();
    const auto manager = state ? state->sessionManager() : nullptr;
    if (!manager) return callback(false);
    manager->flushSessionInvalidation(userAgent(), std::move(callback));
}

} // namespace tavrin
