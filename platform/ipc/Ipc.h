#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

#include "platform/base/FileHandle.h"
#include "platform/run/Queue.h"
#include "platform/run/Reply.h"
#include "platform/values/Error.h"
#include "platform/values/Value.h"

namespace platform {
class Record;
class RecordClasses;
} // namespace platform

/// Local IPC: the D-Bus protocol, peer to peer over Unix sockets, implemented with sd-bus.
///
/// A server is a `Listener` that accepts `Connection`s. Each connection exports one object, which handles method calls,
/// and can push signals to its peer. Calls run on the connection's serial queue. sd-bus messages stay on another queue
/// of the connection; no other room sees them. A service can send file handles but accepts none: a call that carries
/// one ends its connection.
namespace platform::ipc {

/// The arguments of a call, a reply or a signal.
///
/// The D-Bus signature selects the encoding: s, x, t, u, i, b and d are values of those types, "ay" is Bytes, "a{sv}" a
/// dictionary, "aa{sv}" and "as" are arrays, "ah" is an array of indexes into `handles`. Inside "v" the value's type
/// selects it: bool b, integers x or t, double d, string s, bytes ay, arrays av, dictionaries a{sv}, dates d (seconds
/// since 1970). D-Bus has no null: null entries of dictionaries are left out, null elements of arrays become empty
/// dictionaries.
struct Message {
    std::vector<Value> args;
    std::vector<FileHandle> handles;
    /// Records in place of dictionaries, by the index of the argument, which is then null in `args`. Null, or beyond
    /// the end, for other arguments. A record doesn't change as long as the message lives.
    std::vector<std::shared_ptr<const Record>> records;

    /// Returns the record of an argument, or null.
    [[nodiscard]] const Record* record(std::size_t index) const
    {
        return index < records.size() ? records[index].get() : nullptr;
    }
};

/// Which arguments of a message are records, and of which classes.
struct RecordArguments {
    std::uint32_t which = 0; ///< bit i is set for argument i
    const RecordClasses& (*classes)() = nullptr;

    [[nodiscard]] constexpr bool has(std::size_t index) const { return index < 32 && (which >> index & 1) != 0; }
};

/// One member of an interface, with D-Bus signatures of its arguments.
struct Member {
    std::string_view name;
    std::string_view in;             ///< of the call, or of the signal
    std::string_view out;            ///< of the reply; empty for a signal
    bool noReply = false;            ///< the reply is empty; callers needn't request it
    std::string_view interface = {}; ///< to which the member belongs; if empty, `Interface::name`
    std::string_view inNames = {};   ///< names of the arguments of `in`, separated by blanks; for error texts
    std::string_view outNames = {};
    RecordArguments inRecords = {}; ///< decoded without a dictionary in between
    RecordArguments outRecords = {};
};

/// The methods of an exported object, and the signals that it pushes. Texts must outlive the transport.
struct Interface {
    std::string path;      ///< of the object: "/com/example/service"
    std::string_view name; ///< "com.example.Service"
    std::vector<Member> methods;
    std::string_view listenerName; ///< interface of the signals; may be empty
    std::vector<Member> signals;
    std::string_view introspection; ///< the XML document that Introspect returns
};

/// Limits for faulty and hostile peers. A peer beyond a limit waits, gets an error or is disconnected; other peers are
/// not affected.
///
/// Bytes count received messages, the values decoded from them, and messages that a peer has not read yet. Together the
/// limits bound the memory that all peers can make the service use. An unread file handle counts as 16 KiB.
struct Limits {
    /// Bytes of one incoming message with its header. A peer that announces a larger one is disconnected. Decoded
    /// values may take twice as much; a call beyond that gets the error LimitsExceeded.
    std::size_t messageSize = 8u << 20;
    /// Pending calls of one connection, and their bytes. Beyond either, further calls wait in the socket.
    unsigned callsInFlight = 256;
    std::size_t bytesInFlight = 16u << 20;
    /// Unread bytes of one peer. Beyond a quarter its calls wait in the socket; beyond the whole it is disconnected. A
    /// single message may be larger.
    std::size_t queuedBytes = 16u << 20;
    /// Bytes for one process, and for all. Beyond either, each connection may have one small message pending.
    std::size_t bytesPerProcess = 26u << 20;
    std::size_t bytes = 30u << 20;
    /// Unread bytes of all peers. Beyond it the connection with the most unread bytes is closed.
    std::size_t unreadBytes = 18u << 20;
    /// Bytes of replies that handlers gave and that are not encoded yet. Beyond it no handler is called.
    std::size_t unsentBytes = 8u << 20;
    /// Open connections of one process over all listeners; further ones are closed.
    unsigned connectionsPerProcess = 512;
    /// Open connections of one listener; further ones wait to be accepted until one closes.
    unsigned connections = 1024;
    /// Time for a peer to authenticate, to complete a message that it began, and to read what was sent before its
    /// connection was closed.
    Duration patience = std::chrono::seconds(30);
};

/// Why a call failed; becomes a D-Bus error reply. The connection stays open.
struct CallError {
    std::string name = "org.freedesktop.DBus.Error.InvalidArgs";
    std::string message;
};
using CallResult = std::expected<Message, CallError>;
using Responder = Reply<CallResult>;

/// Handles the calls of one connection, on its queue. `member` is valid as long as the interface.
using Handler = std::function<void(std::string_view member, Message arguments, Responder reply)>;

struct Peer {
    pid_t pid = 0;
    uid_t uid = 0;
};

/// The server's end of one connection. Any thread.
///
/// Life: a listener creates it, the acceptor calls `resume()`, and it is invalidated once: if the peer disconnects, at
/// a limit, by `invalidate()`, or when its owner releases it. Calls that the peer sent before it disconnected are still
/// delivered; after `invalidate()` none is. An invalidated connection drops pushes and replies.
class Connection {
public:
    virtual ~Connection() = default;

