#include "CoreTavrin/TAVMembers.h"

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"

namespace tavrin {

namespace ipc = platform::ipc;
using platform::Dictionary;
using platform::Result;
using platform::Value;

Value valueFromError(const OptionalError& error)
{
    if (!error) return Dictionary();
    Value userInfo = error->userInfo;
    if (!userInfo.asDictionary()) userInfo = Dictionary();
    return Value::dictionaryOf({{"domain", error->domain}, {"code", error->code}, {"userInfo", std::move(userInfo)}});
}

OptionalError errorFromValue(const Value& value)
{
    const std::string* domain = value["domain"].asString();
    if (!domain) return std::nullopt;
    return platform::Error(*domain, value["code"].asInt().value_or(0), value["userInfo"]);
}

namespace wire {

void append(ipc::Message& message, Value value)
{
    if (!value.asDictionary()) value = Dictionary();
    message.args.push_back(std::move(value));
}

void append(ipc::Message& message, std::shared_ptr<const platform::Record> record)
{
    if (!record) return append(message, Value(Dictionary()));
    message.args.emplace_back();
    message.records.resize(message.args.size());
    message.records.back() = std::move(record);
}

void append(ipc::Message& message, const platform::Record& record)
{
    append(message, std::shared_ptr<const platform::Record>(std::shared_ptr<void>(), &record));
}

void append(ipc::Message& message, const std::shared_ptr<const TAVBag>& bag)
{
    append(message, bag ? std::make_shared<const TAVBagRecord>(*bag) : nullptr);
}

void append(ipc::Message& message, const OptionalError& error)
{
    message.args.push_back(valueFromError(error));
}

void append(ipc::Message& message, platform::FileHandle file)
{
    Value::Array indexes;
    if (file) {
        indexes.emplace_back(message.handles.size());
        message.handles.push_back(std::move(file));
    }
    message.args.emplace_back(std::move(indexes));
}

Result<std::shared_ptr<platform::Record>> takeRecord(ipc::Message& message, std::size_t index)
{
    // The message is the only owner of what it was decoded into.
    if (message.record(index)) return std::const_pointer_cast<platform::Record>(std::move(message.records[index]));
    const Value& value = message.args[index];
    if (value.count() == 0) return nullptr;
    return platform::recordFromValue(value, coreRecordClasses());
}

template <> Result<std::string> Take<std::string>::from(ipc::Message& message, std::size_t index)
{
    const std::string* text = message.args[index].asString();
    return text ? *text : std::string();
}

template <> Result<bool> Take<bool>::from(ipc::Message& message, std::size_t index)
{
    return message.args[index].asBool().value_or(false);
}

template <> Result<std::int64_t> Take<std::int64_t>::from(ipc::Message& message, std::size_t index)
{
    return message.args[index].asInt().value_or(0);
}

template <> Result<std::uint64_t> Take<std::uint64_t>::from(ipc::Message& message, std::size_t index)
{
    return message.args[index].asUInt().value_or(0);
}

template <> Result<platform::Bytes> Take<platform::Bytes>::from(ipc::Message& message, std::size_t index)
{
    const platform::Bytes* bytes = message.args[index].asBytes();
    return bytes ? *bytes : platform::Bytes();
}

template <> Result<Value> Take<Value>::from(ipc::Message& message, std::size_t index)
{
    return std::move(message.args[index]);
}

template <> Result<Value::Array> Take<Value::Array>::from(ipc::Message& message, std::size_t index)
{
    const Value::Array* array = message.args[index].asArray();
    return array ? *array : Value::Array();
}

template <> Result<OptionalError> Take<OptionalError>::from(ipc::Message& message, std::size_t index)
{
    return errorFromValue(message.args[index]);
}

template <> Result<platform::FileHandle> Take<platform::FileHandle>::from(ipc::Message& message, std::size_t index)
{
    const auto handle = message.args[index][0].asUInt();
    if (!handle || *handle >= message.handles.size()) return platform::FileHandle();
    return std::move(message.handles[*handle]);
}

Result<std::shared_ptr<const TAVBag>> Take<std::shared_ptr<const TAVBag>>::from(ipc::Message& message,
                                                                                std::size_t index)
{
    const auto record = Take<std::shared_ptr<TAVBagRecord>>::from(message, index);
    if (!record) return std::unexpected(record.error());
    return *record ? (*record)->bag() : nullptr;
}

} // namespace wire

} // namespace tavrin
