#pragma once

#include <cstddef>
#include <cstdio>
#include <filesystem>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace CLI {
class App;
class Error;
class Option;
class ParseError;
} // namespace CLI

/// What the tools share to read their command lines, and to say what is wrong with one.
namespace tavrin::tools {

/// Exit statuses of all tools. A tool that Ctrl-C ends dies from SIGINT, which a shell reports as 130.
inline constexpr int kFailed = 1;
inline constexpr int kWrongUsage = 2;

/// Returns the candidate that was probably meant by `typed`: the nearest one, with at most a quarter of the letters (or
/// one) wrong, missing, surplus or swapped, ignoring case. Returns an empty text if there is none, or if `typed` is a
/// candidate.
[[nodiscard]] std::string nearest(std::string_view typed, const std::vector<std::string>& candidates);
/// Returns "; did you mean NEAREST?", or an empty text.
[[nodiscard]] std::string didYouMean(std::string_view typed, const std::vector<std::string>& candidates);

/// Accepts only numbers from `low` to `high`. The option's help shows `placeholder` for its value.
void takesNumber(CLI::Option* option, const std::string& placeholder, double low, double high);
/// The same for whole numbers.
void takesWholeNumber(CLI::Option* option, const std::string& placeholder, double low, double high);
/// Accepts the names, which stand for numbers, and the numbers themselves.
void takesName(CLI::Option* option, const std::string& placeholder, std::vector<std::pair<std::string, int>> names);

/// Adds --address and --identifier: where the daemon is, and as which client the tool connects.
void addConnectionOptions(CLI::App& app, std::string& address, std::string& identifier);

/// Makes the help of `app` and of its commands readable: placeholders for values, defaults in brackets, and the options
/// of `app` under "Global options" in the help of each command. Call it before commands are added.
void useReadableHelp(CLI::App& app);

/// Returns what is wrong with the command line in one line, for example "unknown command serch; did you mean search?".
[[nodiscard]] std::string complaint(const CLI::App& app, const CLI::ParseError& error);
/// Handles the end of parsing: prints the help or the version for its option, else the complaint with the name of the
/// program. Returns the exit status.
[[nodiscard]] int endOfParsing(const CLI::App& app, const CLI::ParseError& error, const std::string& program);

/// Returns the absolute path of a file that the user names, with links followed: `platform::Files` follows none.
[[nodiscard]] std::filesystem::path resolved(const std::string& path);
/// Writes all of `text` to a stream and flushes it. Returns an error message, or an empty text.
[[nodiscard]] std::string writeTo(std::FILE* stream, std::string_view text);

/// Returns the size in bytes of the control character at the beginning of a text, or 0 if there is none.
[[nodiscard]] std::size_t controlLength(std::string_view text);
/// Replaces control characters by blanks, so that a text that others chose can't control the terminal.
[[nodiscard]] std::string printable(std::string_view text);
/// Escapes the control characters that JSON texts may contain: DEL, and those beyond ASCII. The result parses to the
/// same value.
[[nodiscard]] std::string printableJson(std::string_view json);

} // namespace tavrin::tools
