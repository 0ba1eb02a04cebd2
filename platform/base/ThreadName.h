#pragma once

#include <string_view>

namespace platform {

/// Names the calling thread after the last word of a queue's label ("com.example.service.cache" → "cache",
/// at most 15 bytes), so that a debugger and `top -H` show who works. Costs nothing if the name is set already.
void setThreadNameForLabel(std::string_view label);

} // namespace platform
