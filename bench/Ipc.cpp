// A round trip of the smallest call, beside an echo of as many bytes over a bare socket. On one core, so that the figure
// is work and not luck with the scheduler.

#include <cstdlib>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include "bench/Support.h"

namespace tavrin::bench {

namespace {

constexpr int kCalls = 5000;
/// A ListSessions call is 168 bytes on the wire, its answer of one client 152.
constexpr std::size_t kMessage = 160;

/// A process that sends back what it gets.
class Echo {
public:
    Echo()
    {
        if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, _sockets) != 0) std::abort();
        _pid = fork();
        if (_pid == 0) {
            close(_sockets[0]);
            char message[kMessage];
            while (recv(_sockets[1], message, sizeof(message), MSG_WAITALL) == kMessage)
                if (write(_sockets[1], message, sizeof(message)) != kMessage) break;
            _exit(0);
        }
        close(_sockets[1]);
    }
    ~Echo()
    {
        close(_sockets[0]);
        waitpid(_pid, nullptr, 0);
    }
    double roundTrips() const
    {
        char message[kMessage] = {};
        const double begin = now();
        for (int i = 0; i < kCalls; ++i)
            if (write(_sockets[0], message, sizeof(message)) != kMessage ||
                recv(_sockets[0], message, sizeof(message), MSG_WAITALL) != kMessage)
                std::abort();
        return (now() - begin) / kCalls;
    }

private:
    int _sockets[2];
    pid_t _pid;
};

} // namespace

std::vector<Row> ipc()
{
    const OneCore pinned;
    const Service service(1000);
    const Daemon daemon(service.url("/bag"));
    const auto client = daemon.client();
    const Echo echo;
    return {compare(
        "`ListSessions` over IPC, beside a socket echo of as many bytes, on one core", 9, 3.5,
        [&] {
            const double begin = now();
            for (int i = 0; i < kCalls; ++i)
                if (!client->sessions()) std::abort();
            return (now() - begin) / kCalls;
        },
        [&] { return echo.roundTrips(); })};
}

} // namespace tavrin::bench
