// tavrinctl feedback: reports events as a client does, and shows the events of the current session.

#include <algorithm>
#include <array>
#include <iostream>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/Characters.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/Events.h"
#include "tools/tavrinctl/FeedbackRecords.h"

namespace tavrin::ctl {

using platform::Value;

namespace {

constexpr std::size_t kMaximumEventsFile = 64u << 20;
constexpr std::size_t kProblemsShown = 20;
constexpr std::size_t kOutstanding = 64; // reports without an answer before the next one is sent

constexpr const char* kExamples =
    R"(FILE is JSON: one record or an array of them; "-" is standard input. A record has its "class", the fields of the
class, and the "queryId" that it belongs to. Enumerations are numbers. Nothing is sent if any record is wrong.
"tavrinctl feedback records" lists the classes and their fields.

  echo '{"class": "ZRSearchViewAppearFeedback", "viewAppearEvent": 5}' | tavrinctl feedback send -

  tavrinctl --agent Vistrel/4.2 feedback send - <<'END'
  [{"class": "ZRStartSearchFeedback", "queryId": 7, "input": "weather", "triggerEvent": 1},
   {"class": "ZRVisibleResultsFeedback", "queryId": 7, "triggerEvent": 1,
    "results": [{"class": "ZRSearchResult", "identifier": "w1", "type": 1, "rankingScore": 0.9}]},
   {"class": "ZRResultEngagementFeedback", "queryId": 7, "triggerEvent": 2, "destination": 2,
    "result": {"class": "ZRSearchResult", "identifier": "w1", "type": 1}}]
  END)";

std::string contents(const std::string& file)
{
    if (file == "-") {
        endProgress(); // the user may type the events
        std::string text;
        std::array<char, 1u << 16> piece;
        while (text.size() <= kMaximumEventsFile && std::cin.read(piece.data(), piece.size()).gcount() > 0)
            text.append(piece.data(), static_cast<std::size_t>(std::cin.gcount()));
        if (text.size() > kMaximumEventsFile)
            throw Failure(fmt::format("standard input has more than {} bytes", kMaximumEventsFile));
        return text;
    }
    return readFile(file, kMaximumEventsFile);
}

std::vector<ReportedEvent> eventsInFile(const std::string& file)
{
    const auto json = platform::parseJson(contents(file), kMaximumEventsFile);
    if (!json) throw Failure(fmt::format("{} is not JSON: {}", file, json.error().reason()));
    auto events = eventsIn(*json);
    if (events) return std::move(*events);
    const std::vector<std::string>& problems = events.error();
    std::string lines;
    for (std::size_t i = 0; i < std::min(problems.size(), kProblemsShown); ++i)
        lines += "\n  " + printable(problems[i]);
    if (problems.size() > kProblemsShown) lines += fmt::format("\n  … and {} more", problems.size() - kProblemsShown);
    throw Failure(fmt::format("{}: nothing was sent:{}\n\"tavrinctl feedback records\" lists the classes and fields.",
                              file, lines));
}

void send(const Options& options, const std::string& file)
{
    const std::vector<ReportedEvent> events = eventsInFile(file);
    const Session session = openSession(options);
    if (const auto bag = session.client->bag(); bag && bag->bag && !bag->bag->feedbackEnabled())
        fmt::print(stderr, "tavrinctl: the bag disables feedback for {}: the daemon drops the events\n", options.agent);

    std::size_t out = 0, taken = 0;
    std::string refusal;
    const auto wait = [&](std::size_t most) {
        const auto timeout = platform::durationFromSeconds(options.timeout);
        if (session.client->wait([&] { return out <= most; }, timeout)) return;
        throw Failure(fmt::format("the daemon accepted {} of {} events, then {}", taken, events.size(),
                                  session.client->connected()
                                      ? fmt::format("sent no answer within {:g} s; see --timeout", options.timeout)
                                      : "closed the connection"));
    };
    for (const ReportedEvent& event : events) {
        ++out;
        session.client->reportEvent(std::string(event.feedback->className()), event.queryId, *event.feedback,
                                    [&](const platform::Result<void>& result) {
                                        --out;
                                        if (result)
                                            ++taken;
                                        else if (refusal.empty())
                                            refusal = result.error().reason();
                                    });
        wait(kOutstanding);
    }
    wait(0);
    if (options.json)
        printJson(Value::dictionaryOf({{"reported", taken}, {"refused", events.size() - taken}}));
    else
        printLine(fmt::format("{} event{} reported.", taken, taken == 1 ? "" : "s"));
    if (!refusal.empty())
        throw Failure(fmt::format("the daemon refused {} events: {}", events.size() - taken, refusal));
}

void listEvents(const Options& options)
{
    const Value::Array events = valueOf(openSession(options).client->feedback());
    if (options.json) return printJson(events);
    if (events.empty())
        return printLine("The daemon holds no events of a current session in memory. "
                         "\"tavrinctl watch\" shows events as they arrive.");
    for (const Value& event : events)
        printLine(fmt::format("{:>9.3f} s  {}", event["timestamp"].asDouble().value_or(0) / 1000, eventLine(event)));
}

void listRecords(const Options& options)
{
    const auto [events, parts] = reportableRecords();
    if (options.json) return printJson(Value::dictionaryOf({{"events", events}, {"parts", parts}}));
    const auto list = [](const char* title, const platform::Dictionary& records) {
        printLine(title);
        for (const auto& [name, fields] : records) {
            printLine("  " + bold(name));
            for (const auto& [field, type] : *fields.asDictionary())
                printLine(fmt::format("    {} {}", padded(field, 27), *type.asString()));
        }
    };
    list("Events", events);
    list("Parts of events", parts);
}

} // namespace

void addFeedbackCommands(CLI::App& app, Command& chosen)
{
    CLI::App* feedback = app.add_subcommand("feedback", "Show the current session's events, or report more");
    feedback->require_subcommand(0, 1);
    // Runs after the callbacks of its subcommands.
    feedback->callback([&chosen, feedback] {
        if (feedback->get_subcommands().empty()) chosen = paged(listEvents);
    });

    CLI::App* sendCommand = feedback->add_subcommand("send", "Report events as a client does");
    auto file = std::make_shared<std::string>();
    sendCommand->add_option("file", *file, "JSON file, or - for standard input; see below")->required();
    sendCommand->footer(kExamples);
    sendCommand->callback([&chosen, file] { chosen = [file](const Options& options) { send(options, *file); }; });
    feedback
        ->add_subcommand("records",
                         "List the events that can be reported and their parts, with the types of their fields")
        ->callback([&chosen] { chosen = paged(listRecords); });
}

} // namespace tavrin::ctl
