#pragma once

#include <concepts>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"
#include "searchrecords/ZRSearchResult.h"

namespace platform {
struct Error;
}

/// The JSON form of the objects in events; docs/feedback.md shows one event of each type. Values share their text with
/// the records. Any thread.
namespace tavrin {

enum class ResultEngagementDestination : std::int64_t;
struct ZRResultRankingFeedback;
struct ZRSectionRankingFeedback;

[[nodiscard]] platform::Dictionary jsonObject(const ZRSearchResult& result);
[[nodiscard]] platform::Dictionary jsonObject(const ZRSearchSuggestion& suggestion);
[[nodiscard]] platform::Dictionary jsonObject(const ZRResultSection& section);
[[nodiscard]] platform::Dictionary jsonObject(const ZRResultRankingFeedback& ranking);
[[nodiscard]] platform::Dictionary jsonObject(const ZRSectionRankingFeedback& ranking);

/// Return the JSON value of a field; null for a missing text, array or record.
[[nodiscard]] inline platform::Value jsonValue(const std::string* text)
{
    return text ? platform::Value(*text) : platform::Value();
}
[[nodiscard]] inline platform::Value jsonValue(const std::optional<std::string>& text)
{
    return text ? platform::Value(*text) : platform::Value();
}
template <class T> [[nodiscard]] platform::Value jsonValue(const std::vector<std::shared_ptr<T>>& records)
{
    platform::Value::Array array;
    array.reserve(records.size());
    for (const auto& record : records)
        array.push_back(record ? platform::Value(jsonObject(*record)) : platform::Value());
    return array;
}
template <class T> [[nodiscard]] platform::Value jsonValue(const RecordArray<T>& records)
{
    return records ? jsonValue(*records) : platform::Value();
}
template <std::convertible_to<platform::Value> T> [[nodiscard]] platform::Value jsonValue(T&& value)
{
    return std::forward<T>(value);
}

/// Adds fields to an object: `fields("id", section.identifier)("score", section.score)`.
class JsonFields {
public:
    explicit JsonFields(platform::Dictionary& object) : _object(object) {}

    template <class T> JsonFields& operator()(const char* key, T&& value)
    {
        _object.set(key, jsonValue(std::forward<T>(value)));
        return *this;
    }
    /// Returns the object with the fields added so far. The caller may replace it.
    [[nodiscard]] platform::Dictionary& object() { return _object; }

private:
    platform::Dictionary& _object;
};

/// Returns an error's "code", "domain" and "reason".
[[nodiscard]] platform::Dictionary encodeErrorForJSON(const platform::Error& error);

/// Returns the URL that the engagement of a result opened, or null. An engaged action opens its own punchout. A result
/// opens its punchout only if `destination` is `Punchout`. Valid while the records are unchanged.
[[nodiscard]] const std::string* actionDestinationFromResult(const ZRSearchResult& result,
                                                             const ZRActionItem* actionEngaged,
                                                             ResultEngagementDestination destination);

} // namespace tavrin
