#include "platform/ipc/BusTransport.h"

#include <atomic>
#include <cerrno>
#include <cstring>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

#include "platform/base/Mutex.h"
#include "platform/ipc/BusConnection.h"
#include "platform/ipc/BusContext.h"
#include "platform/ipc/IpcLog.h"
#include "platform/ipc/ListenSocket.h"
#include "platform/run/Clock.h"
#include "platform/run/RunLoop.h"

namespace platform::ipc {

namespace {

constexpr std::string_view kEndpointPrefix = "endpoint-";

/// Connections accepted in one go, before the loop's other work runs.
constexpr int kAcceptsPerTurn = 16;

/// When to retry after accept failed for lack of descriptors or memory.
constexpr Duration kAcceptRetry = std::chrono::seconds(1);

/// The loop's side of a listener; accepts until the listener is destroyed. Loop's thread, except for `retire` and calls
/// before `start`.
class Acceptance : public std::enable_shared_from_this<Acceptance> {
public:
    Acceptance(std::shared_ptr<BusContext> context, const Interface& interface, std::string label, ListenSocket socket)
        : _context(std::move(context)), _interface(std::make_shared<const Interface>(interface)),
          _label(std::move(label)), _socket(std::move(socket))
    {}

    [[nodiscard]] BusContext& context() const { return *_context; }
    [[nodiscard]] std::string endpoint() const { return busAddress(_socket.path()); }

    /// Call before `start`.
    void setAcceptor(Listener::Acceptor acceptor) { _acceptor = std::move(acceptor); }

    void start()
    {
        if (_watch || _retired || !_acceptor) return;
        _watch = _context->loop.watch(_socket.fd(), EPOLLIN, [weak = weak_from_this()](std::uint32_t) {
            if (auto self = weak.lock()) self->accept();
        });
    }

    /// Removes the path and stops accepting; call `stop` next. Any thread.
    void retire()
    {
        _retired = true;
        _socket.unlinkPath();
    }

