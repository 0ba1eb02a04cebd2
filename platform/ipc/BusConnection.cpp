#include "platform/ipc/BusConnection.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <poll.h>
#include <sys/epoll.h>

#include <fmt/format.h>
#include <systemd/sd-bus.h>

#include "platform/base/Log.h"
#include "platform/ipc/BusStandardCalls.h"

namespace platform::ipc {

namespace {

const Log kLog("platform", "ipc");

/// Messages taken from one connection before the others, and the loop's jobs, have their turn.
constexpr unsigned kMessagesPerTurn = 32;

/// What a message costs besides its arguments, roughly: its header and sd-bus's own record of it.
constexpr std::size_t kMessageOverhead = 512;

bool isDisconnect(int result)
{
    return result == -ECONNRESET || result == -EPIPE || result == -ENOTCONN || result == -ESHUTDOWN ||
           result == -ESTALE;
}

/// Why sd-bus gave up, for `end`: a peer's going needs no words.
std::string_view describe(int result)
{
    return isDisconnect(result) ? std::string_view() : std::strerror(-result);
}

} // namespace

/// What the connection's owner holds: every wish becomes a job on the loop.
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
        onLoop([core = _core] { core->start(); });
    }
    void push(std::string_view signal, Message arguments) override
    {
        onLoop(
            [core = _core, name = std::string(signal), message = std::move(arguments)] { core->push(name, message); });
    }
    void invalidate() override
    {
        _core->_silenced = true;
        onLoop([core = _core] { core->invalidate(); });
    }

private:
    void onLoop(Executor::Job job) { _core->_context->loop.execute(Priority::Default, std::move(job)); }

    const std::shared_ptr<BusConnection> _core;
};

void BusConnection::BusUnref::operator()(sd_bus* bus) const
{
    sd_bus_close_unref(bus);
}

std::shared_ptr<BusConnection> BusConnection::make(std::shared_ptr<BusContext> context,
                                                   std::shared_ptr<const Interface> interface, FileHandle socket,
                                                   Peer peer, std::shared_ptr<Queue> queue,
                                                   std::function<void()> closed)
{
    std::shared_ptr<BusConnection> connection(new BusConnection(
        std::move(context), std::move(interface), std::move(socket), peer, std::move(queue), std::move(closed)));
    connection->_context->connections.insert(connection);
    return connection;
}

BusConnection::BusConnection(std::shared_ptr<BusContext> context, std::shared_ptr<const Interface> interface,
                             FileHandle socket, Peer peer, std::shared_ptr<Queue> queue, std::function<void()> closed)
    : _context(std::move(context)), _interface(std::move(interface)), _peer(peer), _queue(std::move(queue)),
      _closed(std::move(closed)), _socket(std::move(socket))
{}

BusConnection::~BusConnection() = default;

std::shared_ptr<Connection> BusConnection::handle()
{
    return std::make_shared<Handle>(shared_from_this());
}

// MARK: - the owner's wishes

void BusConnection::start()
{
    if (_state != State::Waiting) return;
    _state = State::Open;

    sd_bus* bus = nullptr;
    sd_id128_t serverId;
    int result = sd_bus_new(&bus);
    if (result < 0) return end("there is no memory for it");
    _bus.reset(bus);
    if (result >= 0) result = sd_id128_randomize(&serverId);
    if (result >= 0) result = sd_bus_set_server(bus, true, serverId);
    if (result >= 0) result = sd_bus_negotiate_fds(bus, true);
    if (result >= 0)
        result = sd_bus_add_filter(
            bus, nullptr,
            [](sd_bus_message* message, void* self, sd_bus_error*) {
                return static_cast<BusConnection*>(self)->onMessage(message);
            },
            this);
    if (result >= 0) result = sd_bus_set_fd(bus, _socket.fd(), _socket.fd());
    if (result >= 0) _fd = _socket.release();
    if (result >= 0) result = sd_bus_start(bus);
    if (result < 0) return end(describe(result));

    startTimer();
    _watchedEvents = EPOLLIN;
    _watch = _context->loop.watch(_fd, _watchedEvents, [weak = weak_from_this()](std::uint32_t events) {
        if (auto self = weak.lock()) self->ready(events);
    });
    drive(false);
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
        return pushFailed(fmt::format("{} can't be made", signal));
    const BusMessage owned(message);
    auto size = encodeArguments(message, member->in, arguments);
    if (!size) return pushFailed(fmt::format("{} can't be sent: {}", signal, size.error()));
    send(message, *size);
    updateWatch();
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
    _calls.clear();
    _parked.clear();
    if (_unwritten.empty()) return close();
    startTimer();
    updateWatch();
}

