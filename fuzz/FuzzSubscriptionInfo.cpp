#include "fuzz/Check.h"
#include "platform/text/Text.h"
#include "tavrind/TavrinSubscriptionInfo.h"

/// The input is a text of pairs. What is read of it, put together again, reads as the same.
void runInput(std::string_view input)
{
    using tavrin::TavrinSubscriptionInfo;
    check(platform::trimmed(platform::trimmed(input)) == platform::trimmed(input));
    const auto pairs = TavrinSubscriptionInfo::dictionaryWithKeyValuePairListString(input);
    if (!pairs) return;
    std::string again;
    for (const auto& [key, value] : *pairs) again += (again.empty() ? "" : ", ") + key + " = " + *value.asString();
    if (again.size() <= 64u << 10)
        check(TavrinSubscriptionInfo::dictionaryWithKeyValuePairListString(again) == pairs, again);
    const platform::Date now = platform::dateFromSecondsSince1970(1767225600);
    if (const auto info = TavrinSubscriptionInfo::withString(input, now)) {
        check(!info->type().empty());
        (void)info->isExpired(now);
    }
}
