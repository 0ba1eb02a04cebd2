// A round trip of the smallest call, beside an echo of as many bytes over a bare socket. On one core, so that the
// figure is work and not luck with the scheduler.

#include <cstdlib>

#include "bench/Support.h"

namespace tavrin::bench {

namespace {

constexpr int kCalls = 5000;
/// A ListSessions call is 168 bytes on the wire, its answer of one client 152.
constexpr std::size_t kMessage = 160;

} // namespace

std::vector<Row> ipc()
{
    const OneCore pinned;
    const Service service(1000);
    const Daemon daemon(service.url("/bag"));
    const auto client = daemon.client();
    Echo echo(kMessage, kMessage);
    return {compare(
        "`ListSessions` over IPC, beside a socket echo of as many bytes, on one core", 9, 3.5,
        [&] {
            const double begin = now();
            for (int i = 0; i < kCalls; ++i)
                if (!client->sessions()) std::abort();
            return (now() - begin) / kCalls;
        },
        [&] {
            const double begin = now();
            for (int i = 0; i < kCalls; ++i) echo.roundTrip();
            return (now() - begin) / kCalls;
        })};
}

} // namespace tavrin::bench
