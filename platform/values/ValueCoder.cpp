#include "platform/values/ValueCoder.h"

#include "platform/values/Dictionary.h"
#include "platform/values/Record.h"

namespace platform {

namespace {

/// Builds a dictionary from a record.
class ValueEncoder final : public Encoder {
public:
    void beginRecord(std::string_view className, std::size_t fieldCount) override
    {
        Dictionary& record = _open.emplace_back().record.emplace();
        record.reserve(fieldCount + 1);
        record.set(std::string(kClassKey), className);
    }
    void key(std::string_view name) override { _open.back().key = name; }
    void endRecord() override { put(close().record.value()); }
    void beginArray(std::size_t count) override { _open.emplace_back().elements.reserve(count); }
    void endArray() override { put(close().elements); }
    void null() override { put(nullptr); }
    void boolean(bool value) override { put(value); }
    void integer(std::int64_t value) override { put(value); }
    void unsignedInteger(std::uint64_t value) override { put(value); }
    void real(double value) override { put(value); }
    void string(std::string_view value) override { put(value); }
    void bytes(const Bytes& value) override { put(value); }
    void date(Date value) override { put(value); }
    void value(const Value& value) override { put(value); }

    [[nodiscard]] Value take() { return std::move(_root); }

private:
    /// A record or an array that is being built.
    struct Open {
        std::optional<Dictionary> record; ///< empty for an array
        std::string_view key;
        Value::Array elements;
    };

    Open close()
    {
        Open last = std::move(_open.back());
        _open.pop_back();
        return last;
    }

    void put(Value value)
    {
        if (_open.empty())
            _root = std::move(value);
        else if (!_open.back().record)
            _open.back().elements.push_back(std::move(value));
        else if (!value.isNull())
            _open.back().record->set(std::string(_open.back().key), std::move(value));
    }

    std::vector<Open> _open;
    Value _root;
};

/// Reads a record from its dictionary, which must outlive the decoder unchanged.
class ValueDecoder final : public Decoder {
public:
    ValueDecoder(const Value& value, const RecordClasses& classes) : Decoder(classes), _here(&value) {}

    bool null() override { return !failed() && _here->isNull(); }
    bool boolean() override { return take(_here->asBool(), "a boolean"); }
    std::int64_t integer() override
    {
        if (_here->type() == Value::Type::UInt) fail("number out of range");
        return take(_here->type() == Value::Type::Double ? std::nullopt : _here->asInt(), "an integer");
    }
    std::uint64_t unsignedInteger() override
    {
        if (_here->type() == Value::Type::Int && *_here->asInt() < 0) fail("number out of range");
        return take(_here->type() == Value::Type::Double ? std::nullopt : _here->asUInt(), "an integer");
    }
    double real() override { return take(_here->asDouble(), "a double"); }
    std::string_view string() override
    {
        const std::string* found = _here->asString();
        if (!found) failExpecting("a string", _here->type());
        return found ? *found : std::string_view();
    }
    Bytes bytes() override
    {
        const Bytes* found = _here->asBytes();
        if (!found) failExpecting("bytes", _here->type());
        return found ? *found : Bytes();
    }
    Date date() override
    {
        if (_here->isNumber()) return dateFromSecondsSince1970(*_here->asDouble());
        return take(_here->asDate(), "a date");
    }
    Value value() override { return *_here; }
    void skip() override {}
    bool isRecord() override { return !failed() && (*_here)[kClassKey].asString(); }

    std::string_view beginRecord() override
    {
        const Dictionary* record = _here->asDictionary();
        const std::string* className = (*_here)[kClassKey].asString();
        if (!record)
            failExpecting("a record", _here->type());
        else if (!className)
            fail("record without a class");
        else if (enter({.record = record}))
            return *className;
        return {};
    }

    bool nextKey(std::string_view& name) override
    {
        if (failed()) return false;
        Open& open = _open.back();
        auto entry = open.record->begin() + static_cast<std::ptrdiff_t>(open.next);
        if (entry != open.record->end() && entry->first == kClassKey) ++entry;
        if (entry == open.record->end()) return leave();
        open.next = static_cast<std::size_t>(entry - open.record->begin()) + 1;
        name = entry->first;
        _here = &entry->second;
        return true;
    }

    std::size_t beginArray() override
    {
        const Value::Array* array = _here->asArray();
        if (!array) failExpecting("an array", _here->type());
        return array && enter({.array = array}) ? array->size() : 0;
    }

    bool nextElement() override
    {
        if (failed()) return false;
        Open& open = _open.back();
        if (open.next == open.array->size()) return leave();
        _here = &(*open.array)[open.next++];
        return true;
    }

private:
    /// A record or an array that is being read.
    struct Open {
        const Dictionary* record = nullptr;
        const Value::Array* array = nullptr;
        std::size_t next = 0;
    };

    template <class T> T take(std::optional<T> found, std::string_view expected)
    {
        if (!found) failExpecting(expected, _here->type());
        return found.value_or(T());
    }

    bool enter(Open open)
    {
        if (_open.size() == kMaximumDepth)
            fail("nested too deep");
        else
            _open.push_back(open);
        return !failed();
    }

    bool leave()
    {
        _open.pop_back();
        return false;
    }

    const Value* _here;
    std::vector<Open> _open;
};

} // namespace

Value toValue(const Record& record)
{
    ValueEncoder encoder;
    encodeRecord(encoder, record);
    return encoder.take();
}

Result<std::shared_ptr<Record>> recordFromValue(const Value& value, const RecordClasses& classes)
{
    ValueDecoder decoder(value, classes);
    auto record = decodeRecord(decoder);
    if (auto error = decoder.error()) return std::unexpected(std::move(*error));
    return record;
}

} // namespace platform