    [[nodiscard]] virtual Peer peer() const = 0;
    /// Returns the serial queue on which calls and the invalidation handler run.
    [[nodiscard]] virtual const std::shared_ptr<Queue>& queue() const = 0;
    /// Sets the handler of calls. Call it before `resume()`, like the next two.
    virtual void exportObject(Handler handler) = 0;
    /// Sets the handler that runs once, after the last call.
    virtual void setInvalidationHandler(std::move_only_function<void()> handler) = 0;
    /// Sets the handler that runs with the reason if a push can't be sent, on any thread.
    virtual void setPushErrorHandler(std::function<void(const std::string&)> handler) = 0;
    /// Starts reading.
    virtual void resume() = 0;
    /// Sends a signal of `Interface::listenerName`. Calls the push error handler if that fails.
    virtual void push(std::string_view signal, Message arguments) = 0;
    /// Stops delivering calls at once; closes the connection after pending output has been written.
    virtual void invalidate() = 0;
};

/// Accepts connections on a socket. Rejects peers of other users. The destructor stops accepting and removes the socket
/// that it created; connections stay open.
class Listener {
public:
    /// Runs on the run loop's thread for each new connection. Owns the connection: sets its handlers and resumes it.
    using Acceptor = std::function<void(std::shared_ptr<Connection>)>;

    virtual ~Listener() = default;
    virtual void setAcceptor(Acceptor acceptor) = 0;
    /// Starts accepting.
    virtual void resume() = 0;
    /// Returns the D-Bus address of this listener: "unix:path=…". Any thread.
    [[nodiscard]] virtual std::string endpoint() = 0;
};

/// Creates listeners. One for each process.
class Transport {
public:
    virtual ~Transport() = default;
    /// Creates the service's well-known listener: on the socket that the service manager passed, else on
    /// `directory`/socket (directory 0700, socket 0600). Replaces the socket of a dead process; fails with EADDRINUSE
    /// if a process listens on it.
    [[nodiscard]] virtual Result<std::unique_ptr<Listener>> listen(const Interface& interface,
                                                                   const std::string& label) = 0;
    /// Creates a listener with an unguessable name in the same directory; pass its `endpoint()` to the client. The
    /// endpoint is empty while its socket can't be created, which is logged; each call of `endpoint()` tries again.
    /// `interface` must outlive the listener.
    [[nodiscard]] virtual std::unique_ptr<Listener> anonymous(const Interface& interface, const std::string& label) = 0;
};

} // namespace platform::ipc
