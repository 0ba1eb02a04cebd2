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

/// Domain of errors of the way to the daemon: no daemon, a lost connection, a call that was refused or not answered.
inline constexpr std::string_view TAVClientErrorDomain = "TAVClient";

/// How a request was answered.
struct TAVAnswer {
    std::int64_t queryId = 0;
    std::shared_ptr<TAVReply> reply;      ///< none where the request was skipped, failed or overtaken
    std::optional<platform::Error> error; ///< the daemon's, or the service's
};

/// The bag as the daemon sees it for this client. Either may be missing.
struct TAVBagAnswer {
    std::shared_ptr<const TAVBag> bag;
    std::optional<platform::Error> error;
};

/// A downloaded resource: its file, open at the start, and what is known of it.
struct TAVResourceAnswer {
    platform::FileHandle file;
    platform::Value attributes;
    std::optional<platform::Error> error;
};

/// What all kinds of connection share. One thread; callbacks run inside `wait` and the calls that wait.
class TAVConnection {
public:
    using AnswerHandler = std::function<void(platform::Result<TAVAnswer>)>;

    /// How long the calls that wait do so; 30 s. A daemon that has just been started needs some of it.
    void setTimeout(platform::Duration timeout) { _timeout = timeout; }
    /// Runs callbacks until `done()`, and answers that; false when `timeout` passed or the connection ended before. A
    /// program that waits for something else too, such as keys, gives its descriptor: `done` is asked again, and reads
    /// it, whenever it can be read.
    bool wait(const std::function<bool()>& done, platform::Duration timeout, int descriptor = -1);
    /// False once the daemon has closed the connection, as it does after an invalid configuration.
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

/// A connection to the endpoint that `configure` answered: requests for views that outlive a search, and images.
class TAVEndpointClient : public TAVConnection {
public:
    [[nodiscard]] static platform::Result<std::unique_ptr<TAVEndpointClient>> connect(const std::string& endpoint);

    /// More results and cards are served here; other kinds are not answered.
    platform::Result<TAVAnswer> request(const TAVRequest& request, const TAVSessionConfiguration& configuration);
    /// The bytes of images, by their "url" or "id": as many of them as the daemon has within `limit`, a minute at most.
    /// `images` are dictionaries with these keys, as they stand in answers.
    platform::Result<std::map<std::string, platform::Bytes>> loadImages(const platform::Value::Array& images,
                                                                        platform::Duration limit);

private:
    using TAVConnection::TAVConnection;
};

/// A connection to the flusher bridge, whose address `TAVClient::listenToFlusher` answers. A tool that watches then
/// waits:
///
///     auto bridge = tavrin::TAVFlusherClient::connect(endpoint, listener);
///     (*bridge)->initiateConnection(FlusherIntent::WatchEvents);
///     (*bridge)->wait([&] { return seenEnough; }, timeout);
class TAVFlusherClient : public TAVConnection {
public:
    /// `listener` must outlive the connection.
    [[nodiscard]] static platform::Result<std::unique_ptr<TAVFlusherClient>> connect(const std::string& endpoint,
                                                                                     TAVFlusherListener& listener);

    /// Answered once the bridge knows it; its work may be done later, see `TAVFlusherListener::workDone`.
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
/// While the user types, `send` a request for each key and take the answers inside `wait`: those that a later request
/// has overtaken come without a reply.
class TAVClient : public TAVConnection {
public:
    /// "unix:path=$XDG_RUNTIME_DIR/com.quorvane.tavrind/socket".
    [[nodiscard]] static std::string defaultAddress();
    /// Connects; where systemd holds the socket, that starts the daemon.
    [[nodiscard]] static platform::Result<std::unique_ptr<TAVClient>>
    connect(const std::string& address = defaultAddress());

    /// Introduces the client, which other calls need; answers the address for `TAVEndpointClient`.
    platform::Result<std::string> configure(const TAVSessionConfiguration& configuration);
    platform::Result<TAVBagAnswer> bag();
    platform::Result<TAVAnswer> request(const TAVRequest& request);
    void send(const TAVRequest& request, AnswerHandler handler);
    /// Reports what the user saw or did. It is out once `wait` or another call has run; inside of which `taken` is
    /// called when the daemon has it, or with the reason why it didn't take it.
    void reportEvent(const std::string& event, std::int64_t queryId, const ZRFeedback& feedback,
                     std::function<void(platform::Result<void>)> taken = {});
    /// The feedback of the current session, as it would be uploaded.
    platform::Result<platform::Value::Array> feedback();
    /// The address of the flusher bridge.
    platform::Result<std::string> listenToFlusher();
    /// One {"identifier", "agent"} for each client that the daemon knows.
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
