// tavrinctl: a client of the daemon for people and scripts.

#include <cstdio>
#include <cstdlib>
#include <ranges>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Commands.h"

namespace {

namespace tools = tavrin::tools;
using tavrin::ctl::Failure;

/// Prints the help of the command with these names; of the program without names.
void printHelp(const CLI::App& app, const std::vector<std::string>& names)
{
    const CLI::App* command = &app;
    std::string path; // of the command's parents
    for (const std::string& name : names) {
        const CLI::App* next = nullptr;
        std::vector<std::string> known;
        for (const CLI::App* each : command->get_subcommands([](const CLI::App*) { return true; })) {
            if (each->get_name() == name) next = each;
            known.push_back(each->get_name());
        }
        if (!next)
            throw Failure(fmt::format("unknown command {}{}", name, tools::didYouMean(name, known)),
                          tools::kWrongUsage);
        path += (path.empty() ? "" : " ") + command->get_name();
        command = next;
    }
    tavrin::ctl::printText(command->help(path));
}

/// Says on standard error why the command failed; file names may hold control characters.
void complain(std::string_view what)
{
    std::string text = "tavrinctl:";
    char before = ' ';
    for (const auto line : std::views::split(what, '\n')) {
        text += std::exchange(before, '\n') + tavrin::ctl::printable(std::string_view(line));
    }
    std::fprintf(stderr, "%s\n", text.c_str());
}

} // namespace

int main(int argc, char** argv)
{
    using namespace tavrin::ctl;

    Options options;
    Command chosen;
    CLI::App app("Sends searches to the daemon, and shows its state, its counters and its feedback.", "tavrinctl");
    tools::useReadableHelp(app);
    app.set_version_flag("--version", "tavrinctl " TAVRIND_VERSION);
    app.fallthrough();
    app.require_subcommand(0, 1);
    app.add_flag("--json", options.json, "Print JSON");
    tools::addConnectionOptions(app, options.address, options.identifier);
    app.add_option("--agent", options.agent, "User agent, which selects this client's view of the bag")
        ->type_name("NAME/VERSION")
        ->capture_default_str();
    tools::takesNumber(app.add_option("--timeout", options.timeout, "How long to wait for an answer, in seconds")
                           ->capture_default_str()
                           ->take_last(),
                       "SECONDS", 0.001, 86400);
    tools::takesWholeNumber(
        app.add_option("-n,--limit", options.limit, "Results to list; 0 lists all")->capture_default_str(), "COUNT", 0,
        1e9);
    app.footer("Exit status: 0 if the command succeeded, 1 if it failed, 2 if it was used wrongly, 130 after Ctrl-C.\n"
               "\"tavrinctl help COMMAND\" explains a command; \"tavrinctl doctor\" looks for what is wrong.");
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
    addDoctorCommand(app, chosen);
    addPreviewCommand(app, chosen);
    addTopCommand(app, chosen);
    addWipeCommand(app, chosen);
    std::vector<std::string> names;
    CLI::App* help = app.add_subcommand("help", "Explain a command");
    help->add_option("command", names, "The command, and its own command");
    help->callback([&] { chosen = paged([&](const Options&) { printHelp(app, names); }); });

    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return tools::endOfParsing(app, error, "tavrinctl");
    }
    if (!chosen) {
        std::fputs(app.help().c_str(), stderr);
        return tools::kWrongUsage;
    }
    int status = EXIT_SUCCESS;
    try {
        startProgress();
        chosen(options);
    } catch (const Failure& failure) {
        status = failure.status;
        endOutput();
        if (*failure.what()) complain(failure.what());
    } catch (const std::exception& error) { // of the file system, for example: the working directory is gone
        status = EXIT_FAILURE;
        endOutput();
        complain(error.what());
    }
    endOutput();
    return status;
}
