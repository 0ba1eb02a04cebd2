#include "platform/ipc/BusMessage.h"

#include <algorithm>
#include <cstring>
#include <fcntl.h>
#include <optional>

#include <fmt/format.h>
#include <simdjson.h>
#include <systemd/sd-bus.h>
#include <unicode/unistr.h>

#include "platform/values/Dictionary.h"

namespace platform::ipc {

namespace {

/// The least that a value counts for in a message, in bytes.
constexpr std::size_t kSmallestValue = 8;

// Estimated memory of decoded values in bytes, with the overhead of containers and the allocator.
constexpr std::size_t kScalarCost = 2 * sizeof(Value);
constexpr std::size_t kTextCost = 128;
constexpr std::size_t kContainerCost = 192;
constexpr std::size_t kKeyCost = 96;

/// Reads one message from start to end. After the first failure all reads return null.
class ArgumentReader {
public:
    ArgumentReader(sd_bus_message* bus, std::size_t maximumSize) : _bus(bus), _maximumSize(maximumSize) {}

    std::expected<DecodedArguments, CallError> readAll()
    {
        DecodedArguments decoded;
        while (sd_bus_message_at_end(_bus, true) == 0 && !_error) {
            decoded.message.args.push_back(value(false));
            if (_error) _error->message = fmt::format("argument {}: {}", decoded.message.args.size(), _error->message);
        }
        if (_error) return std::unexpected(std::move(*_error));
        decoded.message.handles = std::move(_handles);
        decoded.size = _size;
        return decoded;
    }

private:
    Value fail(std::string message, const char* name = SD_BUS_ERROR_INVALID_ARGS)
    {
        if (!_error) _error = CallError{name, std::move(message)};
        return {};
    }

    bool charge(std::size_t bytes)
    {
        _size += bytes;
        if (_size <= _maximumSize) return true;
        fail(fmt::format("the arguments take more than {} bytes", _maximumSize), SD_BUS_ERROR_LIMITS_EXCEEDED);
        return false;
    }

    template <class T> T basic(char type)
    {
        T read{};
        if (!charge(kScalarCost)) return T{};
        if (sd_bus_message_read_basic(_bus, type, &read) <= 0) fail("malformed value");
        return read;
    }

    std::string text(char type, std::size_t cost)
    {
        const char* read = nullptr;
        if (sd_bus_message_read_basic(_bus, type, &read) <= 0 || !read) return fail("malformed text"), std::string();
        const std::size_t length = std::strlen(read);
        return charge(cost + length) ? std::string(read, length) : std::string();
    }

    Value value(bool inVariant)
    {
        char type = 0;
        const char* contents = nullptr;
        if (sd_bus_message_peek_type(_bus, &type, &contents) <= 0) return fail("malformed value");
        switch (type) {
        case SD_BUS_TYPE_BOOLEAN: return basic<int>(type) != 0;
        case SD_BUS_TYPE_BYTE: return basic<std::uint8_t>(type);
        case SD_BUS_TYPE_INT16: return basic<std::int16_t>(type);
        case SD_BUS_TYPE_UINT16: return basic<std::uint16_t>(type);
        case SD_BUS_TYPE_INT32: return basic<std::int32_t>(type);
        case SD_BUS_TYPE_UINT32: return basic<std::uint32_t>(type);
        case SD_BUS_TYPE_INT64: return basic<std::int64_t>(type);
        case SD_BUS_TYPE_UINT64: return basic<std::uint64_t>(type);
        case SD_BUS_TYPE_DOUBLE: return basic<double>(type);
        case SD_BUS_TYPE_STRING:
        case SD_BUS_TYPE_OBJECT_PATH:
        case SD_BUS_TYPE_SIGNATURE: return text(type, kTextCost);
        case SD_BUS_TYPE_UNIX_FD: return inVariant ? fail("a variant can't hold a file handle") : handle();
        case SD_BUS_TYPE_VARIANT: return variant(contents);
        case SD_BUS_TYPE_ARRAY:
            if (std::string_view(contents) == "y") return bytes();
            // `contents` is valid until the next call of sd-bus, so it is copied.
            return contents[0] == '{' ? dictionary(std::string(contents), inVariant)
                                      : array(std::string(contents), inVariant);
        default: return fail(fmt::format("values of type '{}' are not supported", type));
        }
    }