// MARK: - reading

bool BusConnection::paused() const
{
    if (_state != State::Open) return true;
    // A peer that has gone can add nothing: what it left in the socket is bounded by the kernel.
    if (_peerGone) return false;
    const Limits& limits = _context->limits;
    return _calls.size() >= limits.callsInFlight || _bytesInFlight >= limits.bytesInFlight ||
           _unwrittenBytes >= limits.queuedBytes / 4;
}

void BusConnection::ready(std::uint32_t events)
{
    if (_state == State::Closed) return;
    if ((events & (EPOLLHUP | EPOLLERR)) != 0) {
        if (_state == State::Draining) return close();
        _peerGone = true;
    }
    drive((events & EPOLLOUT) != 0);
}

void BusConnection::drive(bool writable)
{
    for (unsigned turn = 0; turn < kMessagesPerTurn; ++turn) {
        dispatchParked();
        if (_state == State::Closed) return;
        if (sd_bus_is_open(_bus.get()) <= 0) return end({}); // before sd-bus closes the descriptor that is watched
        // sd-bus writes and reads in one step. While reading is paused it is called only to write; when that didn't end
        // a message it reads one, which is what `_parked` is for.
        if (paused() && !writable) return updateWatch();
        writable = false;

        const int result = sd_bus_process(_bus.get(), nullptr);
        if (_state == State::Closed) return;
        if (result < 0) return end(describe(result));
        settleWriteQueue(kMessageOverhead);
        if (_state == State::Draining && _unwritten.empty()) return close();
        if (result == 0) {
            if (_state == State::Open && sd_bus_is_ready(_bus.get()) > 0) {
                cancelTimer();
                _readsExactly = true;
            }
            return updateWatch();
        }
        if (_readsExactly && _parked.empty() && !hasQueuedRead()) return updateWatch();
    }
    // What is left may be in sd-bus's buffer, where no event tells of it.
    driveAgainLater();
}

bool BusConnection::hasQueuedRead() const
{
    std::uint64_t queued = 0;
    return sd_bus_get_n_queued_read(_bus.get(), &queued) < 0 || queued > 0;
}

void BusConnection::driveAgainLater()
{
    if (std::exchange(_driveQueued, true)) return;
    _context->loop.execute(Priority::Default, [self = shared_from_this()] {
        self->_driveQueued = false;
        if (self->_state != State::Closed) self->drive(false);
    });
}

int BusConnection::onMessage(sd_bus_message* message)
{
    constexpr int kTaken = 1;
    constexpr int kLeftToSdBus = 0;
    std::uint8_t type = 0;
    sd_bus_message_get_type(message, &type);
    if (type != SD_BUS_MESSAGE_METHOD_CALL || _state != State::Open) return kTaken;

    const char* path = sd_bus_message_get_path(message);
    const char* interface = sd_bus_message_get_interface(message);
    const char* name = sd_bus_message_get_member(message);
    if (interface && std::strcmp(interface, "org.freedesktop.DBus.Peer") == 0) return kLeftToSdBus;
    if (BusMessage standard = answerStandardCall(message, *_interface)) {
        send(standard.get(), _interface->introspection.size());
        return kTaken;
    }

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
            if (member.name != name) continue;
            receive(message, member);
            return kTaken;
        }
        error = knownInterface
                    ? CallError{SD_BUS_ERROR_UNKNOWN_METHOD, fmt::format("there is no method {}", name)}
                    : CallError{SD_BUS_ERROR_UNKNOWN_INTERFACE, fmt::format("there is no interface {}", interface)};
    }
    if (BusMessage answer = makeErrorAnswer(message, error)) send(answer.get(), error.message.size());
    return kTaken;
}

