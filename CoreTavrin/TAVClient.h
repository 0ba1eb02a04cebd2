#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/ipc/BusClient.h"
#include "platform/ipc/Ipc.h"
#include "platform/values/Error.h"
#include "platform/values/Value.h"

/// The client's side of the daemon's IPC, for programs in C++. Other languages speak D-Bus: see docs/ipc.md.
namespace tavrin {

class TAVBag;
class TAVFlusherListener;
enum class FlusherIntent : std::uint64_t;
struct TAVReply;
struct TAVRequest;
struct TAVSessionConfiguration;
struct ZRFeedback;

/// Domain of errors on the way to the daemon: there is no daemon, the connection was lost, a call was refused or got no
/// answer. Codes are those of errno.
inline constexpr std::string_view TAVClientErrorDomain = "TAVClient";

/// The answer to a request.
struct TAVAnswer {
    std::int64_t queryId = 0;
    std::shared_ptr<TAVReply> reply;      ///< null if the request was skipped, overtaken, or failed
    std::optional<platform::Error> error; ///< the daemon's, or the service's
};

/// The bag as this client sees it, or why there is none; an error may come with a bag, too.
struct TAVBagAnswer {
    std::shared_ptr<const TAVBag> bag;
    std::optional<platform::Error> error;
};

/// A downloaded resource: a descriptor of its own for its file, at the start, and its "size", "modified" and "created".
struct TAVResourceAnswer {
    platform::FileHandle file;
    platform::Value attributes;
    std::optional<platform::Error> error;
};

/// What all kinds of connection share. Belongs to one thread; callbacks run inside `wait` and inside calls that wait.
class TAVConnection {
public:
    using AnswerHandler = std::function<void(platform::Result<TAVAnswer>)>;

    /// How long calls wait for their answer; default 30 s, of which a daemon that is just being started takes some.
    void setTimeout(platform::Duration timeout) { _timeout = timeout; }
    /// Runs callbacks until `done()` returns true; returns false if `timeout` passes or the connection ends before. To
    /// wait for something else too, such as keys, pass its descriptor: `done` is called again whenever that can be
    /// read, and must read it.
    bool wait(const std::function<bool()>& done, platform::Duration timeout, int descriptor = -1);
    /// False after the daemon has closed the connection, as it does after an invalid configuration.
    [[nodiscard]] bool connected() const;

protected:
    static platform::Result<std::unique_ptr<platform::ipc::Client>> open(const std::string& address);

    TAVConnection(std::unique_ptr<platform::ipc::Client> client, const platform::ipc::Interface& interface)
        : _client(std::move(client)), _interface(interface)
    {}
    using MessageHandler = std::function<void(platform::Result<platform::ipc::Message>)>;
    /// Sends a call of `member`; `handler` gets its answer, or an error in `TAVClientErrorDomain`, inside a later wait.
    void sendCall(const platform::ipc::Member& member, platform::ipc::Message message, MessageHandler handler);
    /// Sends a call and waits for its answer, which may take the daemon `more` than others do.
    platform::Result<platform::ipc::Message> call(const platform::ipc::Member& member, platform::ipc::Message message,
                                                  platform::Duration more = {});

    std::unique_ptr<platform::ipc::Client> _client;
    const platform::ipc::Interface& _interface;
    platform::Duration _timeout = std::chrono::seconds(30);
};

/// A connection to the endpoint that `configure` returns: requests for views that outlive a search, and images.
class TAVEndpointClient : public TAVConnection {
public:
    [[nodiscard]] static platform::Result<std::unique_ptr<TAVEndpointClient>> connect(const std::string& endpoint);

    /// Serves more results and cards; requests of other kinds get no answer.
    platform::Result<TAVAnswer> request(const TAVRequest& request, const TAVSessionConfiguration& configuration);
    /// The bytes of images, by their "url" or "id": of those that the daemon has within `limit`, a minute at most.
    /// `images` are dictionaries with these keys, as in answers of the service.
    platform::Result<std::map<std::string, platform::Bytes>> loadImages(const platform::Value::Array& images,
                                                                        platform::Duration limit);

private:
    using TAVConnection::TAVConnection;
};

/// A connection to the flusher bridge, at the address that `TAVClient::listenToFlusher` returns. A tool that watches:
///
///     auto bridge = tavrin::TAVFlusherClient::connect(endpoint, listener);
///     (*bridge)->initiateConnection(FlusherIntent::WatchEvents);
///     (*bridge)->wait([&] { return seenEnough; }, timeout);
class TAVFlusherClient : public TAVConnection {
public:
    /// `listener` must outlive the connection.
    [[nodiscard]] static platform::Result<std::unique_ptr<TAVFlusherClient>> connect(const std::string& endpoint,
                                                                                     TAVFlusherListener& listener);

    /// Returns when the bridge has the intent; its work may end later, see `TAVFlusherListener::workDone`.
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
/// While the user types, `send` a request for each key and take the answers inside `wait`: an answer that a later
/// request has overtaken has no reply.
class TAVClient : public TAVConnection {
public:
    /// "unix:path=$XDG_RUNTIME_DIR/com.quorvane.tavrind/socket".
    [[nodiscard]] static std::string defaultAddress();
    /// Connects. If systemd holds the socket, that starts the daemon.
    [[nodiscard]] static platform::Result<std::unique_ptr<TAVClient>>
    connect(const std::string& address = defaultAddress());

    /// Introduces the client, as other calls require; returns the address for `TAVEndpointClient`.
    platform::Result<std::string> configure(const TAVSessionConfiguration& configuration);
    platform::Result<TAVBagAnswer> bag();
    platform::Result<TAVAnswer> request(const TAVRequest& request);
    void send(const TAVRequest& request, AnswerHandler handler);
    /// Reports what the user saw or did. The event is sent inside `wait` or the next call. `taken` is called there,
    /// too, when the daemon has the event, or with the reason why it refused it.
    void reportEvent(const std::string& event, std::int64_t queryId, const ZRFeedback& feedback,
                     std::function<void(platform::Result<void>)> taken = {});
    /// The feedback of the current session, as it would be uploaded.
    platform::Result<platform::Value::Array> feedback();
    /// The address of the flusher bridge.
    platform::Result<std::string> listenToFlusher();
    /// {"identifier", "agent"} of each client that the daemon knows.
    platform::Result<platform::Value::Array> sessions();
    platform::Result<TAVResourceAnswer> resource(const std::string& identifier);
    /// What the daemon is doing; needs no configuration.
    platform::Result<platform::Value> status();
    /// The daemon's counters as OpenMetrics text; needs no configuration.
    platform::Result<std::string> statistics();

    /// Called with every bag that the daemon pushes.
    void onBagDidLoad(std::function<void(TAVBagAnswer)> handler);

private:
    using TAVConnection::TAVConnection;
};

} // namespace tavrin
