#pragma once

namespace platform {

/// Owns an open file descriptor, or none, and closes it on destruction. One thread at a time.
class FileHandle {
public:
    FileHandle() = default;
    /// Takes over `fd`; a negative number means none.
    explicit FileHandle(int fd) : _fd(fd) {}
    FileHandle(FileHandle&& other) noexcept : _fd(other.release()) {}
    FileHandle& operator=(FileHandle&& other) noexcept;
    ~FileHandle();
    /// The descriptor, still owned by this handle; negative for none.
    [[nodiscard]] int fd() const { return _fd; }
    [[nodiscard]] explicit operator bool() const { return _fd >= 0; }
    /// Returns the descriptor, which the caller now owns.
    int release();
    /// Returns another descriptor of the same open file (offset and flags are shared); none if the process has too many
    /// descriptors or this handle has none.
    [[nodiscard]] FileHandle duplicate() const;

private:
    int _fd = -1;
};

} // namespace platform