void BusConnection::receive(sd_bus_message* message, const Member& member)
{
    std::expected<DecodedArguments, CallError> decoded;
    const char* signature = sd_bus_message_get_signature(message, true);
    if (signature && member.in == signature)
        decoded = decodeArguments(message, _context->limits.messageSize);
    else
        decoded = std::unexpected(CallError{
            .message = fmt::format("{} takes \"{}\", not \"{}\"", member.name, member.in, signature ? signature : "")});
    if (!decoded) {
        kLog.info("call {} of process {} refused: {}", member.name, _peer.pid, decoded.error().message);
        if (BusMessage answer = makeErrorAnswer(message, decoded.error()))
            send(answer.get(), decoded.error().message.size());
        return;
    }
    const std::size_t size = decoded->size + kMessageOverhead;
    Call call{&member, std::move(decoded->message), size, BusMessage(sd_bus_message_ref(message))};
    if (_parked.empty() && !paused()) return dispatch(std::move(call));
    _parkedBytes += size;
    _parked.push_back(std::move(call));
    if (_parkedBytes > _context->limits.queuedBytes) end("it sends more than it reads");
}

void BusConnection::dispatchParked()
{
    while (!_parked.empty() && !paused()) {
        Call call = std::move(_parked.front());
        _parked.pop_front();
        _parkedBytes -= call.size;
        dispatch(std::move(call));
    }
}

void BusConnection::dispatch(Call call)
{
    const std::uint64_t id = ++_lastCall;
    _bytesInFlight += call.size;
    const std::string_view member = call.member->name;
    _calls.emplace(id, PendingCall{call.member, call.size, std::move(call.message)});

    // The responder is made where it is used: a task that never runs owes no answer.
    _queue->async([self = shared_from_this(), handler = _handler, id, member,
                   arguments = std::move(call.arguments)]() mutable {
        RunLoop& loop = self->_context->loop;
        if (self->_silenced) return;
        Responder responder(
            [self, id, &loop](CallResult result) {
                loop.execute(Priority::Default,
                             [self, id, result = std::move(result)]() mutable { self->answer(id, std::move(result)); });
            },
            [self, id, &loop] { loop.execute(Priority::Default, [self, id] { self->forget(id); }); });
        (*handler)(member, std::move(arguments), std::move(responder));
    });
}

// MARK: - writing

void BusConnection::answer(std::uint64_t id, CallResult result)
{
    const auto call = _calls.find(id);
    if (call == _calls.end()) return;
    if (sd_bus_message_get_expect_reply(call->second.message.get()) > 0) {
        std::size_t size = 0;
        if (BusMessage answer = encodeAnswer(call->second, std::move(result), size)) send(answer.get(), size);
    }
    forget(id);
}

void BusConnection::forget(std::uint64_t id)
{
    const auto call = _calls.find(id);
    if (call == _calls.end()) return;
    const bool wasPaused = paused();
    _bytesInFlight -= call->second.size;
    _calls.erase(call);
    if (wasPaused && !paused())
        drive(false);
    else
        updateWatch();
}