    Value bytes()
    {
        const void* data = nullptr;
        std::size_t size = 0;
        if (sd_bus_message_read_array(_bus, 'y', &data, &size) < 0) return fail("malformed byte string");
        if (!charge(kTextCost + size)) return {};
        return Bytes(std::string(static_cast<const char*>(data), size));
    }

    Value handle()
    {
        int fd = -1;
        if (sd_bus_message_read_basic(_bus, SD_BUS_TYPE_UNIX_FD, &fd) <= 0) return fail("malformed file handle");
        if (_handles.size() >= kMaximumHandles)
            return fail(fmt::format("more than {} file handles", kMaximumHandles), SD_BUS_ERROR_LIMITS_EXCEEDED);
        FileHandle duplicate(fcntl(fd, F_DUPFD_CLOEXEC, 3));
        if (!duplicate) return fail("no file descriptor is free", SD_BUS_ERROR_LIMITS_EXCEEDED);
        _handles.push_back(std::move(duplicate));
        return _handles.size() - 1;
    }

    Value variant(const char* contents)
    {
        if (sd_bus_message_enter_container(_bus, SD_BUS_TYPE_VARIANT, std::string(contents).c_str()) <= 0)
            return fail("malformed variant, or nested too deeply");
        Value inner = value(true);
        if (!_error && sd_bus_message_exit_container(_bus) < 0) return fail("malformed variant");
        return inner;
    }

    Value array(const std::string& contents, bool inVariant)
    {
        Value::Array elements;
        if (!charge(kContainerCost)) return {};
        if (sd_bus_message_enter_container(_bus, SD_BUS_TYPE_ARRAY, contents.c_str()) < 0)
            return fail("malformed array, or nested too deeply");
        while (!_error && sd_bus_message_at_end(_bus, false) == 0) elements.push_back(value(inVariant));
        if (!_error && sd_bus_message_exit_container(_bus) < 0) return fail("malformed array");
        return elements;
    }

    Value dictionary(const std::string& contents, bool inVariant)
    {
        if (contents[1] != 's') return fail("a dictionary's keys must be strings");
        const std::string entry = contents.substr(1, contents.size() - 2);
        Dictionary entries;
        if (!charge(kContainerCost)) return {};
        if (sd_bus_message_enter_container(_bus, SD_BUS_TYPE_ARRAY, contents.c_str()) < 0)
            return fail("malformed dictionary, or nested too deeply");
        while (!_error && sd_bus_message_at_end(_bus, false) == 0) {
            if (sd_bus_message_enter_container(_bus, SD_BUS_TYPE_DICT_ENTRY, entry.c_str()) <= 0)
                return fail("malformed dictionary entry");
            std::string key = text(SD_BUS_TYPE_STRING, kKeyCost);
            if (_error) break;
            Value element = value(inVariant);
            if (_error) {
                _error->message = fmt::format("\"{}\": {}", key, _error->message);
                break;
            }
            entries.set(std::move(key), std::move(element));
            if (sd_bus_message_exit_container(_bus) < 0) return fail("malformed dictionary entry");
        }
        if (!_error && sd_bus_message_exit_container(_bus) < 0) return fail("malformed dictionary");
        return entries;
    }

    sd_bus_message* const _bus;
    const std::size_t _maximumSize;
    std::size_t _size = 0;
    std::vector<FileHandle> _handles;
    std::optional<CallError> _error;
};

/// Returns true only for texts that a bus message can contain; returns false for a few that it can, too.
bool isBusText(const std::string& text)
{
    // The UTF-8 form of every noncharacter, such as U+FFFF, contains one of these sequences.
    return simdjson::validate_utf8(text) && text.find('\0') == std::string::npos && !text.contains("\xef\xb7") &&
           !text.contains("\xbf\xbe") && !text.contains("\xbf\xbf");
}

/// Appends arguments one complete type at a time. After `append` has returned false, `reason` says why and the message
/// is unusable.
class ArgumentWriter {
public:
    ArgumentWriter(sd_bus_message* bus, const std::vector<FileHandle>& handles) : _bus(bus), _handles(handles) {}

