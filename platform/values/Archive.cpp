#include "platform/values/Archive.h"

#include <array>
#include <bit>

#include <msgpack.hpp>

#include "platform/values/ArchiveTokens.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Record.h"

/// A record is a MessagePack map whose first key is "class"; a date is a timestamp, extension type -1.
namespace platform {

namespace {

using archives::kNanosecondsPerSecond;
using archives::kTimestamp;
using archives::Token;
using archives::TokenReader;

// Writing

class ArchiveEncoder final : public Encoder {
public:
    void beginRecord(std::string_view className, std::size_t) override
    {
        // A map whose 16-bit count is filled in when the record ends.
        _records.push_back({.start = _stream.bytes.size(), .entries = 1});
        _stream.bytes.append("\xde\0\0", 3);
        packText(kClassKey);
        packText(className);
    }
    void key(std::string_view name) override
    {
        _keyStart = _stream.bytes.size();
        packText(name);
        _keyEnd = _stream.bytes.size();
        ++_records.back().entries;
    }
    void endRecord() override
    {
        store(_stream.bytes.data() + _records.back().start + 1, _records.back().entries);
        _records.pop_back();
    }
    void beginArray(std::size_t count) override { _packer.pack_array(static_cast<std::uint32_t>(count)); }
    void endArray() override {}
    /// Leaves out a null field: removes the key that was just written.
    void null() override
    {
        if (_stream.bytes.size() != _keyEnd) {
            _packer.pack_nil();
            return;
        }
        _stream.bytes.resize(_keyStart);
        _keyEnd = std::string::npos;
        --_records.back().entries;
    }
    void boolean(bool value) override { value ? _packer.pack_true() : _packer.pack_false(); }
    void integer(std::int64_t value) override { _packer.pack_int64(value); }
    void unsignedInteger(std::uint64_t value) override { _packer.pack_uint64(value); }
    void real(double value) override
    {
        // The packer would write a whole number as an integer, and the value would be read back as another type.
        std::array<char, 9> number{'\xcb'};
        store(number.data() + 1, std::bit_cast<std::uint64_t>(value));
        _stream.write(number.data(), number.size());
    }
    void string(std::string_view value) override { packText(value); }
    void bytes(const Bytes& value) override
    {
        _packer.pack_bin(static_cast<std::uint32_t>(value.size()));
        _packer.pack_bin_body(value.data(), static_cast<std::uint32_t>(value.size()));
    }
    void date(Date value) override
    {
        // The 96-bit form holds every date.
        const std::int64_t count = value.time_since_epoch().count();
        const std::int64_t rest = count % kNanosecondsPerSecond;
        const std::int64_t seconds = count / kNanosecondsPerSecond - (rest < 0 ? 1 : 0);
        std::array<char, 12> body;
        store(body.data(), static_cast<std::uint32_t>(rest < 0 ? rest + kNanosecondsPerSecond : rest));
        store(body.data() + 4, static_cast<std::uint64_t>(seconds));
        _packer.pack_ext(body.size(), kTimestamp);
        _packer.pack_ext_body(body.data(), body.size());
    }
    void value(const Value& value) override
    {
        switch (value.type()) {
        case Value::Type::Null: return null();
        case Value::Type::Bool: return boolean(*value.asBool());
        case Value::Type::Int: return integer(*value.asInt());
        case Value::Type::UInt: return unsignedInteger(*value.asUInt());
        case Value::Type::Double: return real(*value.asDouble());
        case Value::Type::String: return string(*value.asString());
        case Value::Type::Bytes: return bytes(*value.asBytes());
        case Value::Type::Date: return date(*value.asDate());
        case Value::Type::Array:
            beginArray(value.count());
            for (const Value& element : *value.asArray()) this->value(element);
            return;
        case Value::Type::Dictionary:
            _packer.pack_map(static_cast<std::uint32_t>(value.count()));
            for (const auto& [name, entry] : *value.asDictionary()) {
                packText(name);
                this->value(entry);
            }
            return;
        }
    }

