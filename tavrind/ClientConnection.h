#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "CoreTavrin/TAVProtocols.h"
#include "platform/base/Mutex.h"
#include "platform/run/NotificationCenter.h"

namespace tavrin {

struct Assembly;
struct RequestKind;
struct ZRCustomFeedback;
class ClientState;
class ClientStateManager;
class TavrinFlusherXPC;

/// The daemon's side of one client connection.
///
/// The first valid configuration binds it to its client's state; the binding never changes. Protocol calls run on the
/// connection's queue, other functions on any thread. Answers to searches arrive on any thread and only read the
/// highest query id.
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

    /// Ends the client's session, then calls back. A connection that never configured calls back at once.
    void flushSession(std::move_only_function<void()> callback);
    /// Handles the end of the connection; see `ClientSessionManager::flushSessionInvalidation`. Without a session
    /// manager, calls back with false at once.
    void flushSessionInvalidation(std::move_only_function<void(bool flushed)> callback);

    [[nodiscard]] const std::shared_ptr<platform::ipc::Connection>& connection() const { return _connection; }
    [[nodiscard]] std::int64_t currentQueryId() const { return _currentQueryId; }
    /// Returns the client's short name; nothing before it has configured or if it has none.
    [[nodiscard]] std::optional<std::string> clientShortName() const;
    /// Returns the client's user agent; empty before it has configured.
    [[nodiscard]] std::string userAgent() const;

    /// Sets what the client left open: the keyboard's input mode and the screen's scale.
    static void completeDefaults(TAVRequest& request, platform::Device& device);

private:
    /// Binds the connection to the state of its client if it has none yet, and returns it; null if it can't.
    std::shared_ptr<ClientState> _ensureState();
    [[nodiscard]] std::shared_ptr<ClientState> _boundState() const;
    void search(ClientState& state, const RequestKind& kind, std::shared_ptr<TAVRequest> request, RequestReply reply);
    void reportEvent(std::shared_ptr<ZRFeedback> feedback, std::int64_t queryId, std::shared_ptr<void> call);
    void handleCustomFeedback(std::shared_ptr<ZRCustomFeedback> feedback, std::int64_t queryId,
                              std::shared_ptr<void> call);
    void _reportOneOff(const platform::Error& error) const;
    void bagChangeNotification(std::shared_ptr<const TAVBag> bag);

    Assembly& _assembly;
    std::shared_ptr<ClientStateManager> _clientStateManager;
    std::shared_ptr<TAVClientXPC> _remoteObject;
    std::shared_ptr<platform::ipc::Connection> _connection;
    std::shared_ptr<TavrinFlusherXPC> _flusherListener;
    mutable platform::Mutex _mutex;
    // Written on the connection's queue, read on any thread.
    std::shared_ptr<TAVSessionConfiguration> _configuration GUARDED_BY(_mutex);
    std::shared_ptr<ClientState> _state GUARDED_BY(_mutex);
    std::atomic<std::int64_t> _currentQueryId = 0; // the highest accepted; only compare-and-swap raises it
    // Held while a query is accepted, and while an answer is checked and sent. Otherwise a newer query could be
    // accepted and answered between the check of an older answer and its delivery.
    platform::Mutex _orderMutex;
    std::atomic<bool> _reportedNoState = false; ///< limits the error sessions to one for each connection
    platform::NotificationCenter::Token _bagObserver;
};

} // namespace tavrin
