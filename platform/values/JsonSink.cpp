#include "platform/values/JsonSink.h"

#include <algorithm>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/JsonText.h"

namespace platform {

void JsonTextSink::separate()
{
    if (!_isFirst) _text += ',';
    _isFirst = false;
}

void JsonTextSink::quote(std::string_view text, std::string_view end)
{
    if (json::isPlain(text)) {
        const std::size_t size = _text.size();
        _text.resize(size + text.size() + end.size() + 2, '"');
        std::ranges::copy(end, std::ranges::copy(text, &_text[size] + 1).out + 1);
    } else {
        json::putString(*this, text);
        _text += end;
    }
}

void JsonTextSink::beginObject()
{
    separate();
    _text += '{';
    _isFirst = true;
}

void JsonTextSink::key(std::string_view key)
{
    separate();
    quote(key, ":");
    _isFirst = true;
}

void JsonTextSink::endObject()
{
    _text += '}';
    _isFirst = false;
}

void JsonTextSink::beginArray()
{
    separate();
    _text += '[';
    _isFirst = true;
}

void JsonTextSink::endArray()
{
    _text += ']';
    _isFirst = false;
}

void JsonTextSink::null()
{
    separate();
    _text += "null";
}

void JsonTextSink::boolean(bool value)
{
    separate();
    _text += value ? "true" : "false";
}

void JsonTextSink::integer(std::int64_t value)
{
    separate();
    json::putNumber(*this, value);
}

void JsonTextSink::unsignedInteger(std::uint64_t value)
{
    separate();
    json::putNumber(*this, value);
}

void JsonTextSink::real(double value)
{
    separate();
    json::putReal(*this, value);
}

void JsonTextSink::string(std::string_view value)
{
    separate();
    quote(value, "");
}

void JsonTextSink::value(const Value& value)
{
    separate();
    _text += toJson(value);
}

void JsonValueSink::beginObject()
{
    _open.push_back({.key = {}, .container = Dictionary()});
}

void JsonValueSink::key(std::string_view key)
{
    _open.back().key = key;
}

void JsonValueSink::beginArray()
{
    _open.push_back({.key = {}, .container = Value::Array()});
}

void JsonValueSink::close()
{
    Value value = std::move(_open.back().container);
    _open.pop_back();
    put(std::move(value));
}

void JsonValueSink::put(Value value)
{
    if (_open.empty()) {
        _root = std::move(value);
        return;
    }
    auto& [key, container] = _open.back();
    if (container.asDictionary())
        container.mutableDictionary().set(std::move(key), std::move(value));
    else
        container.mutableArray().push_back(std::move(value));
}

} // namespace platform
