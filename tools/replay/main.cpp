// tavrin-replay: types a corpus into a running daemon at the users' pace and reports how the daemon answered.

#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <list>
#include <memory>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/files/Files.h"
#include "platform/text/Text.h"
#include "platform/values/Json.h"
#include "tools/replay/Corpus.h"
#include "tools/replay/Report.h"
#include "tools/shared/CommandLine.h"

namespace tavrin::replay {

namespace {

constexpr std::size_t kLargestCorpus = 16 << 20;

struct Options {
    std::string corpus;
    std::string address = TAVClient::defaultAddress();
    std::string identifier = "com.quorvane.tavrin-replay";
    double speed = 1;
    bool lockstep = false;
    std::size_t queries = 0;
    double timeout = 30;
    bool json = false;
};

[[noreturn]] void fail(const std::string& what)
{
    fmt::print(stderr, "tavrin-replay: {}\n", what);
    std::exit(2);
}

template <class T> T valueOf(platform::Result<T> result, std::string_view what)
{
    if (!result) fail(fmt::format("{}: {}", what, result.error().reason()));
    return std::move(*result);
}

double now()
{
    timespec time{};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

/// A client that sends a search for each key, and receives answers between the keys.
class Replay {
public:
    explicit Replay(const Options& options)
        : _options(options), _client(valueOf(TAVClient::connect(options.address), "no daemon answers"))
    {
        _client->setTimeout(platform::durationFromSeconds(options.timeout));
        TAVSessionConfiguration configuration(options.identifier, "tavrin-replay/" TAVRIND_VERSION);
        configuration.dontPreloadImages = true; // the report is about searches
        (void)valueOf(_client->configure(configuration), "configure");
        for (int attempt = 0; attempt < 10 && !_bag; ++attempt) // each waits up to a second for the first bag
            _bag = valueOf(_client->bag(), "the bag").bag;
        if (!_bag) fail("the daemon has no bag; check its URL: tavrinctl defaults read TAVBagURL");
    }

    Report run(const std::vector<TypedQuery>& queries)
    {
        double due = now();
        for (std::size_t i = 0; i < queries.size(); ++i) {
            for (const Keystroke& key : queries[i].keys) {
                due += std::chrono::duration<double>(key.pause).count() / _options.speed;
                if (!_options.lockstep) takeAnswers([&] { return now() >= due; }, due - now());
                if (!key.text.empty()) send(key.text);
                if (_options.lockstep) takeAnswers([&] { return _underWay.empty(); }, _options.timeout);
            }
            if (i % 10 == 9 && _showProgress) fmt::print(stderr, "\r{} of {} queries ", i + 1, queries.size());
        }
        takeAnswers([&] { return _underWay.empty(); }, _options.timeout);
        for (const Search& search : _underWay) _report.addUnanswered(search);
        if (_showProgress) fmt::print(stderr, "\n");
        return std::move(_report);
    }

private:
    void takeAnswers(const std::function<bool()>& done, double seconds)
    {
        if (!_client->wait(done, platform::durationFromSeconds(std::max(seconds, 0.0))) && !_client->connected())
            fail("the daemon closed the connection");
    }

    void send(const std::string& text)
    {
        for (Search& earlier : _underWay) earlier.overtaken = true;
        auto request = TAVSearchRequest::searchRequestWithString(text, StartSearchTrigger::NewCharacter);
        request->queryId = ++_lastQueryId;
        request->scale = 1;
        request->keyboardInputMode = "en";
        request->verboseReply = true; // shows if the cache or the service answered
        const auto search = _underWay.insert(_underWay.end(), {.queryId = _lastQueryId, .text = text});
        search->tooShort = !_bag->isEnabled() || platform::utf16Length(text) < _bag->minimumQueryLength();
        search->sent = now();
        _client->send(*request, [this, search](const platform::Result<TAVAnswer>& answer) {
            search->answered = now();
            _report.add(*search, answer);
            _underWay.erase(search);
        });
    }

    const Options& _options;
    const bool _showProgress = isatty(STDERR_FILENO) == 1;
    std::unique_ptr<TAVClient> _client;
    std::shared_ptr<const TAVBag> _bag;
    std::list<Search> _underWay;
    std::int64_t _lastQueryId = 0;
    Report _report;
};

int run(const Options& options)
{
    const auto path = tools::resolved(options.corpus);
    const auto bytes = valueOf(platform::makeSystemFiles()->read(path, kLargestCorpus), "the corpus");
    auto queries = valueOf(parseCorpus(bytes.view()), options.corpus);
    if (options.queries > 0 && options.queries < queries.size()) queries.resize(options.queries);
    const Report report = Replay(options).run(queries);
    const std::string text =
        options.json ? platform::toJson(report.json(), platform::JsonStyle::Pretty) + "\n" : report.text();
    if (const std::string problem = tools::writeTo(stdout, text); !problem.empty()) fail(problem);
    return report.stale().empty() && report.failed().empty() ? EXIT_SUCCESS : EXIT_FAILURE;
}

} // namespace
} // namespace tavrin::replay

int main(int argc, char** argv)
{
    using namespace tavrin::replay;
    namespace tools = tavrin::tools;
    Options options;
    CLI::App app(
        "Types a corpus of queries into the daemon, key by key, and reports hits, requests saved, stale answers and "
        "latencies. The exit status is 1 if an answer was stale or failed.");
    app.set_version_flag("--version", "tavrin-replay " TAVRIND_VERSION);
    tools::useReadableHelp(app);
    app.add_option("corpus", options.corpus, "Corpus file, such as /usr/share/tavrin/corpus.txt")->required();
    tools::addConnectionOptions(app, options.address, options.identifier);
    CLI::Option* speed =
        app.add_option("--speed", options.speed, "Factor on the speed of the users")->capture_default_str();
    tools::takesNumber(speed, "FACTOR", 0.01, 100000);
    app.add_flag("--lockstep", options.lockstep, "Type each key as soon as the previous one is answered")
        ->excludes(speed);
    tools::takesWholeNumber(app.add_option("-n,--queries", options.queries, "Queries to type; 0 types all"), "COUNT", 0,
                            1e9);
    tools::takesNumber(app.add_option("--timeout", options.timeout, "How long to wait for an answer, in seconds")
                           ->capture_default_str(),
                       "SECONDS", 0.001, 86400);
    app.add_flag("--json", options.json, "Print JSON");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return tools::endOfParsing(app, error, "tavrin-replay");
    }
    return run(options);
}
