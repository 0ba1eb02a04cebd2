#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "platform/ipc/BusClient.h"
#include "platform/ipc/Ipc.h"
#include "platform/values/Error.h"
#include "platform/values/Value.h"

/// The client side of the daemon's IPC for C++ programs. Other programs use D-Bus directly: see docs/ipc.md.
namespace tavrin {

class TAVBag;
class TAVFlusherListener;
enum class FlusherIntent : std::uint64_t;
struct TAVReply;
struct TAVRequest;
struct TAVSessionConfiguration;
struct ZRFeedback;

/// The domain of errors of a call: the connection was lost (ECONNRESET), the daemon refused the call (EPROTO), or no
/// answer came in time (ETIMEDOUT).
inline constexpr std::string_view TAVClientErrorDomain = "TAVClient";

/// The answer to a request.
struct TAVAnswer {
    std::int64_t queryId = 0;
    std::shared_ptr<TAVReply> reply;      ///< null if the request was skipped, overtaken, or failed
    std::optional<platform::Error> error; ///< the daemon's, or the service's
};

/// This client's view of the bag. `bag` is null before the first one. `error` may be set with or without a bag.
struct TAVBagAnswer {
    std::shared_ptr<const TAVBag> bag;
    std::optional<platform::Error> error;
};

/// A downloaded resource. `file` is a new descriptor at offset 0. `attributes` has "size" in bytes, and "modified" and
/// "created" in seconds since 1970.
struct TAVResourceAnswer {
    platform::FileHandle file;
    platform::Value attributes;
    std::optional<platform::Error> error;
};

/// The base of all kinds of connection. Use a connection on one thread only. Callbacks run on that thread, inside
/// `wait` and inside calls that wait for an answer.
class TAVConnection {
public:
    using AnswerHandler = std::function<void(platform::Result<TAVAnswer>)>;

    /// Sets how long calls wait for their answer; default 30 s, which allows for a daemon that is still starting.
    void setTimeout(platform::Duration timeout) { _timeout = timeout; }
    /// Runs callbacks until `done()` returns true, then returns true. Returns false if `timeout` passes or the
    /// connection ends first. `done` is called after each callback, and whenever `descriptor` (-1: none) is readable;
    /// it must then read from it.
    bool wait(const std::function<bool()>& done, platform::Duration timeout, int descriptor = -1);
    /// Returns false after the daemon has closed the connection, for example because of an invalid configuration.
    [[nodiscard]] bool connected() const;

protected:
    static platform::Result<std::unique_ptr<platform::ipc::Client>> open(const std::string& address);

    TAVConnection(std::unique_ptr<platform::ipc::Client> client, const platform::ipc::Interface& interface)
        : _client(std::move(client)), _interface(interface)
    {}
    using MessageHandler = std::function<void(platform::Result<platform::ipc::Message>)>;
    /// Sends a call of `member`. A later wait calls `handler` with the answer or an error in `TAVClientErrorDomain`.
    void sendCall(const platform::ipc::Member& member, platform::ipc::Message message, MessageHandler handler);
    /// Sends a call and waits for its answer, at most for the time-out plus `more`.
    platform::Result<platform::ipc::Message> call(const platform::ipc::Member& member, platform::ipc::Message message,
                                                  platform::Duration more = {});

    std::unique_ptr<platform::ipc::Client> _client;
    const platform::ipc::Interface& _interface;
    platform::Duration _timeout = std::chrono::seconds(30);
};

/// A connection to the endpoint whose address `configure` returns: for views that outlive a search, and for images.
class TAVEndpointClient : public TAVConnection {
public:
    [[nodiscard]] static platform::Result<std::unique_ptr<TAVEndpointClient>> connect(const std::string& endpoint);

