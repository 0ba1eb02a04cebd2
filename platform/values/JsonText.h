#pragma once

#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

#include <fmt/format.h>
#include <openssl/evp.h>
#include <simdjson.h>

/// How values look in JSON text. A sink has `put(char)` and `put(std::string_view)`.
namespace platform::json {

template <class Sink, class Number, class... Format> void putNumber(Sink& sink, Number number, Format... format)
{
    std::array<char, 32> digits;
    const auto result = std::to_chars(digits.begin(), digits.end(), number, format...);
    sink.put(std::string_view(digits.begin(), result.ptr));
}

template <class Sink> void putReal(Sink& sink, double number)
{
    // Readers take large doubles without an exponent for integers out of range, and "-0" for an integer zero.
    constexpr double kIntegerLimit = 9223372036854775808.0;
    if (!std::isfinite(number))
        sink.put("null");
    else if (std::abs(number) >= kIntegerLimit)
        putNumber(sink, number, std::chars_format::scientific);
    else if (number == 0 && std::signbit(number))
        sink.put("-0.0");
    else
        putNumber(sink, number);
}

/// Returns whether a text is ASCII and has nothing to escape.
inline bool isPlain(std::string_view text)
{
    constexpr std::uint64_t kOnes = 0x0101010101010101;
    constexpr std::uint64_t kHigh = 0x8080808080808080;
    const auto hasZero = [](std::uint64_t bytes) { return (bytes - kOnes) & ~bytes & kHigh; };
    std::uint64_t found = 0;
    while (!text.empty()) {
        std::uint64_t bytes = kOnes * ' '; // plain
        const std::size_t count = std::min(text.size(), sizeof(bytes));
        std::memcpy(&bytes, text.data(), count);
        const std::uint64_t control = (bytes - kOnes * ' ') & ~bytes;
        found |= (bytes | control) & kHigh;
        found |= hasZero(bytes ^ (kOnes * '"')) | hasZero(bytes ^ (kOnes * '\\'));
        text.remove_prefix(count);
    }
    return found == 0;
}

/// Replaces each byte that is not part of valid UTF-8 by U+FFFD.
inline std::string repaired(std::string_view text)
{
    std::string valid;
    valid.reserve(text.size() + 16);
    for (std::size_t i = 0; i < text.size();) {
        const auto lead = static_cast<unsigned char>(text[i]);
        const std::size_t length = lead < 0x80 ? 1 : lead < 0xe0 ? 2 : lead < 0xf0 ? 3 : 4;
        const std::string_view character = text.substr(i, length);
        if (character.size() == length && simdjson::validate_utf8(character)) {
            valid += character;
            i += length;
        } else {
            valid += "\xef\xbf\xbd";
            ++i;
        }
    }
    return valid;
}

/// Returns how a byte is written in a string; empty for a byte that stays as it is.
inline std::string escaped(char c)
{
    switch (c) {
    case '"': return "\\\"";
    case '\\': return "\\\\";
    case '\b': return "\\b";
    case '\f': return "\\f";
    case '\n': return "\\n";
    case '\r': return "\\r";
    case '\t': return "\\t";
    default: return static_cast<unsigned char>(c) < 0x20 ? fmt::format("\\u{:04x}", c) : std::string();
    }
}

template <class Sink> void putString(Sink& sink, std::string_view text)
{
    sink.put('"');
    if (isPlain(text)) {
        sink.put(text);
    } else {
        const std::string valid = simdjson::validate_utf8(text) ? std::string() : repaired(text);
        if (!valid.empty()) text = valid;
        std::size_t begin = 0;
        for (std::size_t i = 0; i < text.size(); ++i) {
            const auto c = static_cast<unsigned char>(text[i]);
            if (c >= 0x20 && c != '"' && c != '\\') continue;
            sink.put(text.substr(begin, i - begin));
            sink.put(escaped(text[i]));
            begin = i + 1;
        }
        sink.put(text.substr(begin));
    }
    sink.put('"');
}

template <class Sink> void putBase64(Sink& sink, std::string_view bytes)
{
    constexpr std::size_t kChunk = 3 * 1024;
    std::array<unsigned char, kChunk / 3 * 4 + 1> encoded;
    sink.put('"');
    for (; !bytes.empty(); bytes.remove_prefix(std::min(kChunk, bytes.size()))) {
        const int length = EVP_EncodeBlock(encoded.data(), reinterpret_cast<const unsigned char*>(bytes.data()),
                                           static_cast<int>(std::min(kChunk, bytes.size())));
        sink.put(std::string_view(reinterpret_cast<const char*>(encoded.data()), static_cast<std::size_t>(length)));
    }
    sink.put('"');
}

} // namespace platform::json
