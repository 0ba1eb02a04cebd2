#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/base/Date.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

namespace tavrin {

/// One subscription, as a text of pairs tells it: "type=news, expires=3600". A plain value.
class TavrinSubscriptionInfo {
public:
    /// The pairs of a text: separated by ",", each split at its first "=", white space around key and value dropped.
    /// None, with a line in the log, for an empty or unpaired piece, an empty key or value, a key that comes twice, and
    /// a text of more than 64 KiB. None for an empty text.
    [[nodiscard]] static std::optional<platform::Dictionary>
    dictionaryWithKeyValuePairListString(std::string_view text);

    [[nodiscard]] static std::optional<TavrinSubscriptionInfo> withString(std::string_view text, platform::Date now);
    /// "type": a text that isn't empty. "expires", which may be missing: seconds from `now`, a number or a text that is
    /// one. None, with a line in the log, where one is something else.
    [[nodiscard]] static std::optional<TavrinSubscriptionInfo> withDictionary(const platform::Dictionary& dictionary,
                                                                              platform::Date now);

    [[nodiscard]] const std::string& type() const { return _type; }
    [[nodiscard]] const std::optional<platform::Date>& expirationDate() const { return _expirationDate; }
    /// The expiration date lies in the past.
    [[nodiscard]] bool isExpired(platform::Date now) const { return _expirationDate && *_expirationDate < now; }

private:
    std::string _type;
    std::optional<platform::Date> _expirationDate;
};

} // namespace tavrin
