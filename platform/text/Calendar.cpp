#include "platform/text/Calendar.h"

#include <memory>

#include <unicode/timezone.h>
#include <unicode/unistr.h>

namespace platform {

std::int64_t localDay(Date date, std::string_view timeZone)
{
    const auto name = icu::UnicodeString::fromUTF8({timeZone.data(), static_cast<int32_t>(timeZone.size())});
    const std::unique_ptr<icu::TimeZone> zone(icu::TimeZone::createTimeZone(name));
    int32_t standard = 0;
    int32_t saving = 0;
    UErrorCode error = U_ZERO_ERROR;
    const auto milliseconds = std::chrono::floor<std::chrono::milliseconds>(date);
    zone->getOffset(static_cast<UDate>(milliseconds.time_since_epoch().count()), false, standard, saving, error);
    if (U_FAILURE(error)) standard = saving = 0;
    const auto local = milliseconds + std::chrono::milliseconds(standard + saving);
    return std::chrono::floor<std::chrono::days>(local).time_since_epoch().count();
}

} // namespace platform
