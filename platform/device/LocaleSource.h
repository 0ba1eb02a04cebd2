#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

/// The user's locale, as far as requests tell it.
struct LocaleContext {
    std::string identifier = "en_US";                     ///< "de_CH"
    std::string systemLanguage = "en";                    ///< language of the user interface, BCP 47: "de", "zh-Hant"
    std::vector<std::string> preferredLanguages{"en-US"}; ///< BCP 47, most preferred first
    std::string calendar = "gregorian";                   ///< CLDR calendar type: "gregorian", "buddhist"
    bool is24Hour = false;                  ///< the hour format (skeleton "j") has two-digit hours of a day: "HH"
    std::string measurementSystem = "U.S."; ///< "U.S.", "U.K." or "Metric"
    std::string region = "US";              ///< ISO 3166 country code, or empty

    bool operator==(const LocaleContext&) const = default;
};

/// Where the locale and the time zone come from, and word of their changes. Any thread.
class LocaleSource {
public:
    virtual ~LocaleSource() = default;
    [[nodiscard]] virtual LocaleContext locale() = 0;
    /// IANA name of the local time zone: "Europe/Zurich".
    [[nodiscard]] virtual std::string timeZone() = 0;
    /// The input mode of the current keyboard ("de_CH@sw=QWERTZ"-like text of the platform's making); empty if unknown.
    [[nodiscard]] virtual std::string keyboardInputMode() = 0;
    /// The first input mode that is on by default for the current locale.
    [[nodiscard]] virtual std::string defaultInputMode() = 0;

    enum class Change { Locale, TimeZone };
    /// Called on the run loop's thread after a change. One handler.
    virtual void onChange(std::function<void(Change)> handler) = 0;
};

} // namespace platform
