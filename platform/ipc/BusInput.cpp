#include "platform/ipc/BusInput.h"

#include <algorithm>
#include <bit>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

#include <fmt/format.h>

namespace platform::ipc {

namespace {

std::uint32_t numberAt(std::span<const char, kFixedHeader> header, std::size_t offset)
{
    std::uint32_t number = 0;
    std::memcpy(&number, header.data() + offset, sizeof(number));
    const bool bigEndian = header[0] == 'B';
    return bigEndian == (std::endian::native == std::endian::big) ? number : std::byteswap(number);
}

BusInput::Outcome outcomeOf(ssize_t got)
{
    if (got > 0) return BusInput::Outcome::Passed;
    return got < 0 && (errno == EAGAIN || errno == EINTR) ? BusInput::Outcome::Empty : BusInput::Outcome::Ended;
}

} // namespace

std::optional<std::uint64_t> messageSize(std::span<const char, kFixedHeader> header)
{
    constexpr char kVersion = 1;
    if ((header[0] != 'l' && header[0] != 'B') || header[3] != kVersion) return std::nullopt;
    const std::uint64_t fields = numberAt(header, 12);
    return kFixedHeader + (fields + 7) / 8 * 8 + numberAt(header, 4);
}

BusInput::Outcome BusInput::fill()
{
    if (_drained) return Outcome::Empty; // saves a read
    std::array<char, kReadAhead> bytes;
    const std::size_t room = bytes.size() - _buffer.size();
    const ssize_t got = recv(_socket, bytes.data(), room, 0);
    if (got > 0) {
        _buffer.append(bytes.data(), static_cast<std::size_t>(got));
        _drained = !_isLast && static_cast<std::size_t>(got) < room;
    }
    return outcomeOf(got);
}

/// Writes at most `kReadAhead` bytes. They fit, because sd-bus has read what was written before.
bool BusInput::write(std::span<const char> bytes)
{
    return ::write(_pipe.fd(), bytes.data(), bytes.size()) == static_cast<ssize_t>(bytes.size());
}

void BusInput::consume(std::size_t count)
{
    _buffer.erase(0, count);
}

BusInput::Outcome BusInput::passLine()
{
    for (;;) {
        if (const std::size_t end = _buffer.find('\n'); end != std::string::npos) {
            if (!write({_buffer.data(), end + 1})) return Outcome::Ended;
            consume(end + 1);
            return Outcome::Passed;
        }
        if (_buffer.size() == kReadAhead) return Outcome::Malformed;
        if (const Outcome outcome = fill(); outcome != Outcome::Passed) return outcome;
    }
}

bool BusInput::passOwnLines()
{
    std::string lines = std::string(1, '\0') + "AUTH EXTERNAL ";
    for (const char digit : std::to_string(geteuid())) lines += fmt::format("{:02x}", digit);
    lines += "\r\nBEGIN\r\n";
    return write(lines);
}

BusInput::Outcome BusInput::look()
{
    while (_buffer.size() < kFixedHeader)
        if (const Outcome outcome = fill(); outcome != Outcome::Passed) return outcome;
    const auto size = messageSize(std::span<const char, kFixedHeader>(_buffer.data(), kFixedHeader));
    if (!size) return Outcome::Malformed;
    _announced = *size;
    return Outcome::Passed;
}

BusInput::Outcome BusInput::pass()
{
    if (_left == 0) _left = _announced;
    if (_buffer.empty() && _left <= kReadAhead)
        if (const Outcome outcome = fill(); outcome != Outcome::Passed) return outcome;
    if (!_buffer.empty()) {
        const std::size_t count = std::min(_left, _buffer.size());
        if (!write({_buffer.data(), count})) return Outcome::Ended;
        consume(count);
        _left -= count;
    } else {
        const ssize_t got = splice(_socket, nullptr, _pipe.fd(), nullptr, _left, SPLICE_F_NONBLOCK);
        if (got <= 0) return outcomeOf(got);
        _left -= static_cast<std::size_t>(got);
    }
    if (_left == 0) _announced = 0;
    return Outcome::Passed;
}

} // namespace platform::ipc
