#include "tavrind/decoder.h"

#include <array>

#include <openssl/evp.h>
#include <zlib.h>

#include "tavrind/encoder.h"

namespace tavrin {

namespace {

constexpr std::size_t kHeader = 8;

std::size_t bigEndian(std::string_view bytes)
{
    std::size_t value = 0;
    for (const char byte : bytes) value = value << 8 | static_cast<unsigned char>(byte);
    return value;
}

std::optional<std::string> fromBase64(std::string_view text)
{
    if (text.size() % 4 != 0 || text.size() > 1u << 20) return std::nullopt;
    std::size_t padding = 0;
    while (padding < 2 && padding < text.size() && text[text.size() - 1 - padding] == '=') ++padding;
    if (text.substr(0, text.size() - padding).find_first_of("=\n ") != std::string_view::npos) return std::nullopt;
    std::string bytes(text.size() / 4 * 3, '\0');
    const int length =
        EVP_DecodeBlock(reinterpret_cast<unsigned char*>(bytes.data()),
                        reinterpret_cast<const unsigned char*>(text.data()), static_cast<int>(text.size()));
    if (length < 0 || static_cast<std::size_t>(length) != bytes.size()) return std::nullopt;
    bytes.resize(bytes.size() - padding);
    return bytes;
}

using platform::malformed;

} // namespace

std::optional<std::string> rle_expand(std::string_view buffer, std::size_t payloadOffset, std::size_t payloadLength,
                                      std::size_t outputLength, bool compressed)
{
    if (!compressed) {
        if (buffer.size() < kDigestTail || buffer.size() - kDigestTail < outputLength) return std::nullopt;
        return std::string(buffer.substr(kDigestTail, outputLength));
    }
    if (payloadOffset > buffer.size() || buffer.size() - payloadOffset < payloadLength || payloadLength < 2)
        return std::nullopt;
    const std::string_view payload = buffer.substr(payloadOffset, payloadLength);
    const std::size_t runs = bigEndian(payload.substr(0, 2));
    if (2 + runs + (runs + 7) / 8 != payloadLength) return std::nullopt;
    const std::string_view lengths = payload.substr(2, runs);
    const std::string_view values = payload.substr(2 + runs);

    std::string output(outputLength, '\0');
    std::size_t bit = 0;
    for (std::size_t run = 0; run < runs; ++run) {
        const std::size_t end = bit + getRunLength(lengths, run) + 1;
        if (end > outputLength * 8) return std::nullopt;
        const bool value = (static_cast<unsigned char>(values[run / 8]) & 0x80u >> run % 8) != 0;
        if (value)
            for (std::size_t i = bit; i < end; ++i)
                output[i / 8] = static_cast<char>(static_cast<unsigned char>(output[i / 8]) | 0x80u >> i % 8);
        bit = end;
    }
    return output;
}

platform::Result<AppSignature> readSignature(std::string_view text)
{
    const auto bytes = fromBase64(text);
    if (!bytes) return malformed("not base64");
    const std::string_view all = *bytes;
    if (all.size() < kHeader + kDigestTail) return malformed("too short");
    const std::string_view checked = all.substr(4);
    if (crc32_z(0, reinterpret_cast<const unsigned char*>(checked.data()), checked.size()) !=
        bigEndian(all.substr(0, 4)))
        return malformed("the CRC-32 differs");

    const std::string_view buffer = all.substr(kHeader);
    const std::size_t length = bigEndian(all.substr(6, 2));
    const std::size_t version = bigEndian(all.substr(4, 2));
    const bool compressed = (version & 0x8000) != 0;
    if (!compressed && buffer.size() != kDigestTail + length) return malformed("the bitmap's length differs");
    auto bitmap = rle_expand(buffer, kDigestTail, buffer.size() - kDigestTail, length, compressed);
    if (!bitmap) return malformed("the runs don't fit the bitmap");

    std::array<unsigned char, EVP_MAX_MD_SIZE> digest{};
    unsigned size = 0;
    EVP_Digest(bitmap->data(), bitmap->size(), digest.data(), &size, EVP_md5(), nullptr);
    const std::string_view tail(reinterpret_cast<const char*>(digest.data()) + size - kDigestTail, kDigestTail);
    if (tail != buffer.substr(0, kDigestTail)) return malformed("the MD5 digest differs");
    return AppSignature{static_cast<unsigned>(version & 0x7fff), compressed, std::move(*bitmap)};
}

} // namespace tavrin