    bool append(std::string_view type, const Value& value)
    {
        if (type == "ay") {
            if (value.isNull()) return appendBytes({});
            const Bytes* bytes = value.asBytes();
            return bytes ? appendBytes(*bytes) : mismatch(type);
        }
        if (type == "a{sv}") {
            if (value.isNull()) return appendDictionary({});
            const Dictionary* dictionary = value.asDictionary();
            return dictionary ? appendDictionary(*dictionary) : mismatch(type);
        }
        if (type.starts_with('a')) {
            if (value.isNull()) return appendArray(type.substr(1), {});
            const Value::Array* array = value.asArray();
            return array ? appendArray(type.substr(1), *array) : mismatch(type);
        }
        switch (type.front()) {
        case SD_BUS_TYPE_BOOLEAN: return appendNumber<int>(type, value.isNull() ? false : value.asBool());
        case SD_BUS_TYPE_INT32: return appendNumber<std::int32_t>(type, value.isNull() ? 0 : value.asInt());
        case SD_BUS_TYPE_UINT32: return appendNumber<std::uint32_t>(type, value.isNull() ? 0 : value.asUInt());
        case SD_BUS_TYPE_INT64: return appendNumber<std::int64_t>(type, value.isNull() ? 0 : value.asInt());
        case SD_BUS_TYPE_UINT64: return appendNumber<std::uint64_t>(type, value.isNull() ? 0 : value.asUInt());
        case SD_BUS_TYPE_DOUBLE: return appendNumber<double>(type, value.isNull() ? 0 : value.asDouble());
        case SD_BUS_TYPE_STRING:
            if (value.isNull()) return appendText({});
            return value.asString() ? appendText(*value.asString()) : mismatch(type);
        case SD_BUS_TYPE_UNIX_FD: {
            const auto index = value.asUInt();
            return index && *index < _handles.size() ? appendBasic(type.front(), _handles[*index].fd())
                                                     : mismatch(type);
        }
        case SD_BUS_TYPE_VARIANT: return appendVariant(value);
        default: return mismatch(type);
        }
    }

    [[nodiscard]] std::size_t size() const { return _size; }
    std::string reason;

private:
    bool mismatch(std::string_view type)
    {
        if (reason.empty()) reason = fmt::format("the value is not of type \"{}\"", type);
        return false;
    }
    bool check(int result)
    {
        if (result < 0 && reason.empty()) reason = std::strerror(-result);
        return result >= 0;
    }
    void count(std::size_t bytes) { _size += std::max(bytes, kSmallestValue); }

    template <class T> bool appendBasic(char type, T value)
    {
        count(sizeof(T));
        return check(sd_bus_message_append_basic(_bus, type, &value));
    }

    template <class T, class From> bool appendNumber(std::string_view type, std::optional<From> value)
    {
        if (!value || (std::is_integral_v<T> && static_cast<From>(static_cast<T>(*value)) != *value))
            return mismatch(type);
        return appendBasic(type.front(), static_cast<T>(*value));
    }

    bool appendText(const std::string& text)
    {
        count(kSmallestValue + text.size());
        return check(sd_bus_message_append_basic(_bus, SD_BUS_TYPE_STRING,
                                                 isBusText(text) ? text.c_str() : busText(text).c_str()));
    }

    bool appendBytes(const Bytes& bytes)
    {
        count(kSmallestValue + bytes.size());
        return check(sd_bus_message_append_array(_bus, 'y', bytes.data(), bytes.size()));
    }

    bool appendArray(std::string_view element, const Value::Array& array)
    {
        count(kSmallestValue);
        return check(sd_bus_message_open_container(_bus, SD_BUS_TYPE_ARRAY, std::string(element).c_str())) &&
               std::ranges::all_of(array, [&](const Value& value) { return append(element, value); }) &&
               check(sd_bus_message_close_container(_bus));
    }

