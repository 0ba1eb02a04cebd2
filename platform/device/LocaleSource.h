#pragma once

#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

/// The properties of the user's locale that requests contain.
struct LocaleContext {
    std::string identifier = "en_US";                     ///< "de_CH"
    std::string systemLanguage = "en";                    ///< language of the user interface, BCP 47: "de", "zh-Hant"
    std::vector<std::string> preferredLanguages{"en-US"}; ///< BCP 47, most preferred first
    std::string calendar = "gregorian";                   ///< CLDR calendar type: "gregorian", "buddhist"
    bool is24Hour = false;                                ///< the hour format (CLDR skeleton "j") is "HH"
    std::string measurementSystem = "U.S.";               ///< "U.S.", "U.K." or "Metric"
    std::string region = "US";                            ///< ISO 3166 country code, or empty

    bool operator==(const LocaleContext&) const = default;
};

/// Reports the locale, the time zone and the keyboard, and changes of the locale and time zone. Any thread.
class LocaleSource {
public:
    virtual ~LocaleSource() = default;
    [[nodiscard]] virtual LocaleContext locale() = 0;
    /// Returns the IANA name of the local time zone: "Europe/Zurich".
    [[nodiscard]] virtual std::string timeZone() = 0;
    /// Returns the input mode of the current keyboard, "LOCALE@layout=LAYOUT"; empty if unknown.
    [[nodiscard]] virtual std::string keyboardInputMode() = 0;
    /// Returns the default input mode of the current locale, "LOCALE@layout=default".
    [[nodiscard]] virtual std::string defaultInputMode() = 0;

    enum class Change { Locale, TimeZone };
    /// Calls `handler` on the run loop's thread after every change. One handler; a new one replaces it.
    virtual void onChange(std::function<void(Change)> handler) = 0;
};

} // namespace platform
