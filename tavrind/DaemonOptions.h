#pragma once

#include "platform/base/Log.h"

namespace tavrin {

struct DaemonOptions {
    bool logToJournal = false;
    platform::LogLevel logLevel = platform::LogLevel::Default;
};

/// Reads the command line; prints help, the version or what is wrong with it, and exits, where that is asked for.
[[nodiscard]] DaemonOptions parseDaemonOptions(int argc, char** argv);

} // namespace tavrin
