#pragma once

#include <atomic>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <unordered_map>

#include "platform/ipc/BusInput.h"
#include "platform/ipc/BusMessage.h"
#include "platform/ipc/Ipc.h"
#include "platform/run/Clock.h"
#include "platform/run/RunLoop.h"

struct sd_bus;

namespace platform::ipc {

class BusConnection;

/// What the parts of one transport share, and the account of what peers make it hold. Loop's thread.
struct BusContext {
    struct Process {
        unsigned connections = 0;
        std::size_t bytes = 0;
        bool refused = false; ///< one was refused since the last one closed
    };

    /// A part of what `process` makes the transport hold was `before` bytes, and is `now`.
    void hold(pid_t process, std::size_t before, std::size_t now);
    /// Whether so much is held, by all or by `process`, that its further calls have to wait.
    [[nodiscard]] bool full(pid_t process);
    /// Whether there is room for as much more of `process`. Who is told no is driven again once there is more room.
    [[nodiscard]] bool admits(pid_t process, std::size_t bytes);

    RunLoop& loop;
    Executor& executor;
    Clock& clock;
    const Limits limits;
    std::set<std::shared_ptr<BusConnection>> connections{}; ///< those not closed yet
    std::map<pid_t, Process> processes{};                   ///< those with connections
    std::size_t held = 0;                                   ///< by all processes
    std::size_t unread = 0;                                 ///< of `held`: what waits to be read by peers
    bool starved = false;                                   ///< somebody waits for room
};

/// The loop's side of one server connection: an sd-bus object and what is on its way through it.
///
///     call: socket → BusInput (limits) → sd-bus → onMessage (decode) → queue: handler
///     answer: any thread → loop: answer (encode) → sd-bus → [its write queue] → socket
///
/// Waiting until `start`; Open; Draining after a local end while queued output is still being written; Closed. The
/// context keeps it alive until Closed. Everything but `handle` belongs to the loop's thread.
class BusConnection final : public std::enable_shared_from_this<BusConnection> {
public:
    /// Takes over a connected socket. `closed` is called once, on the loop.
    static std::shared_ptr<BusConnection> make(std::shared_ptr<BusContext> context,
                                               std::shared_ptr<const Interface> interface, FileHandle socket, Peer peer,
                                               std::shared_ptr<Queue> queue, std::function<void()> closed);
    ~BusConnection();

    /// The connection for its acceptor, whose release ends the connection. Called once.
    [[nodiscard]] std::shared_ptr<Connection> handle();
    /// Closes at once, dropping what was not written; for the transport's own end.
    void abandon();
    /// Goes on with what was held back.
    void driveAgainLater();

private:
    class Handle;
    struct BusUnref {
        void operator()(sd_bus* bus) const;
    };
    enum class State { Waiting, Open, Draining, Closed };
    /// A call that the handler hasn't answered yet.
    struct PendingCall {
        const Member* member;
        std::size_t size;
        BusMessage message;
    };

    BusConnection(std::shared_ptr<BusContext> context, std::shared_ptr<const Interface> interface, FileHandle socket,
                  Peer peer, std::shared_ptr<Queue> queue, std::function<void()> closed);

    // the owner's operations, each a job on the loop
    void start();
    void push(std::string_view signal, const Message& arguments);
    void pushFailed(const std::string& reason) const;
    void invalidate();

    // reading
    [[nodiscard]] bool paused() const;
    void ready(std::uint32_t events);
    void drive(bool writable);
    [[nodiscard]] bool feed();
    [[nodiscard]] bool announceMessage();
    void waitForMore();
    int onMessage(sd_bus_message* message);
    void takeMessage(sd_bus_message* message);
    void receive(sd_bus_message* message, const Member& member);
    void hold(std::size_t& part, std::size_t bytes);

    // writing
    void answer(std::uint64_t id, CallResult result);
    void forget(std::uint64_t id);
    void dropCalls();
    [[nodiscard]] BusMessage encodeAnswer(const PendingCall& call, CallResult result, std::size_t& size) const;
    void send(sd_bus_message* message, std::size_t size);
    void settleWriteQueue(std::size_t sizeOfNewest);
    void setUnwritten(std::size_t bytes);
    void relieve();
    [[nodiscard]] bool peerHasGone();
    void updateWatch();

    // ending
    void end(std::string_view reason);
    void close();
    void dispose();
    void startTimer();
    void cancelTimer();
    void announceEnd();

    const std::shared_ptr<BusContext> _context;
    const std::shared_ptr<const Interface> _interface;
    const Peer _peer;
    const std::shared_ptr<Queue> _queue;
    std::function<void()> _closed;

    // Set by the owner before `start`.
    std::shared_ptr<const Handler> _handler;
    std::move_only_function<void()> _invalidationHandler;
    std::function<void(const std::string&)> _pushErrorHandler;
    std::atomic<bool> _silenced = false; // no call is to reach the handler any more

    State _state = State::Waiting;
    FileHandle _socket;             // until sd-bus has it
    int _fd = -1;                   // of the peer's socket, which sd-bus writes to and owns
    std::optional<BusInput> _input; // from `start`
    std::unique_ptr<sd_bus, BusUnref> _bus;
    std::unique_ptr<RunLoop::Watch> _watch;
    std::uint32_t _watchedEvents = 0;
    bool _peerGone = false;
    bool _driveQueued = false;
    bool _authenticated = false;
    bool _fed = false;        // sd-bus hasn't said yet that it has read all that it was given
    bool _messageDue = false; // sd-bus was given some of a message, and hasn't handed it out
    bool _heldBack = false;   // the next message waits for room
    Clock::TimerId _timer = 0;

    std::unordered_map<std::uint64_t, PendingCall> _calls;
    std::uint64_t _lastCall = 0;
    std::size_t _receiving = 0; // what the message under way may cost
    std::size_t _bytesInFlight = 0;
    std::deque<std::size_t> _unwritten; // sizes of the messages in sd-bus's write queue
    std::size_t _unwrittenBytes = 0;
};

} // namespace platform::ipc
