#include "platform/ipc/BusValue.h"

#include <algorithm>
#include <cstring>
#include <fcntl.h>

#include <fmt/format.h>
#include <simdjson.h>
#include <systemd/sd-bus.h>
#include <unicode/unistr.h>

#include "platform/values/Dictionary.h"

namespace platform::ipc {

// MARK: - reading

bool BusReader::atEnd() const
{
    return sd_bus_message_at_end(_bus, true) != 0;
}

Value BusReader::fail(std::string message, std::string name)
{
    if (!_error) _error = CallError{std::move(name), std::move(message)};
    return {};
}

bool BusReader::charge(std::size_t bytes)
{
    _size += bytes;
    if (_size <= _maximumSize) return true;
    fail(fmt::format("the arguments take more than {} bytes", _maximumSize), SD_BUS_ERROR_LIMITS_EXCEEDED);
    return false;
}

void BusReader::readBasic(char type, void* to)
{
    if (charge(kScalarCost) && sd_bus_message_read_basic(_bus, type, to) <= 0) fail("malformed value");
}

std::string_view BusReader::text(char type, std::size_t cost)
{
    const char* read = nullptr;
    if (sd_bus_message_read_basic(_bus, type, &read) <= 0 || !read) return fail("malformed text"), std::string_view();
    const std::string_view text = read;
    return charge(cost + text.size()) ? text : std::string_view();
}

std::string_view BusReader::byteString()
{
    const void* data = nullptr;
    std::size_t size = 0;
    if (sd_bus_message_read_array(_bus, 'y', &data, &size) < 0)
        return fail("malformed byte string"), std::string_view();
    return charge(kTextCost + size) ? std::string_view(static_cast<const char*>(data), size) : std::string_view();
}

Value BusReader::value(bool inVariant)
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
        if (std::string_view(contents) == "y") return Bytes(std::string(byteString()));
        // `contents` is valid until the next call of sd-bus, so it is copied.
        return contents[0] == '{' ? dictionary(std::string(contents), inVariant)
                                  : array(std::string(contents), inVariant);
    default: return fail(fmt::format("values of type '{}' are not supported", type));
    }
}

Value BusReader::handle()
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

Value BusReader::variant(const char* contents)
{
    // The message holds a variant's contents.
    if (sd_bus_message_enter_container(_bus, SD_BUS_TYPE_VARIANT, contents) <= 0)
        return fail("malformed variant, or nested too deeply");
    Value inner = value(true);
    if (!_error && sd_bus_message_exit_container(_bus) < 0) return fail("malformed variant");
    return inner;
}

Value BusReader::array(const std::string& contents, bool inVariant)
{
    Value::Array elements;
    if (!charge(kContainerCost)) return {};
    if (sd_bus_message_enter_container(_bus, SD_BUS_TYPE_ARRAY, contents.c_str()) < 0)
        return fail("malformed array, or nested too deeply");
    while (!_error && sd_bus_message_at_end(_bus, false) == 0) elements.push_back(value(inVariant));
    if (!_error && sd_bus_message_exit_container(_bus) < 0) return fail("malformed array");
    return elements;
}

Value BusReader::dictionary(const std::string& contents, bool inVariant)
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
        const std::string_view key = text(SD_BUS_TYPE_STRING, kKeyCost);
        if (_error) break;
        Value element = value(inVariant);
        if (_error) {
            _error->message = fmt::format("\"{}\": {}", key, _error->message);
            break;
        }
        entries.set(std::string(key), std::move(element));
        if (sd_bus_message_exit_container(_bus) < 0) return fail("malformed dictionary entry");
    }
    if (!_error && sd_bus_message_exit_container(_bus) < 0) return fail("malformed dictionary");
    return entries;
}

// MARK: - writing

namespace {

/// The least that a value counts for in a message, in bytes.
constexpr std::size_t kSmallestValue = 8;

/// Returns true only for texts that a bus message can contain; returns false for a few that it can, too.
bool isBusText(std::string_view text)
{
    // The UTF-8 form of every noncharacter, such as U+FFFF, contains one of these sequences.
    return simdjson::validate_utf8(text) && text.find('\0') == std::string_view::npos && !text.contains("\xef\xb7") &&
           !text.contains("\xbf\xbe") && !text.contains("\xbf\xbf");
}

} // namespace

