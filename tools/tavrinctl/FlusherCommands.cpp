// tavrinctl watch, flush: follow and control the feedback pipeline.

#include <chrono>
#include <cstdio>
#include <filesystem>

#include <CLI/CLI.hpp>
#include <fmt/chrono.h>
#include <fmt/format.h>

#include "CoreTavrin/TAVProtocols.h"
#include "platform/files/Files.h"
#include "platform/values/Json.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/Events.h"

namespace tavrin::ctl {

using platform::Value;

namespace {

/// Forwards what the bridge sends to the callbacks that are set.
struct Listener final : TAVFlusherListener {
    std::function<void(const platform::Bytes&)> onFlushedData = [](const platform::Bytes&) {};
    std::function<void(const std::string&)> onEvent = [](const std::string&) {};
    bool done = false;
    std::optional<std::int64_t> successor; ///< the process that has taken over

    void flushedData(const platform::Bytes& body) override { onFlushedData(body); }
    void receivedFeedbackDescription(const std::string& description) override { onEvent(description); }
    void workDone() override { done = true; }
    void replaced(FlusherIntent, std::int64_t process) override { successor = process; }
};

/// A connection to the diagnostic bridge, and the client session that it was requested through.
struct Bridge {
    Session session;
    std::unique_ptr<TAVFlusherClient> client;

    Bridge(const Options& options, Listener& listener)
        : session(openSession(options)),
          client(valueOf(TAVFlusherClient::connect(valueOf(session.client->listenToFlusher()), listener)))
    {
        client->setTimeout(platform::durationFromSeconds(options.timeout));
    }
    void initiate(FlusherIntent intent)
    {
        if (const auto answer = client->initiateConnection(intent); !answer) throw Failure(answer.error().reason());
    }
};

/// Shows what the bridge sends until `count` items were shown.
class Watch {
public:
    /// 0 for `count` means no limit. `what` is watched.
    Watch(const Options& options, std::uint64_t count, FlusherIntent what)
        : _options(options), _count(count), _intent(what)
    {}

    /// Counts one more item. Returns false if the limit is reached.
    bool takes()
    {
        if (full()) return false;
        tellAttached(); // an event may arrive before the bridge's answer
        ++_seen;
        return true;
    }
    void run(Bridge& bridge, const Listener& listener)
    {
        endOnSignal();
        const bool events = _intent == FlusherIntent::WatchEvents;
        _predecessor = valueOf(bridge.session.client->status())["watchers"][events ? "events" : "flushes"].asInt();
        bridge.initiate(_intent);
        tellAttached();
        if (!bridge.client->wait([&] { return full() || listener.successor; }, platform::Duration::max()))
            throw Failure("the daemon closed the connection");
        if (!full())
            throw Failure(fmt::format("process {} watches {} now, and only one tool can", *listener.successor,
                                      events ? "events" : "flushes"));
    }

private:
    [[nodiscard]] bool full() const { return _count > 0 && _seen == _count; }
    /// Scripts wait for this line before they cause events.
    void tellAttached()
    {
        if (std::exchange(_told, true)) return;
        endProgress();
        if (_options.json) return fmt::print(stderr, "{}\n", R"({"attached":true})");
        if (_predecessor)
            fmt::print(stderr, "Process {} was watching, and receives nothing more: only one tool can.\n",
                       *_predecessor);
        fmt::print(stderr, "Attached: showing every {} from now on. Press Ctrl-C to end.\n",
                   _intent == FlusherIntent::WatchEvents ? "event" : "body that is flushed");
    }

