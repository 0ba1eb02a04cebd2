#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/base/Date.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

namespace tavrin {

/// A subscription described by a text of pairs: "type=news, expires=3600". A plain value.
class TavrinSubscriptionInfo {
public:
    /// Returns the pairs of a text, which are separated by "," and split at their first "="; keys and values are
    /// trimmed. Returns nothing for an empty text. Logs and returns nothing if a piece has no "=", a key or value is
    /// empty, a key is repeated, or the text is longer than 64 KiB.
    [[nodiscard]] static std::optional<platform::Dictionary>
    dictionaryWithKeyValuePairListString(std::string_view text);

    [[nodiscard]] static std::optional<TavrinSubscriptionInfo> withString(std::string_view text, platform::Date now);
    /// Reads "type", a non-empty text, and "expires", seconds from `now` as a number or a numeric text, which may be
    /// missing. Logs and returns nothing if one of them is anything else.
    [[nodiscard]] static std::optional<TavrinSubscriptionInfo> withDictionary(const platform::Dictionary& dictionary,
                                                                              platform::Date now);

    [[nodiscard]] const std::string& type() const { return _type; }
    [[nodiscard]] const std::optional<platform::Date>& expirationDate() const { return _expirationDate; }
    /// Returns true if the expiration date lies in the past.
    [[nodiscard]] bool isExpired(platform::Date now) const { return _expirationDate && *_expirationDate < now; }

private:
    std::string _type;
    std::optional<platform::Date> _expirationDate;
};

} // namespace tavrin
