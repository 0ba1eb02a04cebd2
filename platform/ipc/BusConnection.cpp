#include "platform/ipc/BusConnection.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <malloc.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <fmt/format.h>
#include <systemd/sd-bus.h>

#include "platform/ipc/BusStandardCalls.h"
#include "platform/ipc/IpcLog.h"

namespace platform::ipc {

namespace {

/// Steps in one go, before other connections have their turn. A message takes one or two.
constexpr unsigned kStepsPerTurn = 64;

/// Bytes that the kernel keeps for a peer that doesn't read; it counts them twice. A usual reply, of 60 KB, fits.
constexpr int kSocketBuffer = 128 << 10;

/// Estimated bytes of a message beside its text: sd-bus's record of it, the pending call and the queued task.
constexpr std::size_t kMessageOverhead = 1536;

/// A message of at most this size is accepted even at the limits, so that every connection can have one pending call.
constexpr std::size_t kSmallMessage = 4u << 10;

/// How many times its size the decoded arguments of a message may take.
constexpr std::size_t kDecodedShare = 2;

bool isDisconnect(int result)
{
    return result == -ECONNRESET || result == -EPIPE || result == -ENOTCONN || result == -ESHUTDOWN ||
           result == -ESTALE;
}

/// Returns why sd-bus failed, for `end`; empty if the peer disconnected.
std::string_view describe(int result)
{
    return isDisconnect(result) ? std::string_view() : std::strerror(-result);
}

} // namespace

/// The owner's end: posts every operation to the lane.
class BusConnection::Handle final : public Connection {
public:
    explicit Handle(std::shared_ptr<BusConnection> core) : _core(std::move(core)) {}
    ~Handle() override { invalidate(); }

