#include "platform/device/LocaleSourceIcu.h"

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <optional>
#include <utility>

#include <unicode/calendar.h>
#include <unicode/dtptngen.h>
#include <unicode/locid.h>
#include <unicode/timezone.h>
#include <unicode/ulocdata.h>

#include "platform/base/Mutex.h"
#include "platform/device/LocaleSource.h"
#include "platform/files/FileWatch.h"
#include "platform/run/RunLoop.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

/// "de_CH.UTF-8@euro" → "de_CH"; empty for "C" and "POSIX".
std::string withoutEncoding(std::string_view locale)
{
    std::string name(locale.substr(0, locale.find_first_of(".@")));
    return name == "C" || name == "POSIX" ? std::string() : name;
}

std::string languageTag(const icu::Locale& locale)
{
    UErrorCode status = U_ZERO_ERROR;
    std::string tag;
    icu::StringByteSink<std::string> sink(&tag);
    locale.toLanguageTag(sink, status);
    return U_SUCCESS(status) ? tag : std::string("und");
}

/// Returns the language of the user interface, with its script if that is not the language's usual script.
std::string systemLanguage(icu::Locale locale)
{
    UErrorCode status = U_ZERO_ERROR;
    locale.addLikelySubtags(status);
    const icu::Locale inFull(locale.getLanguage(), locale.getScript());
    icu::Locale usual(locale.getLanguage());
    usual.addLikelySubtags(status);
    const bool usualScript = std::string_view(usual.getScript()) == locale.getScript();
    return languageTag(usualScript ? icu::Locale(locale.getLanguage()) : inFull);
}

bool uses24Hours(const icu::Locale& locale)
{
    UErrorCode status = U_ZERO_ERROR;
    const std::unique_ptr<icu::DateTimePatternGenerator> generator(
        icu::DateTimePatternGenerator::createInstance(locale, status));
    if (U_FAILURE(status)) return false;
    return generator->getBestPattern(u"j", status).indexOf(u"HH") >= 0;
}

std::string calendarType(const icu::Locale& locale)
{
    UErrorCode status = U_ZERO_ERROR;
    const std::unique_ptr<icu::Calendar> calendar(icu::Calendar::createInstance(locale, status));
    return U_SUCCESS(status) ? calendar->getType() : "gregorian";
}

std::string measurementSystem(const icu::Locale& locale)
{
    UErrorCode status = U_ZERO_ERROR;
    switch (ulocdata_getMeasurementSystem(locale.getName(), &status)) {
    case UMS_US: return "U.S.";
    case UMS_UK: return "U.K.";
    default: return "Metric";
    }
}

std::optional<std::string> environment(const char* name)
{
    const char* value = std::getenv(name);
    return value && *value ? std::optional<std::string>(value) : std::nullopt;
}

/// Returns the value of NAME=VALUE or NAME="VALUE" in a shell-like settings file.
std::optional<std::string> setting(const fs::path& file, std::string_view name)
{
    constexpr int kMaximumLines = 1000;
    std::ifstream stream(file);
    std::string line;
    for (int i = 0; i < kMaximumLines && std::getline(stream, line); ++i) {
        if (!line.starts_with(name) || line.size() <= name.size() || line[name.size()] != '=') continue;
        std::string value = line.substr(name.size() + 1);
        std::erase_if(value, [](char c) { return c == '"' || c == '\''; });
        if (!value.empty()) return value;
    }
    return std::nullopt;
}

/// "/usr/share/zoneinfo/Europe/Zurich" → "Europe/Zurich"; nothing for a path outside the database.
std::optional<std::string> zoneOfPath(std::string_view path)
{
    constexpr std::string_view kDatabase = "zoneinfo/";
    const std::size_t at = path.find(kDatabase);
    return at == std::string_view::npos ? std::nullopt : std::optional(std::string(path.substr(at + kDatabase.size())));
}

constexpr const char* kLocaleFiles[] = {"locale.conf", "default/locale"};
constexpr const char* kLocalTime = "localtime";
constexpr const char* kTimeZone = "timezone"; // has the zone's name if the above is a copy, not a link
constexpr const char* kKeyboardFile = "default/keyboard";

class SystemLocale final : public LocaleSource {
public:
    SystemLocale(RunLoop& runLoop, fs::path etc) : _runLoop(runLoop), _etc(std::move(etc)) {}

    LocaleContext locale() override
    {
        MutexLock lock(_mutex);
        if (!_locale) {
            _locale = read();
            startWatching();
        }
        return *_locale;
    }

