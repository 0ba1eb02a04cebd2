#include "platform/base/Uuid.h"

#include <cstdlib>

#include <openssl/rand.h>

namespace platform {

namespace {

constexpr std::size_t kTextLength = 36;

constexpr bool isDashPosition(std::size_t i)
{
    return i == 8 || i == 13 || i == 18 || i == 23;
}

/// Returns the value of a hexadecimal digit, or -1.
constexpr int digitValue(char c)
{
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

} // namespace

Uuid Uuid::random()
{
    std::array<std::uint8_t, 16> bytes;
    // Without randomness two identifiers could be equal. No caller can handle that.
    if (RAND_bytes(bytes.data(), static_cast<int>(bytes.size())) != 1) std::abort();
    bytes[6] = static_cast<std::uint8_t>((bytes[6] & 0x0f) | 0x40);
    bytes[8] = static_cast<std::uint8_t>((bytes[8] & 0x3f) | 0x80);
    return Uuid(bytes);
}

std::optional<Uuid> Uuid::parse(std::string_view text)
{
    if (text.size() != kTextLength) return std::nullopt;
    std::array<std::uint8_t, 16> bytes;
    auto byte = bytes.begin();
    for (std::size_t i = 0; i < kTextLength;) {
        if (isDashPosition(i)) {
            if (text[i++] != '-') return std::nullopt;
            continue;
        }
        const int high = digitValue(text[i]);
        const int low = digitValue(text[i + 1]);
        if (high < 0 || low < 0) return std::nullopt;
        *byte++ = static_cast<std::uint8_t>(high << 4 | low);
        i += 2;
    }
    return Uuid(bytes);
}

std::string Uuid::string() const
{
    constexpr char kDigits[] = "0123456789ABCDEF";
    std::string text;
    text.reserve(kTextLength);
    for (const std::uint8_t byte : _bytes) {
        if (isDashPosition(text.size())) text += '-';
        text += kDigits[byte >> 4];
        text += kDigits[byte & 0xf];
    }
    return text;
}

} // namespace platform
