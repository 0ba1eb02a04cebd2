#pragma once

namespace platform {

/// Owns a file descriptor, or none, and closes it on destruction. One thread at a time.
class FileHandle {
public:
    FileHandle() = default;
    /// Takes over `fd`; a negative number means none.
    explicit FileHandle(int fd) : _fd(fd) {}
    FileHandle(FileHandle&& other) noexcept : _fd(other.release()) {}
    FileHandle& operator=(FileHandle&& other) noexcept;
    ~FileHandle();
    /// Returns the descriptor, which this handle still owns; negative if it has none.
    [[nodiscard]] int fd() const { return _fd; }
    [[nodiscard]] explicit operator bool() const { return _fd >= 0; }
    /// Returns the descriptor and passes its ownership to the caller.
    int release();
    /// Returns a second descriptor of the same open file, close-on-exec; offset and flags are shared. Returns an empty
    /// handle if the process has reached its limit of descriptors or this handle is empty.
    [[nodiscard]] FileHandle duplicate() const;

private:
    int _fd = -1;
};

} // namespace platform
