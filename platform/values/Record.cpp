#include "platform/values/Record.h"

#include <fmt/format.h>

#include "platform/values/Dictionary.h"

namespace platform {

namespace {

std::string_view withArticle(Value::Type type)
{
    switch (type) {
    case Value::Type::Null: return "null";
    case Value::Type::Bool: return "a boolean";
    case Value::Type::Int:
    case Value::Type::UInt: return "an integer";
    case Value::Type::Double: return "a double";
    case Value::Type::String: return "a string";
    case Value::Type::Bytes: return "bytes";
    case Value::Type::Date: return "a date";
    case Value::Type::Array: return "an array";
    case Value::Type::Dictionary: return "a dictionary";
    }
    return "";
}

/// Reads the fields of the record that `beginRecord` entered.
void decodeFields(Decoder& decoder, Record& record)
{
    std::string_view key;
    std::size_t next = 0;
    while (decoder.nextKey(key)) {
        if (!record.decodeField(key, decoder, next)) decoder.skip();
        if (decoder.failed()) return decoder.failedIn(key);
    }
}

Value valueFromError(const Error& error)
{
    Dictionary dictionary{{"domain", error.domain}, {"code", error.code}};
    if (!error.userInfo.isNull()) dictionary.set("userInfo", error.userInfo);
    if (error.underlying) dictionary.set("underlying", valueFromError(*error.underlying));
    return dictionary;
}

} // namespace

void Decoder::fail(std::string reason, std::int64_t code)
{
    if (!_failure) _failure = Failure{{}, std::move(reason), code};
}

void Decoder::failExpecting(std::string_view expected, Value::Type found)
{
    if (!_failure) fail(fmt::format("expected {}, found {}", expected, withArticle(found)));
}

void Decoder::failedIn(std::string_view field)
{
    std::string& place = _failure->place;
    place.insert(0, place.empty() || place.front() == '[' ? std::string(field) : fmt::format("{}.", field));
}

void Decoder::failedIn(std::size_t index)
{
    std::string& place = _failure->place;
    place.insert(0, place.empty() || place.front() == '[' ? fmt::format("[{}]", index) : fmt::format("[{}].", index));
}

std::optional<Error> Decoder::error() const
{
    if (!_failure) return std::nullopt;
    // Only a record's own class may be unknown to its reader. An unknown class inside it is a malformed field.
    const std::int64_t code = _failure->place.empty() ? _failure->code : kMalformed;
    return Error::withReason(kFormatErrorDomain, code,
                             _failure->place.empty() ? _failure->reason
                                                     : fmt::format("{}: {}", _failure->place, _failure->reason));
}

bool Record::decodeField(std::string_view key, Decoder& decoder, std::size_t& next)
{
    const auto readers = fieldReaders();
    for (std::size_t looked = 0; looked < readers.size(); ++looked, ++next) {
        if (next >= readers.size()) next = 0;
        if (readers[next].name != key) continue;
        readers[next++].read(*this, decoder);
        return true;
    }
    return false;
}

void encodeRecord(Encoder& encoder, const Record& record)
{
    encoder.beginRecord(record.className(), record.fieldCount());
    record.encodeFields(encoder);
    encoder.endRecord();
}

std::shared_ptr<Record> decodeRecord(Decoder& decoder)
{
    const std::string_view className = decoder.beginRecord();
    if (decoder.failed()) return nullptr;
    auto record = decoder.classes().make(className);
    if (!record) {
        decoder.fail(fmt::format("unknown class {}", className), Decoder::kUnknownClass);
        return nullptr;
    }
    decodeFields(decoder, *record);
    return decoder.failed() ? nullptr : record;
}

std::shared_ptr<Record> decodeRecordIf(Decoder& decoder, bool (*wanted)(const Record&))
{
    if (!decoder.isRecord()) {
        decoder.skip();
        return nullptr;
    }
    auto record = decoder.classes().make(decoder.beginRecord());
    if (record && wanted(*record)) {
        decodeFields(decoder, *record);
    } else {
        record = nullptr;
        std::string_view key;
        while (decoder.nextKey(key)) decoder.skip();
    }
    return decoder.failed() ? nullptr : record;
}

std::optional<Error> errorFromDictionary(const Value& value)
{
    const Value& domain = value["domain"];
    const Value& code = value["code"];
    const Value& userInfo = value["userInfo"];
    const Value& underlying = value["underlying"];
    if (!value.asDictionary() || !(domain.isNull() || domain.asString()) || !(code.isNull() || code.asInt()) ||
        !(userInfo.isNull() || userInfo.asDictionary()))
        return std::nullopt;

    Error error(domain.asString() ? *domain.asString() : std::string(), code.asInt().value_or(0), userInfo);
    if (!underlying.isNull()) {
        auto cause = errorFromDictionary(underlying);
        if (!cause) return std::nullopt;
        error.underlying = std::make_shared<const Error>(std::move(*cause));
    }
    return error;
}

namespace detail {

void encodeError(Encoder& encoder, const Error& error)
{
    encoder.value(valueFromError(error));
}

Error decodeError(Decoder& decoder)
{
    const Value value = decoder.value();
    if (decoder.failed()) return {};
    auto error = errorFromDictionary(value);
    if (!error) decoder.fail("not an error");
    return error.value_or(Error());
}

} // namespace detail

} // namespace platform
