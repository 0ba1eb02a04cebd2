// Events that clients report, on their way into sessions, beside a server that only decodes them. All figures are CPU
// time of the server, whatever the clients need.

#include <fmt/format.h>

#include "bench/Feedback.h"
#include "bench/Support.h"
#include "CoreTavrin/TAVProtocols.h"
#include "searchrecords/ZRFeedback.h"

namespace tavrin::bench {

namespace {

constexpr int kClients = 8;
/// Events that a client sends before it waits for an answer; so no socket is ever full for long.
constexpr int kBurst = 105;

using Clients = std::vector<std::unique_ptr<TAVClient>>;

/// All clients report `count` events together, in bursts. Returns the number of events.
int report(const Clients& clients, int count)
{
    const auto events = eventsOfSearch(1);
    int sent = 0;
    while (sent < count) {
        for (const auto& client : clients)
            for (int i = 0; i < kBurst; ++i)
                client->reportEvent("event", 1, *events[static_cast<std::size_t>(i) % events.size()]);
        for (const auto& client : clients) require(client->sessions().has_value(), "the server doesn't answer");
        sent += kBurst * kClients;
    }
    return sent;
}

/// The same, but each client waits until its event is in the file, so that nothing waits in the daemon.
void reportOneByOne(const Clients& clients, int count)
{
    const auto events = eventsOfSearch(1);
    for (int sent = 0; sent < count; ++sent) {
        bool taken = false;
        const auto& client = clients[static_cast<std::size_t>(sent) % clients.size()];
        client->reportEvent("event", 1, *events[static_cast<std::size_t>(sent) % events.size()],
                            [&taken](const platform::Result<void>& result) { taken = result.has_value(); });
        require(client->wait([&taken] { return taken; }, std::chrono::seconds(10)), "the daemon doesn't take an event");
    }
}

/// The daemon with eight clients, each with a session of its own.
class DaemonUnderLoad {
public:
    DaemonUnderLoad()
    {
        for (int i = 0; i < kClients; ++i) _clients.push_back(_daemon.client(true, fmt::format("bench{}/1", i)));
        _reported = -recorded(); // of the daemon's own
    }
    [[nodiscard]] pid_t pid() const { return _daemon.pid(); }

    /// CPU of the daemon for each of `count` events, until it rests again.
    double cpuOfEvents(int count)
    {
        settle();
        const double begin = cpu(pid());
        const int sent = report(_clients, count);
        _reported += sent;
        settle();
        return (cpu(pid()) - begin) / sent;
    }

    /// Reports `count` events one by one.
    void take(int count)
    {
        reportOneByOne(_clients, count);
        _reported += count;
        settle();
    }

private:
    [[nodiscard]] std::int64_t books(const char* key) const
    {
        const auto status = _clients.front()->status();
        require(status.has_value(), "status");
        return (*status)["feedback"][key].asInt().value_or(0);
    }
    [[nodiscard]] std::int64_t recorded() const { return books("recorded"); }

    /// Waits until every event has been recorded, and the daemon has written what it wanted to.
    void settle() const
    {
        while (recorded() < _reported) pass(0.01);
        for (double before = 0; before != cpu(pid()); pass(0.1)) before = cpu(pid());
        require(books("open") >= _reported, "events were dropped");
    }

    Service _service{1000};
    /// Sessions without end, so that every event is written.
    Daemon _daemon{_service.url("/bag"), {}, TAVRIND, {{"TAVSessionSizeLimit", std::int64_t{1} << 32}}};
    Clients _clients;
    std::int64_t _reported = 0;
};

} // namespace

std::vector<Row> events()
{
    constexpr int kEvents = 20'000;
    DaemonUnderLoad daemon;
    const PlainServer server;
    Clients clients;
    for (int i = 0; i < kClients; ++i) clients.push_back(server.client());
    return {compare(
        "events of 8 clients into their sessions, CPU an event, beside a server that decodes them", 7, 1.7,
        [&] { return daemon.cpuOfEvents(kEvents); },
        [&] {
            const double begin = cpu(server.pid());
            const int sent = report(clients, kEvents);
            return (cpu(server.pid()) - begin) / sent;
        })};
}

std::vector<Row> millionEvents()
{
    DaemonUnderLoad daemon;
    constexpr int kSteps = 10;
    double early = 0;
    for (int step = 1; step <= kSteps; ++step) {
        daemon.take(1'000'000 / kSteps);
        if (step == 1) early = privateDirtyMegabytes(daemon.pid());
        std::fprintf(stderr, "\rmillion: %d tenths, %.2f MB ", step, privateDirtyMegabytes(daemon.pid()));
    }
    std::fputc('\n', stderr);
    const double late = privateDirtyMegabytes(daemon.pid());
    return {{"growth of private dirty memory between 100,000 and a million events, one by one",
             fmt::format("{:.2f} → {:.2f} MB", early, late), "", late - early, 0.2, "MB"}};
}

} // namespace tavrin::bench
