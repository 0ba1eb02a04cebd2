// tavrinctl bag, sessions, status, stats: show the daemon's state.

#include <charconv>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/StatusText.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

void row(const std::string& name, const std::string& value)
{
    printLine(fmt::format("{:<18} {}", name, value));
}

std::string urlText(const std::optional<platform::Url>& url)
{
    return url ? printable(url->string()) : "none";
}

void showBag(const Options& options)
{
    const Session session = openSession(options);
    const TAVBagAnswer answer = valueOf(session.client->bag());
    if (options.json) {
        Dictionary description;
        if (answer.bag) {
            Value::Array problems;
            for (std::string& problem : bagProblems(*answer.bag)) problems.emplace_back(std::move(problem));
            description.set("bag", answer.bag->rawBag());
            description.set("userAgent", answer.bag->userAgent());
            description.set("problems", std::move(problems));
        }
        if (answer.error) description.set("error", answer.error->reason());
        printJson(description);
    } else if (answer.bag) {
        const TAVBag& bag = *answer.bag;
        row("version", printable(bag.version()));
        row("search", bag.isEnabled() ? "on" : "off");
        row("feedback", bag.feedbackEnabled() ? "on" : "off");
        row("shortest query", fmt::format("{}", bag.minimumQueryLength()));
        row("search URL", urlText(bag.searchURL()));
        row("warm-up URL", urlText(bag.warmURL()));
        row("flight URL", urlText(bag.flightURL()));
        row("feedback URL", urlText(bag.feedbackURL()));
        row("crowdsourcing URL", urlText(bag.crowdsourcingURL()));
        row("image URL", bag.imageURL() ? printable(*bag.imageURL()) : "none");
        for (const std::string& problem : bagProblems(bag)) row("problem", printable(problem));
        printLine(dim("as " + printable(bag.userAgent()) + " sees it; --json shows every key"));
    }
    if (answer.bag) return;
    std::string cause = lastFetchText(valueOf(session.client->status())["bag"]);
    if (cause.empty()) cause = answer.error ? answer.error->reason() : "no reason given";
    throw Failure(fmt::format("the daemon has no bag ({}).\n\"tavrinctl doctor\" says what to do.", printable(cause)));
}

void showSessions(const Options& options)
{
    const Value::Array sessions = valueOf(connect(options)->sessions());
    if (options.json) return printJson(sessions);
    if (sessions.empty()) printLine("No client has connected yet.");
    for (const Value& session : sessions)
        printLine(fmt::format("{:<36} {}", plain(session["identifier"]), plain(session["agent"])));
}

void printStatus(const Options& options, const Value& status)
{
    if (options.json) return printJson(status);
    for (const auto& [name, line] : statusRows(status)) row(name, line);
}

/// Shows the status again and again, until Ctrl-C. A terminal is cleared each time.
void watchStatus(const Options& options, double interval)
{
    endOnSignal();
    const auto client = connect(options);
    const bool clears = isatty(STDOUT_FILENO) == 1 && !options.json;
    for (;;) {
        const Value status = valueOf(client->status());
        if (clears) printText("\033[H\033[2J");
        printStatus(options, status);
        if (!clears && !options.json) printLine("");
        client->wait([] { return false; }, platform::durationFromSeconds(interval));
    }
}

/// Parses the samples of OpenMetrics text in order. A counter's name is its label "key", or the metric's name.
Dictionary samplesIn(std::string_view openMetrics)
{
    Dictionary samples;
    while (!openMetrics.empty()) {
        const std::string_view line = openMetrics.substr(0, openMetrics.find('\n'));
        openMetrics.remove_prefix(std::min(line.size() + 1, openMetrics.size()));
        const auto blank = line.rfind(' ');
        if (line.empty() || line.front() == '#' || blank == std::string_view::npos) continue;
        std::string_view name = line.substr(0, blank);
        if (const auto key = name.find("key=\""); key != std::string_view::npos)
            name = name.substr(key + 5, name.rfind('"') - key - 5);
        std::int64_t value = 0;
        std::from_chars(line.data() + blank + 1, line.data() + line.size(), value);
        samples.set(std::string(name), value);
    }
    return samples;
}

void showStatistics(const Options& options, bool openMetrics)
{
    const std::string statistics = valueOf(connect(options)->statistics());
    if (openMetrics) return printText(statistics);
    const Dictionary samples = samplesIn(statistics);
    if (options.json) return printJson(samples);
    for (const auto& [name, value] : samples) printLine(fmt::format("{:>12}  {}", plain(value), printable(name)));
}

} // namespace

void addInspectCommands(CLI::App& app, Command& chosen)
{
    const auto add = [&](const char* name, const char* description, auto action) {
        CLI::App* command = app.add_subcommand(name, description);
        command->callback([&chosen, action] { chosen = paged(action); });
        return command;
    };
    add("bag", "The service's configuration, as this client sees it", showBag);
    add("sessions", "List the clients that connected", showSessions);

    CLI::App* status = app.add_subcommand("status", "Show the state of the daemon");
    auto watch = std::make_shared<bool>(false);
    auto interval = std::make_shared<double>(1);
    CLI::Option* watching = status->add_flag("-w,--watch", *watch, "Show it again and again, until Ctrl-C");
    CLI::Option* pause = status->add_option("--interval", *interval, "Time between two looks, in seconds");
    tools::takesNumber(pause->capture_default_str()->needs(watching), "SECONDS", 0.1, 3600);
    status->callback([&chosen, watch, interval] {
        if (*watch)
            chosen = [interval](const Options& options) { watchStatus(options, *interval); };
        else
            chosen = paged([](const Options& options) { printStatus(options, valueOf(connect(options)->status())); });
    });

    auto openMetrics = std::make_shared<bool>(false);
    add("stats", "Show the daemon's counters", [openMetrics](const Options& options) {
        showStatistics(options, *openMetrics);
    })->add_flag("--openmetrics", *openMetrics, "Print OpenMetrics text for a collector");
}

} // namespace tavrin::ctl
