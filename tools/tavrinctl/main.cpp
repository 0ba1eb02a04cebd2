// tavrinctl: a client of the daemon for people and scripts.

#include <cstdio>
#include <cstdlib>

#include <CLI/CLI.hpp>

#include "tools/tavrinctl/Commands.h"

int main(int argc, char** argv)
{
    using namespace tavrin::ctl;

    Options options;
    Command chosen;
    CLI::App app("Sends searches to the daemon, and shows its state, its counters and its feedback.");
    app.set_version_flag("--version", "tavrinctl " TAVRIND_VERSION);
    app.fallthrough();
    app.require_subcommand(0, 1);
    app.add_flag("--json", options.json, "Print JSON");
    app.add_option("--address", options.address, "The daemon's D-Bus address")->capture_default_str();
    app.add_option("--identifier", options.identifier, "Client identifier to connect as")->capture_default_str();
    app.add_option("--agent", options.agent, "User agent, which selects this client's view of the bag")
        ->capture_default_str();
    app.add_option("--timeout", options.timeout, "Seconds to wait for an answer")
        ->check(CLI::Range(0.001, 86400.0))
        ->capture_default_str();
    app.add_option("-n,--limit", options.limit, "Results to list; 0 lists all")->capture_default_str();
    addSearchCommand(app, chosen);
    addOtherRequestCommands(app, chosen);
    addImagesCommand(app, chosen);
    addInspectCommands(app, chosen);
    addResourceCommand(app, chosen);
    addFlusherCommands(app, chosen);
    addFeedbackCommands(app, chosen);
    addSessionCommand(app, chosen);
    addDefaultsCommands(app, chosen);
    addActivityCommands(app, chosen);

    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? EXIT_SUCCESS : 2;
    }
    if (!chosen) {
        std::fputs(app.help().c_str(), stderr);
        return 2;
    }
    try {
        chosen(options);
    } catch (const Failure& failure) {
        if (*failure.what()) std::fprintf(stderr, "tavrinctl: %s\n", failure.what());
        return failure.status;
    }
    return EXIT_SUCCESS;
}
