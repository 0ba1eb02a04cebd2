#pragma once

#include <array>
#include <bit>
#include <cstdint>
#include <string>
#include <string_view>

namespace platform::test {

/// Raw DEFLATE of a text of at most 65,535 bytes: one block, stored.
inline std::string storedDeflate(std::string_view text)
{
    std::string packed = "\x01";
    for (const std::size_t part : {text.size(), text.size() >> 8, ~text.size(), ~text.size() >> 8})
        packed += static_cast<char>(part & 0xff);
    return packed.append(text);
}

/// An archive as a record of a session file.
inline std::string framed(std::string_view archive)
{
    const auto length = std::bit_cast<std::array<char, 8>>(std::uint64_t{archive.size()});
    return std::string(length.data(), length.size()).append(archive);
}

} // namespace platform::test