    const Options& _options;
    const std::uint64_t _count;
    const FlusherIntent _intent;
    std::optional<std::int64_t> _predecessor; ///< the process that watched before
    std::uint64_t _seen = 0;
    bool _told = false;
};

std::string timeOfDay()
{
    const auto now = std::chrono::system_clock::now();
    const auto milliseconds = std::chrono::duration_cast<std::chrono::milliseconds>(now.time_since_epoch()) % 1000;
    return fmt::format("{:%H:%M:%S}.{:03}", fmt::localtime(std::chrono::system_clock::to_time_t(now)),
                       milliseconds.count());
}

void watchEvents(const Options& options, std::uint64_t count)
{
    Watch watch(options, count, FlusherIntent::WatchEvents);
    Listener listener;
    listener.onEvent = [&](const std::string& description) {
        if (!watch.takes()) return;
        if (options.json) return printLine(description);
        const auto event = platform::parseJson(description);
        printLine(dim(timeOfDay()) + "  " + (event ? eventLine(*event) : printable(description)));
    };
    Bridge bridge(options, listener);
    watch.run(bridge, listener);
}

void showBody(const Options& options, const FlushedBody& body)
{
    printLine(options.json ? printableJson(platform::toJson(describe(body))) : summary(body));
}

void watchFlushes(const Options& options, std::uint64_t count)
{
    Watch watch(options, count, FlusherIntent::WatchFlushes);
    Listener listener;
    listener.onFlushedData = [&](const platform::Bytes& packed) {
        if (watch.takes()) showBody(options, flushedBody(packed));
    };
    Bridge bridge(options, listener);
    watch.run(bridge, listener);
}

/// Sends a command to the bridge and waits until it is done. Throws `Failure` on a time-out.
void work(const Options& options, Bridge& bridge, const Listener& listener, FlusherIntent intent)
{
    bridge.initiate(intent);
    if (bridge.client->wait([&] { return listener.done; }, platform::durationFromSeconds(options.timeout))) return;
    if (!bridge.client->connected()) throw Failure("the daemon closed the connection");
    throw Failure(fmt::format("the daemon did not finish within {:g} s; wait longer with --timeout", options.timeout));
}

void stopFlushing(const Options& options)
{
    Listener listener;
    Bridge bridge(options, listener);
    work(options, bridge, listener, FlusherIntent::StopFlushing);
    if (options.json)
        printJson(Value::dictionaryOf({{"stopped", true}}));
    else
        printLine("Background flushes are stopped until \"tavrinctl flush dump\".");
}

/// Saves a body as DIR/flushed-N.json with the first free number. Throws `Failure`.
std::filesystem::path save(const std::filesystem::path& directory, const FlushedBody& body)
{
    const auto files = platform::makeSystemFiles();
    const auto failed = [&](const platform::Error& error) {
        return Failure(fmt::format("can't write to {}: {}", directory.string(), error.reason()));
    };
    if (const auto made = files->createDirectories(directory); !made) throw failed(made.error());
    for (std::uint64_t number = 1;; ++number) {
        const auto path = directory / fmt::format("flushed-{}.json", number);
        const auto file = files->createForAppending(path);
        if (!file && file.error().code == EEXIST) continue;
        if (!file) throw failed(file.error());
        if (const auto written = (*file)->append({body.text}); !written) throw failed(written.error());
        return path;
    }
}

void dump(const Options& options, const std::string& directory)
{
    Listener listener;
    std::size_t bodies = 0;
    std::string unsaved;
    listener.onFlushedData = [&](const platform::Bytes& packed) {
        ++bodies;
        const FlushedBody body = flushedBody(packed);
        showBody(options, body);
        if (directory.empty() || body.text.empty()) return;
        try {
            const auto path = save(std::filesystem::absolute(directory).lexically_normal(), body);
            if (!options.json) printLine(dim("  saved as " + path.string()));
        } catch (const Failure& failure) { // the other bodies are still shown
            unsaved = failure.what();
        }
    };
    Bridge bridge(options, listener);
    work(options, bridge, listener, FlusherIntent::Dump);
    if (bodies == 0 && !options.json)
        printLine("Flushed, but received no body: either there was none, or another tool is watching flushes.");
    if (!unsaved.empty()) throw Failure(unsaved);
}

} // namespace

void addFlusherCommands(CLI::App& app, Command& chosen)
{
    const auto countOf = [](CLI::App* command) {
        auto count = std::make_shared<std::uint64_t>(0);
        tools::takesWholeNumber(
            command->add_option("--count", *count, "End after this many; 0 never ends")->capture_default_str(), "COUNT",
            0, 1e15);
        return count;
    };

    CLI::App* watch = app.add_subcommand("watch", "Show every event as clients report it");
    watch->footer("Prints a line on standard error once it is attached. With --json each line is one event as JSON.\n"
                  "Ends with Ctrl-C, or after --count events.");
    watch->callback([&chosen, count = countOf(watch)] {
        chosen = [count](const Options& options) { watchEvents(options, *count); };
    });

    CLI::App* flush = app.add_subcommand("flush", "Watch, stop or force uploads of feedback");
    flush->require_subcommand(1);
    CLI::App* flushWatch = flush->add_subcommand("watch", "Show every body as it is flushed");
    flushWatch->callback([&chosen, count = countOf(flushWatch)] {
        chosen = [count](const Options& options) { watchFlushes(options, *count); };
    });
    flush->add_subcommand("stop", "Stop background flushes until the next dump")->callback([&chosen] {
        chosen = stopFlushing;
    });
    CLI::App* flushDump = flush->add_subcommand("dump", "End all sessions, flush them now and show the bodies");
    auto directory = std::make_shared<std::string>();
    flushDump->add_option("-o,--output", *directory, "Directory to save the bodies to, as flushed-N.json")
        ->type_name("DIRECTORY");
    flushDump->callback(
        [&chosen, directory] { chosen = [directory](const Options& options) { dump(options, *directory); }; });
}

} // namespace tavrin::ctl
