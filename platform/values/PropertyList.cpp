#include "platform/values/PropertyList.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <memory>

#include <fmt/format.h>
#include <plist/plist.h>
#include <simdjson.h>
#include <unicode/unistr.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Value.h"

/// libplist writes property lists. It doesn't read them: it recurses as deep as a file nests and copies an object for
/// every reference to it, so that a file of one kilobyte could exhaust memory.
namespace platform {

namespace {

/// 2001-01-01 00:00 UTC, from which property list dates count, in seconds since 1970.
constexpr std::int64_t kEpoch = 978307200;

// Reading

/// Parses one file:
///
///     "bplist00" | objects | offset of each object | trailer
///
/// An object is a marker byte (type in the high half, length or width in the low half) and its contents; containers
/// refer to other objects by number. The trailer (32 bytes, big-endian) has the widths of offsets and references,
/// the number of objects, the root object's number, and where the offsets begin.
class Reader {
public:
    Reader(std::string_view file, std::size_t maximumSize)
        : _file(file), _objectsLeft(file.size()), _bytesLeft(maximumSize)
    {}

    std::expected<Value, Error> read()
    {
        constexpr std::string_view kMagic = "bplist00";
        constexpr std::size_t kTrailerSize = 32;
        if (!_file.starts_with(kMagic)) return malformed("not a binary property list");
        if (_file.size() < kMagic.size() + kTrailerSize) return malformed("truncated");

        const std::size_t trailer = _file.size() - kTrailerSize;
        _offsetWidth = *number(trailer + 6, 1);
        _referenceWidth = *number(trailer + 7, 1);
        _objectCount = *number(trailer + 8, 8);
        const std::uint64_t root = *number(trailer + 16, 8);
        _offsetTable = *number(trailer + 24, 8);
        if (!isWidth(_offsetWidth) || !isWidth(_referenceWidth) || _offsetTable > trailer ||
            _objectCount > (trailer - _offsetTable) / _offsetWidth)
            return malformed("broken trailer");

        Value value;
        if (!readObject(root, 0, value)) return malformed(_reason);
        return value;
    }

private:
    static bool isWidth(std::uint64_t width) { return width >= 1 && width <= 8; }

    bool fail(const char* reason)
    {
        _reason = reason;
        return false;
    }

    /// Returns `count` bytes at `position`, or nothing if the file is too short.
    [[nodiscard]] std::optional<std::string_view> bytes(std::uint64_t position, std::uint64_t count) const
    {
        if (position > _file.size() || count > _file.size() - position) return std::nullopt;
        return _file.substr(position, count);
    }

    /// Returns the big-endian number of `width` bytes (at most 8) at `position`, or nothing if the file is too short.
    [[nodiscard]] std::optional<std::uint64_t> number(std::uint64_t position, std::uint64_t width) const
    {
        const auto digits = bytes(position, width);
        if (!digits) return std::nullopt;
        std::uint64_t value = 0;
        for (const char c : *digits) value = value << 8 | static_cast<unsigned char>(c);
        return value;
    }

    /// Reads object `index`, which is nested in `depth` containers.
    bool readObject(std::uint64_t index, std::size_t depth, Value& value)
    {
        if (index >= _objectCount) return fail("reference to no object");
        const auto position = number(_offsetTable + index * _offsetWidth, _offsetWidth);
        const auto marker = position ? number(*position, 1) : std::nullopt;
        if (!marker) return fail("object outside the file");
        if (_objectsLeft-- == 0) return fail("refers to its containers more than once");

        const std::uint64_t contents = *position + 1;
        const auto low = static_cast<unsigned>(*marker & 0xf);
        switch (*marker >> 4) {
        case 0x0: return readSingle(low, value);
        case 0x1: return readInteger(contents, low, value);
        case 0x2: return readReal(contents, low, value);
        case 0x3: return readDate(contents, low, value);
        case 0x4:
        case 0x5:
        case 0x6: return readRun(*marker >> 4, contents, low, value);
        case 0xa: return readArray(contents, low, depth + 1, value);
        case 0xd: return readDictionary(contents, low, depth + 1, value);
        default: return fail("object of an unsupported type");
        }
    }

    bool readSingle(unsigned which, Value& value)
    {
        if (which == 0x8)
            value = false;
        else if (which == 0x9)
            value = true;
        else
            return fail("object of an unsupported type");
        return true;
    }

    /// Integers of 8 bytes are signed, shorter ones unsigned. The upper half of a 16-byte integer must be its sign.
    bool readInteger(std::uint64_t position, unsigned exponent, Value& value)
    {
        if (exponent > 4) return fail("integer of an unsupported width");
        const std::uint64_t width = 1u << exponent;
        const auto low = number(width == 16 ? position + 8 : position, std::min<std::uint64_t>(width, 8));
        if (!low) return fail("truncated integer");
        const auto number64 = static_cast<std::int64_t>(*low);
        if (width == 16) {
            const std::uint64_t high = *number(position, 8);
            if (high == 0)
                value = *low;
            else if (high == UINT64_MAX && number64 < 0)
                value = number64;
            else
                return fail("integer beyond 64 bits");
        } else {
            value = number64;
        }
        return true;
    }

