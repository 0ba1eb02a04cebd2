#pragma once

namespace platform {

/// An open file descriptor that closes itself. Movable; the holder may hand it to another thread.
class FileHandle {
public:
    FileHandle() = default;
    explicit FileHandle(int fd) : _fd(fd) {}
    FileHandle(FileHandle&& other) noexcept : _fd(other.release()) {}
    FileHandle& operator=(FileHandle&& other) noexcept;
    ~FileHandle();
    [[nodiscard]] int fd() const { return _fd; }
    [[nodiscard]] explicit operator bool() const { return _fd >= 0; }
    /// Gives the descriptor up; the caller closes it.
    int release();
    /// Another descriptor of the same open file; none where the process has too many, or where this is none.
    [[nodiscard]] FileHandle duplicate() const;

private:
    int _fd = -1;
};

} // namespace platform
