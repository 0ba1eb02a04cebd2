#include "platform/net/ContentCoding.h"

#include <algorithm>
#include <array>

#include "platform/net/HttpHeaders.h"

namespace platform {

namespace {

/// Further codings are ignored: each stage takes 40 KiB of memory.
constexpr std::size_t kMaximumStages = 4;

unsigned byteAt(const std::string& text, std::size_t at)
{
    return static_cast<unsigned char>(text[at]);
}

} // namespace

ContentDecoder::ContentDecoder(std::string_view codings)
{
    while (!codings.empty() && _stages.size() < kMaximumStages) {
        const std::string_view element = codings.substr(0, codings.find(','));
        codings.remove_prefix(std::min(element.size() + 1, codings.size()));
        const std::string_view coding = withoutBlanks(element);
        const bool gzip = equalIgnoringCase(coding, "gzip") || equalIgnoringCase(coding, "x-gzip");
        if (gzip || equalIgnoringCase(coding, "deflate")) _stages.emplace_front(gzip);
    }
}

bool ContentDecoder::feed(std::string_view bytes, const Sink& sink)
{
    return feed(_stages.begin(), bytes, sink);
}

bool ContentDecoder::feed(std::list<Stage>::iterator stage, std::string_view bytes, const Sink& sink)
{
    if (stage == _stages.end()) return sink(bytes);
    const auto next = std::next(stage);
    if (next == _stages.end()) return stage->feed(bytes, sink);
    return stage->feed(bytes, [&](std::string_view decoded) {
        _between += decoded.size();
        return _between <= kMaximumBetween && feed(next, decoded, sink);
    });
}

bool ContentDecoder::finished() const
{
    return std::ranges::all_of(_stages, &Stage::finished);
}

/// Detects the format from the first two bytes, and initializes zlib for it.
bool ContentDecoder::Stage::begin()
{
    const bool gzipMember = _start == "\x1f\x8b";
    if (_anyEnded && !gzipMember) {
        _state = State::After;
        return true;
    }
    const bool zlibHeader =
        (byteAt(_start, 0) & 15) == Z_DEFLATED && (byteAt(_start, 0) * 256 + byteAt(_start, 1)) % 31 == 0;
    const int window = _gzip ? MAX_WBITS + 16 : zlibHeader ? MAX_WBITS : -MAX_WBITS;
    _state = State::Inside;
    return (_anyEnded ? inflateReset(&_stream) : inflateInit2(&_stream, window)) == Z_OK;
}

bool ContentDecoder::Stage::feed(std::string_view bytes, const Sink& sink)
{
    std::array<char, 16 * 1024> decoded;
    while (!bytes.empty() && _state != State::After) {
        std::string_view input = bytes;
        if (_state == State::Before) {
            _start.push_back(bytes.front());
            bytes.remove_prefix(1);
            if (_start.size() < 2) continue;
            if (!begin()) return false;
            if (_state == State::After) break;
            input = _start;
        }
        _stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(input.data()));
        _stream.avail_in = static_cast<uInt>(input.size());
        int result = Z_OK;
        do {
            _stream.next_out = reinterpret_cast<Bytef*>(decoded.data());
            _stream.avail_out = decoded.size();
            result = inflate(&_stream, Z_NO_FLUSH);
            if (result != Z_OK && result != Z_STREAM_END && result != Z_BUF_ERROR) return false;
            const std::size_t size = decoded.size() - _stream.avail_out;
            if (size > 0 && !sink({decoded.data(), size})) return false;
        } while (result == Z_OK && _stream.avail_out == 0);
        if (input.data() == bytes.data()) bytes.remove_prefix(bytes.size() - _stream.avail_in);
        _start.clear();
        if (result == Z_STREAM_END) {
            _anyEnded = true;
            _state = _gzip ? State::Before : State::After;
        }
    }
    return true;
}

} // namespace platform
