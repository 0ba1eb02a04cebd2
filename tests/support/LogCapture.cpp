#include "tests/support/LogCapture.h"

#include <algorithm>

namespace platform::test {

int LogCapture::count(std::string_view part) const
{
    std::lock_guard lock(_mutex);
    return static_cast<int>(std::ranges::count_if(_lines, [&](const Line& line) { return line.text.contains(part); }));
}

bool LogCapture::has(LogLevel level, std::string_view category, std::string_view part) const
{
    std::lock_guard lock(_mutex);
    return std::ranges::any_of(_lines, [&](const Line& line) {
        return line.level == level && line.category == category && line.text.contains(part);
    });
}

} // namespace platform::test
