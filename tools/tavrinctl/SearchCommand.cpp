// tavrinctl search: sends one query, one for each prefix of it, or one for each key that the user types.

#include <chrono>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/TAVRequest.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/InteractiveSearch.h"
#include "tools/tavrinctl/RequestRunner.h"

namespace tavrin::ctl {

using platform::Value;

namespace {

struct SearchOptions {
    std::string query;
    bool typed = false;
    bool interactive = false;
    bool verbose = false;
    double interval = 80; // milliseconds
    std::vector<std::string> items;
};

/// Returns the prefixes of the query by code point, as a user types it.
std::vector<std::string> prefixes(const std::string& query)
{
    std::vector<std::string> result;
    for (std::size_t end = 1; end <= query.size(); ++end) {
        const bool inCharacter = end < query.size() && (static_cast<unsigned char>(query[end]) & 0xc0) == 0x80;
        if (!inCharacter) result.push_back(query.substr(0, end));
    }
    return result;
}

void search(const Options& options, const SearchOptions& searchOptions)
{
    const auto request = [&](const std::string& query) {
        auto search = TAVSearchRequest::searchRequestWithString(query, StartSearchTrigger::NewCharacter);
        search->queryItems = queryItems(searchOptions.items);
        return search;
    };
    if (searchOptions.interactive && options.json)
        throw Failure("--interactive shows a screen for people; use --typed with --json", tools::kWrongUsage);
    if (searchOptions.interactive) return searchInteractively(options, searchOptions.query, request);

    RequestRunner runner(options, searchOptions.verbose);
    if (!searchOptions.typed) return finish(options, runner.run(*request(searchOptions.query), searchOptions.query));

    // Prints each answer when it arrives; a later key may overtake an earlier one.
    const auto show = [&](const Exchange& exchange) {
        if (!options.json) printLine(summary(exchange));
    };
    std::vector<std::shared_ptr<Exchange>> keys;
    for (const std::string& prefix : prefixes(searchOptions.query)) {
        if (!keys.empty()) runner.pause(std::chrono::duration<double, std::milli>(searchOptions.interval));
        keys.push_back(runner.send(*request(prefix), prefix, show));
    }
    runner.waitForAll();

    if (options.json) {
        Value::Array described;
        for (const auto& key : keys) described.push_back(describe(*key));
        printJson(Value::dictionaryOf({{"keys", std::move(described)}}));
    } else if (!keys.empty()) {
        printAnswer(*keys.back(), options.limit);
    }
    if (!keys.empty() && keys.back()->outcome() == Outcome::Failed)
        throw Failure("the last key's search failed: " + explanation(*keys.back()));
}

} // namespace

void addSearchCommand(CLI::App& app, Command& chosen)
{
    auto options = std::make_shared<SearchOptions>();
    CLI::App* command = app.add_subcommand("search", "Search once, or with every key");
    command->add_option("query", options->query, "Text to search for; initial text with --interactive");
    CLI::Option* interactive =
        command->add_flag("-i,--interactive", options->interactive, "Search with every key typed into the terminal");
    command->add_flag("--typed", options->typed, "Send a request for each key without waiting for answers")
        ->excludes(interactive);
    tools::takesNumber(command->add_option("--interval", options->interval, "Time between keys, in milliseconds")
                           ->capture_default_str(),
                       "MILLISECONDS", 0, 60000);
    command->add_flag("-v,--verbose", options->verbose, "Show the HTTP request and response");
    addItemOption(*command, options->items);
    command->callback([options, &chosen] {
        if (options->query.empty() && !options->interactive)
            throw CLI::ValidationError("give a query, or use --interactive");
        chosen = [options](const Options& common) { search(common, *options); };
    });
}

} // namespace tavrin::ctl