bool BusWriter::append(std::string_view type, const Value& value)
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
        if (value.isNull()) return appendText("");
        return value.asString() ? appendText(*value.asString()) : mismatch(type);
    case SD_BUS_TYPE_UNIX_FD: {
        const auto index = value.asUInt();
        return index && *index < _handles.size() ? appendBasic(type.front(), _handles[*index].fd()) : mismatch(type);
    }
    case SD_BUS_TYPE_VARIANT: return appendVariant(value);
    default: return mismatch(type);
    }
}

bool BusWriter::appendVariant(const Value& value)
{
    const auto with = [this](const char* type, auto&& contents) {
        return open(SD_BUS_TYPE_VARIANT, type) && contents() && close();
    };
    switch (value.type()) {
    case Value::Type::Null: return with("a{sv}", [&] { return appendDictionary({}); });
    case Value::Type::Dictionary: return with("a{sv}", [&] { return appendDictionary(*value.asDictionary()); });
    case Value::Type::Bool: return with("b", [&] { return appendBasic<int>('b', *value.asBool()); });
    case Value::Type::Int: return with("x", [&] { return appendBasic('x', *value.asInt()); });
    case Value::Type::UInt: return with("t", [&] { return appendBasic('t', *value.asUInt()); });
    case Value::Type::Double: return with("d", [&] { return appendBasic('d', *value.asDouble()); });
    case Value::Type::Date: return with("d", [&] { return appendBasic('d', secondsSince1970(*value.asDate())); });
    case Value::Type::String: return with("s", [&] { return appendText(*value.asString()); });
    case Value::Type::Bytes: return with("ay", [&] { return appendBytes(*value.asBytes()); });
    case Value::Type::Array: return with("av", [&] { return appendArray("v", *value.asArray()); });
    }
    return false;
}

bool BusWriter::appendTextVariant(std::string_view text)
{
    return open(SD_BUS_TYPE_VARIANT, "s") && appendText(text) && close();
}

bool BusWriter::appendText(std::string_view text)
{
    count(kSmallestValue + text.size());
    if (!isBusText(text)) return check(sd_bus_message_append_basic(_bus, SD_BUS_TYPE_STRING, busText(text).c_str()));
    // Valid texts skip sd-bus's own check.
    char* space = nullptr;
    if (!check(sd_bus_message_append_string_space(_bus, text.size(), &space))) return false;
    std::ranges::copy(text, space);
    return true;
}

bool BusWriter::open(char type, const char* contents)
{
    if (type == SD_BUS_TYPE_ARRAY) count(kSmallestValue);
    return check(sd_bus_message_open_container(_bus, type, contents));
}

bool BusWriter::close()
{
    return check(sd_bus_message_close_container(_bus));
}

void BusWriter::failedIn(std::string_view field)
{
    reason = fmt::format("\"{}\": {}", field, reason);
}

bool BusWriter::mismatch(std::string_view type)
{
    if (reason.empty()) reason = fmt::format("the value is not of type \"{}\"", type);
    return false;
}

bool BusWriter::check(int result)
{
    if (result < 0 && reason.empty()) reason = std::strerror(-result);
    return result >= 0;
}

void BusWriter::count(std::size_t bytes)
{
    _size += std::max(bytes, kSmallestValue);
}

template <class T> bool BusWriter::appendBasic(char type, T value)
{
    count(sizeof(T));
    return check(sd_bus_message_append_basic(_bus, type, &value));
}

template <class T, class From> bool BusWriter::appendNumber(std::string_view type, std::optional<From> value)
{
    if (!value || (std::is_integral_v<T> && static_cast<From>(static_cast<T>(*value)) != *value)) return mismatch(type);
    return appendBasic(type.front(), static_cast<T>(*value));
}

bool BusWriter::appendBytes(const Bytes& bytes)
{
    count(kSmallestValue + bytes.size());
    return check(sd_bus_message_append_array(_bus, 'y', bytes.data(), bytes.size()));
}

bool BusWriter::appendArray(std::string_view element, const Value::Array& array)
{
    return open(SD_BUS_TYPE_ARRAY, std::string(element).c_str()) &&
           std::ranges::all_of(array, [&](const Value& value) { return append(element, value); }) && close();
}

bool BusWriter::appendDictionary(const Dictionary& dictionary)
{
    const auto appendEntry = [this](const Dictionary::Entry& entry) {
        const auto& [key, value] = entry;
        if (value.isNull()) return true;
        if (open(SD_BUS_TYPE_DICT_ENTRY, "sv") && appendText(key) && appendVariant(value) && close()) return true;
        failedIn(key);
        return false;
    };
    return open(SD_BUS_TYPE_ARRAY, "{sv}") && std::ranges::all_of(dictionary, appendEntry) && close();
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
