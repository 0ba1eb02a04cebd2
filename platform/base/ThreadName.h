#pragma once

#include <string_view>

namespace platform {

/// Names the calling thread after the last word of a queue's label ("com.example.service.cache" → "cache",
/// 15 bytes at most), so that a debugger and `top -H` show who works. Costs nothing where the name is set already.
void setThreadNameForLabel(std::string_view label);

} // namespace platform