    [[nodiscard]] std::string take() { return std::move(_stream.bytes); }

private:
    struct Stream {
        void write(const char* from, std::size_t count) { bytes.append(from, count); }
        std::string bytes;
    };
    struct OpenRecord {
        std::size_t start;
        std::uint16_t entries;
    };

    void packText(std::string_view text)
    {
        _packer.pack_str(static_cast<std::uint32_t>(text.size()));
        _packer.pack_str_body(text.data(), static_cast<std::uint32_t>(text.size()));
    }

    template <class Number> static void store(char* to, Number number)
    {
        for (std::size_t i = sizeof(Number); i > 0; number = static_cast<Number>(number >> 8))
            to[--i] = static_cast<char>(number & 0xff);
    }

    Stream _stream;
    msgpack::packer<Stream> _packer{_stream};
    std::vector<OpenRecord> _records;
    std::size_t _keyStart = 0;
    std::size_t _keyEnd = std::string::npos; ///< end of the last key; equals the size if nothing followed the key
};

// Reading

/// Reads an archive value by value, as records ask for it. The library's parsers read the whole archive into objects or
/// for a visitor first; storing that took a third of the decoding time.
class ArchiveDecoder final : public Decoder {
public:
    /// `archive` must outlive the decoder.
    ArchiveDecoder(std::string_view archive, const RecordClasses& classes) : Decoder(classes), _tokens(archive)
    {
        constexpr std::size_t kUsualDepth = 16; // one allocation instead of one for each doubling
        _left.reserve(kUsualDepth);
    }

    /// Fails unless the whole archive was read.
    void finish()
    {
        if (!failed() && (_isRead || !_tokens.atEnd())) fail("trailing bytes");
    }

    bool null() override
    {
        if (here().type != Value::Type::Null || failed()) return false;
        _isRead = false;
        return true;
    }
    bool boolean() override { return take(Value::Type::Bool, "a boolean").boolean; }
    std::int64_t integer() override
    {
        if (here().type == Value::Type::UInt) fail("number out of range");
        return take(Value::Type::Int, "an integer").integer;
    }
    std::uint64_t unsignedInteger() override
    {
        if (here().type == Value::Type::UInt) return take(Value::Type::UInt, "an integer").unsignedInteger;
        if (here().type == Value::Type::Int && here().integer < 0) fail("number out of range");
        return take(Value::Type::Int, "an integer").unsignedInteger;
    }
    double real() override
    {
        if (here().type == Value::Type::Int) return static_cast<double>(take(Value::Type::Int, "a double").integer);
        if (here().type == Value::Type::UInt)
            return static_cast<double>(take(Value::Type::UInt, "a double").unsignedInteger);
        return take(Value::Type::Double, "a double").real;
    }
    std::string_view string() override { return take(Value::Type::String, "a string").text(); }
    Bytes bytes() override { return Bytes(std::string(take(Value::Type::Bytes, "bytes").text())); }
    Date date() override { return Date(Duration(take(Value::Type::Date, "a date").integer)); }
    Value value() override { return value(kMaximumDepth); }
    /// Reads the next value. Fails if its arrays and dictionaries nest deeper than `levels`.
    Value value(std::size_t levels)
    {
        const Token token = here();
        if (failed()) return {};
        if (token.type >= Value::Type::Array && levels == 0) {
            fail("nested too deep");
            return {};
        }
        _isRead = false;
        switch (token.type) {
        case Value::Type::Array: {
            Value::Array array;
            array.reserve(token.size);
            for (std::uint32_t i = 0; i < token.size; ++i) array.push_back(value(levels - 1));
            return array;
        }
        case Value::Type::Dictionary: {
            Dictionary dictionary;
            dictionary.reserve(token.size);
            for (std::uint32_t i = 0; i < token.size; ++i) {
                std::string key(string());
                dictionary.set(std::move(key), value(levels - 1));
            }
            return dictionary;
        }
        default: return archives::plainValue(token);
        }
    }

