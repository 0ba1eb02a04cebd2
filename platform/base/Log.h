#pragma once

#include <atomic>
#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <type_traits>

#include <fmt/core.h>

namespace platform {

/// Levels in order of severity. Default is what operators read every day. Error is a failure that was handled; Fault is
/// a bug in the program or its caller.
enum class LogLevel { Debug, Info, Default, Error, Fault };

/// Marks an argument that reveals what the user typed, saw or received: queries, URLs, titles, bodies. It is logged as
/// "<private>", except at the debug level or if `Log::privateData` is set. The text must outlive the log call.
struct Private {
    std::string_view text;
};

/// A log handle: one category of one subsystem. Any thread; a handle must outlive every call.
///
/// A message below the threshold costs one atomic load: its arguments are not formatted. Text arguments are cut at
/// `kLongestArgument` bytes. Control characters are escaped, so that no argument can forge a line.
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
    /// Writes at LogLevel::Default.
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

    /// The lowest level that is written; Default at start.
    static std::atomic<LogLevel> threshold;
    /// If true, private arguments are written at all levels; false at start.
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
    /// Cuts a text at a character boundary after at most `kLongestArgument` bytes and appends "…".
    static std::string shortened(std::string_view text);
    void emit(LogLevel level, std::string text) const;

    std::string _subsystem;
    std::string _category;
};

/// One line as a tap sees it. The texts are valid during the call.
struct LogLine {
    LogLevel level;
    std::string_view subsystem;
    std::string_view category;
    std::string_view text;
};

/// Where lines go: standard error at start. Call `setLogSink` before other threads log. `program` is the journal's
/// identifier.
enum class LogSink { StandardError, Journal };
void setLogSink(LogSink sink, std::string_view program);

/// Passes every line of every level to `tap` while it exists, in addition to the sink. For tests and diagnostics.
///
/// Lowers the threshold to Debug; the sink keeps its old threshold. At most one tap may exist. `tap` runs on the
/// logging thread, under a lock, and must not log.
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

/// Returns the log for messages without a category.
[[nodiscard]] const Log& defaultLog();

} // namespace platform

/// Needed only for the compile-time check of formats: `Log` replaces a `Private` before it formats.
template <> struct fmt::formatter<platform::Private> : formatter<std::string_view> {
    auto format(const platform::Private&, format_context& context) const
    {
        return formatter<std::string_view>::format("<private>", context);
    }
};
