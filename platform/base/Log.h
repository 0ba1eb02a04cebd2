#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include <fmt/core.h>

namespace platform {

/// Levels from the least to the most grave. Default is what an operator reads day by day; an error is a failure
/// that was handled; a fault is a mistake in the program or its caller.
enum class LogLevel { Debug, Info, Default, Error, Fault };

/// A log handle: one category of one subsystem. Handles live as long as the process. Any thread.
///
/// A message below the threshold costs one load; its arguments are not formatted.
class Log {
public:
    Log(std::string_view subsystem, std::string_view category) : _subsystem(subsystem), _category(category) {}

    template <class... Args> void debug(fmt::format_string<Args...> text, Args&&... args) const
    {
        write(LogLevel::Debug, text, args...);
    }
    template <class... Args> void info(fmt::format_string<Args...> text, Args&&... args) const
    {
        write(LogLevel::Info, text, args...);
    }
    /// At the default level.
    template <class... Args> void log(fmt::format_string<Args...> text, Args&&... args) const
    {
        write(LogLevel::Default, text, args...);
    }
    template <class... Args> void error(fmt::format_string<Args...> text, Args&&... args) const
    {
        write(LogLevel::Error, text, args...);
    }
    template <class... Args> void fault(fmt::format_string<Args...> text, Args&&... args) const
    {
        write(LogLevel::Fault, text, args...);
    }

    [[nodiscard]] static bool enabled(LogLevel level) { return level >= threshold.load(std::memory_order_relaxed); }
    [[nodiscard]] const std::string& category() const { return _category; }
    [[nodiscard]] const std::string& subsystem() const { return _subsystem; }

    /// The lowest level that is written. Default until someone sets it.
    static std::atomic<LogLevel> threshold;

private:
    template <class... Args> void write(LogLevel level, fmt::string_view text, const Args&... args) const
    {
        if (enabled(level)) emit(level, fmt::vformat(text, fmt::make_format_args(args...)));
    }
    void emit(LogLevel level, std::string text) const;

    std::string _subsystem;
    std::string _category;
};

/// One written line.
struct LogLine {
    LogLevel level;
    std::string_view subsystem;
    std::string_view category;
    std::string_view text;
};

/// Where lines go: standard error until something else is chosen. Not while other threads log.
enum class LogSink { StandardError, Journal };
void setLogSink(LogSink sink, std::string_view program);

/// Sees every line at every level while it lives, beside the sink; lowers the threshold to Debug. For tests and
/// diagnostics; one at a time; called on the logging thread.
class LogTap {
public:
    explicit LogTap(std::function<void(const LogLine&)> tap);
    ~LogTap();
    LogTap(const LogTap&) = delete;
    LogTap& operator=(const LogTap&) = delete;

private:
    LogLevel _previousThreshold;
};

[[nodiscard]] std::string_view logLevelName(LogLevel level);

/// The process's default log, for what belongs to no category.
[[nodiscard]] const Log& defaultLog();

} // namespace platform