    bool appendDictionary(const Dictionary& dictionary)
    {
        count(kSmallestValue);
        return check(sd_bus_message_open_container(_bus, SD_BUS_TYPE_ARRAY, "{sv}")) &&
               std::ranges::all_of(dictionary, [&](const Dictionary::Entry& entry) { return appendEntry(entry); }) &&
               check(sd_bus_message_close_container(_bus));
    }

    bool appendEntry(const Dictionary::Entry& entry)
    {
        if (entry.second.isNull()) return true;
        if (check(sd_bus_message_open_container(_bus, SD_BUS_TYPE_DICT_ENTRY, "sv")) && appendText(entry.first) &&
            appendVariant(entry.second) && check(sd_bus_message_close_container(_bus)))
            return true;
        reason = fmt::format("\"{}\": {}", entry.first, reason);
        return false;
    }

    bool appendVariant(const Value& value)
    {
        const char* type = nullptr;
        switch (value.type()) {
        case Value::Type::Null:
        case Value::Type::Dictionary: type = "a{sv}"; break;
        case Value::Type::Bool: type = "b"; break;
        case Value::Type::Int: type = "x"; break;
        case Value::Type::UInt: type = "t"; break;
        case Value::Type::Double:
        case Value::Type::Date: type = "d"; break;
        case Value::Type::String: type = "s"; break;
        case Value::Type::Bytes: type = "ay"; break;
        case Value::Type::Array: type = "av"; break;
        }
        const auto date = value.asDate();
        return check(sd_bus_message_open_container(_bus, SD_BUS_TYPE_VARIANT, type)) &&
               (date ? appendBasic('d', secondsSince1970(*date)) : append(type, value)) &&
               check(sd_bus_message_close_container(_bus));
    }

    sd_bus_message* const _bus;
    const std::vector<FileHandle>& _handles;
    std::size_t _size = 0;
};

/// Returns the length of the first complete type of a signature: a basic type, "v", "a{sv}", or an array of these.
std::size_t firstType(std::string_view signature)
{
    constexpr std::string_view kDictionary = "a{sv}";
    if (signature.starts_with(kDictionary)) return kDictionary.size();
    return signature.starts_with('a') && signature.size() > 1 ? 1 + firstType(signature.substr(1)) : 1;
}

} // namespace

void BusMessageUnref::operator()(sd_bus_message* message) const
{
    sd_bus_message_unref(message);
}

std::expected<DecodedArguments, CallError> decodeArguments(sd_bus_message* message, std::size_t maximumSize)
{
    return ArgumentReader(message, maximumSize).readAll();
}

std::expected<std::size_t, std::string> encodeArguments(sd_bus_message* bus, std::string_view signature,
                                                        const Message& message)
{
    ArgumentWriter writer(bus, message.handles);
    std::size_t index = 0;
    for (; !signature.empty(); ++index) {
        const auto type = signature.substr(0, firstType(signature));
        signature.remove_prefix(type.size());
        if (index >= message.args.size()) return std::unexpected(fmt::format("argument {} is missing", index + 1));
        if (!writer.append(type, message.args[index]))
            return std::unexpected(fmt::format("argument {}: {}", index + 1, writer.reason));
    }
    if (index < message.args.size()) return std::unexpected(fmt::format("argument {} is not expected", index + 1));
    return writer.size();
}

std::string busText(std::string_view text)
{
    std::string repaired;
    const auto unicode =
        icu::UnicodeString::fromUTF8(icu::StringPiece(text.data(), static_cast<std::int32_t>(text.size())));
    icu::UnicodeString fit;
    for (std::int32_t i = 0; i < unicode.length(); i = unicode.moveIndex32(i, 1)) {
        const UChar32 character = unicode.char32At(i);
        fit.append(character == 0 || U_IS_UNICODE_NONCHAR(character) ? UChar32{0xFFFD} : character);
    }
    fit.toUTF8String(repaired);
    return repaired;
}

} // namespace platform::ipc
