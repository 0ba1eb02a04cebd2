// tavrinctl zkw, more, card, lookup, flight, warm: send the other kinds of request.

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/TAVRequest.h"
#include "platform/values/Dictionary.h"
#include "searchrecords/ZRViewFeedback.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/RequestRunner.h"

namespace tavrin::ctl {

using platform::Url;
using platform::Value;

namespace {

struct RequestOptions {
    std::string what;
    bool endpoint = false;
    bool verbose = false;
    bool searchFlights = false;
    std::vector<std::string> items;
    std::string context, clientContext, domain;
    std::int64_t selection = 0;
};

Exchange run(const Options& options, const RequestOptions& requestOptions, TAVRequest& request)
{
    request.queryItems = queryItems(requestOptions.items);
    RequestRunner runner(options, requestOptions.verbose);
    return requestOptions.endpoint ? runner.runThroughEndpoint(request, requestOptions.what)
                                   : runner.run(request, requestOptions.what);
}

/// Searches for `query` and returns the first URL under `key` in a result set, its sections or its results.
Url urlFromSearch(const Options& options, const std::string& query, const char* key)
{
    RequestRunner runner(options);
    const Exchange exchange =
        runner.run(*TAVSearchRequest::searchRequestWithString(query, StartSearchTrigger::NewCharacter), query);
    if (exchange.outcome() != Outcome::Answered) throw Failure("the search for the URL failed: " + summary(exchange));
    const Value sets = rawResponse(exchange);
    std::vector<Value> places;
    for (std::size_t i = 0; i < sets.count(); ++i) {
        places.push_back(sets[i]);
        for (const char* list : {"sections", "results"})
            if (const Value::Array* parts = sets[i][list].asArray())
                places.insert(places.end(), parts->begin(), parts->end());
    }
    for (const Value& place : places) {
        const std::string* text = place[key].asString();
        if (auto url = text ? Url::parse(*text) : std::nullopt) return *url;
    }
    throw Failure(fmt::format("the answer to \"{}\" has no \"{}\": try another query, or pass the URL", query, key));
}

Url urlFor(const Options& options, const std::string& what, const char* key)
{
    const bool isUrl = what.starts_with("https://") || what.starts_with("http://");
    if (!isUrl) return urlFromSearch(options, what, key);
    if (auto url = Url::parse(what)) return *url;
    throw Failure(fmt::format("\"{}\" is not a valid URL", what), 2);
}

std::optional<std::string> given(const std::string& text)
{
    return text.empty() ? std::nullopt : std::optional(text);
}

/// Adds a command with the options that these commands share.
CLI::App* add(CLI::App& app, const char* name, const char* description, const std::shared_ptr<RequestOptions>& options)
{
    CLI::App* command = app.add_subcommand(name, description);
    command->add_flag("-v,--verbose", options->verbose, "Show the HTTP request and response");
    addItemOption(*command, options->items);
    return command;
}

/// Reports that a search view appears, which makes the daemon open its connection to the service.
void warm(const Options& options)
{
    const Session session = openSession(options);
    ZRSearchViewAppearFeedback appeared;
    appeared.viewAppearEvent = SearchViewAppearTrigger::KeyboardShortcut;
    session.client->reportEvent("searchViewDidAppear", 0, appeared);
    (void)valueOf(session.client->status()); // calls are handled in order, so the event was handled
    if (options.json)
        printJson(platform::Dictionary{{"reported", appeared.className()}});
    else
        printLine("Reported that the search view appeared; the daemon's log shows if the connection was already warm.");
}

} // namespace

void addItemOption(CLI::App& command, std::vector<std::string>& items)
{
    command.add_option("--item", items, "Item to add to the URL's query; may be repeated")
        ->type_name("NAME=VALUE")
        ->allow_extra_args(false);
}

void addOtherRequestCommands(CLI::App& app, Command& chosen)
{
    app.add_subcommand("warm", "Open the connection to the service before a search")->callback([&chosen] {
        chosen = warm;
    });

    const auto onChosen = [&chosen](CLI::App* command, auto action) {
        command->callback(
            [&chosen, action] { chosen = [action](const Options& common) { finish(common, action(common)); }; });
    };

    auto zkw = std::make_shared<RequestOptions>();
    onChosen(add(app, "zkw", "Show suggestions for an empty query", zkw), [zkw](const Options& common) {
        TAVZeroKeywordRequest request;
        return run(common, *zkw, request);
    });

    // Requests for a URL of an earlier answer; the endpoint serves these, too.
    const auto addFollowing = [&](const char* name, const char* description, auto follow) {
        auto options = std::make_shared<RequestOptions>();
        CLI::App* command = add(app, name, description, options);
        command->add_option("what", options->what, "URL from an earlier answer, or a query to search for first")
            ->required();
        command->add_flag("--endpoint", options->endpoint,
                          "Send the request to the endpoint instead of the connection");
        onChosen(command, [options, follow](const Options& common) { return follow(common, *options); });
    };
    addFollowing("more", "Show more results of a section", [](const Options& common, const RequestOptions& more) {
        TAVMoreResultsRequest request;
        request.moreResultsURL = urlFor(common, more.what, "more_results_url");
        return run(common, more, request);
    });
    addFollowing("card", "Show the card of a result", [](const Options& common, const RequestOptions& card) {
        TAVCardRequest request;
        request.cardURL = urlFor(common, card.what, "card_url");
        return run(common, card, request);
    });

    auto lookup = std::make_shared<RequestOptions>();
    CLI::App* lookupCommand = add(app, "lookup", "Look up words of a text", lookup);
    lookupCommand->add_option("words", lookup->what, "Words to look up")->required();
    lookupCommand->add_option("--context", lookup->context, "Text around the words")->type_name("TEXT");
    lookupCommand->add_option("--client-context", lookup->clientContext, "Kind of the text: mail, article, …")
        ->type_name("KIND");
    lookupCommand->add_option("--domain", lookup->domain, "Domain of the tapped hint")->type_name("DOMAIN");
    tools::takesName(lookupCommand->add_option("--selection", lookup->selection,
                                               "How the words were selected: default, explicit, or hint"),
                     "HOW", {{"default", 0}, {"explicit", 1}, {"hint", 2}});
    onChosen(lookupCommand, [lookup](const Options& common) {
        TAVLookupRequest request;
        request.queryString = lookup->what;
        request.triggerEvent = StartSearchTrigger::Lookup;
        request.queryContext = given(lookup->context);
        request.clientContext = given(lookup->clientContext);
        request.hintDomain = given(lookup->domain);
        request.selectionType = static_cast<LookupSelectionType>(lookup->selection);
        return run(common, *lookup, request);
    });

    auto flight = std::make_shared<RequestOptions>();
    CLI::App* flightCommand = add(app, "flight", "Show a flight by its number, or search for flights", flight);
    flightCommand->add_option("flight", flight->what, "Flight number, or text to search for")->required();
    flightCommand->add_flag("--search", flight->searchFlights, "Search for flights instead of one number");
    onChosen(flightCommand, [flight](const Options& common) {
        std::unique_ptr<TAVRequest> request;
        if (flight->searchFlights)
            request = std::make_unique<TAVFlightSearchRequest>();
        else
            request = std::make_unique<TAVFlightLookupRequest>();
        request->queryString = flight->what;
        return run(common, *flight, *request);
    });
}

} // namespace tavrin::ctl
