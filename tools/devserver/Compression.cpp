#include "tools/devserver/Compression.h"

#include <algorithm>
#include <array>
#include <stdexcept>

#include <zlib.h>

namespace devserver {
namespace {

constexpr int kRaw = -MAX_WBITS;
constexpr int kGzip = MAX_WBITS + 16;

Bytef* bytes(const char* text)
{
    return reinterpret_cast<Bytef*>(const_cast<char*>(text)); // zlib doesn't write to its input
}

/// Packs `repetitions` times `piece`, and then its first `rest` bytes.
std::string pack(std::string_view piece, std::size_t repetitions, std::size_t rest, int windowBits)
{
    z_stream stream{};
    if (deflateInit2(&stream, Z_BEST_COMPRESSION, Z_DEFLATED, windowBits, 9, Z_DEFAULT_STRATEGY) != Z_OK)
        throw std::runtime_error("zlib: out of memory");
    std::string packed;
    std::array<char, 16384> buffer;
    for (std::size_t i = 0; i <= repetitions; ++i) {
        stream.next_in = bytes(piece.data());
        stream.avail_in = static_cast<uInt>(i < repetitions ? piece.size() : rest);
        do {
            stream.next_out = bytes(buffer.data());
            stream.avail_out = buffer.size();
            deflate(&stream, i < repetitions ? Z_NO_FLUSH : Z_FINISH);
            packed.append(buffer.data(), buffer.size() - stream.avail_out);
        } while (stream.avail_out == 0);
    }
    deflateEnd(&stream);
    return packed;
}

} // namespace

std::string gzipOfBlanks(std::size_t count)
{
    const std::string blanks(1u << 16, ' ');
    return pack(blanks, count / blanks.size(), count % blanks.size(), kGzip);
}

std::string zlibPacked(std::string_view piece)
{
    return pack(piece, 0, piece.size(), MAX_WBITS);
}

std::expected<std::string, std::string> inflateRaw(std::string_view packed, std::size_t maximumSize)
{
    z_stream stream{};
    if (inflateInit2(&stream, kRaw) != Z_OK) throw std::runtime_error("zlib: out of memory");
    stream.next_in = bytes(packed.data());
    stream.avail_in = static_cast<uInt>(packed.size());
    std::string unpacked;
    std::array<char, 16384> buffer;
    int status = Z_OK;
    while (status == Z_OK && unpacked.size() <= maximumSize) {
        stream.next_out = bytes(buffer.data());
        stream.avail_out = buffer.size();
        status = inflate(&stream, Z_NO_FLUSH);
        unpacked.append(buffer.data(), buffer.size() - stream.avail_out);
    }
    const bool trailing = stream.avail_in > 0;
    inflateEnd(&stream);
    if (unpacked.size() > maximumSize) return std::unexpected("the body unpacks to too many bytes");
    if (status == Z_BUF_ERROR) return std::unexpected("the DEFLATE stream is cut off");
    if (status != Z_STREAM_END) return std::unexpected("the body is no raw DEFLATE stream");
    if (trailing) return std::unexpected("bytes after the DEFLATE stream");
    return unpacked;
}

} // namespace devserver
