// tavrinctl session: shows the contents of a session file. Needs no daemon.

#include <CLI/CLI.hpp>
#include <fmt/chrono.h>
#include <fmt/format.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/Events.h"
#include "tools/tavrinctl/SessionFile.h"

namespace tavrin::ctl {

using platform::Value;

namespace {

constexpr std::size_t kMaximumSessionFile = 256u << 20;

Value describe(const SessionFile& file)
{
    Value::Array events;
    for (const SessionFile::Event& event : file.events)
        events.push_back(Value::dictionaryOf({{"offset", event.offset}, {"size", event.size}, {"event", event.value}}));
    Value damage;
    if (file.damage) damage = Value::dictionaryOf({{"offset", file.damage->offset}, {"reason", file.damage->reason}});
    return Value::dictionaryOf({{"version", file.version ? Value(*file.version) : Value()},
                                {"session", file.session},
                                {"events", std::move(events)},
                                {"damage", std::move(damage)}});
}

void printHeader(const SessionFile& file)
{
    if (!file.version) return;
    printLine(fmt::format("{:<28} {}", "version", printable(*file.version)));
    if (const auto* session = file.session.asDictionary())
        for (const auto& [name, value] : *session) {
            if (name == "class" || value.isNull()) continue;
            std::string text = value.asString() ? *value.asString() : platform::toJson(value);
            if (const auto date = value.asDate())
                text = fmt::format("{:%F %T}",
                                   fmt::localtime(std::chrono::system_clock::to_time_t(
                                       std::chrono::time_point_cast<std::chrono::system_clock::duration>(*date))));
            printLine(fmt::format("{:<28} {}", printable(name), printable(text)));
        }
}

void printEvents(const SessionFile& file)
{
    if (file.events.empty()) return;
    const auto timestampOf = [](const SessionFile::Event& event) {
        return event.value["feedback"]["timestamp"].asDouble().value_or(0) / 1e9;
    };
    const double first = timestampOf(file.events.front());
    printLine(bold(fmt::format("{:>10} {:>8} {:>11}  event", "offset", "size", "time")));
    for (const SessionFile::Event& event : file.events) {
        const Value& record = event.value["feedback"];
        const std::string* className = record["class"].asString();
        printLine(fmt::format("{:>10} {:>8} {:>+9.3f} s  {:<32} {:<10} {}", event.offset, event.size,
                              timestampOf(event) - first, className ? printable(*className) : "no record",
                              queryText(event.value["query_id"]),
                              record.asDictionary() ? fieldsLine(*record.asDictionary(), {"class", "timestamp"}) : ""));
    }
}

void show(const Options& options, const std::string& path)
{
    const SessionFile file = readSessionFile(readFile(path, kMaximumSessionFile));
    if (options.json) {
        printJson(describe(file));
    } else {
        printHeader(file);
        printEvents(file);
    }
    if (file.damage)
        throw Failure(fmt::format("{} is damaged at offset {}: {}; {} events before that are intact", path,
                                  file.damage->offset, file.damage->reason, file.events.size()));
}

} // namespace

void addSessionCommand(CLI::App& app, Command& chosen)
{
    CLI::App* command = app.add_subcommand("session", "Show the contents of a session file; needs no daemon");
    auto file = std::make_shared<std::string>();
    command->add_option("file", *file, "$XDG_CACHE_HOME/com.quorvane.tavrind/session.N")->required();
    command->footer(
        "Times are relative to the first event. A damaged file is shown up to the damage, with exit status 1.");
    command->callback([&chosen, file] { chosen = paged([file](const Options& options) { show(options, *file); }); });
}

} // namespace tavrin::ctl