    [[nodiscard]] std::optional<double> real(std::uint64_t position, unsigned exponent) const
    {
        if (exponent != 2 && exponent != 3) return std::nullopt;
        const auto bits = number(position, 1u << exponent);
        if (!bits) return std::nullopt;
        return exponent == 3 ? std::bit_cast<double>(*bits)
                             : double{std::bit_cast<float>(static_cast<std::uint32_t>(*bits))};
    }

    bool readReal(std::uint64_t position, unsigned exponent, Value& value)
    {
        const auto number = real(position, exponent);
        if (!number) return fail("broken real number");
        value = *number;
        return true;
    }

    bool readDate(std::uint64_t position, unsigned exponent, Value& value)
    {
        const auto seconds = exponent == 3 ? real(position, exponent) : std::nullopt;
        if (!seconds || !std::isfinite(*seconds)) return fail("broken date");
        // Shifts whole seconds only: the fraction keeps its precision.
        const double whole = std::floor(*seconds);
        value = dateFromSecondsSince1970(whole + static_cast<double>(kEpoch)) + durationFromSeconds(*seconds - whole);
        return true;
    }

    /// Reads the length of an object: the low half of its marker, or the integer object that follows the marker. Moves
    /// `position` past it.
    bool readLength(std::uint64_t& position, unsigned low, std::uint64_t& length)
    {
        length = low;
        if (low != 0xf) return true;
        const auto marker = number(position, 1);
        if (!marker || *marker >> 4 != 0x1 || (*marker & 0xf) > 3) return fail("broken length");
        const std::uint64_t width = std::uint64_t{1} << (*marker & 0xf);
        const auto written = number(position + 1, width);
        if (!written) return fail("truncated length");
        length = *written;
        position += 1 + width;
        return true;
    }

    /// Reads data (type 4), an ASCII string (5) or a UTF-16 string (6).
    bool readRun(std::uint64_t type, std::uint64_t position, unsigned low, Value& value)
    {
        std::uint64_t length = 0;
        if (!readLength(position, low, length)) return false;
        if (length > _file.size()) return fail("truncated data");
        const auto run = bytes(position, type == 6 ? length * 2 : length);
        if (!run) return fail("truncated data");
        if (run->size() > _bytesLeft) return fail("expands beyond the size limit");
        _bytesLeft -= run->size();
        if (type == 4)
            value = Bytes(std::string(*run));
        else if (type == 6)
            value = utf8FromUtf16(*run);
        else if (std::ranges::all_of(*run, [](char c) { return static_cast<unsigned char>(c) < 0x80; }))
            value = *run;
        else
            return fail("string that is not ASCII");
        return true;
    }

    static std::string utf8FromUtf16(std::string_view bigEndian)
    {
        std::u16string units(bigEndian.size() / 2, u'\0');
        for (std::size_t i = 0; i < units.size(); ++i)
            units[i] = static_cast<char16_t>(static_cast<unsigned char>(bigEndian[2 * i]) << 8 |
                                             static_cast<unsigned char>(bigEndian[2 * i + 1]));
        std::string text;
        icu::UnicodeString(false, units.data(), static_cast<std::int32_t>(units.size())).toUTF8String(text);
        return text;
    }

    /// Reads the head of a container at nesting `depth` that has `width` references for each of its `length` items.
    /// Moves `position` to the references.
    bool readHead(std::uint64_t& position, unsigned low, std::size_t depth, unsigned width, std::uint64_t& length)
    {
        if (depth > kMaximumDepth) return fail("nested too deep");
        if (!readLength(position, low, length)) return false;
        if (length > _file.size() || !bytes(position, length * width * _referenceWidth))
            return fail("truncated container");
        return true;
    }

    bool readReference(std::uint64_t position, std::uint64_t index, std::size_t depth, Value& value)
    {
        return readObject(*number(position + index * _referenceWidth, _referenceWidth), depth, value);
    }

    bool readArray(std::uint64_t position, unsigned low, std::size_t depth, Value& value)
    {
        std::uint64_t length = 0;
        if (!readHead(position, low, depth, 1, length)) return false;
        Value::Array array;
        for (std::uint64_t i = 0; i < length; ++i)
            if (!readReference(position, i, depth, array.emplace_back())) return false;
        value = std::move(array);
        return true;
    }

    /// Reads a dictionary: references to all keys, then to all values.
    bool readDictionary(std::uint64_t position, unsigned low, std::size_t depth, Value& value)
    {
        std::uint64_t length = 0;
        if (!readHead(position, low, depth, 2, length)) return false;
        Dictionary dictionary;
        for (std::uint64_t i = 0; i < length; ++i) {
            Value key;
            Value entry;
            if (!readReference(position, i, depth, key)) return false;
            if (!key.asString()) return fail("key that is not a string");
            if (!readReference(position, length + i, depth, entry)) return false;
            dictionary.set(*key.asString(), std::move(entry));
        }
        value = std::move(dictionary);
        return true;
    }

