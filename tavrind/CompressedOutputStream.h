#pragma once

#include <array>
#include <memory>

#include "tavrind/OutputStream.h"

struct evp_md_ctx_st;
struct z_stream_s;

namespace tavrin {

/// Compresses what is written (raw DEFLATE, RFC 1951, without a header) into another stream, and digests it (SHA-512)
/// as it was before. An error of the other stream is this stream's. One thread at a time.
class CompressedOutputStream final : public OutputStream {
public:
    /// Into memory.
    CompressedOutputStream();
    explicit CompressedOutputStream(std::unique_ptr<OutputStream> outputStream);
    ~CompressedOutputStream() override;

    /// Opens the other stream, too.
    void open() override;
    std::ptrdiff_t write(std::string_view bytes) override;
    /// Writes what the compressor still holds, lets go of it, and closes the other stream. A stream that was closed, be
    /// it before it was opened, can't be opened again.
    void close() override;
    [[nodiscard]] StreamStatus streamStatus() const override { return _status; }
    [[nodiscard]] std::optional<platform::Error> streamError() const override { return _error; }

    /// The digest of the uncompressed bytes, as 128 small hexadecimal digits. Complete once the stream is closed.
    [[nodiscard]] std::string dataDigestForStream() const;
    [[nodiscard]] const OutputStream& outputStream() const { return *_outputStream; }

private:
    /// Runs the compressor over `bytes`; false after an error.
    bool _deflate(std::string_view bytes, int flush);
    void _fail(platform::Error error);

    std::unique_ptr<OutputStream> _outputStream;
    std::unique_ptr<z_stream_s, void (*)(z_stream_s*)> _stream;
    std::unique_ptr<evp_md_ctx_st, void (*)(evp_md_ctx_st*)> _sha512Context;
    std::array<unsigned char, 64> _digest{};
    std::array<char, 4096> _destBuffer;
    StreamStatus _status = StreamStatus::NotOpen;
    std::optional<platform::Error> _error;
};

} // namespace tavrin
