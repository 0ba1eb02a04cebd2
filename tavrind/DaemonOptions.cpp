#include "tavrind/DaemonOptions.h"

#include <cstdio>
#include <cstdlib>
#include <map>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

namespace tavrin {

DaemonOptions parseDaemonOptions(int argc, char** argv)
{
    DaemonOptions options;
    options.logToJournal = std::getenv("JOURNAL_STREAM") != nullptr; // set by systemd for its services

    CLI::App app("The search daemon. It listens on $XDG_RUNTIME_DIR/com.quorvane.tavrind/socket, or on the socket that "
                 "systemd passes, and runs until it is killed. Settings: tavrinctl defaults.");
    app.set_version_flag("--version", "tavrind " TAVRIND_VERSION);
    const std::map<std::string, platform::LogLevel> levels{{"debug", platform::LogLevel::Debug},
                                                           {"info", platform::LogLevel::Info},
                                                           {"default", platform::LogLevel::Default},
                                                           {"error", platform::LogLevel::Error},
                                                           {"fault", platform::LogLevel::Fault}};
    app.add_option("--log-level", options.logLevel, "Lowest level that is logged (default: default)")
        ->transform(CLI::CheckedTransformer(levels, CLI::ignore_case).description("{debug,info,default,error,fault}"));
    std::string sink;
    app.add_option("--log-to", sink, "Where the log goes (default: the journal under systemd, else stderr)")
        ->check(CLI::IsMember({"stderr", "journal"}));
    app.add_flag("--check-queues", options.checkQueues,
                 "Abort with an explanation if queues may wait for each other (for development)");
    app.add_option("--etc", options.etc, "Where locale, time zone and keyboard are read (for development)")
        ->check(CLI::ExistingDirectory)
        ->capture_default_str();
    app.add_option(
           "--wipe", options.wipe,
           "Before the start, remove everything that is kept about the users: traces, or settings, too. No other "
           "daemon may run")
        ->check(CLI::IsMember({"traces", "settings"}));
    try {
        app.parse(argc, argv);
    } catch (const CLI::Success& asked) { // for the help or the version
        std::exit(app.exit(asked));
    } catch (const CLI::ParseError& error) {
        const std::vector<std::string> left = app.remaining();
        std::fprintf(stderr, "tavrind: %s\nSee \"tavrind --help\".\n",
                     left.empty() ? error.what() : ("unknown argument " + left.front()).c_str());
        std::exit(2);
    }
    if (!sink.empty()) options.logToJournal = sink == "journal";
    return options;
}

} // namespace tavrin
