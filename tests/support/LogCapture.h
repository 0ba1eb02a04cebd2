#pragma once

#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Log.h"

namespace platform::test {

/// Collects what is logged while it lives.
class LogCapture {
public:
    /// Lines that contain `part`.
    [[nodiscard]] int count(std::string_view part) const;
    [[nodiscard]] bool has(LogLevel level, std::string_view category, std::string_view part) const;

private:
    struct Line {
        LogLevel level;
        std::string category;
        std::string text;
    };
    mutable std::mutex _mutex;
    std::vector<Line> _lines;
    LogTap _tap{[this](const LogLine& line) {
        std::lock_guard lock(_mutex);
        _lines.push_back({line.level, std::string(line.category), std::string(line.text)});
    }};
};

} // namespace platform::test
