#pragma once

#include <atomic>
#include <deque>
#include <functional>
#include <memory>
#include <set>
#include <string>
#include <unordered_map>

#include "platform/ipc/BusMessage.h"
#include "platform/ipc/Ipc.h"
#include "platform/run/Clock.h"
#include "platform/run/RunLoop.h"

struct sd_bus;

namespace platform::ipc {

class BusConnection;

/// What the parts of one transport share.
struct BusContext {
    RunLoop& loop;
    Executor& executor;
    Clock& clock;
    const Limits limits;
    std::set<std::shared_ptr<BusConnection>> connections{}; ///< those not closed yet; loop's thread
};

/// The loop's side of one server connection: an sd-bus object and what is on its way through it.
///
///     call: socket → onMessage (decode) → [_parked, past the limits] → dispatch → queue: handler
///     answer: any thread → loop: answer (encode) → sd-bus → [its write queue] → socket
///
/// Waiting until `start`; Open; Draining after a local end while queued output is still being written; Closed. The
/// context keeps it alive until Closed. Everything but `handle` and `silence` belongs to the loop's thread.
class BusConnection final : public std::enable_shared_from_this<BusConnection> {
public:
    /// Takes over a connected socket. `closed` is called once, on the loop.
    static std::shared_ptr<BusConnection> make(std::shared_ptr<BusContext> context,
                                               std::shared_ptr<const Interface> interface, FileHandle socket, Peer peer,
                                               std::shared_ptr<Queue> queue, std::function<void()> closed);
    ~BusConnection();

    /// The connection as its acceptor sees it; letting go of it ends the connection. Called once.
    [[nodiscard]] std::shared_ptr<Connection> handle();
    /// Closes at once, dropping what was not written; for the transport's own end.
    void abandon();

private:
    class Handle;
    struct BusUnref {
        void operator()(sd_bus* bus) const;
    };
    enum class State { Waiting, Open, Draining, Closed };
    /// A decoded call.
    struct Call {
        const Member* member;
        Message arguments;
        std::size_t size;
        BusMessage message;
    };
    /// A call that the handler has.
    struct PendingCall {
        const Member* member;
        std::size_t size;
        BusMessage message;
    };

    BusConnection(std::shared_ptr<BusContext> context, std::shared_ptr<const Interface> interface, FileHandle socket,
                  Peer peer, std::shared_ptr<Queue> queue, std::function<void()> closed);

    // the owner's wishes, each a job on the loop
    void start();
    void push(std::string_view signal, const Message& arguments);
    void pushFailed(const std::string& reason) const;
    void invalidate();

    // reading
    [[nodiscard]] bool paused() const;
    void ready(std::uint32_t events);
    void drive(bool writable);
    void driveAgainLater();
    [[nodiscard]] bool hasQueuedRead() const;
    int onMessage(sd_bus_message* message);
    void receive(sd_bus_message* message, const Member& member);
    void dispatch(Call call);
    void dispatchParked();

    // writing
    void answer(std::uint64_t id, CallResult result);
    void forget(std::uint64_t id);
    [[nodiscard]] BusMessage encodeAnswer(const PendingCall& call, CallResult result, std::size_t& size) const;
    void send(sd_bus_message* message, std::size_t size);
    void settleWriteQueue(std::size_t sizeOfNewest);
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
    FileHandle _socket; // until sd-bus has it
    int _fd = -1;
    std::unique_ptr<sd_bus, BusUnref> _bus;
    std::unique_ptr<RunLoop::Watch> _watch;
    std::uint32_t _watchedEvents = 0;
    bool _peerGone = false;
    bool _driveQueued = false;
    /// Past the authentication, whose reading may run into the messages behind it, sd-bus reads message by message:
    /// what it hasn't taken is in the socket, whose event tells of it.
    bool _readsExactly = false;
    Clock::TimerId _timer = 0;

    std::unordered_map<std::uint64_t, PendingCall> _calls;
    std::uint64_t _lastCall = 0;
    std::size_t _bytesInFlight = 0;
    std::deque<Call> _parked; // decoded while the limits were reached
    std::size_t _parkedBytes = 0;
    std::deque<std::size_t> _unwritten; // sizes of the messages in sd-bus's write queue
    std::size_t _unwrittenBytes = 0;
};

} // namespace platform::ipc
