#pragma once

#include <atomic>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <type_traits>

#include <fmt/core.h>

namespace platform {

/// Levels in order of gravity. Operators read Default day by day. Error is a failure that was handled, Fault a mistake
/// in the program or its caller.
enum class LogLevel { Debug, Info, Default, Error, Fault };

/// Marks an argument that tells what the user typed, saw or received: queries, URLs, titles, bodies. It is logged as
/// "<private>", except at the debug level or if `Log::privateData` is set. The text must outlive the log call.
struct Private {
    std::string_view text;
};

/// A log handle: one category of one subsystem. Any thread; handles must outlive every call.
///
/// A message below the threshold costs one load: its arguments are not formatted. Of every text argument at most
/// `kLongestArgument` bytes are written. Control characters are escaped, so that no argument can forge a line.
class Log {
public:
    static constexpr std::size_t kLongestArgument = 200;

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

    /// The lowest level that is written; initially Default.
    static std::atomic<LogLevel> threshold;
    /// Whether private arguments are written at all levels; initially not.
    static std::atomic<bool> privateData;

private:
    template <class... Args> void write(LogLevel level, fmt::string_view text, const Args&... args) const
    {
        if (enabled(level)) emit(level, fmt::vformat(text, fmt::make_format_args(writable(level, args)...)));
    }
    template <class T> static decltype(auto) writable(LogLevel level, const T& argument)
    {
        if constexpr (std::is_same_v<T, Private>)
            return level == LogLevel::Debug || privateData ? shortened(argument.text) : std::string("<private>");
        else if constexpr (std::is_convertible_v<const T&, std::string_view>)
            return shortened(argument);
        else
            return (argument);
    }
    /// Cuts a long text between two characters and marks the cut with "…".
    static std::string shortened(std::string_view text);
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

/// Where lines go; initially to standard error. Not to be changed while other threads log.
enum class LogSink { StandardError, Journal };
void setLogSink(LogSink sink, std::string_view program);

/// Sees every line of every level while it lives, in addition to the sink. For tests and diagnostics.
///
/// Lowers the threshold to Debug; the sink keeps the one before. One at a time. Runs on the logging thread and must not
/// log.
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

/// The process's default log, for messages of no category.
[[nodiscard]] const Log& defaultLog();

} // namespace platform

/// Lets the compiler check formats. `Log` itself never formats a `Private`.
template <> struct fmt::formatter<platform::Private> : formatter<std::string_view> {
    auto format(const platform::Private&, format_context& context) const
    {
        return formatter<std::string_view>::format("<private>", context);
    }
};
