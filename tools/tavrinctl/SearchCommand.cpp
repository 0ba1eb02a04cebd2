// tavrinctl search: one query, one for every key as a user would type it, or one for every key that is typed.

#include <chrono>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/TAVRequest.h"
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

/// The query as it grows key by key: its prefixes by Unicode character.
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
        search->verboseReply = true; // it tells the cache's answers from the service's
        search->queryItems = queryItems(searchOptions.items);
        return search;
    };
    if (searchOptions.interactive) return searchInteractively(options, searchOptions.query, request);

    RequestRunner runner(options, searchOptions.verbose);
    if (!searchOptions.typed) return finish(options, runner.run(*request(searchOptions.query), searchOptions.query));

    // Lines come as answers do; a later key may overtake an earlier one's.
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
    if (!keys.empty() && keys.back()->outcome() == Outcome::Failed) throw Failure("the last key's search failed");
}

} // namespace

void addSearchCommand(CLI::App& app, Command& chosen)
{
    auto options = std::make_shared<SearchOptions>();
    CLI::App* command = app.add_subcommand("search", "Search, once or as a user types");
    command->add_option("query", options->query, "What to search for; with --interactive, what to begin with");
    CLI::Option* interactive = command->add_flag("-i,--interactive", options->interactive,
                                                 "Type in the terminal, and see what every key brings");
    command->add_flag("--typed", options->typed, "Send a request for each key, without waiting for the answers")
        ->excludes(interactive);
    command->add_option("--interval", options->interval, "Milliseconds between keys")
        ->check(CLI::Range(0.0, 60000.0))
        ->capture_default_str();
    command->add_flag("-v,--verbose", options->verbose, "Show the HTTP request and response");
    command->add_option("--item", options->items, "NAME=VALUE to add to the request's query; may be repeated");
    command->callback([options, &chosen] {
        if (options->query.empty() && !options->interactive) throw CLI::RequiredError("query, or --interactive,");
        chosen = [options](const Options& common) { search(common, *options); };
    });
}

} // namespace tavrin::ctl
