#include "platform/net/BackgroundPolicy.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <string>

#include <curl/curl.h>

#include "platform/net/UrlSession.h"

namespace platform {

using namespace std::chrono_literals;

Duration retryDelay(unsigned failures, double jitter)
{
    constexpr Duration kFirst = 30s;
    constexpr Duration kSecond = 2h;
    constexpr Duration kLongest = 4h;
    const double spread = std::clamp(jitter, 0.0, 1.0);
    if (failures <= 1) return durationFromSeconds(toSeconds(kFirst) * (0.5 + spread / 2));
    return durationFromSeconds(toSeconds(failures == 2 ? kSecond : kLongest) * (0.25 + 0.75 * spread));
}

Duration startDelay(Duration window, double jitter)
{
    return durationFromSeconds(toSeconds(window) * std::clamp(jitter, 0.0, 1.0));
}

bool isTransient(const Error& error)
{
    if (error.domain == kPosixErrorDomain) return mayPass(error);
    if (error.domain != kUrlErrorDomain) return false;
    constexpr std::array<std::int64_t, 6> kFinal{kUrlCancelled,        kUrlBadUrl,   kUrlUnsupported,
                                                 kUrlTooManyRedirects, kUrlTooLarge, kUrlForbiddenRedirect};
    return std::ranges::find(kFinal, error.code) == kFinal.end();
}

std::optional<Duration> retryAfter(std::string_view field, Date now, double jitter)
{
    constexpr Duration kLongest = 24h;
    constexpr Duration kDateSpread = 30min;
    const double spread = std::clamp(jitter, 0.0, 1.0);
    const bool isNumber = !field.empty() && std::ranges::all_of(field, [](char c) { return c >= '0' && c <= '9'; });
    if (isNumber) {
        std::uint64_t seconds = 0;
        const auto read = std::from_chars(field.data(), field.data() + field.size(), seconds);
        if (read.ec != std::errc() || seconds >= 24 * 60 * 60) return kLongest;
        return std::min(durationFromSeconds(static_cast<double>(seconds) * (1 + spread / 2)), kLongest);
    }
    constexpr std::size_t kLongestDate = 64;
    if (field.size() > kLongestDate) return std::nullopt;
    const time_t date = curl_getdate(std::string(field).c_str(), nullptr);
    if (date < 0) return std::nullopt;
    // Computed in seconds: a date in the far future doesn't fit nanoseconds.
    const double wait = static_cast<double>(date) - secondsSince1970(now);
    if (wait <= 0) return 0s;
    return std::min<Duration>(durationFromSeconds(wait + toSeconds(kDateSpread) * spread), kLongest);
}

} // namespace platform
