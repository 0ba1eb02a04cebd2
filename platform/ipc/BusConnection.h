#pragma once

#include <atomic>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>

#include "platform/ipc/BusContext.h"
#include "platform/ipc/BusInput.h"
#include "platform/ipc/BusMessage.h"
#include "platform/ipc/Ipc.h"
#include "platform/run/Clock.h"
#include "platform/run/WorkerPool.h"

struct sd_bus;

namespace platform::ipc {

/// One server connection: an sd-bus object, its pending calls and its unwritten output.
///
///     call: socket → BusInput (limits) → sd-bus → onMessage (decode) → queue: handler
///     answer: any thread → lane: answer (encode) → sd-bus → [its write queue] → socket
///
/// A serial queue of its own, the lane, guards the sd-bus object and everything else here. The socket is a source on
/// it, so that the worker that a call wakes also runs the handler and writes the reply, while both queues are idle. The
/// lane goes on while the connection's queue is suspended.
///
/// States: Waiting until `start`; Open; Draining after `invalidate` until queued output is written; Closed. The context
/// owns the connection until Closed. Confined to the lane, except for `make`, `handle`, `abandon`, `driveAgain`,
/// `drop` and `callHandler`.
class BusConnection final : public std::enable_shared_from_this<BusConnection> {
public:
    /// Takes ownership of a connected socket. `label` becomes the label of the connection's queue. `closed` runs once,
    /// on the lane.
    static std::shared_ptr<BusConnection> make(std::shared_ptr<BusContext> context,
                                               std::shared_ptr<const Interface> interface, FileHandle socket, Peer peer,
                                               const std::string& label, std::function<void()> closed);
    ~BusConnection();

    /// Returns the connection for its acceptor; releasing it ends the connection. Call it once.
    [[nodiscard]] std::shared_ptr<Connection> handle();
    /// Closes soon and drops unwritten output; for the destructor of the transport.
    void abandon();
    /// Reads input that was held back, soon.
    void driveAgain();
    /// Ends the connection soon, because all connections together have too many unread bytes.
    void drop();

private:
    class Handle;
    enum class State { Waiting, Open, Draining, Closed };
    /// A call without a reply yet.
    struct PendingCall {
        const Member* member;
        std::size_t size;
        BusMessage message;
    };

    BusConnection(std::shared_ptr<BusContext> context, std::shared_ptr<const Interface> interface, FileHandle socket,
                  Peer peer, const std::string& label, std::function<void()> closed);

    // the owner's operations
    void start();
    [[nodiscard]] int openBus(FileHandle output);
    [[nodiscard]] bool readOn();
    void push(std::string_view signal, const Message& arguments);
    void pushFailed(const std::string& reason) const;
    void invalidate();

    // reading
    [[nodiscard]] bool paused() const;
    void ready(std::uint32_t events);
    void drive(bool writable);
    [[nodiscard]] bool feed();
    [[nodiscard]] bool announceMessage();
    void catchUp();
    void waitForMore();
    int onMessage(sd_bus_message* message);
    void takeMessage(sd_bus_message* message);
    void receive(sd_bus_message* message, const Member& member);
    void callHandler(const Handler& handler, std::string_view member, Message arguments, std::uint64_t id);
    void hold(std::size_t& part, std::size_t bytes);

    // writing
    void answer(std::uint64_t id, CallResult result, std::size_t size);
    void forget(std::uint64_t id);
    void dropCalls();
    [[nodiscard]] BusMessage encodeAnswer(const PendingCall& call, CallResult result) const;
    void send(sd_bus_message* message, std::size_t size);
    void settleWriteQueue(std::size_t sizeOfNewest);
    void setUnwritten(std::size_t bytes);
    [[nodiscard]] bool peerHasGone();
    void updateEvents();

    // ending
    void end(std::string_view reason);
    void endUnread(std::string_view reason);
    void close();
    void dispose();
    void startTimer();
    void cancelTimer();
    void announceEnd();

    const std::shared_ptr<BusContext> _context;
    const std::shared_ptr<const Interface> _interface;
    const Peer _peer;
    const std::shared_ptr<Queue> _queue;
    const std::shared_ptr<Queue> _lane;
    std::function<void()> _closed;

    // Set by the owner before `start`.
    std::shared_ptr<const Handler> _handler;
    std::move_only_function<void()> _invalidationHandler;
    std::function<void(const std::string&)> _pushErrorHandler;
    std::atomic<bool> _silenced = false; // the handler gets no more calls

    State _state = State::Waiting;
    FileHandle _socket;             // until sd-bus owns it
    int _fd = -1;                   // the peer's socket, which sd-bus writes to and owns
    std::optional<BusInput> _input; // from `start`
    std::unique_ptr<sd_bus, BusUnref> _bus;
    std::unique_ptr<sd_bus, BusUnref> _failedBus; // the one that owns the socket, after a write failed
    std::unique_ptr<WorkerPool::Source> _source;
    std::uint32_t _watchedEvents = 0;
    bool _peerGone = false;
    bool _catchingUp = false;
    std::atomic<bool> _driveQueued = false;
    bool _authenticated = false;
    bool _fed = false;        // sd-bus may have unread input
    bool _messageDue = false; // sd-bus has part of a message and has not delivered it
    bool _heldBack = false;   // the next message waits until bytes are freed
    Clock::TimerId _timer = 0;
    std::uint64_t _lastTimer = 0; // number of the timer that was started last

    std::unordered_map<std::uint64_t, PendingCall> _calls;
    std::uint64_t _lastCall = 0;
    std::size_t _receiving = 0; // bytes reserved for the current message
    std::size_t _bytesInFlight = 0;
    std::deque<std::size_t> _unwritten; // sizes of the messages in sd-bus's write queue
    std::size_t _unwrittenBytes = 0;
};

} // namespace platform::ipc
