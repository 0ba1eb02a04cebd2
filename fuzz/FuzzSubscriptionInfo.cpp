#include "fuzz/Check.h"
#include "platform/text/Text.h"
#include "tavrind/TavrinSubscriptionInfo.h"

/// The input is a text of pairs. What is read of it, put together again, reads as the same.
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    using tavrin::TavrinSubscriptionInfo;
    const std::string_view text = textOf(data, size);
    check(platform::trimmed(platform::trimmed(text)) == platform::trimmed(text));
    const auto pairs = TavrinSubscriptionInfo::dictionaryWithKeyValuePairListString(text);
    if (!pairs) return 0;
    std::string again;
    for (const auto& [key, value] : *pairs) again += (again.empty() ? "" : ", ") + key + " = " + *value.asString();
    if (again.size() <= 64u << 10)
        check(TavrinSubscriptionInfo::dictionaryWithKeyValuePairListString(again) == pairs, again);
    const platform::Date now = platform::dateFromSecondsSince1970(1767225600);
    if (const auto info = TavrinSubscriptionInfo::withString(text, now)) {
        check(!info->type().empty());
        (void)info->isExpired(now);
    }
    return 0;
}
