// A round trip of the smallest call, beside an echo of as many bytes over a bare socket. On one core, so that the
// figure is work and not luck with the scheduler.

#include <cstdio>
#include <cstdlib>

#include "bench/Support.h"

namespace tavrin::bench {

namespace {

constexpr int kRounds = 9;
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
    const PlainServer server;
    Echo echo(daemon.sizesOf(listSessions));
    const auto client = daemon.client();
    const auto plainClient = server.client();
    const auto run = [](auto&& one) {
        const double begin = now();
        for (int i = 0; i < kCalls; ++i) one();
        return (now() - begin) / kCalls;
    };
    std::vector<double> times[3];
    for (int round = 0; round < kRounds; ++round) {
        std::fprintf(stderr, "\rListSessions: round %d of %d ", round + 1, kRounds);
        times[0].push_back(run([&] { listSessions(*client); }));
        times[1].push_back(run([&] { listSessions(*plainClient); }));
        times[2].push_back(run([&] { echo.roundTrip(); }));
    }
    std::fputc('\n', stderr);
    return callRows("`ListSessions` over IPC", 2.5, median(times[0]), median(times[1]), median(times[2]));
}

} // namespace tavrin::bench
