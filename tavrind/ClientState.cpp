#include "tavrind/ClientState.h"

#include "CoreTavrin/ClientVocabulary.h"
#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/device/Device.h"
#include "platform/files/UserDefaults.h"
#include "platform/run/Clock.h"
#include "searchrecords/ZRNetworkFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/Exchange.h"
#include "tavrind/FeedbackRecords.h"
#include "tavrind/QueryCache.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/RequestKind.h"
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

} // namespace

bool needsWarming(std::optional<platform::Date> lastRequest, platform::Date now)
{
    return !lastRequest || now < *lastRequest || now - *lastRequest >= kConnectionStaysWarm;
}

ClientState::ClientState(std::string identifier, Assembly& assembly)
    : _assembly(assembly), _identifier(std::move(identifier)), _clientShortName(shortName(_identifier)),
      _queue(assembly.device.serialQueue("com.quorvane.tavrind.clientState", rank::kStore)),
      _bagFetch(std::make_shared<platform::Event>())
{
    if (assembly.userDefaults.boolean("TAVNoQueryCache")) {
        log(kLogSearch).log("query cache OFF for {}", _identifier);
    } else {
        log(kLogSearch).log("query cache ON for {}", _identifier);
        _queryCache = QueryCache::make(assembly);
    }
    if (assembly.sharedSession) {
        log(kLogSearch).log("Tavrin is using shared instance of guid controller");
    } else {
        log(kLogSearch).log("Tavrin is using individual instance of guid controller {}", _identifier);
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

ClientView ClientState::view() const
{
    return _queue->sync([this] { return _view; });
}

void ClientState::setUserAgent(std::string userAgent)
{
    _queue->sync([&] { _view.userAgent = std::move(userAgent); });
}

void ClientState::setConfiguration(std::shared_ptr<const TAVSessionConfiguration> configuration)
{
    _queue->sync([&] { _view.configuration = std::move(configuration); });
}

void ClientState::bag(const std::optional<std::string>& userAgent, BagReply reply)
{
    const bool known = _queue->sync([&] {
        if (userAgent && !userAgent->empty() && userAgent != _view.userAgent) {
            _view.userAgent = userAgent;
            if (_view.bag) {
                _view.bag = std::make_shared<const TAVBag>(_view.bag->rawBag(), *_view.userAgent);
                if (_queryCache) _queryCache->removeAllObjects();
            }
        }
        return _view.userAgent.has_value();
    });
    if (!known) return reply(nullptr, makeTAVError(TAVErrorTimeout, "no UserAgent"));

    _ensureBag([self = shared_from_this(), reply = std::move(reply)](bool ensured) mutable {
        reply(self->bag(), ensured ? OptionalError() : makeTAVError(TAVErrorTimeout, "timeout"));
    });
}

/// Calls `then` with whether the client has a bag: at once, or if one must be fetched first, after suspending the
/// current queue for at most `kBagWait`.
void ClientState::_ensureBag(std::move_only_function<void(bool)> then)
{
    enum class State { NoAgent, Held, Missing };
    // The event is read before the bag is requested, because the fetch may end at any moment after that.
    const auto [state, fetch] = _queue->sync([this] {
        if (!_view.userAgent) return std::pair(State::NoAgent, _bagFetch);
        if (_view.bag) return std::pair(State::Held, _bagFetch);
        log(kLogSearch).log("Warming bag cache for agent: {}", *_view.userAgent);
        if (!_bagObserver) {
            _bagObserver = _assembly.notificationCenter.observe(
                TAVBagChangeNotification, [weak = weak_from_this()](const platform::Notification& notification) {
                    if (auto self = weak.lock())
                        self->bagChangeNotification(notification.get<std::shared_ptr<const TAVBag>>("bag"));
                });
        }
        return std::pair(State::Missing, _bagFetch);
    });
    if (state != State::Missing) return then(state == State::Held);

    if (const auto current = _assembly.bagController->currentBag()) {
        _storeBagFrom(*current);
        return then(true);
    }

    _markNetworkRequest();
    platform::Queue::current()->suspendUntil(
        *fetch, kBagWait,
        [self = shared_from_this(), then = std::move(then)]() mutable { then(self->bag() != nullptr); });
}

/// Does nothing if a newer bag has been announced since this one was read.
void ClientState::_storeBagFrom(const TAVBag& bag)
{
    _queue->sync([&] {
        if (!_view.bag) _view.bag = std::make_shared<const TAVBag>(bag.rawBag(), *_view.userAgent);
    });
}

/// A null bag means that a fetch failed: waiting requests continue without a bag, and later ones wait for the next
/// fetch.
void ClientState::bagChangeNotification(const std::shared_ptr<const TAVBag>& bag)
{
    _queue->async([self = shared_from_this(), bag] {
        if (bag) self->_view.bag = std::make_shared<const TAVBag>(bag->rawBag(), *self->_view.userAgent);
        std::exchange(self->_bagFetch, std::make_shared<platform::Event>())->signal();
    });
}

void ClientState::warm()
{
    const auto url = _assembly.bagController->warmURL();
    if (!url) return log(kLogSearch).log("warm not required, bag fetch in process");
    const platform::Date now = _assembly.device.clock.wallNow();
    if (!needsWarming(_queue->sync([this] { return _lastNetworkRequest; }), now))
        return log(kLogSearch).log("warm not required, connection still warm");

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
                       log(kLogSearch)
                           .log("Status for warm request: ({}) error: ({})", response ? response->statusCode : 0,
                                error ? error->description() : "none");
                   })
        ->resume();
    _markNetworkRequest();
}

void ClientState::_markNetworkRequest()
{
    const platform::Date now = _assembly.device.clock.wallNow();
    _queue->sync([&] { _lastNetworkRequest = now; });
}

void ClientState::perform(const RequestKind& kind, std::shared_ptr<TAVRequest> request, RequestReply reply)
{
    std::make_shared<Exchange>(_assembly, shared_from_this(), kind, std::move(request), std::move(reply))->begin();
}

void ClientState::_perform(std::shared_ptr<TAVRequest> request, RequestReply reply)
{
    const RequestKind& kind = *kindOf(*request);
    perform(kind, std::move(request), std::move(reply));
}

} // namespace tavrin