BusMessage BusConnection::encodeAnswer(const PendingCall& call, CallResult result, std::size_t& size) const
{
    if (result) {
        sd_bus_message* answer = nullptr;
        if (sd_bus_message_new_method_return(call.message.get(), &answer) < 0) return {};
        BusMessage owned(answer);
        auto encoded = encodeArguments(answer, call.member->out, *result);
        if (encoded) {
            size = *encoded;
            return owned;
        }
        kLog.fault("the answer to {} can't be sent: {}", call.member->name, encoded.error());
        result = std::unexpected(CallError{SD_BUS_ERROR_FAILED, "the answer can't be sent: " + encoded.error()});
    }
    size = result.error().message.size();
    return makeErrorAnswer(call.message.get(), result.error());
}

void BusConnection::send(sd_bus_message* message, std::size_t size)
{
    // Writing to a peer that has gone would make sd-bus forget what that peer sent before it went.
    if (_state != State::Open || peerHasGone()) return;
    const int result = sd_bus_send(_bus.get(), message, nullptr);
    if (result < 0 && !isDisconnect(result)) {
        kLog.error("a message to process {} can't be sent: {}", _peer.pid, std::strerror(-result));
        return;
    }
    settleWriteQueue(size + kMessageOverhead);
    if (_unwritten.size() > 1 && _unwrittenBytes > _context->limits.queuedBytes) end("it doesn't read");
}

/// Follows sd-bus's write queue: what it has written is forgotten, what it has taken on counts.
void BusConnection::settleWriteQueue(std::size_t sizeOfNewest)
{
    std::uint64_t queued = 0;
    if (sd_bus_get_n_queued_write(_bus.get(), &queued) < 0) queued = 0;
    while (_unwritten.size() > queued) {
        _unwrittenBytes -= _unwritten.front();
        _unwritten.pop_front();
    }
    while (_unwritten.size() < queued) {
        _unwritten.push_back(sizeOfNewest);
        _unwrittenBytes += sizeOfNewest;
    }
}

bool BusConnection::peerHasGone()
{
    pollfd state{_fd, 0, 0};
    if (!_peerGone && poll(&state, 1, 0) > 0 && (state.revents & (POLLHUP | POLLERR)) != 0) _peerGone = true;
    return _peerGone;
}

void BusConnection::updateWatch()
{
    if (!_watch || _state == State::Closed) return;
    const int wanted = sd_bus_get_events(_bus.get());
    if (wanted < 0) return driveAgainLater();
    // The peer's end is of interest even while nothing is to be read.
    std::uint32_t events = static_cast<std::uint32_t>(wanted) | EPOLLHUP;
    if (paused()) events &= ~static_cast<std::uint32_t>(EPOLLIN);
    if (events != std::exchange(_watchedEvents, events)) _watch->setEvents(events);
}

// MARK: - ending

void BusConnection::startTimer()
{
    cancelTimer();
    RunLoop& loop = _context->loop;
    _timer = _context->clock.after(_context->limits.patience, [weak = weak_from_this(), &loop] {
        loop.execute(Priority::Default, [weak] {
            auto self = weak.lock();
            if (!self || std::exchange(self->_timer, 0) == 0) return;
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

/// Ends the connection for `reason`; none if the peer just went.
void BusConnection::end(std::string_view reason)
{
    if (_state == State::Closed) return;
    if (!reason.empty()) kLog.error("connection of process {} dropped: {}", _peer.pid, reason);
    if (_state == State::Open) {
        _peerGone = true;
        dispatchParked();
    }
    close();
}

void BusConnection::close()
{
    if (std::exchange(_state, State::Closed) == State::Closed) return;
    cancelTimer();
    announceEnd();
    _calls.clear();
    _parked.clear();
    if (_watch) _watch->setEvents(0);
    // Nobody destroys sd-bus's objects, or the watch, from inside their own callbacks.
    _context->loop.execute(Priority::Default, [self = shared_from_this()] { self->dispose(); });
}

void BusConnection::dispose()
{
    _watch.reset();
    _bus.reset();
    _socket = FileHandle();
    _context->connections.erase(shared_from_this());
    if (_closed) std::exchange(_closed, {})();
}

void BusConnection::abandon()
{
    close();
    dispose();
}

} // namespace platform::ipc
