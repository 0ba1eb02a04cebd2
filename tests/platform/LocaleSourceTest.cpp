#include "platform/device/LocaleSource.h"

#include <gtest/gtest.h>

#include "platform/device/LocaleSourceIcu.h"
#include "platform/run/RunLoop.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

namespace fs = std::filesystem;
using test::runUntil;
using test::writeFile;

TEST(LocaleContext, FollowsTheEnvironment)
{
    const std::pair<const char*, LocaleContext> cases[]{
        {"de_CH.UTF-8", {"de_CH", "de", {"de-CH"}, "gregorian", true, "Metric", "CH"}},
        {"de_DE@euro", {"de_DE", "de", {"de-DE"}, "gregorian", true, "Metric", "DE"}},
        {"en_US.UTF-8", {"en_US", "en", {"en-US"}, "gregorian", false, "U.S.", "US"}},
        {"en_GB", {"en_GB", "en", {"en-GB"}, "gregorian", true, "U.K.", "GB"}},
        {"en_AU", {"en_AU", "en", {"en-AU"}, "gregorian", false, "Metric", "AU"}},
        {"th_TH", {"th_TH", "th", {"th-TH"}, "buddhist", true, "Metric", "TH"}},
        {"fa_IR", {"fa_IR", "fa", {"fa-IR"}, "persian", false, "Metric", "IR"}},
        {"zh_CN.GB18030", {"zh_CN", "zh", {"zh-CN"}, "gregorian", false, "Metric", "CN"}},
        {"zh_TW", {"zh_TW", "zh-Hant", {"zh-TW"}, "gregorian", false, "Metric", "TW"}},
        {"sr_RS", {"sr_RS", "sr", {"sr-RS"}, "gregorian", true, "Metric", "RS"}},
        {"fr", {"fr", "fr", {"fr"}, "gregorian", true, "Metric", ""}},
        {"", {}},
        {"C", {}},
        {"C.UTF-8", {}},
        {"POSIX", {}},
        {"@euro", {}},
        {"_CH", {}},
    };
    for (const auto& [locale, context] : cases) EXPECT_EQ(localeContext(locale), context) << locale;
    EXPECT_EQ(localeContext(std::string(100'000, 'x')), LocaleContext()) << "nonsense reads as nothing";
}

TEST(LocaleContext, LanguagesComeFirstAndOnce)
{
    using List = std::vector<std::string>;
    const struct {
        const char* languages;
        List preferred;
        std::string systemLanguage;
    } cases[]{
        {"fr:de_CH:en", {"fr", "de-CH", "en"}, "fr"},
        {"fr_CA:fr_CA.UTF-8:fr", {"fr-CA", "fr", "de-CH"}, "fr"},
        {"zh_HK:en", {"zh-HK", "en", "de-CH"}, "zh-Hant"},
        {"::C:POSIX:", {"de-CH"}, "de"},
        {"", {"de-CH"}, "de"},
    };
    for (const auto& c : cases) {
        const LocaleContext context = localeContext("de_CH.UTF-8", c.languages);
        EXPECT_EQ(context.preferredLanguages, c.preferred) << c.languages;
        EXPECT_EQ(context.systemLanguage, c.systemLanguage) << c.languages;
        EXPECT_EQ(context.identifier, "de_CH") << "languages don't move the region";
    }
}

struct SystemLocale : testing::Test {
    static constexpr const char* kVariables[]{"LC_ALL", "LC_MESSAGES", "LANG", "LANGUAGE", "TZ"};
    SystemLocale()
    {
        for (const char* variable : kVariables) unsetenv(variable);
        fs::create_directory(etc / "default");
    }
    ~SystemLocale() override
    {
        for (const char* variable : kVariables) unsetenv(variable);
    }
    std::unique_ptr<LocaleSource> make() { return makeLocaleSource(loop, etc.path); }

    test::TemporaryDirectory etc;
    RunLoop loop;
};

TEST_F(SystemLocale, VariablesOverrideEachOtherInTheirOrder)
{
    EXPECT_EQ(make()->locale().identifier, "en_US");
    setenv("LANG", "de_DE.UTF-8", 1);
    EXPECT_EQ(make()->locale().identifier, "de_DE");
    setenv("LC_MESSAGES", "fr_FR.UTF-8", 1);
    EXPECT_EQ(make()->locale().identifier, "fr_FR");
    setenv("LC_ALL", "it_IT.UTF-8", 1);
    EXPECT_EQ(make()->locale().identifier, "it_IT");
    setenv("LC_ALL", "", 1);
    setenv("LANGUAGE", "rm:de", 1);
    EXPECT_EQ(make()->locale().identifier, "fr_FR") << "an empty variable is none";
    EXPECT_EQ(make()->locale().systemLanguage, "rm");
}

TEST_F(SystemLocale, ChangesOfTheSystemAreToldOnceEach)
{
    setenv("LANG", "de_DE.UTF-8", 1);
    writeFile(etc / "locale.conf", "LANG=fr_FR.UTF-8\n");
    fs::create_symlink("/usr/share/zoneinfo/Europe/Rome", etc / "localtime");
    const auto source = make();
    int locales = 0, zones = 0;
    source->onChange(
        [&](LocaleSource::Change change) { ++(change == LocaleSource::Change::Locale ? locales : zones); });
    EXPECT_EQ(source->locale().identifier, "de_DE") << "the login made its environment from the files";
    loop.runOnce(std::chrono::milliseconds(0)); // the watches are there now

    writeFile(etc / "locale.conf", "# by hand\nLC_TIME=xx\nLANG=\"it_CH.UTF-8\"\nLANGUAGE=it:rm\n");
    EXPECT_TRUE(runUntil(loop, [&] { return locales == 1; }));
    EXPECT_EQ(source->locale().identifier, "it_CH");
    EXPECT_EQ(source->locale().preferredLanguages, (std::vector<std::string>{"it", "rm", "it-CH"}));

    fs::create_symlink("/usr/share/zoneinfo/Europe/Zurich", etc / "new");
    fs::rename(etc / "new", etc / "localtime");
    EXPECT_TRUE(runUntil(loop, [&] { return zones == 1; }));
    EXPECT_EQ(source->timeZone(), "Europe/Zurich");
    writeFile(etc / "timezone", "Asia/Tokyo\n"); // not asked, and no change
    fs::remove(etc / "localtime");
    EXPECT_TRUE(runUntil(loop, [&] { return zones == 2; }));
    writeFile(etc / "timezone", "Asia/Seoul\n");
    EXPECT_TRUE(runUntil(loop, [&] { return zones == 3; }));

    writeFile(etc / "locale.conf", "LANG=it_CH.UTF-8\nLANGUAGE=it:rm\n# the same\n");
    writeFile(etc / "unrelated", "LANG=ja_JP.UTF-8\n");
    fs::remove(etc / "locale.conf");
    EXPECT_TRUE(runUntil(loop, [&] { return source->locale().identifier == "de_DE"; })) << "the environment again";
    EXPECT_EQ(locales, 2);
}

TEST_F(SystemLocale, TimeZoneComesFromTheFirstThatHasOne)
{
    const auto source = make();
    EXPECT_EQ(source->timeZone(), "UTC");
    writeFile(etc / "timezone", "Asia/Tokyo\n");
    EXPECT_EQ(source->timeZone(), "Asia/Tokyo");
    writeFile(etc / "localtime", "TZif2");
    EXPECT_EQ(source->timeZone(), "Asia/Tokyo") << "a copy has no name";
    fs::remove(etc / "localtime");
    fs::create_symlink("../usr/share/zoneinfo/America/Argentina/Ushuaia", etc / "localtime");
    EXPECT_EQ(source->timeZone(), "America/Argentina/Ushuaia");
    const std::pair<const char*, const char*> variables[]{{"Europe/Rome", "Europe/Rome"},
                                                          {":Europe/Rome", "Europe/Rome"},
                                                          {"/usr/share/zoneinfo/Europe/Rome", "Europe/Rome"},
                                                          {":/usr/share/zoneinfo/Europe/Rome", "Europe/Rome"},
                                                          {"", "America/Argentina/Ushuaia"}};
    for (const auto& [variable, zone] : variables) {
        setenv("TZ", variable, 1);
        EXPECT_EQ(source->timeZone(), zone) << variable;
    }
}

TEST_F(SystemLocale, KeyboardIsTheFirstLayout)
{
    setenv("LANG", "de_CH.UTF-8", 1);
    const auto source = make();
    EXPECT_EQ(source->keyboardInputMode(), "");
    const std::pair<const char*, const char*> files[]{{"XKBLAYOUT=\"ch,us\"\nXKBVARIANT=fr\n", "de_CH@layout=ch"},
                                                      {"XKBMODEL=pc105\nXKBLAYOUT=us", "de_CH@layout=us"},
                                                      {"XKBLAYOUT=\"\"\n", ""},
                                                      {"XKBLAYOUT=,us\n", ""},
                                                      {"XKBLAYOUTS=us\n", ""}};
    for (const auto& [file, mode] : files) {
        writeFile(etc / "default/keyboard", file);
        EXPECT_EQ(source->keyboardInputMode(), mode) << file;
    }
    EXPECT_EQ(source->defaultInputMode(), "de_CH@layout=default");
}

} // namespace
} // namespace platform
