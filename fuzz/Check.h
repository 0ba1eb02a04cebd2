#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <source_location>
#include <string>
#include <string_view>

/// The input of a fuzz target as text.
inline std::string_view textOf(const std::uint8_t* data, std::size_t size)
{
    return {reinterpret_cast<const char*>(data), size};
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

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);
