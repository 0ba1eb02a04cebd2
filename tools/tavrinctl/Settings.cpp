#include "tools/tavrinctl/Settings.h"

#include <vector>

#include <fmt/format.h>

#include "CoreTavrin/TAVSettings.h"
#include "platform/values/Json.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

using platform::Value;

namespace {

bool fits(const Value& value, std::string_view type)
{
    if (type == "boolean") return value.type() == Value::Type::Bool;
    if (type == "number") return value.asInt() && *value.asInt() >= 0;
    if (type == "object") return value.asDictionary() || value.asArray();
    return value.asString() != nullptr;
}

} // namespace

Value settingValue(std::string_view key, const std::string& typed)
{
    const KnownSetting* known = knownSetting(key);
    if (known && known->type == "string") return typed;
    Value value = platform::parseJson(typed).value_or(Value(typed));
    if (known && !fits(value, known->type))
        throw Failure(
            fmt::format("{} takes {} {}, not \"{}\"", key, known->type == "object" ? "an" : "a", known->type, typed),
            tools::kWrongUsage);
    return value;
}

std::string noteOnChange(std::string_view key)
{
    const KnownSetting* known = knownSetting(key);
    if (!known) {
        std::vector<std::string> keys;
        for (const KnownSetting& each : knownSettings())
            if (!each.isDaemons) keys.emplace_back(each.key);
        return fmt::format("the daemon knows no setting {}{}", key, tools::didYouMean(key, keys));
    }
    if (known->isDaemons) return fmt::format("the daemon itself writes {}, and may overwrite it", key);
    if (known->read == "at start")
        return fmt::format("the daemon reads {} at its start. Restart it: systemctl --user restart tavrind", key);
    if (known->read != "at every fetch" && known->read != "at every download")
        return fmt::format("the daemon reads {} {}", key, known->read);
    return "";
}

} // namespace tavrin::ctl
