#include "tools/devserver/SessionShape.h"

#include <algorithm>
#include <array>
#include <string_view>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"

namespace devserver {

using platform::Value;

namespace {

constexpr std::array<std::string_view, 7> kKeys{
    "fb", "agent", "user_guid", "resource_versions", "first_use", "base_time", "previous_session_end_reason"};
constexpr std::size_t kKeysWithoutVersions = 3;

constexpr std::array<std::string_view, 7> kEndReasons{"no previous session",     "external request", "session idle",
                                                      "max session time passed", "guid changed",     "critical memory",
                                                      "engagement received"};

constexpr std::array<std::string_view, 33> kEventTypes{"visible_results",
                                                       "network_search_start",
                                                       "network_search_end",
                                                       "local_search_start",
                                                       "local_search_end",
                                                       "search_view_appear",
                                                       "search_view_disappear",
                                                       "rank_sections",
                                                       "result_engagement",
                                                       "visible_card",
                                                       "card_engagement",
                                                       "error",
                                                       "suggestion_engagement",
                                                       "card_view_disappear",
                                                       "search_start",
                                                       "search_end",
                                                       "visible_suggestions",
                                                       "custom_unknown",
                                                       "custom_crowdsourcing",
                                                       "custom_wendral_autofill",
                                                       "custom_vistrel_result_features",
                                                       "unknown",
                                                       "results_received_after_timeout",
                                                       "late_sections_appended",
                                                       "clear_input",
                                                       "session_end",
                                                       "skip_tavrin_search",
                                                       "section_engagement",
                                                       "visible_section_header",
                                                       "session_missing_results",
                                                       "session_missing_suggestions",
                                                       "did_go_to_site",
                                                       "connection_invalidated"};

bool isOneOf(const Value& value, const auto& texts)
{
    const std::string* text = value.asString();
    return text && std::ranges::find(texts, *text) != texts.end();
}

/// Returns a non-negative integer that is written as one; nullopt for any other value.
std::optional<std::uint64_t> count(const Value& value)
{
    return value.type() == Value::Type::Double ? std::nullopt : value.asUInt();
}

std::optional<std::string> keysProblem(const platform::Dictionary& session)
{
    if (session.size() == kKeysWithoutVersions || session.size() == kKeys.size()) {
        const auto differs = std::ranges::mismatch(session, kKeys, {},
                                                   [](const auto& entry) -> std::string_view { return entry.first; });
        if (differs.in1 == session.end()) return std::nullopt;
    }
    std::vector<std::string_view> keys;
    for (const auto& [key, value] : session) keys.push_back(key);
    return fmt::format("its keys are {}, not {}; or the first {} of them", fmt::join(keys, ", "),
                       fmt::join(kKeys, ", "), kKeysWithoutVersions);
}

std::optional<std::string> eventsProblem(const Value::Array& events)
{
    std::uint64_t last = 0;
    for (std::size_t i = 0; i < events.size(); ++i) {
        const Value& event = events[i];
        if (!event.asDictionary()) return fmt::format("fb[{}] is no object", i);
        if (!isOneOf(event["type"], kEventTypes))
            return fmt::format("fb[{}] has the \"type\" {}", i, platform::toJson(event["type"]));
        const auto timestamp = count(event["timestamp"]);
        if (!timestamp) return fmt::format("fb[{}] has the \"timestamp\" {}", i, platform::toJson(event["timestamp"]));
        if (*timestamp < last) return fmt::format("fb[{}] is earlier than the event before it", i);
        last = *timestamp;
    }
    return std::nullopt;
}

} // namespace

std::optional<std::string> sessionShapeProblem(const Value& session)
{
    const platform::Dictionary* entries = session.asDictionary();
    if (!entries) return "it is no object";
    if (auto problem = keysProblem(*entries)) return problem;

    const Value::Array* events = session["fb"].asArray();
    if (!events) return "\"fb\" is no array";
    for (const char* key : {"agent", "user_guid"})
        if (!session[key].asString()) return fmt::format("\"{}\" is no text", key);
    if (entries->size() == kKeys.size()) {
        if (!session["resource_versions"].asDictionary()) return "\"resource_versions\" is no object";
        if (!session["first_use"].asBool()) return "\"first_use\" is no boolean";
        if (!count(session["base_time"])) return "\"base_time\" is no whole number";
        if (!isOneOf(session["previous_session_end_reason"], kEndReasons))
            return fmt::format("\"previous_session_end_reason\" is {}",
                               platform::toJson(session["previous_session_end_reason"]));
    }
    return eventsProblem(*events);
}

} // namespace devserver
