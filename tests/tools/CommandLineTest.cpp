#include "tools/shared/CommandLine.h"

#include <fstream>
#include <map>
#include <regex>

#include <CLI/CLI.hpp>
#include <gmock/gmock.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVSettings.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/Settings.h"
#include "tools/tavrinctl/StatusText.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::tools {
namespace {

/// A program with commands, options of each kind, and a command that has commands.
struct Program {
    Program()
    {
        useReadableHelp(app);
        app.fallthrough();
        app.require_subcommand(0, 1);
        app.add_flag("--json", json, "Print JSON");
        takesNumber(app.add_option("--timeout", timeout, "How long to wait")->capture_default_str(), "SECONDS", 0.5,
                    60);
        takesWholeNumber(app.add_option("-n,--limit", limit, "Results"), "COUNT", 0, 100);
        CLI::App* search = app.add_subcommand("search", "Search");
        search->add_option("query", query, "Text")->required();
        search->add_option("--item", items, "Item")->type_name("NAME=VALUE")->allow_extra_args(false);
        takesName(search->add_option("--selection", selection, "How"), "HOW", {{"default", 0}, {"hint", 2}});
        CLI::App* flush = app.add_subcommand("flush", "Flush");
        flush->require_subcommand(1);
        flush->add_subcommand("watch", "Watch");
    }
    /// Returns what the tool prints about a wrong command line, or an empty text.
    std::string parse(const std::string& line)
    {
        try {
            app.parse(line);
        } catch (const CLI::ParseError& error) {
            return complaint(app, error);
        }
        return "";
    }
    CLI::App app{"A program.", "program"};
    bool json = false;
    double timeout = 30;
    int limit = 10, selection = -1;
    std::string query;
    std::vector<std::string> items;
};

TEST(CommandLine, SaysWhatIsWrongAndWhatWasMeant)
{
    const std::pair<const char*, const char*> cases[]{
        {"search weather", ""},
        {"serch weather", "unknown command serch; did you mean search?"},
        {"quux", "unknown command quux"},
        {"flush wacth", "unknown command wacth; did you mean watch?"},
        {"flush", "flush needs a command: watch"},
        {"search weather --jsn", "unknown option --jsn; did you mean --json?"},
        {"search weather --itme=a=b", "unknown option --itme=a=b; did you mean --item?"},
        {"search weather tomorrow", "unexpected argument tomorrow"},
        {"search", "query is required"},
        {"--timeout abc search weather", "--timeout: expected a number from 0.5 to 60, not \"abc\""},
        {"--timeout 0.1 search weather", "--timeout: expected a number from 0.5 to 60, not \"0.1\""},
        {"--limit -1 search weather", "--limit: expected a whole number from 0 to 100, not \"-1\""},
        {"--limit 1.5 search weather", "--limit: expected a whole number from 0 to 100, not \"1.5\""},
        {"search weather --selection x", "--selection: expected one of default, hint, not \"x\""},
        {"search weather --selection hint", ""},
    };
    for (const auto& [line, problem] : cases) EXPECT_EQ(Program().parse(line), problem) << line;
}

TEST(CommandLine, AnOptionTakesOneValueEachTime)
{
    Program program;
    EXPECT_EQ(program.parse("search --item a=b weather --item c=d --selection hint"), "");
    EXPECT_EQ(program.query, "weather");
    EXPECT_EQ(program.items, (std::vector<std::string>{"a=b", "c=d"}));
    EXPECT_EQ(program.selection, 2);
}

TEST(CommandLine, EachHelpHasPlaceholdersAndTheGlobalOptions)
{
    Program program;
    const std::string help = program.app.get_subcommand("search")->help("program");
    for (const char* part : {"Usage: program search [OPTIONS] query", "--item NAME=VALUE", "--selection HOW",
                             "Global options:", "--timeout SECONDS [30]"})
        EXPECT_THAT(help, testing::HasSubstr(part));
    EXPECT_THAT(help, testing::Not(testing::HasSubstr("TEXT")));
}

} // namespace
} // namespace tavrin::tools

