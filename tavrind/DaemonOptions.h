#pragma once

#include <string>

#include "platform/base/Log.h"

namespace tavrin {

struct DaemonOptions {
    bool logToJournal = false;
    platform::LogLevel logLevel = platform::LogLevel::Default;
    bool checkQueues = false;
    std::string etc = "/etc";
    std::string wipe; ///< what to remove before the start: "traces", "settings" (both), or nothing
};

/// Parses the command line. For --help, --version and invalid options, prints a text and ends the process.
[[nodiscard]] DaemonOptions parseDaemonOptions(int argc, char** argv);

} // namespace tavrin
