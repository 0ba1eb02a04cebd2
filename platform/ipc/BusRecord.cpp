#include "platform/ipc/BusRecord.h"

#include <ranges>
#include <utility>
#include <vector>

#include <systemd/sd-bus.h>

#include "platform/values/Record.h"

namespace platform::ipc {

namespace {

/// Reads the values of a record from a message. The position is always at a value whose type is known.
class BusDecoder final : public Decoder {
public:
    BusDecoder(BusReader& reader, const RecordClasses& classes) : Decoder(classes), _reader(reader), _bus(reader.bus())
    {}

    bool null() override { return false; } // D-Bus has none
    bool boolean() override { return is("b") && _reader.basic<int>('b') != 0; }
    std::int64_t integer() override
    {
        switch (_type.front()) {
        case 'y': return _reader.basic<std::uint8_t>('y');
        case 'n': return _reader.basic<std::int16_t>('n');
        case 'q': return _reader.basic<std::uint16_t>('q');
        case 'i': return _reader.basic<std::int32_t>('i');
        case 'u': return _reader.basic<std::uint32_t>('u');
        case 'x': return _reader.basic<std::int64_t>('x');
        default: break;
        }
        const std::uint64_t number = is("t") ? _reader.basic<std::uint64_t>('t') : 0;
        if (number > INT64_MAX) stop();
        return static_cast<std::int64_t>(number);
    }
    std::uint64_t unsignedInteger() override
    {
        if (_type == "t") return _reader.basic<std::uint64_t>('t');
        const std::int64_t number = integer();
        if (number < 0) stop();
        return static_cast<std::uint64_t>(number);
    }
    double real() override
    {
        if (_type == "d") return _reader.basic<double>('d');
        return _type == "t" ? static_cast<double>(_reader.basic<std::uint64_t>('t')) : static_cast<double>(integer());
    }
    std::string_view string() override
    {
        const bool isText = _type == "s" || _type == "o" || _type == "g";
        return isText ? _reader.text(_type.front(), BusReader::kTextCost) : (stop(), std::string_view());
    }
    Bytes bytes() override { return is("ay") ? Bytes(std::string(_reader.byteString())) : Bytes(); }
    Date date() override { return dateFromSecondsSince1970(real()); }
    Value value() override { return _reader.valueInVariant(); }
    void skip() override { (void)_reader.valueInVariant(); }
    bool isRecord() override { return stop(), false; } // would have to look ahead

    std::string_view beginRecord() override
    {
        std::string_view key;
        if (!is("a{sv}") || !enter({.isRecord = true, .element = "{sv}"})) return {};
        if (!nextEntry(key) || key != kClassKey) stop();
        const std::string_view className = failed() ? std::string_view() : string();
        check();
        return className;
    }

    bool nextKey(std::string_view& name) override
    {
        if (!nextEntry(name)) return false;
        if (name == kClassKey) stop();
        return !failed();
    }

    std::size_t beginArray() override
    {
        if (_type.size() < 2 || _type[0] != 'a' || _type[1] == '{' || _type[1] == 'y')
            stop();
        else
            (void)enter({.isRecord = false, .element = _type.substr(1)});
        return 0;
    }

    bool nextElement() override
    {
        if (!leaveVariant()) return false;
        const int atEnd = sd_bus_message_at_end(_bus, false);
        if (atEnd < 0) stop();
        if (atEnd != 0) return leave();
        _type = _open.back().element;
        return _type != "v" || enterVariant();
    }

private:
    /// A record or an array that is being read.
    struct Open {
        bool isRecord;
        std::string_view element;
        bool inVariant = false; ///< the current value is in a variant
    };

    /// Fails. The reason is found by those who read the message again.
    void stop() { fail("not read"); }
    /// Fails if the reader has failed.
    void check()
    {
        if (_reader.error()) stop();
    }
    bool is(std::string_view type)
    {
        if (_type != type) stop();
        return _type == type;
    }

    bool enter(Open open)
    {
        if (!_reader.charge(BusReader::kContainerCost) ||
            sd_bus_message_enter_container(_bus, SD_BUS_TYPE_ARRAY, std::string(open.element).c_str()) < 0)
            stop();
        else
            _open.push_back(open);
        return !failed();
    }

    bool leave()
    {
        _open.pop_back();
        if (sd_bus_message_exit_container(_bus) < 0) stop();
        return false;
    }

