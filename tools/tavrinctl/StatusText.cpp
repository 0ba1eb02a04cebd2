#include "tools/tavrinctl/StatusText.h"

#include <algorithm>
#include <cmath>

#include <fmt/format.h>

#include "CoreTavrin/ClientVocabulary.h"
#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Books.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

std::string bagText(const Value& bag)
{
    std::string line = "none";
    if (!bag["version"].isNull()) {
        line =
            fmt::format("version {}, search {}", plain(bag["version"]), bag["enabled"] == Value(true) ? "on" : "off");
        if (const auto expiresIn = bag["expiresIn"].asDouble())
            line += *expiresIn > 0 ? ", fresh for " + span(*expiresIn) : ", stale since " + span(-*expiresIn);
    }
    if (bag["fetchInProgress"] == Value(true)) line += ", being fetched";
    return line;
}

/// Returns the part of a transport error that a user can act on: "self-signed certificate".
std::string_view causeIn(std::string_view reason)
{
    for (const std::string_view before : {"SSL certificate problem: ", ": "})
        if (const auto found = reason.find(before); found != std::string_view::npos)
            return reason.substr(found + before.size());
    return reason;
}

/// Finds keys that the daemon doesn't read and that resemble one that it reads.
void findMisspelt(const Value& view, const std::string& where, std::vector<std::string>& problems)
{
    const Dictionary* keys = view.asDictionary();
    if (!keys) return;
    std::vector<std::string> known;
    for (const TAVBag::KnownKey& key : TAVBag::knownKeys()) known.emplace_back(key.name);
    for (const auto& [key, value] : *keys)
        if (const std::string meant = tools::nearest(key, known); !meant.empty())
            problems.push_back(fmt::format("{}{}: the daemon reads no such key; did you mean {}?", where, key, meant));
}

} // namespace

std::string span(double seconds)
{
    const auto total = static_cast<std::int64_t>(std::min(std::abs(seconds), 1e15));
    const std::string sign = seconds < 0 ? "-" : "";
    if (total >= 86400) return fmt::format("{}{} d {} h", sign, total / 86400, total / 3600 % 24);
    if (total >= 3600) return fmt::format("{}{} h {} min", sign, total / 3600, total / 60 % 60);
    if (total >= 60) return fmt::format("{}{} min {} s", sign, total / 60, total % 60);
    return fmt::format("{}{} s", sign, total);
}

std::string lastFetchText(const Value& bag)
{
    const Value& fetch = bag["lastFetch"];
    if (!fetch.asDictionary()) return "";
    std::string outcome = "succeeded";
    if (const auto status = fetch["status"].asInt(); status && *status != 200)
        outcome = fmt::format("the service answered {}", *status);
    else if (const std::string* reason = fetch["reason"].asString())
        outcome = printable(causeIn(*reason));
    return fmt::format("last fetch {} ago: {}", span(fetch["ago"].asDouble().value_or(0)), outcome);
}

std::vector<std::pair<std::string, std::string>> statusRows(const Value& status)
{
    std::vector<std::pair<std::string, std::string>> rows;
    const auto add = [&](std::string name, std::string line) { rows.emplace_back(std::move(name), std::move(line)); };
    add("daemon", fmt::format("{}, process {}, up for {}", plain(status["version"]), plain(status["pid"]),
                              span(status["uptime"].asDouble().value_or(0))));
    add("bag", bagText(status["bag"]));
    if (const std::string fetch = lastFetchText(status["bag"]); !fetch.empty()) add("", fetch);
    add("feedback",
        status["sharedSession"] == Value(true) ? "one session for all clients" : "one session for each client");
    if (const Value& books = status["feedback"]; books.asDictionary()) {
        const char* name = "events";
        for (std::string& line : bookLines(books)) add(std::exchange(name, ""), std::move(line));
    }
    add("clients", fmt::format("{}", status["sessions"].count()));
    for (std::size_t i = 0; i < status["connections"].count(); ++i) {
        const Value& connection = status["connections"][i];
        const std::string client = plain(connection["client"]);
        add(i == 0 ? "connections" : "",
            fmt::format("process {}, {}, last query {}", plain(connection["pid"]),
                        client.empty() ? "no known client" : client, plain(connection["currentQueryId"])));
    }
    for (std::size_t i = 0; i < status["validImageHosts"].count(); ++i)
        add(i == 0 ? "image hosts" : "", plain(status["validImageHosts"][i]));
    for (const char* key : {"events", "flushes"})
        if (const Value& process = status["watchers"][key]; !process.isNull())
            add("watched", fmt::format("{}, by process {}", key, plain(process)));
    if (const Dictionary* open = status["transactions"].asDictionary())
        for (const auto& [name, count] : *open) add("pending", fmt::format("{} ({})", printable(name), plain(count)));
    return rows;
}

std::vector<std::string> bagProblems(const TAVBag& bag)
{
    std::vector<std::string> problems = bag.problems();
    findMisspelt(bag.rawBag(), "", problems);
    if (const Dictionary* clients = bag.rawBag()["clients"].asDictionary())
        for (const auto& [name, view] : *clients) {
            findMisspelt(view, fmt::format("clients.{}.", name), problems);
            if (extractClientNameFromString(name) != name)
                problems.push_back(fmt::format("clients.{}: no client has this name", name));
        }
    return problems;
}

} // namespace tavrin::ctl
