// What the daemon costs as a process: its start, its memory, its clients that wait, and its sleep.

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include <fmt/format.h>

#include "bench/Support.h"
#include "CoreTavrin/TAVProtocols.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/values/Json.h"

namespace tavrin::bench {

namespace {

std::uint64_t contextSwitches(pid_t pid)
{
    std::uint64_t sum = 0;
    for (const auto& task : std::filesystem::directory_iterator(fmt::format("/proc/{}/task", pid)))
        sum += numberIn(task.path() / "status", "voluntary_ctxt_switches:") +
               numberIn(task.path() / "status", "nonvoluntary_ctxt_switches:");
    return sum;
}

/// A call that needs neither configuration nor bag, on a connection of its own.
double startToFirstAnswer(const std::string& program, const std::vector<std::string>& environment = {})
{
    const double begin = now();
    const Daemon daemon("http://127.0.0.1:9/bag", environment, program);
    const auto client = TAVClient::connect(daemon.address());
    if (!client || !(*client)->sessions()) std::abort();
    return now() - begin;
}

/// A data directory with so many applications.
std::filesystem::path applications(const Directory& home, const std::string& name, int count)
{
    const auto folder = home / name / "applications";
    std::filesystem::create_directories(folder);
    for (int i = 0; i < count; ++i)
        std::ofstream(folder / fmt::format("org.example.Application{}.desktop", i))
            << "[Desktop Entry]\nType=Application\nName=Application\nExec=true\n";
    return folder.parent_path();
}

} // namespace

std::vector<Row> startUp()
{
    Row row = compare(
        "start to first answered call, beside a program with the same libraries", 100, 1.5,
        [] { return startToFirstAnswer(TAVRIND); }, [] { return startToFirstAnswer(BASELINE); });
    const Directory home;
    const auto with = [&](const std::filesystem::path& data) {
        return startToFirstAnswer(TAVRIND, {"XDG_DATA_DIRS=" + data.string(), "XDG_DATA_HOME=" + data.string()});
    };
    const auto many = applications(home, "many", 500), none = applications(home, "none", 0);
    Row applicationsRow = compare(
        "start with 500 .desktop files, beside a start with none", 100, 1.1, [&] { return with(many); },
        [&] { return with(none); });
    std::vector<double> starts;
    for (int i = 0; i < 21; ++i) starts.push_back(startToFirstAnswer(TAVRIND) * 1000);
    return {row,
            {"the same, in milliseconds", fmt::format("{:.1f} ms", median(starts)), "", median(starts), 40, "ms"},
            applicationsRow};
}

namespace {

/// A daemon that is asked again and again, with a key that no cache has seen.
class Searched {
public:
    explicit Searched(const platform::Value& service)
        : _daemon(*service["https"].asString() + "/bag", {"SSL_CERT_FILE=" + *service["ca"].asString()})
    {}
    /// Private dirty memory after `last` searches in all.
    double megabytesAfter(std::int64_t last)
    {
        static constexpr const char* kQueries[] = {"weather", "zürich", "music", "soup", "film", "train", "cat", "app"};
        while (_queryId < last) {
            auto request = TAVSearchRequest::searchRequestWithString(kQueries[_queryId % std::size(kQueries)],
                                                                     StartSearchTrigger::NewCharacter);
            request->queryItems.push_back(std::make_shared<TAVQueryItem>("n", std::to_string(_queryId)));
            request->queryId = ++_queryId;
            request->scale = 1;
            request->keyboardInputMode = "en";
            const auto answer = _client->request(*request);
            if (!answer || !answer->reply) std::abort();
            if (_queryId % 500 == 0) std::fprintf(stderr, "\rmemory: %lld searches ", static_cast<long long>(_queryId));
        }
        return privateDirtyMegabytes(_daemon.pid());
    }

private:
    const Daemon _daemon;
    const std::unique_ptr<TAVClient> _client = _daemon.client();
    std::int64_t _queryId = 0;
};

/// The slope of the line that fits equidistant values best, for the whole distance.
double rise(const std::vector<double>& values)
{
    const auto count = static_cast<double>(values.size());
    double sum = 0, weighted = 0, squares = 0;
    for (const double value : values) sum += value;
    for (std::size_t i = 0; i < values.size(); ++i) {
        const double x = static_cast<double>(i) - (count - 1) / 2;
        weighted += x * (values[i] - sum / count);
        squares += x * x;
    }
    return weighted / squares * (count - 1);
}

/// Five daemons, each after 20,000 searches, when its heaps have settled. The figure is the lower end of the interval
/// that holds the mean rise with 95 % (Student's t for 4 degrees of freedom): above 0, memory grows.
Row steadyGrowth(const platform::Value& service)
{
    constexpr int kRuns = 5;
    constexpr double kStudent = 2.776;
    std::vector<double> rises;
    double mean = 0, variance = 0;
    for (int run = 0; run < kRuns; ++run) {
        Searched daemon(service);
        std::vector<double> megabytes;
        for (std::int64_t last = 20'000; last <= 40'000; last += 2000) megabytes.push_back(daemon.megabytesAfter(last));
        rises.push_back(rise(megabytes));
        mean += rises.back() / kRuns;
    }
    for (const double each : rises) variance += (each - mean) * (each - mean) / (kRuns - 1);
    const double half = kStudent * std::sqrt(variance / kRuns);
    return {"its growth between 20,000 and 40,000 searches, mean of five runs and its interval's lower end",
            fmt::format("{:.2f} ± {:.2f} MB", mean, half),
            "",
            mean - half,
            0,
            "MB"};
}

} // namespace

std::vector<Row> memory()
{
    Process service({DEVSERVER, "--http-port", "0", "--https-port", "0", "--cert-dir",
                     (std::filesystem::temp_directory_path() / "tavrin-bench-certificate").string(), "--quiet"},
                    {});
    const auto ready = platform::parseJson(service.firstLine()).value();
    Searched daemon(ready);
    const double afterBag = daemon.megabytesAfter(0), early = daemon.megabytesAfter(5000),
                 late = daemon.megabytesAfter(10'000);
    std::vector<Row> rows{
        {"private dirty memory after the first HTTPS bag", fmt::format("{:.1f} MB", afterBag), "", afterBag, 8, "MB"},
        {"its growth between 5,000 and 10,000 searches", fmt::format("{:.2f} → {:.2f} MB", early, late), "",
         late - early, 0.2, "MB"},
        steadyGrowth(ready)};
    std::fputc('\n', stderr);
    return rows;
}

std::vector<Row> waiters()
{
    constexpr int kClients = 500;
    std::fprintf(stderr, "waiters: %d clients\n", kClients);
    const Service silent(1000, -1);
    const Daemon daemon(silent.url("/bag"));
    std::vector<std::unique_ptr<TAVClient>> clients;
    for (int i = 0; i < kClients; ++i) clients.push_back(daemon.client(false));
    // Each has its own wait behind it: that of its configuration, which the daemon reports by a bag that isn't there.
    pass(1.5);
    for (const auto& client : clients) client->wait([] { return true; }, {});

    std::vector<double> waits;
    for (const auto& client : clients) {
        auto request = TAVSearchRequest::searchRequestWithString("weather", StartSearchTrigger::NewCharacter);
        request->queryId = 1;
        client->send(*request, [&waits, begin = now()](const platform::Result<TAVAnswer>& answer) {
            if (!answer || !answer->error) std::abort();
            waits.push_back(now() - begin);
        });
        client->wait([] { return true; }, {});
    }
    // One thread stands for all clients; an answer counts from its request to when this thread gets to it.
    for (const auto& client : clients) {
        const std::size_t before = waits.size();
        if (!client->wait([&] { return waits.size() > before; }, std::chrono::seconds(10))) std::abort();
    }
    const double slowest = std::ranges::max(waits);
    return {{"500 clients wait for the first bag: the slowest answer", fmt::format("{:.2f} s", slowest), "", slowest,
             1.2, "s"}};
}

std::vector<Row> idle()
{
    const Service service(1000);
    const Daemon daemon(service.url("/bag"));
    const auto client = daemon.client();
    std::fprintf(stderr, "idle: first 75 s for connections to be dropped and counters to be saved\n");
    pass(75);
    const std::uint64_t before = contextSwitches(daemon.pid());
    pass(60);
    const auto wakeUps = static_cast<double>(contextSwitches(daemon.pid()) - before);
    return {{"context switches of all threads in 60 idle seconds", fmt::format("{:.0f}", wakeUps), "", wakeUps, 0, ""}};
}

} // namespace tavrin::bench
