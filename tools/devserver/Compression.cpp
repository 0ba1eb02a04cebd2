#include "tools/devserver/Compression.h"

#include <array>
#include <stdexcept>

#include <zlib.h>

namespace devserver {
namespace {

constexpr int kGzip = MAX_WBITS + 16;

Bytef* bytes(const char* text)
{
    return reinterpret_cast<Bytef*>(const_cast<char*>(text)); // zlib doesn't write to its input
}

/// Compresses `piece` repeated `repetitions` times, followed by its first `rest` bytes.
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

std::string gzipPacked(std::string_view piece)
{
    return pack(piece, 0, piece.size(), kGzip);
}

std::string zlibPacked(std::string_view piece)
{
    return pack(piece, 0, piece.size(), MAX_WBITS);
}

} // namespace devserver
