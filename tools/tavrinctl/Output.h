#pragma once

#include <string>
#include <string_view>

#include "platform/values/Value.h"

/// Standard output of all commands. One thread.
namespace tavrin::ctl {

/// From now on until the first output, shows a user at a terminal for how many seconds the command has been waiting.
void startProgress();
/// Removes the progress from the terminal. The functions below call it.
void endProgress();

/// Sends the output of this command through a pager if it goes to a terminal. The pager is the first one set of
/// $TAVRINCTL_PAGER, $PAGER and "less"; an empty name or "cat" is none.
void pageOutput();
/// Flushes the output and waits until the user has left the pager.
void endOutput();

/// Prints a text as it is, and flushes it. Throws `Failure` if it can't be written.
void printText(std::string_view text);
/// Prints a line and flushes it: readers of a pipe see each answer at once.
void printLine(const std::string& text);
/// Prints a value as indented JSON.
void printJson(const platform::Value& value);

/// Makes SIGINT and SIGTERM end the program with status 0, for commands that have no other end.
void endOnSignal();

/// Returns true if standard output is a terminal and NO_COLOR is not set.
[[nodiscard]] bool colours();
[[nodiscard]] std::string bold(const std::string& text);
[[nodiscard]] std::string dim(const std::string& text);

} // namespace tavrin::ctl