    void skip() override
    {
        for (std::uint64_t left = 1; left > 0; --left) {
            left += here().contents();
            if (failed()) return;
            _isRead = false;
        }
    }

    bool isRecord() override
    {
        const Token first = here();
        if (first.type != Value::Type::Dictionary || first.size == 0) return false;
        const TokenReader contents = _tokens;
        const auto isText = [this] {
            _isRead = false;
            return here().type == Value::Type::String;
        };
        const bool isClass = isText() && _here.text() == kClassKey && isText();
        // Restores the position.
        _here = first;
        _isRead = true;
        _tokens = contents;
        return isClass;
    }

    std::string_view beginRecord() override
    {
        const std::uint32_t size = here().size;
        take(Value::Type::Dictionary, "a record");
        if (!failed() && (size == 0 || take(Value::Type::String, "a key").text() != kClassKey))
            fail("record without a class");
        const std::string_view className = take(Value::Type::String, "a class name").text();
        enter(size - 1);
        return className;
    }

    bool nextKey(std::string_view& name) override
    {
        if (!nextElement()) return false;
        if (!_isRead && _tokens.readShortText(name)) return true; // nearly every key is short
        name = take(Value::Type::String, "a key").text();
        return !failed();
    }

    std::size_t beginArray() override
    {
        const std::uint32_t size = take(Value::Type::Array, "an array").size;
        enter(size);
        return size;
    }

    bool nextElement() override
    {
        if (failed()) return false;
        if (_left.back() > 0) return _left.back()-- > 0;
        _left.pop_back();
        return false;
    }

private:
    /// Returns the next token, or null after a failure.
    const Token& here()
    {
        if (!_isRead && !failed()) [[likely]]
            read();
        if (failed()) [[unlikely]]
            _here = {};
        return _here;
    }

    /// Consumes and returns the next token. Fails if it is not of that type; returns an empty token after a failure.
    Token take(Value::Type type, std::string_view expected)
    {
        const Token& token = here();
        if (token.type != type) [[unlikely]]
            failExpecting(expected, token.type);
        if (failed()) [[unlikely]]
            return {};
        _isRead = false;
        return token;
    }

    void read()
    {
        _isRead = true;
        if (const char* reason = _tokens.read(_here)) fail(reason);
    }

    /// Opens a container of `size` elements or fields.
    void enter(std::uint32_t size)
    {
        if (_left.size() == kMaximumDepth) fail("nested too deep");
        _left.push_back(size);
    }

    TokenReader _tokens;
    Token _here;
    bool _isRead = false;             ///< `_here` is the next value, and `_tokens` is after it
    std::vector<std::uint32_t> _left; ///< values left in each open container
};

} // namespace

std::string archive(const Record& record)
{
    ArchiveEncoder encoder;
    encodeRecord(encoder, record);
    return encoder.take();
}

Result<std::shared_ptr<Record>> unarchive(std::string_view bytes, const RecordClasses& classes)
{
    ArchiveDecoder decoder(bytes, classes);
    auto record = decodeRecord(decoder);
    decoder.finish();
    if (auto error = decoder.error()) return std::unexpected(std::move(*error));
    return record;
}

std::string archiveValue(const Value& value)
{
    ArchiveEncoder encoder;
    encoder.value(value);
    return encoder.take();
}

Result<Value> valueFromArchive(std::string_view bytes)
{
    static const RecordClasses kNone;
    ArchiveDecoder decoder(bytes, kNone);
    Value value = decoder.value(2 * kMaximumDepth); // nested records, and a nested value in the innermost one
    decoder.finish();
    if (auto error = decoder.error()) return std::unexpected(std::move(*error));
    return value;
}

} // namespace platform
