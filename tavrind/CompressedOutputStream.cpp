#include "tavrind/CompressedOutputStream.h"

#include <fmt/format.h>
#include <openssl/evp.h>
#include <zlib.h>

namespace tavrin {

namespace {

void endDeflate(z_stream* stream)
{
    deflateEnd(stream);
    delete stream;
}

z_stream* beginDeflate()
{
    constexpr int kRawWindow = -15; // the largest window; negative: no header
    auto stream = std::make_unique<z_stream>();
    if (deflateInit2(stream.get(), Z_DEFAULT_COMPRESSION, Z_DEFLATED, kRawWindow, 8, Z_DEFAULT_STRATEGY) != Z_OK)
        throw std::bad_alloc();
    return stream.release();
}

EVP_MD_CTX* beginDigest()
{
    EVP_MD_CTX* context = EVP_MD_CTX_new();
    if (!context || EVP_DigestInit_ex(context, EVP_sha512(), nullptr) != 1) throw std::bad_alloc();
    return context;
}

} // namespace

CompressedOutputStream::CompressedOutputStream() : CompressedOutputStream(std::make_unique<MemoryOutputStream>()) {}

CompressedOutputStream::CompressedOutputStream(std::unique_ptr<OutputStream> outputStream)
    : _outputStream(std::move(outputStream)), _stream(beginDeflate(), endDeflate),
      _sha512Context(beginDigest(), EVP_MD_CTX_free)
{}

CompressedOutputStream::~CompressedOutputStream() = default;

void CompressedOutputStream::_fail(platform::Error error)
{
    _status = StreamStatus::Error;
    _error = std::move(error);
}

void CompressedOutputStream::open()
{
    if (_status != StreamStatus::NotOpen) return;
    _outputStream->open();
    _status = StreamStatus::Open;
}

bool CompressedOutputStream::_deflate(std::string_view bytes, int flush)
{
    _stream->next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));
    _stream->avail_in = static_cast<uInt>(bytes.size());
    do {
        _stream->next_out = reinterpret_cast<Bytef*>(_destBuffer.data());
        _stream->avail_out = static_cast<uInt>(_destBuffer.size());
        deflate(_stream.get(), flush);
        const std::size_t made = _destBuffer.size() - _stream->avail_out;
        if (made > 0 && _outputStream->write({_destBuffer.data(), made}) < 0) {
            _fail(_outputStream->streamError().value_or(platform::Error::withReason("Stream", 0, "not open")));
            return false;
        }
    } while (_stream->avail_out == 0);
    return true;
}

std::ptrdiff_t CompressedOutputStream::write(std::string_view bytes)
{
    constexpr std::size_t kStep = 1u << 30; // fits into the compressor's counters
    if (_status != StreamStatus::Open) return -1;
    EVP_DigestUpdate(_sha512Context.get(), bytes.data(), bytes.size());
    for (std::string_view left = bytes; !left.empty(); left.remove_prefix(std::min(kStep, left.size())))
        if (!_deflate(left.substr(0, kStep), Z_NO_FLUSH)) return -1;
    return static_cast<std::ptrdiff_t>(bytes.size());
}

void CompressedOutputStream::close()
{
    if (_status == StreamStatus::Open) _deflate({}, Z_FINISH);
    if (_status != StreamStatus::Error) _status = StreamStatus::Closed;
    if (_sha512Context) EVP_DigestFinal_ex(_sha512Context.get(), _digest.data(), nullptr);
    _sha512Context.reset();
    _stream.reset();
    _outputStream->close();
}

std::string CompressedOutputStream::dataDigestForStream() const
{
    return fmt::format("{:02x}", fmt::join(_digest, ""));
}

} // namespace tavrin