    [[nodiscard]] Peer peer() const override { return _core->_peer; }
    [[nodiscard]] const std::shared_ptr<Queue>& queue() const override { return _core->_queue; }
    void exportObject(Handler handler) override
    {
        _core->_handler = std::make_shared<const Handler>(std::move(handler));
    }
    void setInvalidationHandler(std::move_only_function<void()> handler) override
    {
        _core->_invalidationHandler = std::move(handler);
    }
    void setPushErrorHandler(std::function<void(const std::string&)> handler) override
    {
        _core->_pushErrorHandler = std::move(handler);
    }
    void resume() override
    {
        _core->_lane->async([core = _core] { core->start(); });
    }
    void push(std::string_view signal, Message arguments) override
    {
        _core->_lane->async(
            [core = _core, name = std::string(signal), message = std::move(arguments)] { core->push(name, message); });
    }
    void invalidate() override
    {
        _core->_silenced = true;
        _core->_lane->async([core = _core] { core->invalidate(); });
    }

private:
    const std::shared_ptr<BusConnection> _core;
};

std::shared_ptr<BusConnection> BusConnection::make(std::shared_ptr<BusContext> context,
                                                   std::shared_ptr<const Interface> interface, FileHandle socket,
                                                   Peer peer, const std::string& label, std::function<void()> closed)
{
    std::shared_ptr<BusConnection> connection(
        new BusConnection(std::move(context), std::move(interface), std::move(socket), peer, label, std::move(closed)));
    connection->_context->insert(connection);
    return connection;
}

BusConnection::BusConnection(std::shared_ptr<BusContext> context, std::shared_ptr<const Interface> interface,
                             FileHandle socket, Peer peer, const std::string& label, std::function<void()> closed)
    : _context(std::move(context)), _interface(std::move(interface)), _peer(peer),
      _queue(Queue::make(label, Queue::Kind::Serial, _context->pool, _context->clock, Rank::Root)),
      // Of high priority: a reply is written before the work that its call left behind.
      _lane(Queue::make(label + ".transport", Queue::Kind::Serial, _context->pool, _context->clock, Rank::Root,
                        Priority::High)),
      _closed(std::move(closed)), _socket(std::move(socket))
{}

BusConnection::~BusConnection() = default;

std::shared_ptr<Connection> BusConnection::handle()
{
    return std::make_shared<Handle>(shared_from_this());
}

// MARK: - the owner's operations

void BusConnection::start()
{
    if (_state != State::Waiting) return;
    _state = State::Open;

    _fd = _socket.fd();
    _input.emplace(_fd);
    if (const int result = openBus(std::move(_socket)); result < 0) return end(describe(result));
    setsockopt(_fd, SOL_SOCKET, SO_SNDBUF, &kSocketBuffer, sizeof(kSocketBuffer)); // sd-bus takes 8 MiB where it may

    startTimer();
    _source = _context->pool.watch(_fd, _lane, [weak = weak_from_this()](std::uint32_t events) {
        if (auto self = weak.lock()) self->ready(events);
    });
    drive(true);
    updateEvents();
}

/// Creates the sd-bus object, which writes to `output` and reads a pipe. Returns a negative errno if it fails.
int BusConnection::openBus(FileHandle output)
{
    sd_bus* bus = nullptr;
    sd_id128_t serverId;
    int result = sd_bus_new(&bus);
    if (result < 0) return result;
    _bus.reset(bus);
    result = sd_id128_randomize(&serverId);
    if (result >= 0) result = sd_bus_set_server(bus, true, serverId);
    if (result >= 0) result = sd_bus_negotiate_fds(bus, true);
    if (result >= 0)
        result = sd_bus_add_filter(
            bus, nullptr,
            [](sd_bus_message* message, void* self, sd_bus_error*) {
                return static_cast<BusConnection*>(self)->onMessage(message);
            },
            this);
    if (result < 0) return result;

    // sd-bus sends file handles only if both of its ends are sockets when it starts. A pipe costs less to pass through.
    int pair[2], ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, pair) != 0) return -errno;
    FileHandle input(pair[0]);
    const FileHandle other(pair[1]);
    if (pipe2(ends, O_CLOEXEC | O_NONBLOCK) != 0) return -errno;
    const FileHandle readEnd(ends[0]);
    _input->setPipe(FileHandle(ends[1]));
    result = sd_bus_set_fd(bus, input.fd(), output.fd());
    if (result < 0) return result;
    const int inputFd = input.release();
    (void)output.release();
    result = sd_bus_start(bus);
    if (result < 0) return result;
    return dup3(readEnd.fd(), inputFd, O_CLOEXEC) < 0 ? -errno : 0;
}

/// After a failed write sd-bus reads nothing more. Replaces it by another, which reads the rest of what the peer sent
/// and writes nothing. Returns false if that fails.
bool BusConnection::readOn()
{
    if (_state != State::Open || _failedBus || !_authenticated || _messageDue) return false;
    _peerGone = true;
    _input->wake(true);
    _fed = false;
    _failedBus = std::move(_bus);
    FileHandle nowhere(open("/dev/null", O_WRONLY | O_CLOEXEC));
    if (!nowhere || openBus(std::move(nowhere)) < 0 || !_input->passOwnLines()) return false;
    while (sd_bus_is_ready(_bus.get()) <= 0)
        if (sd_bus_process(_bus.get(), nullptr) <= 0) return false;
    return true;
}

void BusConnection::push(std::string_view signal, const Message& arguments)
{
    if (_state != State::Open) return pushFailed("the connection has ended");
    auto member = std::ranges::find(_interface->signals, signal, &Member::name);
    if (member == _interface->signals.end())
        return pushFailed(fmt::format("{} has no signal {}", _interface->listenerName, signal));

    sd_bus_message* message = nullptr;
    const std::string listener(_interface->listenerName);
    const std::string name(signal);
    if (sd_bus_message_new_signal(_bus.get(), &message, _interface->path.c_str(), listener.c_str(), name.c_str()) < 0)
        return pushFailed(fmt::format("{} can't be created", signal));
    const BusMessage owned(message);
    auto size = encodeArguments(message, member->in, arguments);
    if (!size) return pushFailed(fmt::format("{} can't be sent: {}", signal, size.error()));
    send(message, *size);
    updateEvents();
}

