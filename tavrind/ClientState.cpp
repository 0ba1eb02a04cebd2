#include "tavrind/ClientState.h"

#include "CoreTavrin/ClientVocabulary.h"
#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/device/Device.h"
#include "platform/files/UserDefaults.h"
#include "platform/run/Clock.h"
#include "searchrecords/ZRNetworkFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/FeedbackRecords.h"
#include "tavrind/QueryCache.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinUserGUIDController.h"

namespace tavrin {

namespace {

constexpr std::chrono::seconds kBagWait{1};
constexpr std::chrono::seconds kConnectionStaysWarm{30};

std::optional<std::string> shortName(const std::string& identifier)
{
    const auto name = extractClientNameFromString(identifier);
    return name ? std::optional<std::string>(*name) : std::nullopt;
}

const platform::Log& log()
{
    return TavrinLogForCategory(kLogSearch);
}

} // namespace

ClientState::ClientState(std::string identifier, Assembly& assembly)
    : _assembly(assembly), _identifier(std::move(identifier)), _clientShortName(shortName(_identifier)),
      _answersQueue(assembly.device.serialQueue("com.quorvane.tavrind.answers")),
      _queue(assembly.device.serialQueue("com.quorvane.tavrind.clientState"))
{
    if (assembly.userDefaults.boolean("TAVNoQueryCache")) {
        log().log("query cache OFF for {}", _identifier);
    } else {
        log().log("query cache ON for {}", _identifier);
        _queryCache = QueryCache::make(assembly);
    }
    if (assembly.sharedSession) {
        log().log("Tavrin is using shared instance of guid controller");
    } else {
        log().log("Tavrin is using individual instance of guid controller {}", _identifier);
        _ownGuidController = std::make_shared<TavrinUserGUIDController>(assembly);
        _ownSessionManager = std::make_shared<ClientSessionManager>(assembly, _ownGuidController, _identifier);
    }
}

ClientState::~ClientState() = default;

std::shared_ptr<ClientSessionManager> ClientState::sessionManager() const
{
    return _ownSessionManager ? _ownSessionManager : _assembly.clientSessionManager;
}

std::shared_ptr<TavrinUserGUIDController> ClientState::guidController() const
{
    return _ownGuidController ? _ownGuidController : _assembly.guidController;
}

std::optional<std::string> ClientState::userAgent() const
{
    return _queue->sync([this] { return _userAgent; });
}

void ClientState::setUserAgent(std::string userAgent)
{
    _queue->sync([&] { _userAgent = std::move(userAgent); });
}

void ClientState::setConfiguration(std::shared_ptr<TAVSessionConfiguration> configuration)
{
    _queue->sync([&] { _configuration = std::move(configuration); });
}

std::shared_ptr<const TAVBag> ClientState::bag() const
{
    return _queue->sync([this] { return _bag; });
}

void ClientState::bag(const std::optional<std::string>& userAgent, BagReply reply)
{
    const bool known = _queue->sync([&] {
        if (userAgent && !userAgent->empty() && userAgent != _userAgent) {
            _userAgent = userAgent;
            if (_bag) {
                _bag = std::make_shared<const TAVBag>(_bag->rawBag(), *_userAgent);
                if (_queryCache) _queryCache->removeAllObjects();
            }
        }
        return _userAgent.has_value();
    });
    if (!known) return reply(nullptr, makeTAVError(TAVErrorTimeout, "no UserAgent"));

    _ensureBag([self = shared_from_this(), reply = std::move(reply)](bool ensured) mutable {
        reply(self->bag(), ensured ? OptionalError() : makeTAVError(TAVErrorTimeout, "timeout"));
    });
}

/// Calls `then` with whether there is a bag: at once, or after the current queue was held back for it.
void ClientState::_ensureBag(std::move_only_function<void(bool)> then)
{
    enum class State { NoAgent, Held, Missing };
    const State state = _queue->sync([this] {
        if (!_userAgent) return State::NoAgent;
        if (_bag) return State::Held;
        log().log("Warming bag cache for agent: {}", *_userAgent);
        if (!_bagObserver) {
            _bagObserver = _assembly.notificationCenter.observe(
                TAVBagChangeNotification, [weak = weak_from_this()](const platform::Notification& notification) {
                    const auto bag = notification.get<std::shared_ptr<const TAVBag>>("bag");
                    auto self = weak.lock();
                    if (self && bag) self->bagChangeNotification(bag);
                });
        }
        return State::Missing;
    });
    if (state != State::Missing) return then(state == State::Held);

    if (const auto current = _assembly.bagController->currentBag()) {
        _storeBagFrom(*current);
        return then(true);
    }

    _markNetworkRequest();
    platform::Queue::current()->suspendUntil(
        _bagArrived, kBagWait,
        [self = shared_from_this(), then = std::move(then)]() mutable { then(self->bag() != nullptr); });
}

/// Unless a newer one has been announced since it was read.
void ClientState::_storeBagFrom(const TAVBag& bag)
{
    _queue->sync([&] {
        if (!_bag) _bag = std::make_shared<const TAVBag>(bag.rawBag(), *_userAgent);
    });
}

void ClientState::bagChangeNotification(const std::shared_ptr<const TAVBag>& bag)
{
    _queue->async([self = shared_from_this(), bag] {
        self->_bag = std::make_shared<const TAVBag>(bag->rawBag(), *self->_userAgent);
        self->_bagArrived.signal();
    });
}

void ClientState::warm()
{
    const auto url = _assembly.bagController->warmURL();
    if (!url) return log().log("warm not required, bag fetch in process");
    const platform::Date now = _assembly.device.clock.wallNow();
    const auto last = _queue->sync([this] { return _lastNetworkRequest; });
    if (last && now - *last < kConnectionStaysWarm) return log().log("warm not required, connection still warm");

    const platform::UrlRequest request = _assembly.requestFactory->warmRequest(*url);
    if (const auto& manager = _assembly.clientSessionManager) {
        auto start = startNetworkSearchFeedback("", request, StartSearchTrigger::Warm, EndpointType::TavrinWarm);
        start->timestamp = _assembly.device.clock.hostTicks();
        manager->addTavrinFeedback(
            std::make_shared<TavrinFeedback>(std::move(start), 0, "", ClientSessionManager::tavrindUserAgent()));
    }
    _assembly.urlSession
        ->dataTask(request,
                   [](auto, std::optional<platform::UrlResponse> response, std::optional<platform::Error> error) {
                       log().log("Status for warm request: ({}) error: ({})", response ? response->statusCode : 0,
                                 error ? error->description() : "none");
                   })
        ->resume();
    _markNetworkRequest();
}

void ClientState::_markNetworkRequest()
{
    const platform::Date now = _assembly.device.clock.wallNow();
    _queue->async([self = shared_from_this(), now] { self->_lastNetworkRequest = now; });
}

/// Reading it may roll it, which empties query caches: only a request that is about to be made reads it.
platform::Uuid ClientState::_currentUserGUID() const
{
    const auto controller = guidController();
    return controller ? controller->currentUserGUID() : platform::Uuid();
}

void ClientState::_setPerformedSearch()
{
    _assembly.requestFactory->setPerformedSearch();
}

std::optional<platform::Duration> ClientState::_requestTimeout() const
{
    const double seconds =
        _queue->sync([this] { return _configuration ? _configuration->timeoutIntervalForRequest : 0; });
    return seconds > 0 ? std::optional(requestTimeout(seconds)) : std::nullopt;
}

} // namespace tavrin
