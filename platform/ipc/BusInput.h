#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include "platform/base/FileHandle.h"

namespace platform::ipc {

/// Checks a peer's input before sd-bus reads it.
///
/// sd-bus allocates whatever size a message's header announces, up to 128 MiB, and accepts every file handle. Therefore
/// it doesn't read the peer's socket: it reads a pipe, and this class writes permitted input to the other end. It
/// passes the authentication line by line, then one message at a time: the owner learns the size of a message from its
/// fixed header before any of it is passed. File handles are dropped.
///
///     socket → fill → _buffer (at most `kReadAhead`) → pipe → sd-bus
///     socket → pipe, for the rest of a larger message
///
/// Owned by its connection and confined to the connection's lane.
class BusInput {
public:
    enum class Outcome {
        Passed,    ///< sd-bus has something to read
        Empty,     ///< the peer must send more first
        Ended,     ///< the peer has closed its end, and sd-bus has everything that it sent
        Malformed, ///< the input is neither a line nor a message
    };

    /// Bytes that are read before the size of a message is known; also the longest line.
    static constexpr std::size_t kReadAhead = 4096;

    /// `socket` is the peer's, is non-blocking, and must outlive this object.
    explicit BusInput(int socket) : _socket(socket) {}
    /// Sets the end of the pipe that sd-bus doesn't own; it is non-blocking.
    void setPipe(FileHandle pipe) { _pipe = std::move(pipe); }

    /// Call this for each event of the socket; `isLast` if the peer has gone, so that no event follows.
    void wake(bool isLast)
    {
        _drained = false;
        _isLast = isLast;
    }
    /// Passes one line of the authentication.
    [[nodiscard]] Outcome passLine();
    /// Passes an authentication in place of the peer's. Returns false if the pipe has no room.
    [[nodiscard]] bool passOwnLines();
    /// Reads the header of the next message; call it between messages only. After Passed, `announced` is the size.
    [[nodiscard]] Outcome look();
    /// Returns the size in bytes, with its header, of the next or current message; 0 between messages before `look`.
    [[nodiscard]] std::size_t announced() const { return _announced; }
    /// Passes the available part of the announced message.
    [[nodiscard]] Outcome pass();
    /// Returns true until the first byte of a message is passed, and again after its last.
    [[nodiscard]] bool betweenMessages() const { return _left == 0; }
    /// Returns true if part of a line or message has arrived that is not completely passed yet.
    [[nodiscard]] bool begun() const { return _left > 0 || !_buffer.empty(); }

private:
    [[nodiscard]] Outcome fill();
    [[nodiscard]] bool write(std::span<const char> bytes);
    void consume(std::size_t count);

    const int _socket;
    FileHandle _pipe;
    std::string _buffer;
    std::size_t _announced = 0;
    std::size_t _left = 0; // bytes of the current message that are not passed yet
    bool _drained = false; // the last read returned less than asked for: the socket is empty until `wake`
    bool _isLast = false;  // the socket must be read to its end
};

/// Bytes of the fixed part of a D-Bus message header.
inline constexpr std::size_t kFixedHeader = 16;
/// Returns the size of a message from its fixed header, or nothing if the header is invalid.
[[nodiscard]] std::optional<std::uint64_t> messageSize(std::span<const char, kFixedHeader> header);

} // namespace platform::ipc
