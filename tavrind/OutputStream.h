#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Error.h"

namespace platform {
class AppendFile;
}

namespace tavrin {

enum class StreamStatus { NotOpen, Open, Closed, Error };

/// A sink for bytes: open it, write to it, close it. One thread at a time.
class OutputStream {
public:
    virtual ~OutputStream() = default;
    virtual void open() = 0;
    /// Writes all bytes and returns their number; -1 if the stream is in error or not open.
    virtual std::ptrdiff_t write(std::string_view bytes) = 0;
    virtual void close() = 0;
    [[nodiscard]] virtual StreamStatus streamStatus() const = 0;
    /// Returns why the stream is in error; nothing if it isn't.
    [[nodiscard]] virtual std::optional<platform::Error> streamError() const = 0;
    [[nodiscard]] virtual bool hasSpaceAvailable() const { return true; }
};

/// Writes to memory.
class MemoryOutputStream final : public OutputStream {
public:
    void open() override { _status = StreamStatus::Open; }
    std::ptrdiff_t write(std::string_view bytes) override
    {
        if (_status != StreamStatus::Open) return -1;
        _contents += bytes;
        return static_cast<std::ptrdiff_t>(bytes.size());
    }
    void close() override { _status = StreamStatus::Closed; }
    [[nodiscard]] StreamStatus streamStatus() const override { return _status; }
    [[nodiscard]] std::optional<platform::Error> streamError() const override { return std::nullopt; }
    [[nodiscard]] const std::string& contents() const { return _contents; }

private:
    StreamStatus _status = StreamStatus::NotOpen;
    std::string _contents;
};

/// Appends to a file.
class FileOutputStream final : public OutputStream {
public:
    explicit FileOutputStream(std::unique_ptr<platform::AppendFile> file);
    ~FileOutputStream() override;
    void open() override;
    std::ptrdiff_t write(std::string_view bytes) override;
    /// Also closes the file.
    void close() override;
    [[nodiscard]] StreamStatus streamStatus() const override { return _status; }
    [[nodiscard]] std::optional<platform::Error> streamError() const override { return _error; }

private:
    std::unique_ptr<platform::AppendFile> _file;
    StreamStatus _status = StreamStatus::NotOpen;
    std::optional<platform::Error> _error;
};

} // namespace tavrin
