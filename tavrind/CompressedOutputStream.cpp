#include "tavrind/CompressedOutputStream.h"

#include <fmt/format.h>
#include <openssl/evp.h>

#include "tavrind/Deflater.h"

namespace tavrin {

namespace {

EVP_MD_CTX* beginDigest()
{
    EVP_MD_CTX* context = EVP_MD_CTX_new();
    if (!context || EVP_DigestInit_ex(context, EVP_sha512(), nullptr) != 1) throw std::bad_alloc();
    return context;
}

} // namespace

CompressedOutputStream::CompressedOutputStream() : CompressedOutputStream(std::make_unique<MemoryOutputStream>()) {}

CompressedOutputStream::CompressedOutputStream(std::unique_ptr<OutputStream> outputStream)
    : _outputStream(std::move(outputStream)), _stream(Deflater::make()), _sha512Context(beginDigest(), EVP_MD_CTX_free)
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

bool CompressedOutputStream::_deflate(std::string_view bytes, bool isLast)
{
    return _stream->write(bytes, isLast, [this](std::string_view compressed) {
        if (_outputStream->write(compressed) >= 0) return true;
        _fail(_outputStream->streamError().value_or(platform::Error::withReason("Stream", 0, "not open")));
        return false;
    });
}

std::ptrdiff_t CompressedOutputStream::write(std::string_view bytes)
{
    if (_status != StreamStatus::Open) return -1;
    EVP_DigestUpdate(_sha512Context.get(), bytes.data(), bytes.size());
    return _deflate(bytes, false) ? static_cast<std::ptrdiff_t>(bytes.size()) : -1;
}

void CompressedOutputStream::close()
{
    if (_status == StreamStatus::Open) _deflate("", true);
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