void BusConnection::pushFailed(const std::string& reason) const
{
    if (_pushErrorHandler) _pushErrorHandler(reason);
}

void BusConnection::invalidate()
{
    if (_state == State::Waiting) return close();
    if (_state != State::Open) return;
    _state = State::Draining;
    announceEnd();
    dropCalls();
    if (_unwritten.empty() || _peerGone) return close();
    startTimer();
    updateEvents();
}

// MARK: - reading

bool BusConnection::paused() const
{
    if (_state != State::Open) return true;
    const Limits& limits = _context->limits;
    const bool deaf = !_peerGone && _unwrittenBytes >= limits.queuedBytes / 4;
    return _heldBack || deaf || _calls.size() >= limits.callsInFlight || _bytesInFlight >= limits.bytesInFlight ||
           (!_calls.empty() && _context->full(_peer.pid));
}

void BusConnection::ready(std::uint32_t events)
{
    if (_state == State::Closed) return;
    if ((events & (EPOLLHUP | EPOLLERR)) != 0) {
        if (_state == State::Draining) return close();
        _peerGone = true;
    }
    _input->wake(_peerGone);
    drive((events & EPOLLOUT) != 0);
}

void BusConnection::drive(bool writable)
{
    _heldBack = false;
    for (unsigned step = 0; step < kStepsPerTurn; ++step) {
        if (_state == State::Closed) return;
        // Before sd-bus closes the watched descriptor.
        if (sd_bus_is_open(_bus.get()) <= 0 && !readOn()) return end({});
        if (!std::exchange(writable, false) && !_fed) {
            if (!feed()) return;
            continue;
        }

        const int result = sd_bus_process(_bus.get(), nullptr);
        if (_state == State::Closed) return;
        if (result < 0) return end(describe(result));
        settleWriteQueue(kMessageOverhead);
        if (_state == State::Draining && _unwritten.empty()) return close();
        if (result > 0) {
            if (_authenticated && !_messageDue) _fed = false; // saves sd-bus a read that returns nothing
            continue;
        }
        _fed = false;
        if (_messageDue && _input->betweenMessages()) return end("it sent an invalid message");
        if (!_authenticated && sd_bus_is_ready(_bus.get()) > 0) {
            _authenticated = true;
            cancelTimer();
        }
    }
    driveAgain();
}

/// Passes more of the peer's input to sd-bus. Returns false if nothing can be passed now, or if the connection ended.
bool BusConnection::feed()
{
    const bool mayPass = !_authenticated || !_input->betweenMessages() || announceMessage();
    if (!mayPass || _state == State::Closed) return false;
    switch (_authenticated ? _input->pass() : _input->passLine()) {
    case BusInput::Outcome::Passed:
        _fed = true;
        _messageDue = _authenticated;
        return true;
    case BusInput::Outcome::Empty: waitForMore(); return false;
    case BusInput::Outcome::Ended: end({}); return false;
    case BusInput::Outcome::Malformed: end("it sent no D-Bus authentication"); return false;
    }
    return false;
}

/// Reads the next message's header and reserves its bytes. Returns false if it must wait, or has not arrived.
bool BusConnection::announceMessage()
{
    if (paused()) {
        if (_state == State::Open) cancelTimer();
        if (_peerGone) catchUp();
        updateEvents();
        return false;
    }
    switch (_input->look()) {
    case BusInput::Outcome::Passed: break;
    case BusInput::Outcome::Empty: waitForMore(); return false;
    case BusInput::Outcome::Ended: end({}); return false;
    case BusInput::Outcome::Malformed: end("it sent an invalid message"); return false;
    }
    const std::size_t size = _input->announced();
    if (size > _context->limits.messageSize) {
        end(fmt::format("it announced a message of {} bytes", size));
        return false;
    }
    const std::size_t cost = size * (1 + kDecodedShare);
    if (size <= kSmallMessage) {
        hold(_receiving, cost);
    } else if (_context->reserve(_peer.pid, cost)) {
        _receiving = cost;
    } else {
        _heldBack = true;
        if (_peerGone) catchUp();
        updateEvents();
        return false;
    }
    return true;
}

