#pragma once

#include <fstream>
#include <sstream>
#include <string>
#include <string_view>

#include <fmt/format.h>

namespace platform::test {

/// The bytes of the first block "hexdump" in a page of docs/: lines of an offset, bytes in hexadecimal, and what they
/// mean behind a bar. Empty if the page has none.
inline std::string hexDumpIn(const std::string& page)
{
    std::ifstream file(std::string(SOURCE_DIR "/docs/") + page);
    std::string bytes;
    bool inside = false;
    for (std::string line; std::getline(file, line);) {
        if (line.starts_with("```")) {
            if (inside) break;
            inside = line == "```hexdump";
            continue;
        }
        if (!inside) continue;
        std::istringstream words(line.substr(0, line.find('|')));
        std::string word;
        words >> word; // the offset
        while (words >> word) bytes += static_cast<char>(std::stoi(word, nullptr, 16));
    }
    return bytes;
}

/// The same bytes as text, 16 to a line, for a page and for failures.
inline std::string hexDump(std::string_view bytes)
{
    std::string text;
    for (std::size_t i = 0; i < bytes.size(); ++i)
        text += fmt::format("{:02x}{}", static_cast<unsigned char>(bytes[i]), i % 16 == 15 ? "\n" : " ");
    return text;
}

} // namespace platform::test
