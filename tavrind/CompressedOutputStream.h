#pragma once

#include <array>
#include <memory>

#include "tavrind/OutputStream.h"

struct evp_md_ctx_st;

namespace tavrin {

class Deflater;

/// Compresses its input as raw DEFLATE (RFC 1951, without a header) into another stream, which it owns, and computes
/// the SHA-512 digest of the uncompressed input. It fails when the other stream fails. One thread at a time.
class CompressedOutputStream final : public OutputStream {
public:
    /// Writes to memory.
    CompressedOutputStream();
    explicit CompressedOutputStream(std::unique_ptr<OutputStream> outputStream);
    ~CompressedOutputStream() override;

    /// Also opens the other stream.
    void open() override;
    std::ptrdiff_t write(std::string_view bytes) override;
    /// Flushes and releases the compressor, and closes the other stream. A closed stream can't be opened again, even if
    /// it was never open.
    void close() override;
    [[nodiscard]] StreamStatus streamStatus() const override { return _status; }
    [[nodiscard]] std::optional<platform::Error> streamError() const override { return _error; }

    /// Returns the digest of the uncompressed bytes as 128 lower-case hexadecimal digits. Valid after `close`.
    [[nodiscard]] std::string dataDigestForStream() const;
    [[nodiscard]] const OutputStream& outputStream() const { return *_outputStream; }

private:
    /// Compresses `bytes`. Returns false after an error.
    bool _deflate(std::string_view bytes, bool isLast);
    void _fail(platform::Error error);

    std::unique_ptr<OutputStream> _outputStream;
    std::unique_ptr<Deflater> _stream;
    std::unique_ptr<evp_md_ctx_st, void (*)(evp_md_ctx_st*)> _sha512Context;
    std::array<unsigned char, 64> _digest{};
    StreamStatus _status = StreamStatus::NotOpen;
    std::optional<platform::Error> _error;
};

} // namespace tavrin