/// Forgets the pending calls of a peer that has gone when their handlers have been called, and reads on: nobody waits
/// for the replies.
void BusConnection::catchUp()
{
    if (_calls.empty() || std::exchange(_catchingUp, true)) return;
    _queue->async([self = shared_from_this()] {
        self->_lane->async([self] {
            self->_catchingUp = false;
            self->dropCalls();
            self->drive(false);
        });
    });
}

void BusConnection::waitForMore()
{
    if (_authenticated && _state == State::Open && _input->begun() && _timer == 0) startTimer();
    updateEvents();
}

void BusConnection::hold(std::size_t& part, std::size_t bytes)
{
    _context->hold(_peer.pid, part, bytes);
    part = bytes;
}

void BusConnection::driveAgain()
{
    if (_driveQueued.exchange(true)) return;
    _lane->async([self = shared_from_this()] {
        self->_driveQueued = false;
        if (self->_state == State::Open || self->_state == State::Draining) self->drive(false);
    });
}

int BusConnection::onMessage(sd_bus_message* message)
{
    constexpr int kTaken = 1;
    _messageDue = false;
    if (_state != State::Open) return kTaken;
    cancelTimer();
    takeMessage(message);
    hold(_receiving, 0);
    return kTaken;
}

void BusConnection::takeMessage(sd_bus_message* message)
{
    std::uint8_t type = 0;
    sd_bus_message_get_type(message, &type);
    if (type != SD_BUS_MESSAGE_METHOD_CALL) return;

    const char* path = sd_bus_message_get_path(message);
    const char* interface = sd_bus_message_get_interface(message);
    const char* name = sd_bus_message_get_member(message);
    if (BusMessage standard = answerStandardCall(message, *_interface))
        return send(standard.get(), _interface->introspection.size());

    CallError error;
    if (path != _interface->path || !_handler) {
        error = {SD_BUS_ERROR_UNKNOWN_OBJECT,
                 fmt::format("there is no object {}; calls go to {}", path, _interface->path)};
    } else {
        bool knownInterface = !interface;
        for (const Member& member : _interface->methods) {
            const std::string_view home = member.interface.empty() ? _interface->name : member.interface;
            if (interface && home != interface) continue;
            knownInterface = true;
            if (member.name == name) return receive(message, member);
        }
        error = knownInterface
                    ? CallError{SD_BUS_ERROR_UNKNOWN_METHOD, fmt::format("there is no method {}", name)}
                    : CallError{SD_BUS_ERROR_UNKNOWN_INTERFACE, fmt::format("there is no interface {}", interface)};
    }
    send(makeErrorAnswer(message, error).get(), error.message.size());
}

void BusConnection::receive(sd_bus_message* message, const Member& member)
{
    std::expected<DecodedArguments, CallError> decoded;
    const char* signature = sd_bus_message_get_signature(message, true);
    if (signature && member.in == signature)
        decoded = decodeArguments(message, _context->limits.messageSize * kDecodedShare, member.inRecords);
    else
        decoded = std::unexpected(CallError{
            .message = fmt::format("{} takes \"{}\", not \"{}\"", member.name, member.in, signature ? signature : "")});
    if (!decoded) {
        kLog.info("call {} of process {} refused: {}", member.name, _peer.pid, decoded.error().message);
        return send(makeErrorAnswer(message, decoded.error()).get(), decoded.error().message.size());
    }
    // The message is kept, with its body, until the reply.
    const std::size_t size = _receiving / (1 + kDecodedShare) + decoded->size + kMessageOverhead;
    const std::uint64_t id = ++_lastCall;
    hold(_bytesInFlight, _bytesInFlight + size);
    _calls.emplace(id, PendingCall{&member, size, BusMessage(sd_bus_message_ref(message))});

    _queue->async([self = shared_from_this(), handler = _handler, id, name = member.name,
                   arguments = std::move(decoded->message)]() mutable {
        ReplyBacklog& backlog = self->_context->backlog;
        backlog.runWithRoom([self, handler = std::move(handler), id, name, arguments = std::move(arguments)]() mutable {
            self->callHandler(*handler, name, std::move(arguments), id);
        });
    });
}