    const std::string_view _file;
    /// Starts at the file's size: a reference takes at least a byte, so only a file that refers to a container more
    /// than once expands to more objects.
    std::uint64_t _objectsLeft;
    std::uint64_t _bytesLeft; ///< limit of the texts and data, which may be referred to more than once
    std::uint64_t _offsetWidth = 0;
    std::uint64_t _referenceWidth = 0;
    std::uint64_t _objectCount = 0;
    std::uint64_t _offsetTable = 0;
    const char* _reason = "";
};

// Writing

struct NodeDeleter {
    void operator()(plist_t node) const { plist_free(node); }
};
using Node = std::unique_ptr<void, NodeDeleter>;

/// Converts a value to libplist's tree. libplist cuts texts at a NUL or invalid UTF-8 and has dates of 32-bit seconds;
/// values that it would truncate fail.
class NodeMaker {
public:
    /// Returns null after a failure, and for the null value, which the format doesn't have.
    Node make(const Value& value, std::size_t depth = 0)
    {
        switch (value.type()) {
        case Value::Type::Null: return nullptr;
        case Value::Type::Bool: return Node(plist_new_bool(*value.asBool()));
        case Value::Type::Int: return Node(plist_new_uint(static_cast<std::uint64_t>(*value.asInt())));
        case Value::Type::UInt: // The format's 64-bit integers are signed.
        case Value::Type::Double: return Node(plist_new_real(*value.asDouble()));
        case Value::Type::String:
            return text(*value.asString()) ? Node(plist_new_string(value.asString()->c_str())) : nullptr;
        case Value::Type::Bytes: return Node(plist_new_data(value.asBytes()->data(), value.asBytes()->size()));
        case Value::Type::Date: return date(*value.asDate());
        case Value::Type::Array: return array(*value.asArray(), depth + 1);
        case Value::Type::Dictionary: return dictionary(*value.asDictionary(), depth + 1);
        }
        return nullptr;
    }

    [[nodiscard]] const char* failure() const { return _failure; }

private:
    Node fail(const char* reason)
    {
        _failure = reason;
        return nullptr;
    }

    bool text(const std::string& text)
    {
        if (text.find('\0') != std::string::npos) fail("a text with a NUL");
        if (!simdjson::validate_utf8(text)) fail("a text that is not UTF-8");
        return !_failure;
    }

    Node date(Date date)
    {
        using namespace std::chrono;
        const auto whole = floor<seconds>(date.time_since_epoch()) - seconds(kEpoch);
        if (whole.count() < INT32_MIN || whole.count() >= INT32_MAX) return fail("a date out of range");
        // Rounded: a date that was parsed from a double may be just below the microsecond that was written.
        const auto rounded = round<microseconds>(date.time_since_epoch()) - seconds(kEpoch);
        const auto count = floor<seconds>(rounded);
        return Node(plist_new_date(static_cast<std::int32_t>(count.count()),
                                   static_cast<std::int32_t>((rounded - count).count())));
    }

    Node array(const Value::Array& array, std::size_t depth)
    {
        if (depth > kMaximumDepth) return fail("nested too deep");
        Node node(plist_new_array());
        for (const Value& element : array) {
            if (Node child = make(element, depth))
                plist_array_append_item(node.get(), child.release());
            else if (_failure)
                return nullptr;
        }
        return node;
    }

    Node dictionary(const Dictionary& dictionary, std::size_t depth)
    {
        if (depth > kMaximumDepth) return fail("nested too deep");
        Node node(plist_new_dict());
        for (const auto& [key, entry] : dictionary) {
            if (!text(key)) return nullptr;
            if (Node child = make(entry, depth))
                plist_dict_set_item(node.get(), key.c_str(), child.release());
            else if (_failure)
                return nullptr;
        }
        return node;
    }

    const char* _failure = nullptr;
};

} // namespace

std::expected<Value, Error> parsePropertyList(std::string_view bytes, std::size_t maximumSize)
{
    if (bytes.size() > maximumSize) return malformed(fmt::format("larger than {} bytes", maximumSize));
    return Reader(bytes, maximumSize).read();
}

std::expected<std::string, Error> toPropertyList(const Value& value)
{
    NodeMaker maker;
    const Node root = maker.make(value);
    if (!root)
        return malformed(fmt::format("no property list can hold {}", maker.failure() ? maker.failure() : "null"));
    char* bytes = nullptr;
    std::uint32_t length = 0;
    plist_to_bin(root.get(), &bytes, &length);
    if (!bytes) return malformed("the property list could not be written");
    std::string file(bytes, length);
    plist_to_bin_free(bytes);
    return file;
}

} // namespace platform
