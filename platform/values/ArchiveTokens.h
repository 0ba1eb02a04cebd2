#pragma once

#include <array>
#include <bit>
#include <concepts>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

#include "platform/values/Value.h"

/// The encoding of archives, for their readers: MessagePack, token by token. A date is a timestamp, extension type -1.
namespace platform::archives {

inline constexpr std::int8_t kTimestamp = -1;
inline constexpr std::int64_t kNanosecondsPerSecond = 1'000'000'000;

/// One value of an archive, or the head of a container. The contents of a container follow as further tokens.
struct Token {
    Value::Type type = Value::Type::Null;
    std::uint32_t size = 0; ///< bytes of a string or bytes; elements of an array; entries of a dictionary
    union {
        std::int64_t integer = 0; ///< of a date: nanoseconds since 1970
        bool boolean;
        std::uint64_t unsignedInteger;
        double real;
        const char* bytes; ///< in the archive
    };

    [[nodiscard]] std::string_view text() const { return {bytes, size}; }
    /// Returns the number of values that a container declares; 0 for other types.
    [[nodiscard]] std::uint64_t contents() const
    {
        return type == Value::Type::Array ? size : type == Value::Type::Dictionary ? std::uint64_t{size} * 2 : 0;
    }
};

/// Returns the value of a token; null for the head of a container.
inline Value plainValue(const Token& token)
{
    switch (token.type) {
    case Value::Type::Bool: return token.boolean;
    case Value::Type::Int: return token.integer;
    case Value::Type::UInt: return token.unsignedInteger;
    case Value::Type::Double: return token.real;
    case Value::Type::String: return token.text();
    case Value::Type::Bytes: return platform::Bytes(std::string(token.text()));
    case Value::Type::Date: return platform::Date(Duration(token.integer));
    case Value::Type::Null:
    case Value::Type::Array:
    case Value::Type::Dictionary: break;
    }
    return {};
}

/// Reads a big-endian number.
template <std::unsigned_integral Number> Number load(const char* from)
{
    Number number;
    std::memcpy(&number, from, sizeof(number));
    return std::endian::native == std::endian::little ? std::byteswap(number) : number;
}

/// What the first byte of a value says about the bytes after it.
struct Head {
    Value::Type type = Value::Type::Null;
    std::uint8_t width = 0; ///< bytes of the number or length after the first byte
    bool isSigned = false;
    bool isKnown = true;
    std::uint32_t number = 0; ///< the number or length, if the first byte contains it
};

/// MessagePack's table of first bytes (https://msgpack.org).
constexpr Head headOf(unsigned first)
{
    using enum Value::Type;
    const auto widthIn = [first](unsigned base) { return static_cast<std::uint8_t>(1u << (first - base)); };
    if (first <= 0x7f) return {.type = Int, .number = first};
    if (first <= 0x8f) return {.type = Dictionary, .number = first & 0x0f};
    if (first <= 0x9f) return {.type = Array, .number = first & 0x0f};
    if (first <= 0xbf) return {.type = String, .number = first & 0x1f};
    if (first == 0xc0) return {};
    if (first == 0xc1) return {.isKnown = false};
    if (first <= 0xc3) return {.type = Bool, .number = first & 1};
    if (first <= 0xc6) return {.type = Bytes, .width = widthIn(0xc4)};
    if (first <= 0xc9) return {.type = Date, .width = widthIn(0xc7)};
    if (first <= 0xcb) return {.type = Double, .width = static_cast<std::uint8_t>(first == 0xca ? 4 : 8)};
    if (first <= 0xcf) return {.type = UInt, .width = widthIn(0xcc)};
    if (first <= 0xd3) return {.type = Int, .width = widthIn(0xd0), .isSigned = true};
    if (first <= 0xd8) return {.type = Date, .number = 1u << (first - 0xd4)};
    if (first <= 0xdb) return {.type = String, .width = widthIn(0xd9)};
    if (first <= 0xdd) return {.type = Array, .width = widthIn(0xdb)};
    if (first <= 0xdf) return {.type = Dictionary, .width = widthIn(0xdd)};
    return {.type = Int, .isSigned = true, .number = first};
}

inline constexpr auto kHeads = [] {
    std::array<Head, 256> heads;
    for (unsigned first = 0; first < heads.size(); ++first) heads[first] = headOf(first);
    return heads;
}();

/// Reads the tokens of an archive from start to end. A copy continues at the same token.
class TokenReader {
public:
    /// `archive` must outlive the reader.
    explicit TokenReader(std::string_view archive)
        : _next(archive.data()), _end(_next + archive.size()), _valuesLeft(archive.size())
    {}

