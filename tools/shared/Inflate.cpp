#include "tools/shared/Inflate.h"

#include <array>
#include <stdexcept>

#include <zlib.h>

namespace tavrin::tools {

namespace {
constexpr int kRaw = -MAX_WBITS;
}

std::expected<std::string, std::string> inflateRaw(std::string_view packed, std::size_t maximumSize)
{
    z_stream stream{};
    if (inflateInit2(&stream, kRaw) != Z_OK) throw std::runtime_error("zlib: out of memory");
    // zlib doesn't write to its input
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(packed.data()));
    stream.avail_in = static_cast<uInt>(packed.size());
    std::string unpacked;
    std::array<char, 16384> buffer;
    int status = Z_OK;
    while (status == Z_OK && unpacked.size() <= maximumSize) {
        stream.next_out = reinterpret_cast<Bytef*>(buffer.data());
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

} // namespace tavrin::tools
