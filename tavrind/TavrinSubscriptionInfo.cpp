#include "tavrind/TavrinSubscriptionInfo.h"

#include <algorithm>
#include <charconv>
#include <cmath>

#include "platform/text/Text.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::size_t kMaximumLength = 64u << 10;

/// Returns a finite number, given as a number or as text.
std::optional<double> secondsIn(const Value& value)
{
    std::optional<double> seconds = value.asDouble();
    if (const std::string* text = value.asString()) {
        const char* end = text->data() + text->size();
        double parsed = 0;
        const auto read = std::from_chars(text->data(), end, parsed);
        if (read.ec == std::errc() && read.ptr == end) seconds = parsed;
    }
    return seconds && std::isfinite(*seconds) ? seconds : std::nullopt;
}

} // namespace

std::optional<Dictionary> TavrinSubscriptionInfo::dictionaryWithKeyValuePairListString(std::string_view text)
{
    if (text.empty()) return std::nullopt;
    if (text.size() > kMaximumLength) {
        log(kLogSubscription)
            .error("Subscription information is {} bytes long, more than {}", text.size(), kMaximumLength);
        return std::nullopt;
    }
    Dictionary pairs;
    for (std::size_t begin = 0; begin <= text.size();) {
        const std::size_t end = std::min(text.find(',', begin), text.size());
        const std::string_view pair = text.substr(begin, end - begin);
        begin = end + 1;
        const std::size_t equals = pair.find('=');
        if (equals == std::string_view::npos) {
            log(kLogSubscription)
                .error("Subscription information contained invalid key-value pair {} (full string: {})", pair, text);
            return std::nullopt;
        }
        std::string key(platform::trimmed(pair.substr(0, equals)));
        const std::string_view value = platform::trimmed(pair.substr(equals + 1));
        if (key.empty() || value.empty()) {
            log(kLogSubscription)
                .error("Subscription information contained empty key or value (full string: {})", text);
            return std::nullopt;
        }
        if (pairs.contains(key)) {
            log(kLogSubscription)
                .error("Subscription information contained duplicate key {} (full string: {})", key, text);
            return std::nullopt;
        }
        pairs.set(std::move(key), value);
    }
    return pairs;
}

std::optional<TavrinSubscriptionInfo> TavrinSubscriptionInfo::withString(std::string_view text, platform::Date now)
{
    const auto pairs = dictionaryWithKeyValuePairListString(text);
    return pairs ? withDictionary(*pairs, now) : std::nullopt;
}

std::optional<TavrinSubscriptionInfo> TavrinSubscriptionInfo::withDictionary(const Dictionary& dictionary,
                                                                             platform::Date now)
{
    TavrinSubscriptionInfo info;
    const auto refuse = [&](const char* key, const Value* value) {
        log(kLogSubscription)
            .error("Subscription information contained invalid '{}': {} (full dictionary: {})", key,
                   platform::toJson(value ? *value : Value()), platform::toJson(dictionary));
        return std::nullopt;
    };
    if (const Value* expires = dictionary.find("expires")) {
        const auto seconds = secondsIn(*expires);
        if (!seconds) return refuse("expires", expires);
        info._expirationDate = platform::dateFromSecondsSince1970(platform::secondsSince1970(now) + *seconds);
    }
    const Value* type = dictionary.find("type");
    if (!type || !type->asString() || type->asString()->empty()) return refuse("type", type);
    info._type = *type->asString();
    return info;
}

} // namespace tavrin
