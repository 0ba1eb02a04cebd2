#include "platform/base/Log.h"

#include <algorithm>

#include <spdlog/sinks/stdout_sinks.h>
#include <spdlog/sinks/systemd_sink.h>
#include <spdlog/spdlog.h>

#include "platform/base/Mutex.h"

namespace platform {

std::atomic<LogLevel> Log::threshold = LogLevel::Default;
std::atomic<bool> Log::privateData = false;

namespace {

spdlog::level::level_enum spdlogLevel(LogLevel level)
{
    switch (level) {
    case LogLevel::Debug: return spdlog::level::debug;
    case LogLevel::Info: return spdlog::level::info;
    case LogLevel::Default: return spdlog::level::warn; // above info
    case LogLevel::Error: return spdlog::level::err;
    case LogLevel::Fault: return spdlog::level::critical;
    }
    return spdlog::level::err;
}

/// Returns the sink, which is leaked: threads may log while the process exits.
std::shared_ptr<spdlog::logger>& sink()
{
    static auto& logger = *new std::shared_ptr<spdlog::logger>([] {
        auto standardError =
            std::make_shared<spdlog::logger>("stderr", std::make_shared<spdlog::sinks::stderr_sink_mt>());
        standardError->set_pattern("%Y-%m-%d %H:%M:%S.%e %v");
        standardError->set_level(spdlog::level::trace);
        return standardError;
    }());
    return logger;
}

Mutex tapMutex;
std::function<void(const LogLine&)> tap GUARDED_BY(tapMutex);
std::atomic<bool> tapped = false;
std::atomic<LogLevel> sinkThreshold = LogLevel::Debug; // raised while a tap has lowered `Log::threshold`

std::string withoutControlCharacters(std::string text)
{
    const auto isControl = [](unsigned char c) { return c < 0x20 || c == 0x7f; };
    if (std::ranges::none_of(text, isControl)) return text;
    std::string escaped;
    for (unsigned char c : text) {
        if (isControl(c))
            fmt::format_to(std::back_inserter(escaped), "\\x{:02x}", c);
        else
            escaped.push_back(static_cast<char>(c));
    }
    return escaped;
}

} // namespace

std::string_view logLevelName(LogLevel level)
{
    switch (level) {
    case LogLevel::Debug: return "debug";
    case LogLevel::Info: return "info";
    case LogLevel::Default: return "default";
    case LogLevel::Error: return "error";
    case LogLevel::Fault: return "fault";
    }
    return "";
}

std::string Log::shortened(std::string_view text)
{
    if (text.size() <= kLongestArgument) return std::string(text);
    std::size_t end = kLongestArgument;
    while (end > 0 && (static_cast<unsigned char>(text[end]) & 0xc0) == 0x80) --end;
    return std::string(text.substr(0, end)) + "…";
}

void Log::emit(LogLevel level, std::string text) const
{
    text = withoutControlCharacters(std::move(text));
    if (tapped) {
        MutexLock lock(tapMutex);
        if (tap) tap({level, _subsystem, _category, text});
    }
    if (level < sinkThreshold) return;
    sink()->log(spdlogLevel(level), "{:<7} [{}] {}", logLevelName(level), _category, text);
}

void setLogSink(LogSink kind, std::string_view program)
{
    if (kind == LogSink::StandardError) return;
    auto journal = std::make_shared<spdlog::logger>(
        std::string(program), std::make_shared<spdlog::sinks::systemd_sink_mt>(std::string(program)));
    journal->set_level(spdlog::level::trace);
    sink() = std::move(journal);
}

LogTap::LogTap(std::function<void(const LogLine&)> newTap) : _previousThreshold(Log::threshold)
{
    MutexLock lock(tapMutex);
    tap = std::move(newTap);
    tapped = true;
    sinkThreshold = _previousThreshold;
    Log::threshold = LogLevel::Debug;
}

LogTap::~LogTap()
{
    MutexLock lock(tapMutex);
    tap = nullptr;
    tapped = false;
    sinkThreshold = LogLevel::Debug;
    Log::threshold = _previousThreshold;
}

const Log& defaultLog()
{
    static const Log& log = *new Log("", "default");
    return log;
}

} // namespace platform
