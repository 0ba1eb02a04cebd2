// tavrinctl wipe: removes every trace of the users, with or without a running daemon.

#include <chrono>
#include <cstdio>
#include <iostream>
#include <poll.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/Traces.h"
#include "platform/files/Files.h"
#include "platform/ipc/ListenSocket.h"
#include "platform/values/Dictionary.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Commands.h"

namespace tavrin::ctl {

using platform::Value;

namespace {

struct WipeOptions {
    bool yes = false;
    bool settings = false;
};

constexpr int kPause = 50; // milliseconds between attempts to reach the new daemon

void ask(bool settings)
{
    endProgress();
    if (isatty(STDIN_FILENO) != 1) throw Failure("wipe needs a terminal to ask, or --yes", tools::kWrongUsage);
    fmt::print(stderr,
               "This ends all sessions and removes feedback, waiting uploads and downloads, caches, counters, private\n"
               "statistics{}. It can't be undone. Continue? [y/N] ",
               settings ? ", and all settings" : "");
    std::string answer;
    if (!std::getline(std::cin, answer) || (answer != "y" && answer != "yes")) throw Failure("nothing was removed");
}

/// Waits until the daemon that starts again serves its socket: it has removed everything by then. Throws `Failure`.
void awaitRestart(const Options& options)
{
    const auto end = std::chrono::steady_clock::now() + platform::durationFromSeconds(options.timeout);
    while (std::chrono::steady_clock::now() < end) {
        if (const auto client = TAVClient::connect(options.address)) {
            (*client)->setTimeout(platform::durationFromSeconds(options.timeout));
            const auto status = (*client)->status();
            if (status && (*status)["wiped"] == Value(true)) return;
            if (status) throw Failure("the daemon did not remove its traces; its log says why");
        }
        poll(nullptr, 0, kPause);
    }
    throw Failure("the daemon has not come back; start it, and look at its log");
}

/// Removes the traces in the directories of this environment. Holds the daemon's socket meanwhile, so that no daemon
/// uses them. Throws `Failure`.
void removeWithoutDaemon(bool settings)
{
    const platform::Directories directories = platform::Directories::fromEnvironment();
    const auto socket = platform::ipc::ListenSocket::bindExclusive(TAVClient::defaultSocket());
    if (!socket)
        throw Failure(fmt::format("a daemon may be running, but doesn't answer ({}).\n"
                                  "Stop it: systemctl --user stop tavrind.socket tavrind.service",
                                  socket.error().reason()));
    std::string lines;
    for (const std::string& problem : removeTraces(directories, settings)) lines += "\n  " + problem;
    if (!lines.empty()) throw Failure("not everything could be removed:" + lines);
}

void wipe(const Options& options, const WipeOptions& mine)
{
    if (!mine.yes) ask(mine.settings);
    const auto client = TAVClient::connect(options.address);
    if (client) {
        (*client)->setTimeout(platform::durationFromSeconds(options.timeout));
        if (const auto wiped = (*client)->wipe(mine.settings); !wiped) throw Failure(wiped.error().reason());
        awaitRestart(options);
    } else {
        if (options.address != TAVClient::defaultAddress())
            throw Failure(fmt::format("no daemon answers at {} ({})", options.address, client.error().reason()));
        removeWithoutDaemon(mine.settings);
    }
    if (options.json) return printJson(Value::dictionaryOf({{"wiped", true}, {"daemon", client.has_value()}}));
    printLine(client ? "Removed. The daemon has started again with nothing." : "Removed; no daemon was running.");
}

} // namespace

void addWipeCommand(CLI::App& app, Command& chosen)
{
    auto options = std::make_shared<WipeOptions>();
    CLI::App* command = app.add_subcommand("wipe", "Remove everything that is kept about the users");
    command->add_flag("-y,--yes", options->yes, "Don't ask");
    command->add_flag("--settings", options->settings, "Remove all settings, too");
    command->footer(
        "A running daemon ends all connections and starts again without its traces. device.json, which is the\n"
        "device's, and subscriptions.d, which is the content providers', stay.");
    command->callback([&chosen, options] { chosen = [options](const Options& common) { wipe(common, *options); }; });
}

} // namespace tavrin::ctl
