#pragma once

#include <map>
#include <memory>
#include <string>

#include "platform/values/Dictionary.h"
#include "platform/values/Record.h"
#include "platform/values/ValueCoder.h"

/// Help for tests that hold for every record class: they work on a record's own list of fields.
namespace tavrin {

using platform::Bytes;
using platform::Date;
using platform::Dictionary;
using platform::Value;

/// A decoder without input, for one field: each read returns a new value, which is never zero. A field that holds
/// records gets new ones of class `nested`.
class Filler final : public platform::Decoder {
public:
    Filler(const platform::RecordClasses& classes, std::string nested, std::int64_t& number)
        : Decoder(classes), _nested(std::move(nested)), _number(number)
    {}

    /// What the field was given, as `toValue` has it.
    [[nodiscard]] const Value& given() const { return _given; }

    bool null() override { return false; }
    bool boolean() override { return put(true), true; }
    std::int64_t integer() override { return put(++_number), _number; }
    std::uint64_t unsignedInteger() override { return put(++_number), static_cast<std::uint64_t>(_number); }
    double real() override { return put(static_cast<double>(++_number) + 0.5), static_cast<double>(_number) + 0.5; }
    std::string_view string() override
    {
        // A text that is a URL fits fields of either type.
        _text = "https://example.com/" + std::to_string(++_number);
        put(_text);
        return _text;
    }
    Bytes bytes() override
    {
        Bytes run(std::string("\0bytes ", 7) + std::to_string(++_number));
        put(run);
        return run;
    }
    Date date() override
    {
        const Date moment = platform::dateFromSecondsSince1970(static_cast<double>(++_number));
        put(moment);
        return moment;
    }
    Value value() override
    {
        // A dictionary that fits a field of type Error, too.
        const Value any = Dictionary{{"domain", "D"},
                                     {"code", ++_number},
                                     {"userInfo", Dictionary{{"reason", "why"}, {"list", Value::Array{1, "x", true}}}}};
        put(any);
        return any;
    }
    void skip() override {}
    bool isRecord() override { return true; }
    std::string_view beginRecord() override
    {
        const auto record = classes().make(_nested);
        put(record ? platform::toValue(*record) : Value());
        return _nested;
    }
    bool nextKey(std::string_view&) override { return false; }
    std::size_t beginArray() override
    {
        _given = Value::Array();
        return _left = 2;
    }
    bool nextElement() override { return _left-- > 0; }

private:
    void put(Value value)
    {
        if (_given.asArray())
            _given.mutableArray().push_back(std::move(value));
        else
            _given = std::move(value);
    }

    const std::string _nested;
    std::int64_t& _number;
    int _left = 0;
    std::string _text;
    Value _given;
};

/// Sets every field of a record, and returns what each was given. Fields that hold records get the first class that
/// they take; a field that takes nothing is missing in the result.
inline std::map<std::string, Value> fill(platform::Record& record, const platform::RecordClasses& classes)
{
    std::map<std::string, Value> given;
    std::int64_t number = 5'000'000'000; // more than 32 bits
    for (const platform::Record::FieldReader& field : record.fieldReaders()) {
        const std::string name(field.name);
        for (const auto& [nested, factory] : classes) {
            Filler filler(classes, std::string(nested), number);
            if (std::size_t next = 0; !record.decodeField(name, filler, next) || filler.failed()) continue;
            if (!(platform::toValue(record)[name] == filler.given())) continue; // read as null
            given[name] = filler.given();
            break;
        }
    }
    return given;
}

} // namespace tavrin
