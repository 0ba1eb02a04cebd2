// tavrinctl defaults: the daemon's settings file, which the daemon watches. Needs no daemon.

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "CoreTavrin/TAVSettings.h"
#include "platform/base/Log.h"
#include "platform/files/Files.h"
#include "platform/files/UserDefaults.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/Characters.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/Settings.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::size_t kMaximumFileSize = 4u << 20;
constexpr std::string_view kDaemonSuite = "com.quorvane.tavrind";

std::filesystem::path settingsFile(const std::string& suite)
{
    return platform::Directories::fromEnvironment().config / (suite + ".json");
}

/// Reads the settings; empty if the file is missing. Throws `Failure` if the file is unreadable or not a JSON object.
Dictionary readSettings(const std::filesystem::path& path)
{
    auto bytes = platform::makeSystemFiles()->read(path, kMaximumFileSize);
    if (!bytes && bytes.error().code == ENOENT) return {};
    if (!bytes) throw Failure(fmt::format("can't read {}: {}", path.string(), bytes.error().reason()));
    auto value = platform::parseJson(bytes->view());
    if (!value || !value->asDictionary())
        throw Failure(
            fmt::format("{} is not a JSON object ({}).\nRepair or remove it; until then the daemon reads it as empty.",
                        path.string(), value ? "another value" : value.error().reason()));
    return *value->asDictionary();
}

/// Sets one key under the file's lock, and keeps the changes of other processes. Null removes the key.
Dictionary change(const std::filesystem::path& path, const std::string& key, const Value& value)
{
    platform::Log::threshold = platform::LogLevel::Fault; // failures are reported below
    const auto files = platform::makeSystemFiles();
    platform::UserDefaults settings(*files, path, nullptr);
    settings.set(key, value);
    if (const auto written = settings.synchronize(); !written)
        throw Failure(fmt::format("can't write {}: {}", path.string(), written.error().reason()));
    return settings.contents();
}

/// Tells the user what to know about a change. The settings of another program are not known here.
void tellAbout(const std::string& suite, const std::string& key)
{
    if (suite != kDaemonSuite) return;
    if (const std::string note = noteOnChange(key); !note.empty()) {
        endProgress();
        fmt::print(stderr, "tavrinctl: {}\n", printable(note));
    }
}

void read(const Options& options, const std::string& suite, const std::string& key)
{
    const Dictionary settings = readSettings(settingsFile(suite));
    if (key.empty()) {
        if (options.json) return printJson(settings);
        if (settings.empty()) printLine("Nothing is set. \"tavrinctl defaults list\" lists the settings.");
        for (const auto& [name, value] : settings)
            printLine(fmt::format("{} = {}", printable(name), printableJson(platform::toJson(value))));
        return;
    }
    const Value* value = settings.find(key);
    if (options.json) return printJson(value ? *value : Value());
    if (!value) throw Failure(fmt::format("{} is not set", key));
    const std::string* text = value->asString();
    printLine(text ? printable(*text) : printableJson(platform::toJson(*value, platform::JsonStyle::Pretty)));
}

void listDefaults(const Options& options)
{
    if (options.json) {
        Value::Array keys;
        for (const KnownSetting& known : knownSettings())
            keys.push_back(Value::dictionaryOf({{"key", known.key},
                                                {"type", known.type},
                                                {"effect", known.effect},
                                                {"read", known.read},
                                                {"writtenByDaemon", known.isDaemons}}));
        return printJson(keys);
    }
    for (const KnownSetting& known : knownSettings())
        printLine(fmt::format("{} {:<8} {}; {}", padded(known.key, 25), known.type, known.effect,
                              known.isDaemons ? "written by the daemon" : fmt::format("read {}", known.read)));
}

struct DefaultsOptions {
    std::string suite{kDaemonSuite};
    std::string key, value;
};

} // namespace

void addDefaultsCommands(CLI::App& app, Command& chosen)
{
    auto options = std::make_shared<DefaultsOptions>();
    CLI::App* defaults = app.add_subcommand("defaults", "The daemon's settings");
    defaults->require_subcommand(1);
    const auto add = [&](const char* name, const char* description, auto action) {
        CLI::App* command = defaults->add_subcommand(name, description);
        command->add_option("--suite", options->suite, "Program whose settings to use")
            ->type_name("NAME")
            ->capture_default_str();
        command->callback([&chosen, action, options] {
            chosen = [action, options](const Options& common) { action(common, *options); };
        });
        return command;
    };

    add("read", "Print one setting, or all that are set", [](const Options& common, const DefaultsOptions& mine) {
        pageOutput();
        read(common, mine.suite, mine.key);
    })->add_option("key", options->key, "Name of the setting");

    CLI::App* write = add("write", "Change a setting, and say when the daemon applies it",
                          [](const Options& common, const DefaultsOptions& mine) {
                              const auto path = settingsFile(mine.suite);
                              (void)readSettings(path); // never overwrites a broken file
                              const Value value = settingValue(mine.key, mine.value);
                              change(path, mine.key, value);
                              if (common.json) printJson(Value::dictionaryOf({{mine.key, value}}));
                              tellAbout(mine.suite, mine.key);
                          });
    write->add_option("key", options->key, "Name of the setting")->required();
    write->add_option("value", options->value, "JSON, or plain text")->required();

    add("delete", "Remove a setting",
        [](const Options& common, const DefaultsOptions& mine) {
            const auto path = settingsFile(mine.suite);
            if (!readSettings(path).contains(mine.key)) throw Failure(fmt::format("{} is not set", mine.key));
            const Dictionary settings = change(path, mine.key, Value());
            if (common.json) printJson(settings);
            if (knownSetting(mine.key)) tellAbout(mine.suite, mine.key);
        })
        ->add_option("key", options->key, "Name of the setting")
        ->required();

    add("list", "List the settings and their effects", [](const Options& common, const DefaultsOptions&) {
        pageOutput();
        listDefaults(common);
    });
}

} // namespace tavrin::ctl
