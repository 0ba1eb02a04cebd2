#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "CoreTavrin/TAVProtocols.h"
#include "platform/run/NotificationCenter.h"

namespace tavrin {

struct Assembly;
struct TAVSearchRequest;
struct ZRCustomFeedback;
class ClientState;
class ClientStateManager;
class TavrinFlusherXPC;

/// What one client connection talks to.
///
/// It is bound to the state of its client by the first valid configuration, and to no other after that. Calls arrive on
/// the connection's queue; the public rest is for any thread. Answers to searches come from any thread, and only the
/// highest query id is written there.
class ClientConnection : public TAVDaemonXPC, public std::enable_shared_from_this<ClientConnection> {
public:
    /// `remoteObject` is the client's side of `connection`.
    ClientConnection(Assembly& assembly, std::shared_ptr<TAVClientXPC> remoteObject,
                     std::shared_ptr<platform::ipc::Connection> connection);
    ~ClientConnection() override;

    void configure(std::shared_ptr<TAVSessionConfiguration> configuration, platform::Reply<std::string> reply) override;
    void bag(BagReply reply) override;
    void request(std::shared_ptr<TAVRequest> request, RequestReply reply) override;
    void reportEvent(const std::string& event, std::int64_t queryId, std::shared_ptr<ZRFeedback> feedback,
                     std::shared_ptr<void> call) override;
    void feedback(const std::string& argument, platform::Reply<platform::Value::Array, OptionalError> reply) override;
    void listenToFlusher(platform::Reply<std::string> reply) override;
    void listSessions(platform::Reply<platform::Value::Array> reply) override;
    void fileHandleAndAttributesForResource(const std::string& resource, ResourceReply reply) override;

    /// Ends the client's session, then calls back; at once for a connection that never configured.
    void flushSession(std::move_only_function<void()> callback);
    /// As the connection has gone; the callback hears whether a session was flushed.
    void flushSessionInvalidation(std::move_only_function<void(bool flushed)> callback);

    [[nodiscard]] const std::shared_ptr<platform::ipc::Connection>& connection() const { return _connection; }
    [[nodiscard]] std::int64_t currentQueryId() const { return _currentQueryId; }
    /// Short name of the client; none before it configured, or for a client without one.
    [[nodiscard]] std::optional<std::string> clientShortName() const;
    /// Empty before the client has configured.
    [[nodiscard]] std::string userAgent() const;

private:
    void _ensureState();
    [[nodiscard]] std::shared_ptr<ClientState> _boundState() const;
    void _completeDefaults(TAVRequest& request) const;
    void search(std::shared_ptr<TAVSearchRequest> request, RequestReply reply);
    void reportEvent(std::shared_ptr<ZRFeedback> feedback, std::int64_t queryId, std::shared_ptr<void> call);
    void handleCustomFeedback(std::shared_ptr<ZRCustomFeedback> feedback, std::int64_t queryId,
                              std::move_only_function<void()> callback);
    void _reportOneOff(const platform::Error& error) const;
    void bagChangeNotification(std::shared_ptr<const TAVBag> bag);

    Assembly& _assembly;
    std::shared_ptr<ClientStateManager> _clientStateManager;
    std::shared_ptr<TAVClientXPC> _remoteObject;
    std::shared_ptr<platform::ipc::Connection> _connection;
    std::shared_ptr<TavrinFlusherXPC> _flusherListener;
    mutable std::mutex _mutex; // for the two below, which are written on the connection's queue and read anywhere
    std::shared_ptr<TAVSessionConfiguration> _configuration;
    std::shared_ptr<ClientState> _state;
    std::mutex _orderMutex; // so that no query is accepted between an answer's check and its delivery
    std::atomic<std::int64_t> _currentQueryId = 0;
    std::atomic<bool> _reportedNoState = false; ///< one error session for a connection
    platform::NotificationCenter::Token _bagObserver;
};

} // namespace tavrin
