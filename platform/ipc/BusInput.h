#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include "platform/base/FileHandle.h"

namespace platform::ipc {

/// What a peer sends, on its way into sd-bus.
///
/// sd-bus makes room for whatever a message's header announces, up to 128 MiB, and takes every file handle. So it never
/// reads the peer's socket: it reads one end of a pair of sockets, and this class writes into the other what may pass.
/// That is first the authentication, a line at a time, then messages, one at a time: the owner learns the size of each
/// from its fixed header before anything of it is passed on. File handles are left behind.
///
///     socket → fill → _buffer (at most `kReadAhead`) → pair → sd-bus
///     socket → pair, for the rest of a message larger than that
///
/// Not thread-safe; belongs to its connection.
class BusInput {
public:
    enum class Outcome {
        Passed,    ///< sd-bus has something to read
        Empty,     ///< the peer has to send more first
        Ended,     ///< the peer has closed its end, and all that it sent is with sd-bus
        Malformed, ///< what the peer sent is neither a line nor a message
    };

    /// Bytes that may be read before it is decided whether they pass; also the longest line.
    static constexpr std::size_t kReadAhead = 4096;

    /// `socket` is the peer's and must outlive this; `pair` is the end that sd-bus doesn't have. Both non-blocking.
    BusInput(int socket, FileHandle pair) : _socket(socket), _pair(std::move(pair)) {}

    /// Passes one line of the authentication.
    [[nodiscard]] Outcome passLine();
    /// Looks at the next message, between messages only: Passed means that `announced` has its size.
    [[nodiscard]] Outcome look();
    /// The size of the message that is next or under way, in bytes, with its header; 0 between messages before `look`.
    [[nodiscard]] std::size_t announced() const { return _announced; }
    /// Passes as much as is there of the announced message.
    [[nodiscard]] Outcome pass();
    /// True until the first byte of a message is passed, and again after its last.
    [[nodiscard]] bool betweenMessages() const { return _left == 0; }
    /// True if the peer has begun a line or a message that isn't all passed.
    [[nodiscard]] bool begun() const { return _left > 0 || !_buffer.empty(); }

private:
    [[nodiscard]] Outcome fill();
    [[nodiscard]] bool write(std::span<const char> bytes);
    void consume(std::size_t count);

    const int _socket;
    const FileHandle _pair;
    std::string _buffer;
    std::size_t _announced = 0;
    std::size_t _left = 0; // bytes of the message under way that aren't passed yet
    bool _drained = false; // the last read found less than it had room for: nothing is left in the socket
};

/// The bytes of a fixed D-Bus message header.
inline constexpr std::size_t kFixedHeader = 16;
/// The size of a whole message by its fixed header; none if that is no header.
[[nodiscard]] std::optional<std::uint64_t> messageSize(std::span<const char, kFixedHeader> header);

} // namespace platform::ipc