    [[nodiscard]] bool atEnd() const { return _next == _end; }
    /// Returns the first byte of the next token.
    [[nodiscard]] const char* position() const { return _next; }

    /// If the next value is a text whose length is in its first byte, reads it and returns true; otherwise reads
    /// nothing.
    bool readShortText(std::string_view& text)
    {
        if (_next == _end) return false;
        const Head& head = kHeads[static_cast<unsigned char>(*_next)];
        if (head.type != Value::Type::String || head.width > 0 || head.number >= _end - _next) return false;
        text = {_next + 1, head.number};
        _next += 1 + head.number;
        return true;
    }

    /// Reads the next token, or the head of a container. Returns null, or why it can't.
    const char* read(Token& token)
    {
        if (_next == _end) [[unlikely]]
            return "truncated";
        const Head& head = kHeads[static_cast<unsigned char>(*_next++)];
        if (head.width > _end - _next) return "truncated";
        const std::uint64_t number = numberAfter(head);
        _next += head.width;
        token = {.type = head.type};
        switch (head.type) {
        case Value::Type::Null: return head.isKnown ? nullptr : "not an archive";
        case Value::Type::Bool: token.boolean = number != 0; return nullptr;
        case Value::Type::Int: token.integer = static_cast<std::int64_t>(number); return nullptr;
        case Value::Type::UInt:
            if (number <= INT64_MAX) token.type = Value::Type::Int;
            token.unsignedInteger = number;
            return nullptr;
        case Value::Type::Double:
            token.real = head.width == 4 ? double{std::bit_cast<float>(static_cast<std::uint32_t>(number))}
                                         : std::bit_cast<double>(number);
            return nullptr;
        case Value::Type::Date: ++_next; [[fallthrough]]; // skips the extension type
        case Value::Type::String:
        case Value::Type::Bytes:
            if (_next > _end || number > static_cast<std::uint64_t>(_end - _next)) return "truncated";
            token.size = static_cast<std::uint32_t>(number);
            token.bytes = _next;
            _next += number;
            return head.type == Value::Type::Date ? readDate(token) : nullptr;
        case Value::Type::Array:
        case Value::Type::Dictionary:
            token.size = static_cast<std::uint32_t>(number);
            // Every value takes at least one byte, so all containers together can't declare more values than bytes.
            if (token.contents() > _valuesLeft) return "truncated";
            _valuesLeft -= token.contents();
            return nullptr;
        }
        return nullptr;
    }

private:
    /// Returns the number that follows the first byte, sign-extended if it is signed, or the number in the first byte.
    [[nodiscard]] std::uint64_t numberAfter(const Head& head) const
    {
        const auto signedAs = [&head](auto number) -> std::uint64_t {
            using Signed = std::make_signed_t<decltype(number)>;
            return head.isSigned ? static_cast<std::uint64_t>(std::int64_t{static_cast<Signed>(number)}) : number;
        };
        switch (head.width) {
        case 1: return signedAs(load<std::uint8_t>(_next));
        case 2: return signedAs(load<std::uint16_t>(_next));
        case 4: return signedAs(load<std::uint32_t>(_next));
        case 8: return load<std::uint64_t>(_next);
        default: return signedAs(static_cast<std::uint8_t>(head.number));
        }
    }

    /// Reads an extension as a date: a timestamp of 4, 8 or 12 bytes.
    static const char* readDate(Token& token)
    {
        const char* body = token.bytes;
        std::int64_t seconds = 0;
        std::uint64_t nanoseconds = 0;
        if (static_cast<std::int8_t>(body[-1]) != kTimestamp) return "unknown extension type";
        if (token.size == 4) {
            seconds = load<std::uint32_t>(body);
        } else if (token.size == 8) {
            seconds = static_cast<std::int64_t>(load<std::uint64_t>(body) & ((std::uint64_t{1} << 34) - 1));
            nanoseconds = load<std::uint64_t>(body) >> 34;
        } else if (token.size == 12) {
            nanoseconds = load<std::uint32_t>(body);
            seconds = static_cast<std::int64_t>(load<std::uint64_t>(body + 4));
        } else {
            return "broken date";
        }
        const __int128 total = static_cast<__int128>(seconds) * kNanosecondsPerSecond + nanoseconds;
        if (nanoseconds >= kNanosecondsPerSecond || total < INT64_MIN || total > INT64_MAX) return "date out of range";
        token.integer = static_cast<std::int64_t>(total);
        return nullptr;
    }

    const char* _next;
    const char* _end;
    std::uint64_t _valuesLeft; ///< how many values containers may still declare
};

} // namespace platform::archives
