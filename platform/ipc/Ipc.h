#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

#include "platform/base/FileHandle.h"
#include "platform/run/Queue.h"
#include "platform/run/Reply.h"
#include "platform/values/Error.h"
#include "platform/values/Value.h"

/// Local IPC: the D-Bus protocol, peer to peer over Unix sockets, on sd-bus.
///
/// A server is a `Listener` that accepts `Connection`s; each exports one object, which answers method calls, and can
/// push signals to its peer. Calls arrive on the connection's serial queue; bus messages never leave the run loop's
/// thread and nothing outside this layer sees one.
namespace platform::ipc {

/// The arguments of a call, a reply or a signal.
///
/// Their D-Bus signature says how they travel: s, x, t, u, i, b, d as the like values, "ay" as Bytes, "a{sv}" as a
/// dictionary, "aa{sv}" and "as" as arrays, "ah" as an array of indexes into `handles`. Inside "v" a value's own type
/// decides: bool b, integers x or t, double d, string s, bytes ay, arrays av, dictionaries a{sv}; dates are doubles.
/// A null can't travel: such dictionary entries are left out, such array elements become empty dictionaries.
struct Message {
    std::vector<Value> args;
    std::vector<FileHandle> handles;
};

/// One member of an interface, with D-Bus signatures of its arguments.
struct Member {
    std::string_view name;
    std::string_view in;             ///< of the call, or of the signal
    std::string_view out;            ///< of the reply; empty for a signal
    bool noReply = false;            ///< the answer is empty; callers needn't ask for it
    std::string_view interface = {}; ///< that the member belongs to; empty: the object's own
    std::string_view inNames = {};   ///< of the arguments of `in`, separated by blanks; for error texts
    std::string_view outNames = {};
};

/// What an exported object offers, and what it pushes.
struct Interface {
    std::string path;      ///< of the object: "/com/example/service"
    std::string_view name; ///< "com.example.Service"
    std::vector<Member> methods;
    std::string_view listenerName; ///< interface of the signals pushed to the peer; may be empty
    std::vector<Member> signals;
    std::string_view introspection; ///< the XML that Introspect answers, whole
};

/// Limits against a peer that is broken or hostile: it is answered with an error, waits or is dropped, and nobody else
/// notices. Bytes are those of the arguments; a value counts for 8 at least.
struct Limits {
    /// Bytes of one incoming message. A larger one gets the error LimitsExceeded and is not looked at.
    std::size_t messageSize = 8u << 20;
    /// Calls not yet answered, and their bytes. Past either, further calls wait in the socket.
    unsigned callsInFlight = 256;
    std::size_t bytesInFlight = 32u << 20;
    /// Bytes waiting for a peer that doesn't read. Past a quarter its calls wait in the socket; past the whole the
    /// connection is dropped. A single message may be larger.
    std::size_t queuedBytes = 32u << 20;
    /// Connections open at once on one listener, so that no client takes all descriptors. Past it, new ones wait to be
    /// accepted until one closes.
    unsigned connections = 1024;
    /// How long a new peer may take to authenticate, and a closing one to read what was sent before.
    Duration patience = std::chrono::seconds(30);
};

/// Error of a call that could not be decoded; becomes a D-Bus error with this text. The connection lives on.
struct CallError {
    std::string name = "org.freedesktop.DBus.Error.InvalidArgs";
    std::string message;
};
using CallResult = std::expected<Message, CallError>;
using Responder = Reply<CallResult>;

/// Answers the calls of one connection, on its queue.
using Handler = std::function<void(std::string_view member, Message arguments, Responder reply)>;

struct Peer {
    pid_t pid = 0;
    uid_t uid = 0;
};

/// The server's end of one connection. Any thread.
///
/// Life: made by its listener, `resume()`d by the acceptor, invalidated once: by the peer's end, by a limit, by
/// `invalidate()`, or by its owner's letting go of it. Calls that the peer made before it went still arrive; after
/// `invalidate()` none does. Then pushes go nowhere and answers to calls are dropped.
class Connection {
public:
    virtual ~Connection() = default;

    [[nodiscard]] virtual Peer peer() const = 0;
    /// Where calls and the invalidation handler run.
    [[nodiscard]] virtual const std::shared_ptr<Queue>& queue() const = 0;
    /// The object that answers. Before `resume()`.
    virtual void exportObject(Handler handler) = 0;
    /// Called once, after the last call. Before `resume()`.
    virtual void setInvalidationHandler(std::move_only_function<void()> handler) = 0;
    /// Called, on any thread, with the reason why a push could not be sent. Before `resume()`.
    virtual void setPushErrorHandler(std::function<void(const std::string&)> handler) = 0;
    /// Starts reading.
    virtual void resume() = 0;
    /// Sends a signal of the interface's `listenerName`.
    virtual void push(std::string_view signal, Message arguments) = 0;
    /// Closes the connection once what was sent before has been written.
    virtual void invalidate() = 0;
};

/// Accepts connections on a socket, or on an anonymous endpoint. Peers of another user are refused before anyone is
/// asked. Destroying it stops accepting and removes the socket that it made; connections live on.
class Listener {
public:
    /// Called on the run loop's thread for each new connection, which the callee exports, resumes and keeps.
    using Acceptor = std::function<void(std::shared_ptr<Connection>)>;

    virtual ~Listener() = default;
    virtual void setAcceptor(Acceptor acceptor) = 0;
    /// Starts accepting.
    virtual void resume() = 0;
    /// The D-Bus address that reaches this listener: "unix:path=…".
    [[nodiscard]] virtual std::string endpoint() const = 0;
};

/// Makes listeners. One for the process.
class Transport {
public:
    virtual ~Transport() = default;
    /// The service's own listener. The socket comes from the service manager where that passed one, else it is bound at
    /// `directory`/socket (directory 0700, socket 0600); a socket left behind by a dead process is replaced, one that a
    /// living process serves is an error.
    [[nodiscard]] virtual Result<std::unique_ptr<Listener>> listen(const Interface& interface,
                                                                   const std::string& label) = 0;
    /// A listener under an unguessable name in the same directory, to be handed out by `endpoint()`. Where it can't be
    /// made, the failure is logged and the endpoint is empty.
    [[nodiscard]] virtual std::unique_ptr<Listener> anonymous(const Interface& interface, const std::string& label) = 0;
};

} // namespace platform::ipc