    bool enterVariant()
    {
        char type = 0;
        const char* contents = nullptr; // in the message
        if (sd_bus_message_peek_type(_bus, &type, &contents) <= 0 || type != SD_BUS_TYPE_VARIANT ||
            sd_bus_message_enter_container(_bus, SD_BUS_TYPE_VARIANT, contents) <= 0) {
            stop();
            return false;
        }
        _type = contents;
        _open.back().inVariant = true;
        return true;
    }

    /// Leaves the variant of the last value, and the entry of a record. Returns false after a failure.
    bool leaveVariant()
    {
        check();
        if (failed() || !std::exchange(_open.back().inVariant, false)) return !failed();
        if (sd_bus_message_exit_container(_bus) < 0 ||
            (_open.back().isRecord && sd_bus_message_exit_container(_bus) < 0))
            stop();
        return !failed();
    }

    bool nextEntry(std::string_view& key)
    {
        if (!leaveVariant()) return false;
        const int entered = sd_bus_message_enter_container(_bus, SD_BUS_TYPE_DICT_ENTRY, "sv");
        if (entered < 0) stop();
        if (entered <= 0) return !failed() && leave();
        key = _reader.text(SD_BUS_TYPE_STRING, BusReader::kKeyCost);
        check();
        return !failed() && enterVariant();
    }

    BusReader& _reader;
    sd_bus_message* const _bus;
    std::string_view _type = "a{sv}"; ///< of the current value
    std::vector<Open> _open;
};

/// Appends the values of a record to a message. Does nothing after a failure.
class BusEncoder final : public Encoder {
public:
    explicit BusEncoder(BusWriter& writer) : _writer(writer) {}

    void beginRecord(std::string_view className, std::size_t) override
    {
        begin("a{sv}", "{sv}", true);
        key(kClassKey);
        string(className);
    }
    void key(std::string_view name) override { _open.back().key = name; }
    void endRecord() override { end(); }
    void beginArray(std::size_t) override { begin("av", "v", false); }
    void endArray() override { end(); }
    void null() override
    {
        if (!_open.back().isRecord) value({});
    }
    void boolean(bool flag) override { value(flag); }
    void integer(std::int64_t number) override { value(number); }
    void unsignedInteger(std::uint64_t number) override { value(number); }
    void real(double number) override { value(number); }
    void string(std::string_view text) override
    {
        put([&] { return _writer.appendTextVariant(text); });
    }
    void bytes(const Bytes& bytes) override { value(bytes); }
    void date(Date date) override { value(date); }
    void value(const Value& value) override
    {
        if (value.isNull() && _open.back().isRecord) return;
        put([&] { return _writer.appendVariant(value); });
    }

    [[nodiscard]] bool good() const { return _good; }

private:
    /// A record or an array that is being written.
    struct Open {
        bool isRecord;
        std::string_view key; ///< of the current field
    };

    template <class Append> void put(Append append) { check(beginEntry() && append() && endEntry()); }
    void begin(const char* type, const char* contents, bool isRecord)
    {
        const bool isArgument = _open.empty();
        check(isArgument || (beginEntry() && _writer.open(SD_BUS_TYPE_VARIANT, type)));
        if (_good) check(_writer.open(SD_BUS_TYPE_ARRAY, contents));
        _open.push_back({.isRecord = isRecord, .key = {}});
    }
    void end()
    {
        _open.pop_back();
        const bool isArgument = _open.empty();
        check(_good && _writer.close() && (isArgument || (_writer.close() && endEntry())));
    }
    /// Begins the entry of a record's field.
    bool beginEntry()
    {
        return _good && (!_open.back().isRecord ||
                         (_writer.open(SD_BUS_TYPE_DICT_ENTRY, "sv") && _writer.appendText(_open.back().key)));
    }
    bool endEntry() { return !_open.back().isRecord || _writer.close(); }
    /// Adds the way to the field to the first failure's reason.
    void check(bool good)
    {
        if (good || !std::exchange(_good, false)) return;
        for (const Open& open : std::views::reverse(_open))
            if (open.isRecord) _writer.failedIn(open.key);
    }

    BusWriter& _writer;
    std::vector<Open> _open;
    bool _good = true;
};

} // namespace

std::shared_ptr<Record> readRecord(BusReader& reader, const RecordClasses& classes)
{
    BusDecoder decoder(reader, classes);
    return decodeRecord(decoder);
}

bool appendRecord(BusWriter& writer, const Record& record)
{
    BusEncoder encoder(writer);
    encodeRecord(encoder, record);
    return encoder.good();
}

} // namespace platform::ipc
