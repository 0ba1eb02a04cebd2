#include "tavrind/ClientStateManager.h"

#include <fmt/format.h>

#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/device/Device.h"
#include "platform/files/UserDefaults.h"
#include "platform/values/Json.h"
#include "platform/values/ValueCoder.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientState.h"
#include "tavrind/ImageLoader.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/RequestKind.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Value;

namespace {
constexpr const char* kSessionsKey = "sessions";
/// Maximum number of clients. A state lives as long as the daemon and takes about 6 KB.
constexpr std::size_t kMaximumStates = 1024;
} // namespace

std::shared_ptr<ClientStateManager> ClientStateManager::make(Assembly& assembly)
{
    auto manager = std::make_shared<ClientStateManager>(assembly);
    manager->_listener->setAcceptor(
        [weak = manager->weak_from_this()](std::shared_ptr<platform::ipc::Connection> connection) {
            if (auto self = weak.lock()) self->_accept(std::move(connection));
        });
    manager->_listener->resume();
    manager->loadState();
    return manager;
}

ClientStateManager::ClientStateManager(Assembly& assembly)
    : _assembly(assembly), _persistSessions(assembly.userDefaults.boolean("TAVPersistSessions")),
      stateCacheQueue(assembly.device.serialQueue("com.quorvane.tavrind.stateCache", rank::kManager)),
      _imageLoader(std::make_shared<ImageLoader>(assembly)),
      _listener(assembly.device.ipc.anonymous(endpointInterface(), "com.quorvane.tavrind.endpoint"))
{}

ClientStateManager::~ClientStateManager() = default;

std::shared_ptr<ClientState> ClientStateManager::stateForClientIdentifier(const std::optional<std::string>& identifier)
{
    const platform::Log& log = tavrin::log(kLogSession);
    if (!identifier || identifier->empty()) {
        log.fault("client session identifier cannot be nil or empty");
        return nullptr;
    }
    auto state = stateCacheQueue->sync([&]() -> std::shared_ptr<ClientState> {
        if (const auto known = stateCache.find(*identifier); known != stateCache.end()) return known->second;
        if (stateCache.size() >= kMaximumStates) return nullptr;
        return stateCache[*identifier] = std::make_shared<ClientState>(*identifier, _assembly);
    });
    if (!state) {
        log.fault("{} clients are known, refusing another", kMaximumStates);
        return nullptr;
    }
    log.info("using client state: {}", *identifier);
    return state;
}

std::string ClientStateManager::endpoint() const
{
    return _listener->endpoint();
}

Value::Array ClientStateManager::_sessions() const
{
    Value::Array sessions;
    for (const auto& [identifier, state] : stateCache)
        if (const auto agent = state->userAgent())
            sessions.push_back(Value::dictionaryOf({{"identifier", identifier}, {"agent", *agent}}));
    return sessions;
}

Value::Array ClientStateManager::sessions() const
{
    return stateCacheQueue->sync([this] { return _sessions(); });
}

void ClientStateManager::saveState()
{
    if (!_persistSessions) return;
    stateCacheQueue->async([self = shared_from_this()] {
        self->_assembly.userDefaults.set(kSessionsKey, self->_sessions());
        // Not here: clients wait for this queue.
        self->_assembly.device.globalQueue(platform::Priority::Default)
            ->async([&defaults = self->_assembly.userDefaults] { (void)defaults.synchronize(); });
    });
}

void ClientStateManager::loadState()
{
    if (!_persistSessions) return;
    const Value stored = _assembly.userDefaults.value(kSessionsKey);
    if (!stored.asArray()) return;
    stateCacheQueue->sync([&] {
        for (const Value& session : *stored.asArray()) {
            const std::string* identifier = session["identifier"].asString();
            if (!identifier || identifier->empty() || identifier->size() > TAVSessionConfiguration::kMaximumName)
                continue;
            if (stateCache.size() >= kMaximumStates) break;
            auto state = std::make_shared<ClientState>(*identifier, _assembly);
            const std::string* agent = session["agent"].asString();
            if (agent && agent->size() <= TAVSessionConfiguration::kMaximumName) state->setUserAgent(*agent);
            stateCache[*identifier] = std::move(state);
        }
    });
}

void ClientStateManager::_accept(std::shared_ptr<platform::ipc::Connection> connection)
{
    const platform::Log& log = tavrin::log(kLogConnection);
    log.debug("new endpoint connection");
    connection->exportObject(endpointHandler(weak_from_this()));
    // The handler owns the connection until it ends.
    connection->setInvalidationHandler([connection, &log] { log.debug("endpoint connection invalidated"); });
    connection->resume();
}

void ClientStateManager::request(std::shared_ptr<TAVRequest> request,
                                 std::shared_ptr<TAVSessionConfiguration> configuration, RequestReply reply)
{
    const auto state = stateForClientIdentifier(configuration ? configuration->identifier : std::nullopt);
    if (!state) {
        const std::string description = configuration ? platform::toJson(platform::toValue(*configuration)) : "none";
        return reply(request->queryId, nullptr,
                     makeTAVError(TAVErrorInvalidResponse, fmt::format("invalid configuration {}", description)));
    }
    const RequestKind* kind = kindOf(*request);
    if (!kind || !kind->servedOnEndpoint) return reply.abandon();
    state->perform(*kind, std::move(request), std::move(reply));
}

void ClientStateManager::loadImages(Value::Array images, std::uint64_t timeout, platform::Reply<Value> reply)
{
    _imageLoader->loadImages(std::move(images), timeout, std::move(reply));
}

void ClientStateManager::processImagesFromResponse(std::shared_ptr<const platform::JsonDocument> response,
                                                   std::shared_ptr<const TAVBag> bag, platform::UrlSource source)
{
    _imageLoader->processImagesFromResponse(std::move(response), std::move(bag), source);
}

std::set<std::string> ClientStateManager::validImageHosts() const
{
    return _imageLoader->validImageHosts();
}

} // namespace tavrin
