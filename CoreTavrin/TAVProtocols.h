#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/ipc/Ipc.h"
#include "platform/run/Reply.h"
#include "platform/values/Value.h"

/// The protocols between clients and the daemon as abstract types, and the adaptors that serve them as D-Bus interfaces
/// with the rows of TAVMembers.h. docs/ipc.md describes the wire format.
namespace tavrin {

struct TAVReply;
struct TAVRequest;
struct TAVSessionConfiguration;
class TAVBag;
struct ZRFeedback;

using OptionalError = std::optional<platform::Error>;
using BagReply = platform::Reply<std::shared_ptr<const TAVBag>, OptionalError>;
/// (query id, reply or null, error or nothing). A request of a served kind is answered exactly once; any other is
/// abandoned.
using RequestReply = platform::Reply<std::int64_t, std::shared_ptr<TAVReply>, OptionalError>;
using ResourceReply = platform::Reply<platform::FileHandle, platform::Value, OptionalError>;

/// The operations that the daemon offers a client. Calls arrive on the connection's queue. A record is null if the
/// caller sent none or one of an unknown class.
class TAVDaemonXPC {
public:
    virtual ~TAVDaemonXPC() = default;
    /// Introduces the client and replies with the address of the endpoint for `TAVEndpointXPC`. An invalid
    /// configuration gets no reply and closes the connection.
    virtual void configure(std::shared_ptr<TAVSessionConfiguration> configuration,
                           platform::Reply<std::string> reply) = 0;
    virtual void bag(BagReply reply) = 0;
    /// `request` is never null.
    virtual void request(std::shared_ptr<TAVRequest> request, RequestReply reply) = 0;
    /// `feedback` is never null. The call is answered when the last copy of `call` is destroyed: hold one until the
    /// event is written or dropped.
    virtual void reportEvent(const std::string& event, std::int64_t queryId, std::shared_ptr<ZRFeedback> feedback,
                             std::shared_ptr<void> call) = 0;
    /// Replies with the current session's events that are kept in memory, in their uploaded form with relative times.
    virtual void feedback(const std::string& argument,
                          platform::Reply<platform::Value::Array, OptionalError> reply) = 0;
    /// Replies with the address of the flusher bridge, for `TAVFlusherXPC`.
    virtual void listenToFlusher(platform::Reply<std::string> reply) = 0;
    /// Replies with {"identifier", "agent"} of each known client.
    virtual void listSessions(platform::Reply<platform::Value::Array> reply) = 0;
    virtual void fileHandleAndAttributesForResource(const std::string& resource, ResourceReply reply) = 0;
};

/// The operations for diagnosis. They need no configuration. Calls arrive on a connection's queue.
class TAVDiagnosticsXPC {
public:
    virtual ~TAVDiagnosticsXPC() = default;
    /// Returns the daemon's state as a dictionary.
    virtual platform::Value status() = 0;
    /// Returns the statistics counters as OpenMetrics text.
    virtual std::string statistics() = 0;
    /// Returns counts and latencies since the start, for live displays: {"requests": {kind: {"count", "failed",
    /// "latency"}}}; see `LatencyHistogram` for "latency".
    virtual platform::Value figures() = 0;
    /// Replies with {"uploads", "downloads", "activities"}: lists of dictionaries that say what each waits for.
    virtual void waiting(platform::Reply<platform::Value> reply) = 0;
    /// Replies with what the next upload pass would send, a dictionary for each body: {"body" (bytes), "url",
    /// "headers", "events", "open"}. Has "bytes", the size, instead of a body that exceeds 8 MiB with those before it.
    /// Changes nothing but a counter: a session file that is too large is counted again.
    virtual void previewUploads(platform::Reply<platform::Value::Array> reply) = 0;
    /// Replies with the HTTP request that the daemon would send for `request`, item by item: {"url", "items",
    /// "headers"}, each item and header with "name", "value" and "from". Sends nothing.
    virtual void previewRequest(std::shared_ptr<TAVRequest> request,
                                platform::Reply<platform::Value, OptionalError> reply) = 0;
    /// Removes everything that the daemon keeps about its users, and with `settings` their settings: the process starts
    /// again, and removes it before anything else. All connections end; the call gets no reply.
    virtual void wipe(bool settings, platform::Reply<> reply) = 0;
};

/// The notifications that a client receives. Any thread.
class TAVClientXPC {
public:
    virtual ~TAVClientXPC() = default;
    virtual void bagDidLoad(const std::shared_ptr<const TAVBag>& bag, const OptionalError& error) = 0;
};

/// The operations of the endpoint whose address `configure` returns. Calls arrive on that connection's queue.
class TAVEndpointXPC {
public:
    virtual ~TAVEndpointXPC() = default;
    /// Serves more results and cards; other kinds are abandoned. `request` is never null, `configuration` may be.
    virtual void request(std::shared_ptr<TAVRequest> request, std::shared_ptr<TAVSessionConfiguration> configuration,
                         RequestReply reply) = 0;
    /// Replies with the bytes of those images that are loaded within `timeout` nanoseconds, by "url" or "id".
    virtual void loadImages(platform::Value::Array images, std::uint64_t timeout,
                            platform::Reply<platform::Value> reply) = 0;
};

/// A tool's command to the flusher bridge. The values are those on the wire; a tool may send others.
enum class FlusherIntent : std::uint64_t {
    WatchFlushes, ///< send this tool `flushedData`
    WatchEvents,  ///< send this tool `receivedFeedbackDescription`
    StopFlushing, ///< flush nothing in the background until the next dump; `workDone` follows
    Dump,         ///< end and flush all sessions now; `workDone` follows
};

/// The operations that the flusher bridge offers a diagnostic tool. Calls arrive on that connection's queue.
class TAVFlusherXPC {
public:
    virtual ~TAVFlusherXPC() = default;
    virtual void initiateConnectionWithIntent(std::uint64_t intent) = 0;
};

/// The notifications that a diagnostic tool receives. Any thread.
class TAVFlusherListener {
public:
    virtual ~TAVFlusherListener() = default;
    virtual void flushedData(const platform::Bytes& body) = 0;
    virtual void receivedFeedbackDescription(const std::string& description) = 0;
    virtual void workDone() = 0;
    /// Another tool, of the process `process`, has taken over what this tool watched. Nothing more is sent for
    /// `intent`.
    virtual void replaced(FlusherIntent /*intent*/, std::int64_t /*process*/) {}
};

/// The path of every object that the daemon exports.
inline constexpr std::string_view kObjectPath = "/com/quorvane/tavrind";

/// Return the interfaces of the three kinds of connection.
[[nodiscard]] const platform::ipc::Interface& daemonInterface();
[[nodiscard]] const platform::ipc::Interface& endpointInterface();
[[nodiscard]] const platform::ipc::Interface& flusherInterface();

/// Return handlers that decode a call, invoke the object and encode its answer. They hold the object weakly; after its
/// destruction, calls get no answer.
[[nodiscard]] platform::ipc::Handler daemonHandler(std::weak_ptr<TAVDaemonXPC> object,
                                                   std::weak_ptr<TAVDiagnosticsXPC> diagnostics);
[[nodiscard]] platform::ipc::Handler endpointHandler(std::weak_ptr<TAVEndpointXPC> object);
[[nodiscard]] platform::ipc::Handler flusherHandler(std::weak_ptr<TAVFlusherXPC> object);

/// Return proxies that notify the peer of a connection by signals. They hold the connection weakly; after its
/// destruction, they do nothing.
[[nodiscard]] std::shared_ptr<TAVClientXPC> makeClientProxy(std::weak_ptr<platform::ipc::Connection> connection);
[[nodiscard]] std::shared_ptr<TAVFlusherListener>
makeFlusherListenerProxy(std::weak_ptr<platform::ipc::Connection> connection);

} // namespace tavrin
