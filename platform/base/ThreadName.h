#pragma once

#include <string_view>

namespace platform {

/// Names the calling thread after the last component of a label ("com.example.service.cache" → "cache"), so that a
/// debugger and `top -H` show it. Linux limits names to 15 bytes; longer ones are cut. Makes no system call if the
/// thread has that name already.
void setThreadNameForLabel(std::string_view label);

} // namespace platform