    void stop()
    {
        _watch.reset();
        _acceptor = {};
    }

private:
    void accept()
    {
        for (int turn = 0; turn < kAcceptsPerTurn && !_retired; ++turn) {
            if (_open >= _context->limits.connections) {
                kLog.info("{}: {} connections are open; new ones wait", _label, _open);
                return pause(true);
            }
            FileHandle socket(accept4(_socket.fd(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
            if (socket) {
                greet(std::move(socket));
            } else if (errno == EMFILE || errno == ENFILE || errno == ENOBUFS || errno == ENOMEM) {
                kLog.error("{}: can't accept: {}", _label, std::strerror(errno));
                pause(true);
                return retryLater();
            } else if (errno != EINTR && errno != ECONNABORTED) {
                if (errno != EAGAIN) kLog.error("{}: can't accept: {}", _label, std::strerror(errno));
                return;
            }
        }
    }

    void greet(FileHandle socket)
    {
        const auto credentials = peerCredentials(socket.fd());
        if (!credentials || !mayConnect(credentials->uid, geteuid())) {
            kLog.error("{}: refused process {} of user {}", _label, credentials ? credentials->pid : 0,
                       credentials ? credentials->uid : 0);
            return;
        }
        const pid_t pid = credentials->pid;
        switch (_context->admit(pid)) {
        case BusContext::Admission::Admitted: break;
        case BusContext::Admission::Refused: // logs once, however often the process tries
            kLog.error("{}: refused process {}: it has {} connections", _label, pid,
                       _context->limits.connectionsPerProcess);
            return;
        case BusContext::Admission::RefusedAgain: return;
        }
        ++_open;
        auto connection = BusConnection::make(_context, _interface, std::move(socket), Peer{pid, credentials->uid},
                                              _label, [weak = weak_from_this(), &loop = _context->loop] {
                                                  loop.execute(Priority::Default, [weak] {
                                                      auto self = weak.lock();
                                                      if (!self) return;
                                                      --self->_open;
                                                      self->pause(false);
                                                  });
                                              });
        _acceptor(connection->handle());
    }

    void pause(bool paused)
    {
        if (!_watch || std::exchange(_paused, paused) == paused) return;
        _watch->setEvents(paused ? 0u : EPOLLIN);
    }

    void retryLater()
    {
        _context->clock.after(kAcceptRetry, [weak = weak_from_this(), &loop = _context->loop] {
            loop.execute(Priority::Default, [weak] {
                if (auto self = weak.lock()) self->pause(false);
            });
        });
    }

    const std::shared_ptr<BusContext> _context;
    const std::shared_ptr<const Interface> _interface;
    const std::string _label;
    ListenSocket _socket;
    Listener::Acceptor _acceptor;
    std::unique_ptr<RunLoop::Watch> _watch;
    unsigned _open = 0;
    bool _paused = false;
    std::atomic<bool> _retired = false;
};

class BusListener final : public Listener {
public:
    explicit BusListener(std::shared_ptr<Acceptance> acceptance)
        : _acceptance(std::move(acceptance)), _endpoint(_acceptance->endpoint())
    {}
    ~BusListener() override
    {
        _acceptance->retire();
        onLoop([acceptance = _acceptance] { acceptance->stop(); });
    }
    void setAcceptor(Acceptor acceptor) override { _acceptance->setAcceptor(std::move(acceptor)); }
    void resume() override
    {
        onLoop([acceptance = _acceptance] { acceptance->start(); });
    }
    [[nodiscard]] std::string endpoint() override { return _endpoint; }

private:
    void onLoop(Executor::Job job) { _acceptance->context().loop.execute(Priority::Default, std::move(job)); }

    const std::shared_ptr<Acceptance> _acceptance;
    const std::string _endpoint;
};

/// A listener whose socket perhaps can't be created yet. Each call of `endpoint` tries again, until there is one.
class RetryingListener final : public Listener {
public:
    using Make = std::function<Result<std::unique_ptr<Listener>>()>;

    RetryingListener(std::string label, Make make) : _label(std::move(label)), _make(std::move(make))
    {
        (void)endpoint();
    }
    void setAcceptor(Acceptor acceptor) override
    {
        const MutexLock lock(_mutex);
        _acceptor = std::move(acceptor);
        if (_listener) _listener->setAcceptor(_acceptor);
    }
    void resume() override
    {
        const MutexLock lock(_mutex);
        _resumed = true;
        if (_listener) _listener->resume();
    }
    [[nodiscard]] std::string endpoint() override
    {
        const MutexLock lock(_mutex);
        if (!_listener) _try();
        return _listener ? _listener->endpoint() : "";
    }

private:
    void _try() REQUIRES(_mutex)
    {
        auto listener = _make();
        if (!listener) {
            if (!std::exchange(_failed, true))
                kLog.error("{}: can't create an endpoint, trying again when a client asks for it: {}", _label,
                           listener.error().description());
            return;
        }
        if (_failed) kLog.log("{}: has an endpoint now", _label);
        _listener = std::move(*listener);
        if (_acceptor) _listener->setAcceptor(_acceptor);
        if (_resumed) _listener->resume();
    }

    const std::string _label;
    const Make _make;
    Mutex _mutex;
    std::unique_ptr<Listener> _listener GUARDED_BY(_mutex);
    Acceptor _acceptor GUARDED_BY(_mutex);
    bool _resumed GUARDED_BY(_mutex) = false;
    bool _failed GUARDED_BY(_mutex) = false;
};

class BusTransport final : public Transport {
public:
    BusTransport(RunLoop& loop, WorkerPool& pool, Clock& clock, std::filesystem::path directory, const Limits& limits)
        : _context(std::make_shared<BusContext>(loop, pool, clock, limits)), _directory(std::move(directory))
    {
        sweepDeadSockets(_directory, kEndpointPrefix);
    }

    ~BusTransport() override
    {
        for (const auto& connection : _context->takeConnections()) connection->abandon();
    }

    Result<std::unique_ptr<Listener>> listen(const Interface& interface, const std::string& label) override
    {
        if (!_askedServiceManager.exchange(true))
            if (auto socket = ListenSocket::fromServiceManager())
                return make(_context, interface, label, std::move(*socket));
        auto socket = ListenSocket::bindExclusive(_directory / "socket");
        if (!socket) return std::unexpected(std::move(socket.error()));
        return make(_context, interface, label, std::move(*socket));
    }

    std::unique_ptr<Listener> anonymous(const Interface& interface, const std::string& label) override
    {
        return std::make_unique<RetryingListener>(
            label,
            [context = _context, directory = _directory, &interface, label]() -> Result<std::unique_ptr<Listener>> {
                auto socket = ListenSocket::bindUnguessable(directory, kEndpointPrefix);
                if (!socket) return std::unexpected(std::move(socket.error()));
                return make(context, interface, label, std::move(*socket));
            });
    }

private:
    static std::unique_ptr<Listener> make(const std::shared_ptr<BusContext>& context, const Interface& interface,
                                          const std::string& label, ListenSocket socket)
    {
        return std::make_unique<BusListener>(
            std::make_shared<Acceptance>(context, interface, label, std::move(socket)));
    }

    const std::shared_ptr<BusContext> _context;
    const std::filesystem::path _directory;
    std::atomic<bool> _askedServiceManager = false;
};

} // namespace

std::unique_ptr<Transport> makeBusTransport(RunLoop& runLoop, WorkerPool& pool, Clock& clock,
                                            std::filesystem::path directory, Limits limits)
{
    return std::make_unique<BusTransport>(runLoop, pool, clock, std::move(directory), limits);
}

} // namespace platform::ipc