    std::string timeZone() override
    {
        if (const auto fromEnvironment = environment("TZ")) {
            const std::string zone = fromEnvironment->substr(fromEnvironment->front() == ':');
            return zoneOfPath(zone).value_or(zone);
        }
        std::error_code failed;
        const std::string target = fs::read_symlink(_etc / kLocalTime, failed).string();
        if (const auto zone = zoneOfPath(target); zone && !failed) return *zone;
        std::ifstream file(_etc / kTimeZone);
        std::string name;
        if (std::getline(file, name) && !name.empty()) return name;
        return "UTC";
    }

    std::string keyboardInputMode() override
    {
        auto layout = setting(_etc / kKeyboardFile, "XKBLAYOUT");
        if (!layout) return {};
        const std::string first = layout->substr(0, layout->find(','));
        if (first.empty()) return {};
        return locale().identifier + "@layout=" + first;
    }

    std::string defaultInputMode() override { return locale().identifier + "@layout=default"; }

    void onChange(std::function<void(Change)> handler) override
    {
        MutexLock lock(_mutex);
        _handler = std::move(handler);
    }

private:
    /// Reads the system's files only after they have changed: before that the environment counts, which the login set
    /// from them.
    LocaleContext read() REQUIRES(_mutex)
    {
        std::optional<std::string> name;
        std::optional<std::string> languages = environment("LANGUAGE");
        if (_filesChanged) {
            for (const char* file : kLocaleFiles) {
                for (const char* key : {"LC_ALL", "LC_MESSAGES", "LANG"})
                    if (!name) name = setting(_etc / file, key);
                if (name) languages = setting(_etc / file, "LANGUAGE");
                if (name) break;
            }
        }
        for (const char* key : {"LC_ALL", "LC_MESSAGES", "LANG"})
            if (!name) name = environment(key);
        return localeContext(name.value_or(""), languages.value_or(""));
    }

    /// Creates the watches on the loop's thread.
    void startWatching()
    {
        _runLoop.execute(Priority::Default, [this] {
            for (const char* file : kLocaleFiles)
                _watches.push_back(std::make_unique<FileWatch>(_runLoop, _etc / file, [this] { localeChanged(); }));
            _zone = timeZone();
            for (const char* file : {kLocalTime, kTimeZone})
                _watches.push_back(std::make_unique<FileWatch>(_runLoop, _etc / file, [this] { zoneChanged(); }));
        });
    }

    void localeChanged()
    {
        {
            MutexLock lock(_mutex);
            _filesChanged = true;
            LocaleContext fresh = read();
            if (fresh == _locale) return;
            _locale = std::move(fresh);
        }
        tell(Change::Locale);
    }

    void zoneChanged()
    {
        std::string fresh = timeZone();
        if (fresh == _zone) return;
        _zone = std::move(fresh);
        tell(Change::TimeZone);
    }

    void tell(Change change)
    {
        std::function<void(Change)> handler;
        {
            MutexLock lock(_mutex);
            handler = _handler;
        }
        if (handler) handler(change);
    }

    RunLoop& _runLoop;
    const fs::path _etc;
    Mutex _mutex;
    std::optional<LocaleContext> _locale GUARDED_BY(_mutex);
    bool _filesChanged GUARDED_BY(_mutex) = false;
    std::function<void(Change)> _handler GUARDED_BY(_mutex);
    std::vector<std::unique_ptr<FileWatch>> _watches; // loop's thread, like the next
    std::string _zone;                                // last told
};

} // namespace

LocaleContext localeContext(std::string_view localeName, std::string_view languages)
{
    std::string name = withoutEncoding(localeName);
    if (name.empty()) name = "en_US";
    const icu::Locale locale(name.c_str());
    if (locale.isBogus() || !*locale.getLanguage()) return {};

    LocaleContext context;
    context.identifier = locale.getName();
    context.region = locale.getCountry();
    context.calendar = calendarType(locale);
    context.is24Hour = uses24Hours(locale);
    context.measurementSystem = measurementSystem(locale);

    context.preferredLanguages.clear();
    const auto prefer = [&](const icu::Locale& language) {
        const std::string tag = languageTag(language);
        if (!language.isBogus() && *language.getLanguage() &&
            std::ranges::find(context.preferredLanguages, tag) == context.preferredLanguages.end())
            context.preferredLanguages.push_back(tag);
    };
    std::optional<icu::Locale> first;
    while (!languages.empty()) {
        const std::string_view piece = languages.substr(0, languages.find(':'));
        languages.remove_prefix(std::min(piece.size() + 1, languages.size()));
        const std::string one = withoutEncoding(piece);
        if (one.empty()) continue;
        const icu::Locale language(one.c_str());
        if (!first && !language.isBogus()) first = language;
        prefer(language);
    }
    prefer(locale);
    context.systemLanguage = systemLanguage(first.value_or(locale));
    return context;
}

std::unique_ptr<LocaleSource> makeLocaleSource(RunLoop& runLoop, fs::path etc)
{
    return std::make_unique<SystemLocale>(runLoop, std::move(etc));
}

} // namespace platform
