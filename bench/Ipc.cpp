// A round trip of the smallest call, beside an echo of as many bytes over a bare socket. On one core, so that the
// figure is work and not luck with the scheduler.

#include <cstdlib>

#include "bench/Support.h"

namespace tavrin::bench {

namespace {

constexpr int kCalls = 5000;

void listSessions(TAVClient& client)
{
    if (!client.sessions()) std::abort();
}

} // namespace

std::vector<Row> ipc()
{
    const OneCore pinned;
    const Service service(1000);
    const Daemon daemon(service.url("/bag"));
    Echo echo(daemon.sizesOf(listSessions));
    const auto client = daemon.client();
    return {compare(
        "`ListSessions` over IPC, beside a socket echo of as many bytes, on one core", 9, 2.5,
        [&] {
            const double begin = now();
            for (int i = 0; i < kCalls; ++i) listSessions(*client);
            return (now() - begin) / kCalls;
        },
        [&] {
            const double begin = now();
            for (int i = 0; i < kCalls; ++i) echo.roundTrip();
            return (now() - begin) / kCalls;
        })};
}

} // namespace tavrin::bench
