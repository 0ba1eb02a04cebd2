// tavrinctl bag, sessions, status, stats: show the daemon's state.

#include <charconv>
#include <cmath>
#include <utility>

#include <CLI/CLI.hpp>
#include <fmt/chrono.h>
#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/Books.h"
#include "tools/tavrinctl/Commands.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

std::string text(const Value& value)
{
    const std::string* string = value.asString();
    return string ? printable(*string) : platform::toJson(value);
}

/// Formats a time span: "3 d 4 h", "2 min 5 s", "17 s"; with a minus sign if negative.
std::string span(double seconds)
{
    const auto total = static_cast<std::int64_t>(std::min(std::abs(seconds), 1e15));
    const std::string sign = seconds < 0 ? "-" : "";
    if (total >= 86400) return fmt::format("{}{} d {} h", sign, total / 86400, total / 3600 % 24);
    if (total >= 3600) return fmt::format("{}{} h {} min", sign, total / 3600, total / 60 % 60);
    if (total >= 60) return fmt::format("{}{} min {} s", sign, total / 60, total % 60);
    return fmt::format("{}{} s", sign, total);
}

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
    const TAVBagAnswer answer = valueOf(openSession(options).client->bag());
    if (options.json) {
        Dictionary description;
        if (answer.bag) {
            Value::Array problems;
            for (std::string& problem : answer.bag->problems()) problems.emplace_back(std::move(problem));
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
        for (const std::string& problem : bag.problems()) row("problem", printable(problem));
        printLine(dim("as " + printable(bag.userAgent()) + " sees it; --json shows every key"));
    }
    if (!answer.bag)
        throw Failure(fmt::format("the daemon has no bag ({}).\nCheck its URL: tavrinctl defaults read TAVBagURL",
                                  answer.error ? answer.error->reason() : "no reason given"));
}

void showSessions(const Options& options)
{
    const Value::Array sessions = valueOf(connect(options)->sessions());
    if (options.json) return printJson(sessions);
    if (sessions.empty()) printLine("No client has connected yet.");
    for (const Value& session : sessions)
        printLine(fmt::format("{:<36} {}", text(session["identifier"]), text(session["agent"])));
}

void showStatus(const Options& options)
{
    const Value status = valueOf(connect(options)->status());
    if (options.json) return printJson(status);
    row("daemon", fmt::format("{}, process {}, up for {}", text(status["version"]), text(status["pid"]),
                              span(status["uptime"].asDouble().value_or(0))));
    const Value& bag = status["bag"];
    std::string bagText = "none";
    if (!bag["version"].isNull()) {
        bagText =
            fmt::format("version {}, search {}", text(bag["version"]), bag["enabled"] == Value(true) ? "on" : "off");
        if (const auto expiresIn = bag["expiresIn"].asDouble())
            bagText += *expiresIn > 0 ? ", fresh for " + span(*expiresIn) : ", stale since " + span(-*expiresIn);
    }
    if (bag["fetchInProgress"] == Value(true)) bagText += ", being fetched";
    row("bag", bagText);
    row("feedback",
        status["sharedSession"] == Value(true) ? "one session for all clients" : "one session for each client");
    if (const Value& books = status["feedback"]; books.asDictionary()) {
        const char* name = "events";
        for (const std::string& line : bookLines(books)) row(std::exchange(name, ""), line);
    }
    row("clients", fmt::format("{}", status["sessions"].count()));
    for (std::size_t i = 0; i < status["connections"].count(); ++i) {
        const Value& connection = status["connections"][i];
        const std::string client = text(connection["client"]);
        row(i == 0 ? "connections" : "",
            fmt::format("process {}, {}, last query {}", text(connection["pid"]),
                        client.empty() ? "no known client" : client, text(connection["currentQueryId"])));
    }
    for (std::size_t i = 0; i < status["validImageHosts"].count(); ++i)
        row(i == 0 ? "image hosts" : "", text(status["validImageHosts"][i]));
    if (const Dictionary* open = status["transactions"].asDictionary(); open && !open->empty()) {
        for (const auto& [name, count] : *open) row("pending", fmt::format("{} ({})", printable(name), text(count)));
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
    if (openMetrics) {
        std::fwrite(statistics.data(), 1, statistics.size(), stdout);
        return;
    }
    const Dictionary samples = samplesIn(statistics);
    if (options.json) return printJson(samples);
    for (const auto& [name, value] : samples) printLine(fmt::format("{:>12}  {}", text(value), printable(name)));
}

} // namespace

void addInspectCommands(CLI::App& app, Command& chosen)
{
    const auto add = [&](const char* name, const char* description, auto action) {
        CLI::App* command = app.add_subcommand(name, description);
        command->callback([&chosen, action] { chosen = action; });
        return command;
    };
    add("bag", "The service's configuration, as this client sees it", showBag);
    add("sessions", "List the clients that connected", showSessions);
    add("status", "Show the state of the daemon", showStatus);
    auto openMetrics = std::make_shared<bool>(false);
    add("stats", "Show the daemon's counters", [openMetrics](const Options& options) {
        showStatistics(options, *openMetrics);
    })->add_flag("--openmetrics", *openMetrics, "Print OpenMetrics text for a collector");
}

} // namespace tavrin::ctl