/// Calls the handler, on the queue. Creates the responder: a call that is never handled owes no reply.
void BusConnection::callHandler(const Handler& handler, std::string_view member, Message arguments, std::uint64_t id)
{
    if (_silenced) return;
    Responder responder(
        [self = shared_from_this(), id](CallResult result) {
            const std::size_t size = result ? memoryOf(*result) : result.error().message.size();
            self->_context->backlog.add(size);
            self->_lane->async([self, id, size, result = std::move(result)]() mutable {
                self->answer(id, std::move(result), size);
                self->_context->backlog.remove(size);
            });
        },
        [self = shared_from_this(), id] { self->_lane->async([self, id] { self->forget(id); }); });
    handler(member, std::move(arguments), std::move(responder));
}

// MARK: - writing

void BusConnection::answer(std::uint64_t id, CallResult result, std::size_t size)
{
    const auto call = _calls.find(id);
    if (call == _calls.end()) return;
    if (sd_bus_message_get_expect_reply(call->second.message.get()) > 0)
        send(encodeAnswer(call->second, std::move(result)).get(), size);
    forget(id);
}

void BusConnection::forget(std::uint64_t id)
{
    const auto call = _calls.find(id);
    if (call == _calls.end()) return;
    const bool wasPaused = paused();
    hold(_bytesInFlight, _bytesInFlight - call->second.size);
    _calls.erase(call);
    if (wasPaused && !paused())
        drive(false);
    else
        updateEvents();
}

void BusConnection::dropCalls()
{
    _calls.clear();
    hold(_bytesInFlight, 0);
}

BusMessage BusConnection::encodeAnswer(const PendingCall& call, CallResult result) const
{
    if (result) {
        sd_bus_message* answer = nullptr;
        if (sd_bus_message_new_method_return(call.message.get(), &answer) < 0) return {};
        BusMessage owned(answer);
        const auto encoded = encodeArguments(answer, call.member->out, *result);
        if (encoded) return owned;
        kLog.fault("the reply to {} can't be sent: {}", call.member->name, encoded.error());
        result = std::unexpected(CallError{SD_BUS_ERROR_FAILED, "the reply can't be sent: " + encoded.error()});
    }
    return makeErrorAnswer(call.message.get(), result.error());
}

/// Sends a message, which is null if it could not be created. The peer must not wait for ever for a reply that is lost,
/// so a failure ends the connection.
void BusConnection::send(sd_bus_message* message, std::size_t size)
{
    if (_state != State::Open || _peerGone) return;
    if (_messageDue && peerHasGone()) return; // if the write failed, the part that sd-bus has read would be lost
    if (!message || sd_bus_message_set_sender(message, kOwnName) < 0 ||
        (!sd_bus_message_get_destination(message) && sd_bus_message_set_destination(message, kPeerName) < 0))
        return end("out of memory");
    const int result = sd_bus_send(_bus.get(), message, nullptr);
    if (result < 0) return isDisconnect(result) ? driveAgain() : end(describe(result));
    settleWriteQueue(size + kMessageOverhead);
    if (_unwritten.size() > 1 && _unwrittenBytes > _context->limits.queuedBytes) endUnread("it doesn't read");
}

