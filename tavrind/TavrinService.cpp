#include "tavrind/TavrinService.h"

#include <algorithm>
#include <functional>
#include <unistd.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/base/Mutex.h"
#include "platform/device/ActivityScheduler.h"
#include "platform/device/Device.h"
#include "platform/device/ProcessIdentity.h"
#include "platform/files/Counters.h"
#include "platform/files/Files.h"
#include "platform/files/UserDefaults.h"
#include "platform/net/BackgroundSession.h"
#include "platform/run/Clock.h"
#include "platform/run/Group.h"
#include "platform/run/Transactions.h"
#include "platform/values/Dictionary.h"
#include "tavrind/Assembly.h"
#include "tavrind/BackgroundActivitiesManager.h"
#include "tavrind/ClientConnection.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/ClientState.h"
#include "tavrind/ClientStateManager.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/RequestKind.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinFlusherXPC.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinUserGUIDController.h"

namespace tavrin {

using platform::Value;
namespace ipc = platform::ipc;

namespace {

/// Describes a request, with the origin of each part; a part without one is the user's.
Value previewOf(const platform::UrlRequest& request, const RequestOrigins& origins)
{
    const auto part = [](const std::string& name, const std::string& value, const auto& known) {
        const auto found = known.find(name);
        return Value::dictionaryOf(
            {{"name", name}, {"value", value}, {"from", found == known.end() ? "user" : found->second}});
    };
    Value::Array items, headers;
    for (const platform::QueryItem& item : platform::UrlComponents(request.url).queryItems())
        items.push_back(part(item.name, item.value.value_or(""), origins.items));
    for (const auto& [name, value] : request.headers) headers.push_back(part(name, value, origins.headers));
    return Value::dictionaryOf({{"method", request.method},
                                {"url", request.url.string()},
                                {"items", std::move(items)},
                                {"headers", std::move(headers)}});
}

} // namespace

std::shared_ptr<TavrinService> TavrinService::make(Assembly& assembly, StartOptions options)
{
    auto service = std::make_shared<TavrinService>(assembly, std::move(options));
    assembly.guidController = std::make_shared<TavrinUserGUIDController>(assembly);
    assembly.clientSessionManager = std::make_shared<ClientSessionManager>(assembly, assembly.guidController, "tavrin");
    assembly.flusherXPCListener = TavrinFlusherXPC::make(assembly, [weak = service->weak_from_this()] {
        auto self = weak.lock();
        return self ? self->getClientConnections() : std::vector<std::shared_ptr<ClientConnection>>();
    });
    return service;
}

TavrinService::TavrinService(Assembly& assembly, StartOptions options)
    : _assembly(assembly), _options(std::move(options)), _started(assembly.device.clock.wallNow()),
      _queue(assembly.device.serialQueue("com.quorvane.tavrin.serviceQueue", rank::kManager))
{}

TavrinService::~TavrinService() = default;

std::optional<std::string> TavrinService::clientIDForConnection(platform::ProcessIdentity& processes, pid_t pid)
{
    if (auto application = processes.applicationId(pid)) return application;
    const auto path = processes.executablePath(pid);
    if (!path) {
        log(kLogConnection).error("error getting path for pid [{}] {}", pid, path.error().reason());
        return std::nullopt;
    }
    return path->substr(path->find_last_of('/') + 1);
}

void TavrinService::listenerShouldAcceptNewConnection(std::shared_ptr<ipc::Connection> connection)
{
    // Not on the listener's thread: identifying the peer reads the peer's file system, which may be slow or hang.
    connection->queue()->async([self = shared_from_this(), connection] { self->_accept(connection); });
}

void TavrinService::_accept(const std::shared_ptr<ipc::Connection>& connection)
{
    const pid_t pid = connection->peer().pid;
    const std::string clientId = clientIDForConnection(_assembly.device.processes, pid).value_or("none");
    log(kLogConnection).log("new connection from {} ({})", clientId, pid);

    connection->setPushErrorHandler([pid](const std::string& reason) {
        log(kLogConnection).error("(pid:{}) remote proxy error: {}", pid, reason);
    });
    auto client = std::make_shared<ClientConnection>(_assembly, makeClientProxy(connection), connection);
    connection->exportObject(daemonHandler(client, weak_from_this()));
    connection->setInvalidationHandler([weak = weak_from_this(), weakClient = std::weak_ptr(client), clientId, pid] {
        auto self = weak.lock();
        auto invalidated = weakClient.lock();
        if (self && invalidated) self->_connectionInvalidated(invalidated, clientId, pid);
    });
    _queue->async([self = shared_from_this(), client, pid] {
        self->_connections.push_back(client);
        const auto samePid = std::ranges::count_if(
            self->_connections, [pid](const auto& other) { return other->connection()->peer().pid == pid; });
        if (samePid >= 2) log(kLogConnection).error("too many connections {} from pid {}", samePid, pid);
    });
    _assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.clientconnection");
    connection->resume();
}

/// Runs on the connection's queue.
void TavrinService::_connectionInvalidated(const std::shared_ptr<ClientConnection>& connection,
                                           const std::string& clientId, pid_t pid)
{
    log(kLogConnection).log("connection from {} ({}) invalidated", clientId, pid);
    const auto shortName = connection->clientShortName();
    _queue->async([self = shared_from_this(), connection] {
        connection->flushSessionInvalidation([self, connection](bool flushed) {
            log(kLogSession).debug("session {} on invalidation", flushed ? "flushed" : "not flushed");
            self->_queue->async([self, connection] { std::erase(self->_connections, connection); });
        });
    });
    if (shortName) _assembly.diagnosticData.addValue(1, createCounterKey(*shortName, "xcpinvalidation"));
}

std::vector<std::shared_ptr<ClientConnection>> TavrinService::getClientConnections() const
{
    return _queue->sync([this] { return _connections; });
}

Value TavrinService::status()
{
    platform::Device& device = _assembly.device;
    const platform::Date now = device.clock.wallNow();

    Value::Array connections;
    for (const auto& connection : getClientConnections()) {
        connections.push_back(Value::dictionaryOf({{"pid", connection->connection()->peer().pid},
                                                   {"client", connection->clientShortName().value_or("")},
                                                   {"currentQueryId", connection->currentQueryId()}}));
    }

    platform::Dictionary bag;
    bag.set("fetchInProgress", _assembly.bagController->fetchInProgress());
    if (const auto current = _assembly.bagController->inMemoryBag()) {
        bag.set("version", current->version());
        bag.set("enabled", current->isEnabled());
        if (const auto expiration = current->rawBag()["__expiration"].asDouble())
            bag.set("expiresIn", *expiration - platform::secondsSince1970(now));
    }

    if (Value fetch = _assembly.bagController->lastFetch(); fetch.asDictionary()) {
        fetch.mutableDictionary().set("ago", platform::secondsSince1970(now) - fetch["at"].asDouble().value_or(0));
        bag.set("lastFetch", std::move(fetch));
    }

    platform::Dictionary transactions;
    for (const auto& [name, count] : device.transactions.open()) transactions.set(name, count);

    const platform::Directories& places = device.directories;
    platform::Dictionary directories{{"caches", places.caches.string()},   {"config", places.config.string()},
                                     {"state", places.state.string()},     {"data", places.data.string()},
                                     {"runtime", places.runtime.string()}, {"temporary", places.temporary.string()}};

    Value::Array hosts;
    for (const std::string& host : _assembly.clientStateManager->validImageHosts()) hosts.emplace_back(host);

    return Value::dictionaryOf({{"version", ClientSessionManager::tavrindUserAgent()},
                                {"pid", getpid()},
                                {"uptime", platform::toSeconds(now - _started)},
                                {"sharedSession", _assembly.sharedSession},
                                {"connections", std::move(connections)},
                                {"sessions", _assembly.clientStateManager->sessions()},
                                {"bag", std::move(bag)},
                                {"transactions", std::move(transactions)},
                                {"feedback", _assembly.feedbackBooks.description()},
                                {"validImageHosts", std::move(hosts)},
                                {"watchers", _assembly.flusherXPCListener->watchers()},
                                {"flushingStopped", _assembly.backgroundFlusher->stopFlushing()},
                                {"directories", std::move(directories)},
                                {"caFile", _assembly.caFile},
                                {"wiped", _options.wiped}});
}

std::string TavrinService::statistics()
{
    return _assembly.device.counters.openMetrics("tavrind_counter");
}

Value TavrinService::figures()
{
    return Value::dictionaryOf({{"requests", _assembly.requestFigures.description()}});
}

void TavrinService::waiting(platform::Reply<Value> reply)
{
    // Each list arrives on a queue of its own.
    struct Lists {
        platform::Mutex mutex;
        platform::Dictionary lists GUARDED_BY(mutex);
    };
    const auto lists = std::make_shared<Lists>();
    platform::Group all;
    const auto take = [&](const char* name) {
        return [lists, name, done = all.enter()](Value::Array list) {
            const platform::MutexLock lock(lists->mutex);
            lists->lists.set(name, std::move(list));
        };
    };
    _assembly.uploadURLSession->describe(take("uploads"));
    _assembly.downloadURLSession->describe(take("downloads"));
    _assembly.device.activities.describe(take("activities"));
    all.notify([lists, reply = std::move(reply)]() mutable {
        platform::Dictionary waiting;
        {
            const platform::MutexLock lock(lists->mutex);
            waiting = std::move(lists->lists);
        }
        reply(std::move(waiting));
    });
}

void TavrinService::previewUploads(platform::Reply<Value::Array> reply)
{
    _assembly.backgroundFlusher->previewUploads(std::move(reply));
}

void TavrinService::previewRequest(std::shared_ptr<TAVRequest> request, platform::Reply<Value, OptionalError> reply)
{
    const RequestKind* kind = kindOf(*request);
    const auto current = _assembly.bagController->inMemoryBag();
    if (!kind) return reply.abandon();
    if (!current) return reply({}, makeTAVError(TAVErrorTimeout, "timeout"));
    ClientConnection::completeDefaults(*request, _assembly.device);

    const auto& configuration = request->configuration;
    const std::string userAgent = configuration ? configuration->userAgent.value_or("") : "";
    const auto client =
        configuration ? _assembly.clientStateManager->stateForClientIdentifier(configuration->identifier) : nullptr;
    const auto guids = client ? client->guidController() : _assembly.guidController;
    const TAVBag bag(current->rawBag(), userAgent);
    RequestOrigins origins;
    const ClientRequest parts{.request = *request,
                              .bag = &bag,
                              .userGuid = guids->lastKnownUserGUID(),
                              .userAgent = userAgent,
                              .fieldMask = fieldMaskFor(userAgent),
                              .origins = &origins};
    const auto built = std::invoke(kind->builder, *_assembly.requestFactory, parts);
    if (!built) return reply({}, makeTAVError(TAVErrorInvalidResponse, "no URL"));
    reply(previewOf(*built, origins), {});
}

void TavrinService::wipe(bool settings, platform::Reply<> reply)
{
    if (_options.startAgainWiped) _options.startAgainWiped(settings); // returns only if it failed
    reply();
}

} // namespace tavrin
