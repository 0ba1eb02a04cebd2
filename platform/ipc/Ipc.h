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
/// thread and nothing outside this layer sees one. A service can send file handles, but takes none: a call that brings
/// one ends its connection.
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
    std::string_view introspection; ///< the whole XML that Introspect returns
};

/// Limits against peers that are broken or hostile: they wait, get an error or are dropped, and nobody else notices.
///
/// Bytes are those of messages received, of the values decoded from them, and of messages that wait to be read by a
/// peer; together they bound what all peers can make the service hold.
struct Limits {
    /// Bytes of one incoming message, its header included. A peer that announces a larger one is dropped. Decoded
    /// values may take twice as much, else the call gets the error LimitsExceeded.
    std::size_t messageSize = 8u << 20;
    /// Calls of a connection that aren't answered yet, and their bytes. Past either, its further calls wait in the
    /// socket.
    unsigned callsInFlight = 256;
    std::size_t bytesInFlight = 16u << 20;
    /// Bytes waiting for a peer that doesn't read. Past a quarter its calls wait in the socket; past the whole it is
    /// dropped. A single message may be larger.
    std::size_t queuedBytes = 16u << 20;
    /// Bytes held for one process, and for all. Past either only one small message of each connection is let in.
    std::size_t bytesPerProcess = 26u << 20;
    std::size_t bytes = 30u << 20;
    /// Bytes waiting for all peers that don't read. Past it the connection is dropped that the most wait for.
    std::size_t unreadBytes = 18u << 20;
    /// Connections open at once: of one process over all listeners, past which its new ones are closed; and on one
    /// listener, past which new ones wait to be accepted until one closes.
    unsigned connectionsPerProcess = 512;
    unsigned connections = 1024;
    /// How long a peer may take to authenticate or to send a message that it began, and to read what was sent before
    /// its connection was closed.
    Duration patience = std::chrono::seconds(30);
};

/// Why a call could not be decoded; becomes a D-Bus error with this text. The connection stays open.
struct CallError {
    std::string name = "org.freedesktop.DBus.Error.InvalidArgs";
    std::string message;
};
using CallResult = std::expected<Message, CallError>;
using Responder = Reply<CallResult>;

/// Handles the calls of one connection, on its queue. `member` lives as long as the interface.
using Handler = std::function<void(std::string_view member, Message arguments, Responder reply)>;

struct Peer {
    pid_t pid = 0;
    uid_t uid = 0;
};

/// The server's end of one connection. Any thread.
///
/// Life: a listener makes it, the acceptor `resume()`s it, and it is invalidated once: when the peer goes, past a
/// limit, by `invalidate()`, or when its owner releases it. Calls that the peer made before it went still arrive; after
/// `invalidate()` none does. An invalidated connection drops pushes and answers.
class Connection {
public:
    virtual ~Connection() = default;

    [[nodiscard]] virtual Peer peer() const = 0;
    /// The serial queue on which calls and the invalidation handler run.
    [[nodiscard]] virtual const std::shared_ptr<Queue>& queue() const = 0;
    /// Sets the handler of calls. Before `resume()`.
    virtual void exportObject(Handler handler) = 0;
    /// Sets what is called once, after the last call. Before `resume()`.
    virtual void setInvalidationHandler(std::move_only_function<void()> handler) = 0;
    /// Sets what is called, on any thread, with the reason why a push could not be sent. Before `resume()`.
    virtual void setPushErrorHandler(std::function<void(const std::string&)> handler) = 0;
    /// Starts reading.
    virtual void resume() = 0;
    /// Sends a signal of the interface's `listenerName`; fails through the push error handler.
    virtual void push(std::string_view signal, Message arguments) = 0;
    /// Closes the connection once what was sent before has been written.
    virtual void invalidate() = 0;
};

/// Accepts connections on a socket. Refuses peers of other users before the acceptor is called. Destroying it stops
/// accepting and removes the socket that it made; its connections stay open.
class Listener {
public:
    /// Called on the run loop's thread for each new connection, which the acceptor owns: it sets handlers and resumes
    /// it.
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
    /// The service's own listener. Takes the socket that the service manager passed, if it did; else binds
    /// `directory`/socket (directory 0700, socket 0600). Replaces a socket left by a dead process; fails if a living
    /// one serves it.
    [[nodiscard]] virtual Result<std::unique_ptr<Listener>> listen(const Interface& interface,
                                                                   const std::string& label) = 0;
    /// A listener under an unguessable name in the same directory, to be handed out by `endpoint()`. If it can't be
    /// made, logs the failure; the endpoint is empty then.
    [[nodiscard]] virtual std::unique_ptr<Listener> anonymous(const Interface& interface, const std::string& label) = 0;
};

} // namespace platform::ipc