    /// Sends a request for more results or a card. Requests of other kinds get no answer.
    platform::Result<TAVAnswer> request(const TAVRequest& request, const TAVSessionConfiguration& configuration);
    /// Returns the bytes of those images that the daemon has loaded within `limit` (a minute at most), by "url" or
    /// "id". `images` are dictionaries with these keys, as in answers of the service.
    platform::Result<std::map<std::string, platform::Bytes>> loadImages(const platform::Value::Array& images,
                                                                        platform::Duration limit);

private:
    using TAVConnection::TAVConnection;
};

/// A connection to the flusher bridge, at the address that `TAVClient::listenToFlusher` returns. Example:
///
///     auto bridge = tavrin::TAVFlusherClient::connect(endpoint, listener);
///     (*bridge)->initiateConnection(FlusherIntent::WatchEvents);
///     (*bridge)->wait([&] { return seenEnough; }, timeout);
class TAVFlusherClient : public TAVConnection {
public:
    /// Connects to the bridge. `listener` must outlive the connection.
    [[nodiscard]] static platform::Result<std::unique_ptr<TAVFlusherClient>> connect(const std::string& endpoint,
                                                                                     TAVFlusherListener& listener);

    /// Returns once the bridge has received the intent. `TAVFlusherListener::workDone` reports the end of the work.
    platform::Result<void> initiateConnection(FlusherIntent intent);

private:
    using TAVConnection::TAVConnection;
};

/// A connection to the daemon.
///
///     auto client = tavrin::TAVClient::connect();
///     auto endpoint = (*client)->configure({"com.example.app", "Example/1"});
///     auto answer = (*client)->request(*TAVSearchRequest::searchRequestWithString("weather", trigger));
///
/// While the user types, `send` a request for each key and receive the answers inside `wait`. The answer to a request
/// that a later one has overtaken has no reply.
class TAVClient : public TAVConnection {
public:
    /// Returns $XDG_RUNTIME_DIR/com.quorvane.tavrind/socket.
    [[nodiscard]] static std::filesystem::path defaultSocket();
    /// Returns the D-Bus address of that socket.
    [[nodiscard]] static std::string defaultAddress();
    /// Connects. If the socket belongs to a systemd unit, connecting starts the daemon.
    [[nodiscard]] static platform::Result<std::unique_ptr<TAVClient>>
    connect(const std::string& address = defaultAddress());

    /// Introduces the client; call it before any other call. Returns the address for `TAVEndpointClient`.
    platform::Result<std::string> configure(const TAVSessionConfiguration& configuration);
    platform::Result<TAVBagAnswer> bag();
    platform::Result<TAVAnswer> request(const TAVRequest& request);
    void send(const TAVRequest& request, AnswerHandler handler);
    /// Reports what the user saw or did. The next `wait` or call sends the event. It also calls `taken` once the daemon
    /// has accepted the event, or with the reason for a refusal.
    void reportEvent(const std::string& event, std::int64_t queryId, const ZRFeedback& feedback,
                     std::function<void(platform::Result<void>)> taken = {});
    /// Returns the events of the current session that the daemon keeps in memory, in their uploaded form.
    platform::Result<platform::Value::Array> feedback();
    /// Returns the address of the flusher bridge.
    platform::Result<std::string> listenToFlusher();
    /// Returns {"identifier", "agent"} of each client that the daemon knows.
    platform::Result<platform::Value::Array> sessions();
    platform::Result<TAVResourceAnswer> resource(const std::string& identifier);
    /// Returns the daemon's state as a dictionary. Needs no configuration.
    platform::Result<platform::Value> status();
    /// Returns the daemon's counters as OpenMetrics text. Needs no configuration.
    platform::Result<std::string> statistics();
    // Operations of `TAVDiagnosticsXPC`. They need no configuration, except a request's own for `previewRequest`.
    platform::Result<platform::Value> figures();
    platform::Result<platform::Value> waiting();
    platform::Result<platform::Value::Array> previewUploads();
    /// Returns the request that the daemon would send, with where each part comes from. Fails with an error in
    /// `TAVErrorDomain` if it would send none.
    platform::Result<platform::Value> previewRequest(const TAVRequest& request);
    /// Returns after the daemon has closed this connection, which it does to start again without its traces.
    platform::Result<void> wipe(bool settings);

    /// Sets the callback for bags that the daemon pushes; replaces the previous one.
    void onBagDidLoad(std::function<void(TAVBagAnswer)> handler);

private:
    using TAVConnection::TAVConnection;
};

} // namespace tavrin
