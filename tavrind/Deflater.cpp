#include "tavrind/Deflater.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <new>
#include <vector>

#include <zlib.h>
#if HAVE_ISAL
#include <isa-l/igzip_lib.h>
#endif

namespace tavrin {

namespace {

constexpr std::size_t kPiece = 4096;
constexpr std::size_t kMaximumStep = 1u << 30; // fits into the libraries' counters

/// Calls `step` with parts of `bytes` that fit into the libraries' counters, and with whether a part is the last.
template <class Step> bool inSteps(std::string_view bytes, bool isLast, Step step)
{
    do {
        const std::string_view part = bytes.substr(0, kMaximumStep);
        bytes.remove_prefix(part.size());
        if (!step(part, isLast && bytes.empty())) return false;
    } while (!bytes.empty());
    return true;
}

class ZlibDeflater final : public Deflater {
public:
    ZlibDeflater()
    {
        constexpr int kRawWindow = -15; // the largest window; negative: no header
        if (deflateInit2(&_stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, kRawWindow, 8, Z_DEFAULT_STRATEGY) != Z_OK)
            throw std::bad_alloc();
    }
    ~ZlibDeflater() override { deflateEnd(&_stream); }

    bool write(std::string_view bytes, bool isLast, const Take& take) override
    {
        return inSteps(bytes, isLast, [&](std::string_view part, bool isEnd) {
            _stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(part.data()));
            _stream.avail_in = static_cast<uInt>(part.size());
            do {
                _stream.next_out = reinterpret_cast<Bytef*>(_destBuffer.data());
                _stream.avail_out = static_cast<uInt>(_destBuffer.size());
                deflate(&_stream, isEnd ? Z_FINISH : Z_NO_FLUSH);
                const std::size_t made = _destBuffer.size() - _stream.avail_out;
                if (made > 0 && !take({_destBuffer.data(), made})) return false;
            } while (_stream.avail_out == 0);
            return true;
        });
    }

private:
    z_stream _stream{};
    std::array<char, kPiece> _destBuffer;
};

#if HAVE_ISAL
class IsalDeflater final : public Deflater {
public:
    IsalDeflater() : _levelBuffer(ISAL_DEF_LVL2_MEDIUM)
    {
        isal_deflate_init(&_stream);
        _stream.gzip_flag = IGZIP_DEFLATE;
        _stream.level = 2; // level 3 takes eight times as long and compresses JSON no better
        _stream.level_buf = _levelBuffer.data();
        _stream.level_buf_size = static_cast<std::uint32_t>(_levelBuffer.size());
    }

    bool write(std::string_view bytes, bool isLast, const Take& take) override
    {
        return inSteps(bytes, isLast, [&](std::string_view part, bool isEnd) {
            _stream.next_in = reinterpret_cast<std::uint8_t*>(const_cast<char*>(part.data()));
            _stream.avail_in = static_cast<std::uint32_t>(part.size());
            _stream.end_of_stream = isEnd;
            do {
                _stream.next_out = reinterpret_cast<std::uint8_t*>(_destBuffer.data());
                _stream.avail_out = static_cast<std::uint32_t>(_destBuffer.size());
                isal_deflate(&_stream);
                const std::size_t made = _destBuffer.size() - _stream.avail_out;
                if (made > 0 && !take({_destBuffer.data(), made})) return false;
            } while (_stream.avail_out == 0);
            return true;
        });
    }

private:
    std::vector<std::uint8_t> _levelBuffer;
    isal_zstream _stream;
    std::array<char, kPiece> _destBuffer;
};
#endif

} // namespace

std::unique_ptr<Deflater> Deflater::make()
{
#if HAVE_ISAL
    return std::make_unique<IsalDeflater>();
#else
    return makeWithZlib();
#endif
}

std::unique_ptr<Deflater> Deflater::makeWithZlib()
{
    return std::make_unique<ZlibDeflater>();
}

} // namespace tavrin