namespace tavrin::ctl {
namespace {

TEST(Settings, AreThoseOfTheDocument)
{
    std::ifstream file(SOURCE_DIR "/docs/device.md");
    std::map<std::string, std::array<std::string, 2>> documented, known;
    bool inSection = false;
    const std::regex row(R"(\| `([^`]+)` \| (\w+) \| .* \| ([^|]+) \|)");
    for (std::string line; std::getline(file, line);) {
        if (line.starts_with("## ")) inSection = line == "## Settings";
        if (std::smatch found; inSection && std::regex_match(line, found, row))
            documented[found[1]] = {found[2], found[3]};
    }
    for (const KnownSetting& setting : knownSettings())
        known[std::string(setting.key)] = {std::string(setting.type), std::string(setting.read)};
    EXPECT_EQ(documented, known);
}

TEST(Settings, AChangeSaysWhenItIsSeen)
{
    const std::pair<const char*, const char*> cases[]{
        {"TAVBagURL", "^$"},
        {"TAVSharedSession", "at its start. Restart it"},
        {"TAVNoQueryCache", "when a client first connects"},
        {"TAVBagUrl", "no setting TAVBagUrl; did you mean TAVBagURL\\?"},
        {"Colour", "no setting Colour$"},
        {"TavrinFirstUseOfTheDay_news", "the daemon itself writes"},
    };
    for (const auto& [key, note] : cases) EXPECT_TRUE(std::regex_search(noteOnChange(key), std::regex(note))) << key;
    EXPECT_EQ(settingValue("TAVBagURL", "1"), platform::Value("1"));
    EXPECT_EQ(settingValue("TAVSessionSizeLimit", "1"), platform::Value(1));
    EXPECT_EQ(settingValue("Colour", "red"), platform::Value("red"));
    EXPECT_THROW((void)settingValue("TAVSharedSession", "yes"), Failure);
}

TEST(StatusText, TheLastFetchSaysItsCause)
{
    const std::pair<const char*, const char*> cases[]{
        {"{}", ""},
        {R"({"lastFetch": {"ago": 3.2, "status": 200}})", "last fetch 3 s ago: succeeded"},
        {R"({"lastFetch": {"ago": 70, "status": 503, "reason": "statusCode 503"}})",
         "last fetch 1 min 10 s ago: the service answered 503"},
        {R"({"lastFetch": {"ago": 0, "reason": "SSL peer certificate was not OK: SSL certificate problem: self-signed certificate"}})",
         "last fetch 0 s ago: self-signed certificate"},
        {R"({"lastFetch": {"ago": 0, "reason": "Couldn't resolve host name: Could not resolve host: x.example"}})",
         "last fetch 0 s ago: Could not resolve host: x.example"},
        {R"({"lastFetch": {"ago": 0, "reason": "timed out"}})", "last fetch 0 s ago: timed out"},
    };
    for (const auto& [bag, text] : cases) EXPECT_EQ(lastFetchText(*platform::parseJson(bag)), text);
}

TEST(StatusText, MisspeltKeysOfTheBagAreProblems)
{
    const TAVBag bag(*platform::parseJson(R"({"version": 1, "searchUrl": "https://s.example/", "isEnabled": "yes",
        "cardURL": "https://s.example/card", "__expiration": 5,
        "clients": {"news": {"isEnable": false}, "gnus": {}}})"),
                     "news/1");
    EXPECT_THAT(bagProblems(bag), testing::UnorderedElementsAre(
                                      "isEnabled: expected true or false",
                                      "searchUrl: the daemon reads no such key; did you mean searchURL?",
                                      "clients.news.isEnable: the daemon reads no such key; did you mean isEnabled?",
                                      "clients.gnus: no client has this name"));
}

} // namespace
} // namespace tavrin::ctl
