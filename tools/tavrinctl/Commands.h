#pragma once

#include <functional>
#include <string>
#include <vector>

#include "tools/tavrinctl/Tool.h"

namespace CLI {
class App;
}

/// The commands. Each function adds its subcommands to `app`; parsing the command line sets `chosen` to the one given.
namespace tavrin::ctl {

/// Runs a command after the command line was parsed. Throws `Failure`.
using Command = std::function<void(const Options&)>;
/// Returns the command with its output in a pager.
template <class Action> Command paged(Action action)
{
    return [action](const Options& options) {
        pageOutput();
        action(options);
    };
}

/// Adds --item, which takes one NAME=VALUE each time.
void addItemOption(CLI::App& command, std::vector<std::string>& items);

void addSearchCommand(CLI::App& app, Command& chosen);
/// zkw, more, card, lookup, flight and warm.
void addOtherRequestCommands(CLI::App& app, Command& chosen);
/// images.
void addImagesCommand(CLI::App& app, Command& chosen);
/// bag, sessions, status and stats.
void addInspectCommands(CLI::App& app, Command& chosen);
/// resource.
void addResourceCommand(CLI::App& app, Command& chosen);
/// watch; flush watch, stop and dump.
void addFlusherCommands(CLI::App& app, Command& chosen);
/// feedback, and feedback send and records.
void addFeedbackCommands(CLI::App& app, Command& chosen);
/// session.
void addSessionCommand(CLI::App& app, Command& chosen);
/// defaults read, write, delete and list.
void addDefaultsCommands(CLI::App& app, Command& chosen);
/// doctor.
void addDoctorCommand(CLI::App& app, Command& chosen);
/// preview uploads and search.
void addPreviewCommand(CLI::App& app, Command& chosen);
/// wipe.
void addWipeCommand(CLI::App& app, Command& chosen);
/// top.
void addTopCommand(CLI::App& app, Command& chosen);
/// activity add and list.
void addActivityCommands(CLI::App& app, Command& chosen);

} // namespace tavrin::ctl
