#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <source_location>
#include <string>
#include <string_view>

#include "platform/base/Log.h"

/// What a fuzz target does with an input. Each target is one source, which defines it.
void runInput(std::string_view input);

/// Keeps the log quiet: writing it would take most of the time.
extern "C" int LLVMFuzzerInitialize(int*, char***)
{
    platform::Log::threshold = platform::LogLevel::Fault;
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    runInput({reinterpret_cast<const char*>(data), size});
    return 0;
}

/// Removes the first line of `text` and returns it without its end.
inline std::string_view takeLine(std::string_view& text)
{
    const std::string_view first = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(first.size() + 1, text.size()));
    return first;
}

/// Ends the process, which the fuzzer counts as a crash, unless `holds`. `seen` is what was found instead.
inline void check(bool holds, const std::string& seen = {},
                  std::source_location where = std::source_location::current())
{
    if (holds) return;
    std::fprintf(stderr, "%s:%u: does not hold%s%s\n", where.file_name(), where.line(), seen.empty() ? "" : ": ",
                 seen.c_str());
    std::abort();
}
