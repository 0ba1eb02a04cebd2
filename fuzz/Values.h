#pragma once

#include <algorithm>
#include <charconv>
#include <string>
#include <string_view>

#include "platform/ipc/BusValue.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

/// Help for fuzz targets whose input is a JSON text that stands for a richer value.
namespace fuzz {

using platform::Value;

/// `value` with bytes for each text "bytes:…", and a date for each text "date:SECONDS": what JSON doesn't have.
inline Value enriched(const Value& value)
{
    constexpr std::string_view kBytes = "bytes:";
    constexpr std::string_view kDate = "date:";
    if (const std::string* text = value.asString()) {
        if (text->starts_with(kBytes)) return platform::Bytes(text->substr(kBytes.size()));
        std::int64_t seconds = 0;
        if (text->starts_with(kDate) &&
            std::from_chars(text->data() + kDate.size(), text->data() + text->size(), seconds).ec == std::errc())
            return platform::dateFromSecondsSince1970(static_cast<double>(seconds));
        return value;
    }
    if (const Value::Array* array = value.asArray()) {
        Value::Array elements;
        for (const Value& element : *array) elements.push_back(enriched(element));
        return elements;
    }
    if (const platform::Dictionary* dictionary = value.asDictionary()) {
        platform::Dictionary entries;
        for (const auto& [key, entry] : *dictionary) entries.set(key, enriched(entry));
        return entries;
    }
    return value;
}

/// `value` as it arrives over the bus: null entries left out, dates as seconds, texts repaired.
inline Value arriving(const Value& value)
{
    if (const auto date = value.asDate()) return platform::secondsSince1970(*date);
    if (const std::string* text = value.asString()) return platform::ipc::busText(*text);
    if (const Value::Array* array = value.asArray()) {
        Value::Array elements;
        for (const Value& element : *array)
            elements.push_back(element.isNull() ? Value(platform::Dictionary()) : arriving(element));
        return elements;
    }
    if (const platform::Dictionary* dictionary = value.asDictionary()) {
        platform::Dictionary entries;
        for (const auto& [key, entry] : *dictionary)
            if (!entry.isNull()) entries.set(platform::ipc::busText(key), arriving(entry));
        return entries;
    }
    return value;
}

inline std::size_t depthOf(const Value& value)
{
    std::size_t deepest = 0;
    if (const Value::Array* array = value.asArray())
        for (const Value& element : *array) deepest = std::max(deepest, depthOf(element) + 1);
    if (const platform::Dictionary* dictionary = value.asDictionary())
        for (const auto& [key, entry] : *dictionary) deepest = std::max(deepest, depthOf(entry) + 1);
    return deepest;
}

/// Whether `holds` for any value of a tree. Keys of dictionaries count as texts.
template <class Holds> bool anyOf(const Value& value, Holds holds)
{
    if (holds(value)) return true;
    if (const Value::Array* array = value.asArray())
        return std::ranges::any_of(*array, [&](const Value& element) { return anyOf(element, holds); });
    if (const platform::Dictionary* dictionary = value.asDictionary())
        return std::ranges::any_of(
            *dictionary, [&](const auto& entry) { return holds(Value(entry.first)) || anyOf(entry.second, holds); });
    return false;
}

} // namespace fuzz
