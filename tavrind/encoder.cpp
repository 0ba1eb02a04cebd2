#include "tavrind/encoder.h"

#include <algorithm>
#include <array>
#include <bit>
#include <charconv>

#include <openssl/evp.h>
#include <zlib.h>

namespace tavrin {

namespace {

constexpr std::size_t kLongestRun = 256; // bits: a run's length less 1 is one byte

char byteOf(std::size_t value, unsigned shift)
{
    return static_cast<char>(value >> shift & 0xff);
}

void appendBigEndian(std::string& bytes, std::size_t value, unsigned size)
{
    while (size-- > 0) bytes += byteOf(value, size * 8);
}

/// Runs of equal bits: a length for each, and their values packed into bits.
class Runs {
public:
    void saveRun(std::size_t length, bool value)
    {
        _lengths += byteOf(length - 1, 0);
        const std::size_t place = (_lengths.size() - 1) % 8;
        if (place == 0) _values += '\0';
        if (value) _values.back() = byteOf(static_cast<unsigned char>(_values.back()) | 0x80u >> place, 0);
    }
    [[nodiscard]] std::size_t codedSize() const { return 2 + _lengths.size() + _values.size(); }
    [[nodiscard]] std::string coded() const
    {
        std::string bytes;
        bytes.reserve(codedSize());
        appendBigEndian(bytes, _lengths.size(), 2);
        return bytes.append(_lengths).append(_values);
    }

private:
    std::string _lengths;
    std::string _values;
};

bool bitAt(std::string_view bitmap, std::size_t bit)
{
    return (static_cast<unsigned char>(bitmap[bit / 8]) & 0x80u >> bit % 8) != 0;
}

/// Returns the number of consecutive bits from `bit` on that have this value, at most `kLongestRun`.
std::size_t runFrom(std::string_view bitmap, std::size_t bit, bool value)
{
    const std::size_t last = std::min(bit + kLongestRun, bitmap.size() * 8);
    for (std::size_t at = bit; at < last; at = at / 8 * 8 + 8) {
        // The bits of this byte, from `at` on, that differ from the value.
        const auto differing = static_cast<unsigned char>((bitmap[at / 8] ^ (value ? 0xff : 0)) & 0xff >> at % 8);
        if (differing != 0)
            return std::min(at / 8 * 8 + static_cast<std::size_t>(std::countl_zero(differing)), last) - bit;
    }
    return last - bit;
}

/// Returns the last two bytes of a version in hexadecimal as one number; nothing if the text is not hexadecimal bytes.
std::optional<unsigned> versionTail(std::string_view version)
{
    if (version.size() % 2 != 0) return std::nullopt;
    unsigned tail = 0;
    for (; !version.empty(); version.remove_prefix(2)) {
        unsigned byte = 0;
        const auto read = std::from_chars(version.data(), version.data() + 2, byte, 16);
        if (read.ec != std::errc() || read.ptr != version.data() + 2) return std::nullopt;
        tail = (tail << 8 | byte) & 0xffff;
    }
    return tail;
}

std::string base64(std::string_view bytes)
{
    std::string text((bytes.size() + 2) / 3 * 4 + 1, '\0');
    const int length =
        EVP_EncodeBlock(reinterpret_cast<unsigned char*>(text.data()),
                        reinterpret_cast<const unsigned char*>(bytes.data()), static_cast<int>(bytes.size()));
    text.resize(static_cast<std::size_t>(length));
    return text;
}

} // namespace

std::string bitmapOf(std::span<const std::uint32_t> ids)
{
    std::string bitmap(ids.empty() ? 0 : (ids.back() + 7) / 8, '\0');
    for (const std::uint32_t id : ids)
        if (id / 8 < bitmap.size())
            bitmap[id / 8] = byteOf(static_cast<unsigned char>(bitmap[id / 8]) | 0x80u >> id % 8, 0);
    return bitmap;
}

RunLengthCoding encodeRun(std::string_view bitmap)
{
    Runs runs;
    for (std::size_t bit = 0; bit < bitmap.size() * 8;) {
        const bool value = bitAt(bitmap, bit);
        const std::size_t length = runFrom(bitmap, bit, value);
        runs.saveRun(length, value);
        bit += length;
        if (runs.codedSize() >= bitmap.size()) return {std::string(bitmap), false};
    }
    if (runs.codedSize() >= bitmap.size()) return {std::string(bitmap), false};
    return {runs.coded(), true};
}

RunLengthCoding rle_compress(std::string_view bitmap)
{
    std::array<unsigned char, EVP_MAX_MD_SIZE> digest{};
    unsigned length = 0;
    EVP_Digest(bitmap.data(), bitmap.size(), digest.data(), &length, EVP_md5(), nullptr);
    RunLengthCoding coding = encodeRun(bitmap);
    coding.bytes.insert(0, reinterpret_cast<const char*>(digest.data()) + length - kDigestTail, kDigestTail);
    return coding;
}

std::optional<std::string> makeSignature(std::uint16_t bitmapLength, const RunLengthCoding& payload,
                                         std::string_view version)
{
    const auto tail = versionTail(version);
    if (!tail) return std::nullopt;
    std::string checked;
    checked += byteOf((payload.compressed ? 0x80u : 0u) | (*tail >> 8 & 0x7fu), 0);
    checked += byteOf(*tail, 0);
    appendBigEndian(checked, bitmapLength, 2);
    checked += payload.bytes;

    std::string signature;
    appendBigEndian(signature, crc32_z(0, reinterpret_cast<const unsigned char*>(checked.data()), checked.size()), 4);
    return base64(signature + checked);
}

} // namespace tavrin