/// Updates the count of unwritten bytes from sd-bus's write queue. Each new message there counts as `sizeOfNewest`.
void BusConnection::settleWriteQueue(std::size_t sizeOfNewest)
{
    if (_failedBus) return; // it keeps them
    std::uint64_t queued = 0;
    if (sd_bus_get_n_queued_write(_bus.get(), &queued) < 0) queued = 0;
    std::size_t bytes = _unwrittenBytes;
    for (; _unwritten.size() > queued; _unwritten.pop_front()) bytes -= _unwritten.front();
    for (; _unwritten.size() < queued; bytes += sizeOfNewest) _unwritten.push_back(sizeOfNewest);
    setUnwritten(bytes);
}

void BusConnection::setUnwritten(std::size_t bytes)
{
    if (bytes == _unwrittenBytes) return;
    _context->setUnread(*this, bytes);
    hold(_unwrittenBytes, bytes);
}

bool BusConnection::peerHasGone()
{
    pollfd state{_fd, 0, 0};
    if (!_peerGone && poll(&state, 1, 0) > 0 && (state.revents & (POLLHUP | POLLERR)) != 0) {
        _peerGone = true;
        _input->wake(true);
        driveAgain();
    }
    return _peerGone;
}

void BusConnection::updateEvents()
{
    if (!_source || _state == State::Closed) return;
    const int wanted = sd_bus_get_events(_bus.get());
    if (wanted < 0) return driveAgain();
    // Reports a disconnect even while reading is paused.
    std::uint32_t events = static_cast<std::uint32_t>(wanted) | EPOLLHUP | EPOLLET;
    const bool reads = !_authenticated || !_input->betweenMessages() || !paused();
    if (reads)
        events |= EPOLLIN;
    else
        events &= ~static_cast<std::uint32_t>(EPOLLIN);
    if (_peerGone && !reads) events = 0; // the disconnect is known
    if (events != std::exchange(_watchedEvents, events)) _source->setEvents(events);
}

// MARK: - ending

void BusConnection::startTimer()
{
    cancelTimer();
    _timer = _context->clock.after(_context->limits.patience, [weak = weak_from_this(), number = ++_lastTimer] {
        const auto connection = weak.lock();
        if (!connection) return;
        connection->_lane->async([self = connection, number] {
            if (number != self->_lastTimer || std::exchange(self->_timer, 0) == 0) return; // cancelled meanwhile
            self->end("it took too long");
        });
    });
}

void BusConnection::cancelTimer()
{
    if (_timer != 0) _context->clock.cancel(std::exchange(_timer, 0));
}

void BusConnection::announceEnd()
{
    _handler.reset();
    if (_invalidationHandler) _queue->async(std::exchange(_invalidationHandler, {}));
}

/// Ends the connection. Logs `reason`, which is empty if the peer disconnected.
void BusConnection::end(std::string_view reason)
{
    if (_state == State::Closed) return;
    if (!reason.empty()) kLog.error("connection of process {} dropped: {}", _peer.pid, reason);
    close();
}

/// Ends the connection of a peer that reads no replies. Its calls that wait for the handler are dropped, because they
/// would make more of them.
void BusConnection::endUnread(std::string_view reason)
{
    _silenced = true;
    end(reason);
}

void BusConnection::close()
{
    if (std::exchange(_state, State::Closed) == State::Closed) return;
    cancelTimer();
    announceEnd();
    dropCalls();
    hold(_receiving, 0);
    setUnwritten(0);
    _source.reset();
    // Posted: sd-bus's objects must not be destroyed inside their own callbacks.
    _lane->async([self = shared_from_this()] { self->dispose(); });
}

void BusConnection::dispose()
{
    _bus.reset();
    _failedBus.reset();
    _input.reset();
    _socket = FileHandle();
    _context->release(_peer.pid);
    _context->erase(*this);
    if (_closed) std::exchange(_closed, {})();
}

void BusConnection::abandon()
{
    _lane->async([self = shared_from_this()] { self->close(); });
}

void BusConnection::drop()
{
    _lane->async([self = shared_from_this()] {
        self->endUnread("it doesn't read, and memory is short");
        self->_lane->async([self] { malloc_trim(0); }); // after dispose: the heaps of the workers keep freed memory
    });
}

} // namespace platform::ipc
