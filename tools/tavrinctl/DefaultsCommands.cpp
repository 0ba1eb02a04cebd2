// tavrinctl defaults: the daemon's settings, in the file that it watches. Needs no daemon.

#include <algorithm>
#include <array>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "platform/base/Log.h"
#include "platform/files/Files.h"
#include "platform/files/UserDefaults.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/Commands.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::size_t kMaximumFileSize = 4u << 20;

struct KnownKey {
    std::string_view key;
    std::string_view type;
    std::string_view effect;
};
constexpr std::array kKnownKeys{
    KnownKey{"TAVBagURL", "string", "where the bag is fetched from"},
    KnownKey{"TAVSharedSession", "boolean", "all clients share one session; read at start"},
    KnownKey{"TAVSessionSizeLimit", "number", "bytes of a session file; read at start"},
    KnownKey{"TAVSessionMaxAge", "number", "seconds that a session file is kept; read at start"},
    KnownKey{"TAVPersistSessions", "boolean", "the clients known survive a restart; read at start"},
    KnownKey{"TAVNoQueryCache", "boolean", "no answers from memory"},
    KnownKey{"TAVNoParallax", "boolean", "no TCP Fast Open, no TLS session tickets; read at start"},
    KnownKey{"TAVDebugParameters", "string", "name=value&… for every request; read at start"},
    KnownKey{"TAVDownloadDelay", "number", "seconds until a resource is downloaded; for development"},
    KnownKey{"TraceEnabled", "boolean", "trace points; read at start"},
};

std::filesystem::path settingsFile(const std::string& suite)
{
    return platform::Directories::fromEnvironment().config / (suite + ".json");
}

/// The file's contents; none for a file that isn't there, a `Failure` for one that can't be used.
Dictionary readSettings(const std::filesystem::path& path)
{
    auto bytes = platform::makeSystemFiles()->read(path, kMaximumFileSize);
    if (!bytes && bytes.error().code == ENOENT) return {};
    if (!bytes) throw Failure(fmt::format("{} can't be read: {}", path.string(), bytes.error().reason()));
    auto value = platform::parseJson(bytes->view());
    if (!value || !value->asDictionary())
        throw Failure(
            fmt::format("{} is not a JSON object ({}).\nMend it or remove it; until then the daemon takes it for "
                        "empty.",
                        path.string(), value ? "another value" : value.error().reason()));
    return *value->asDictionary();
}

/// Sets one key as the daemon does it: under the file's lock, over what others have written meanwhile. Null removes it.
Dictionary change(const std::filesystem::path& path, const std::string& key, const Value& value)
{
    platform::Log::threshold = platform::LogLevel::Fault; // failures are told below
    const auto files = platform::makeSystemFiles();
    platform::UserDefaults settings(*files, path, nullptr);
    settings.set(key, value);
    if (const auto written = settings.synchronize(); !written)
        throw Failure(fmt::format("{} can't be written: {}", path.string(), written.error().reason()));
    return settings.contents();
}

bool fits(const Value& value, std::string_view type)
{
    if (type == "boolean") return value.type() == Value::Type::Bool;
    if (type == "number") return value.asInt() && *value.asInt() >= 0;
    return value.asString() != nullptr;
}

/// What the user typed: JSON where it is JSON, else a text. A key that takes a text gets one in any case.
Value settingValue(const std::string& key, const std::string& typed)
{
    const auto known = std::ranges::find(kKnownKeys, key, &KnownKey::key);
    if (known != kKnownKeys.end() && known->type == "string") return typed;
    Value value = platform::parseJson(typed).value_or(Value(typed));
    if (known != kKnownKeys.end() && !fits(value, known->type))
        throw Failure(fmt::format("{} takes a {}, not \"{}\"", key, known->type, typed), 2);
    return value;
}

void read(const Options& options, const std::string& suite, const std::string& key)
{
    const Dictionary settings = readSettings(settingsFile(suite));
    if (key.empty()) {
        if (options.json) return printJson(settings);
        if (settings.empty()) printLine("Nothing is set; \"tavrinctl defaults list\" tells what can be.");
        for (const auto& [name, value] : settings)
            printLine(fmt::format("{} = {}", printable(name), platform::toJson(value)));
        return;
    }
    const Value* value = settings.find(key);
    if (options.json) return printJson(value ? *value : Value());
    if (!value) throw Failure(fmt::format("{} is not set", key));
    const std::string* text = value->asString();
    printLine(text ? printable(*text) : platform::toJson(*value, platform::JsonStyle::Pretty));
}

void list(const Options& options)
{
    if (options.json) {
        Value::Array keys;
        for (const KnownKey& known : kKnownKeys)
            keys.push_back(Value::dictionaryOf({{"key", known.key}, {"type", known.type}, {"effect", known.effect}}));
        return printJson(keys);
    }
    for (const KnownKey& known : kKnownKeys)
        printLine(fmt::format("{:<20} {:<8} {}", known.key, known.type, known.effect));
}

struct DefaultsOptions {
    std::string suite = "com.quorvane.tavrind";
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
        command->add_option("--suite", options->suite, "The settings of another program")->capture_default_str();
        command->callback([&chosen, action, options] {
            chosen = [action, options](const Options& common) { action(common, *options); };
        });
        return command;
    };

    add("read", "One setting, or all that are set", [](const Options& common, const DefaultsOptions& mine) {
        read(common, mine.suite, mine.key);
    })->add_option("key", options->key, "Which one");

    CLI::App* write =
        add("write", "Set one; the daemon sees it at once", [](const Options& common, const DefaultsOptions& mine) {
            const auto path = settingsFile(mine.suite);
            (void)readSettings(path); // a broken file is for its owner to mend
            const Value value = settingValue(mine.key, mine.value);
            change(path, mine.key, value);
            if (common.json) printJson(Value::dictionaryOf({{mine.key, value}}));
        });
    write->add_option("key", options->key, "Which one")->required();
    write->add_option("value", options->value, "JSON, or a text")->required();

    add("delete", "Unset one",
        [](const Options& common, const DefaultsOptions& mine) {
            const auto path = settingsFile(mine.suite);
            if (!readSettings(path).contains(mine.key)) throw Failure(fmt::format("{} is not set", mine.key));
            const Dictionary settings = change(path, mine.key, Value());
            if (common.json) printJson(settings);
        })
        ->add_option("key", options->key, "Which one")
        ->required();

    add("list", "What can be set", [](const Options& common, const DefaultsOptions&) { list(common); });
}

} // namespace tavrin::ctl
