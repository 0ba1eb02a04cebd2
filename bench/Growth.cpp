// How costs grow: with connected clients, with clients that ask at once, with cached result sets, and with session
// files that wait at the start. Each row is the largest number beside the smallest.

#include <filesystem>
#include <map>
#include <memory>
#include <thread>
#include <vector>

#include <fmt/format.h>

#include "bench/Feedback.h"
#include "bench/Support.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"

namespace tavrin::bench {

namespace {

namespace fs = std::filesystem;

constexpr int kRounds = 9;
constexpr int kCalls = 500;
constexpr double kFlat = 1.5;

/// A client that asks for texts. Every query has an id above the one before.
class Typist {
public:
    explicit Typist(std::unique_ptr<TAVClient> client) : _client(std::move(client)) {}

    void search(const std::string& text)
    {
        auto request = TAVSearchRequest::searchRequestWithString(text, StartSearchTrigger::NewCharacter);
        request->queryId = ++_queryId;
        request->scale = 1;
        request->keyboardInputMode = "en";
        const auto answer = _client->request(*request);
        require(answer && answer->reply && answer->reply->rawResponse, "no answer to \"" + text + "\"");
    }
    /// Median of `kCalls` searches for the same text.
    double medianOf(const std::string& text)
    {
        std::vector<double> times;
        for (int i = 0; i < kCalls; ++i) times.push_back(timeOf([&] { search(text); }));
        return median(std::move(times));
    }

private:
    std::unique_ptr<TAVClient> _client;
    std::int64_t _queryId = 0;
};

/// A row of figures for growing numbers, the last of which is `beside` times the first.
Row growthRow(std::string what, const std::vector<double>& figures, double beside = 1, double limit = kFlat)
{
    std::string all;
    for (const double figure : figures) all += (all.empty() ? "" : " / ") + seconds(figure);
    return {std::move(what),
            std::move(all),
            seconds(figures.front() * beside),
            figures.back() / figures.front() / beside,
            limit,
            "×"};
}

Row connectedClients()
{
    const OneCore pinned;
    Service service(20'000, 0, "weather in the mountains");
    const Daemon daemon(service.url("/bag"));
    Typist asking(daemon.client());
    asking.search("wea");
    std::vector<std::unique_ptr<TAVClient>> others;
    std::vector<double> figures;
    for (const std::size_t count : {1u, 8u, 64u, 512u}) {
        while (others.size() + 1 < count) others.push_back(daemon.client());
        std::fprintf(stderr, "growth: %zu clients\n", count);
        std::vector<double> rounds;
        for (int i = 0; i < kRounds; ++i) rounds.push_back(asking.medianOf("weather"));
        figures.push_back(median(std::move(rounds)));
    }
    return growthRow("a cached search with 1 / 8 / 64 / 512 clients connected, one of them asking", figures);
}

Row askingClients()
{
    Service service(20'000, 0, "weather in the mountains");
    const Daemon daemon(service.url("/bag"));
    std::vector<Typist> typists;
    for (int i = 0; i < 8; ++i) typists.emplace_back(daemon.client());
    typists.front().search("wea");
    std::vector<double> figures;
    for (const std::size_t count : {1u, 8u}) {
        std::fprintf(stderr, "growth: %zu clients ask\n", count);
        std::vector<double> rounds;
        for (int i = 0; i < kRounds; ++i) {
            std::vector<double> medians(count);
            {
                std::vector<std::jthread> threads;
                for (std::size_t each = 0; each < count; ++each)
                    threads.emplace_back([&, each] { medians[each] = typists[each].medianOf("weather"); });
            }
            rounds.push_back(median(std::move(medians)));
        }
        figures.push_back(median(std::move(rounds)));
    }
    return growthRow("a cached search with 1 / 8 clients asking at once, on all cores", figures, 8);
}

Row cachedSets()
{
    const OneCore pinned;
    Service service(1000);
    const Daemon daemon(service.url("/bag"));
    Typist asking(daemon.client());
    std::vector<double> figures;
    int stored = 0;
    for (const int count : {100, 1000, 10'000, 100'000}) {
        std::string text;
        for (; stored < count; ++stored) {
            text = fmt::format("word{:06}", stored);
            service.setAnswer(fmt::format(R"([{{"status":"OK","query":"{}","results":[]}}])", text));
            asking.search(text);
            if (stored % 500 == 0) std::fprintf(stderr, "\rgrowth: %d cached searches ", stored);
        }
        std::vector<double> rounds;
        for (int i = 0; i < kRounds; ++i) rounds.push_back(asking.medianOf(text));
        figures.push_back(median(std::move(rounds)));
    }
    std::fputc('\n', stderr);
    return growthRow("a cached search after 10² / 10³ / 10⁴ / 10⁵ answers that were cached", figures);
}

/// Moves a session file to `kept`, which a daemon left that was ended without warning, and removes its others. Returns
/// their directory.
fs::path keepSessionFile(const Service& service, const fs::path& caches, const fs::path& kept)
{
    {
        const Daemon daemon(service.url("/bag"), {"XDG_CACHE_HOME=" + caches.string()});
        const auto client = daemon.client();
        for (const auto& event : eventsOfSearch(1)) {
            bool taken = false;
            client->reportEvent("event", 1, *event,
                                [&taken](const platform::Result<void>& result) { taken = result.has_value(); });
            require(client->wait([&taken] { return taken; }, std::chrono::seconds(10)), "an event is not taken");
        }
    }
    std::vector<fs::path> files;
    for (const auto& entry : fs::recursive_directory_iterator(caches))
        if (entry.path().filename().string().starts_with("session.")) files.push_back(entry.path());
    require(!files.empty(), "no session file");
    for (const fs::path& file : files) fs::rename(file, kept); // the last one stays
    return files.front().parent_path();
}

Row waitingFiles()
{
    const Service service(1000);
    const Directory home;
    std::map<fs::path, std::vector<double>> starts; // by caches with more and more files
    for (const int count : {0, 40, 2000}) {
        const fs::path caches = home / fmt::format("caches{:04}", count);
        fs::create_directories(caches);
        const fs::path kept = home / "kept";
        const fs::path directory = keepSessionFile(service, caches, kept);
        for (int i = 1; i <= count; ++i) fs::copy_file(kept, directory / fmt::format("session.{}", i));
        starts[caches];
    }
    std::fprintf(stderr, "growth: start with session files\n");
    for (int i = 0; i < 21; ++i)
        for (auto& [caches, times] : starts)
            times.push_back(timeOf([&] {
                const Daemon daemon(service.url("/bag"), {"XDG_CACHE_HOME=" + caches.string()});
                const auto client = TAVClient::connect(daemon.address());
                require(client && (*client)->sessions(), "the daemon doesn't answer");
            }));
    std::vector<double> figures;
    for (auto& [caches, times] : starts) figures.push_back(median(std::move(times)));
    return growthRow("start to first answered call with 0 / 40 / 2,000 waiting session files", figures);
}

} // namespace

std::vector<Row> growth()
{
    return {connectedClients(), askingClients(), cachedSets(), waitingFiles()};
}

} // namespace tavrin::bench
