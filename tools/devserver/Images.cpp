#include "tools/devserver/Images.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>
#include <random>

#include <zlib.h>

#include "tools/devserver/Compression.h"

namespace devserver {
namespace {

constexpr std::uint32_t kSize = 96;
constexpr std::uint32_t kCells = 6; // per row; the right half mirrors the left

std::uint64_t digest(std::string_view text) // FNV-1a, mixed once more
{
    std::uint64_t hash = 14695981039346656037u;
    for (const char c : text) hash = (hash ^ static_cast<unsigned char>(c)) * 1099511628211u;
    return hash ^ (hash >> 29);
}

std::string bigEndian(std::uint32_t number)
{
    return {static_cast<char>(number >> 24), static_cast<char>(number >> 16), static_cast<char>(number >> 8),
            static_cast<char>(number)};
}

std::string chunk(std::string_view type, std::string_view data)
{
    const std::string checked = std::string(type) + std::string(data);
    const auto sum = crc32(0, reinterpret_cast<const Bytef*>(checked.data()), static_cast<uInt>(checked.size()));
    return bigEndian(static_cast<std::uint32_t>(data.size())) + checked + bigEndian(static_cast<std::uint32_t>(sum));
}

/// Returns incompressible bytes.
std::string noise(std::uint64_t seed, std::size_t size)
{
    std::mt19937_64 generator(seed);
    std::string bytes(size, '\0');
    for (std::size_t i = 0; i < size; i += sizeof(std::uint64_t)) {
        const std::uint64_t word = generator();
        std::memcpy(bytes.data() + i, &word, std::min(size - i, sizeof word));
    }
    return bytes;
}

} // namespace

std::string imageFor(std::string_view identifier, std::size_t size)
{
    const std::uint64_t bits = digest(identifier);
    const std::array<char, 6> palette{static_cast<char>(0xF2),
                                      static_cast<char>(0xF2),
                                      static_cast<char>(0xEE),
                                      static_cast<char>(bits >> 40 & 0xBF),
                                      static_cast<char>(bits >> 48 & 0xBF),
                                      static_cast<char>(bits >> 56 & 0xBF)};
    std::string rows;
    for (std::uint32_t y = 0; y < kSize; ++y) {
        rows += '\0'; // no filter
        for (std::uint32_t x = 0; x < kSize; ++x) {
            const std::uint32_t column = x * kCells / kSize;
            const std::uint32_t mirrored = column < kCells / 2 ? column : kCells - 1 - column;
            rows += static_cast<char>(bits >> (y * kCells / kSize * (kCells / 2) + mirrored) & 1);
        }
    }
    const std::string header =
        bigEndian(kSize) + bigEndian(kSize) + std::string("\x08\x03\0\0\0", 5); // 8 bits, palette
    const std::string picture = "\x89PNG\r\n\x1a\n" + chunk("IHDR", header) +
                                chunk("PLTE", {palette.data(), palette.size()}) + chunk("IDAT", zlibPacked(rows));
    const std::string end = chunk("IEND", "");
    const std::size_t needed = picture.size() + end.size() + end.size(); // an empty chunk is as long as the end
    return picture + (size < needed ? "" : chunk("fiLl", noise(bits, size - needed))) + end;
}

} // namespace devserver
