#include "tavrind/FeedbackJson.h"

#include <algorithm>
#include <array>

#include "CoreTavrin/TAVFeedback.h"
#include "platform/values/Dictionary.h"
#include "searchrecords/ZRResultFeedback.h"
#include "tavrind/FeedbackEnumerations.h"
#include "tavrind/FeedbackTypes.h"
#include "tavrind/SessionProcessingHelper.h"

namespace tavrin {

using platform::operator""_field;
using platform::ArchivedRecord;

namespace {

/// Written instead of the identifier of any application on the device.
constexpr std::string_view kLocalApplication = "com.quorvane.application";

/// The keys of an event's context, in their order.
constexpr std::array<std::string_view, 4> kContextKeys{"query_id", "client_query_id", "type", "timestamp"};

std::optional<std::string_view> bundleId(const ArchivedRecord<ZRSearchResult>& result)
{
    auto id = result["resultBundleId"_field];
    if (!id) id = result["applicationBundleIdentifier"_field];
    return id && result["isLocalApplicationResult"_field] ? kLocalApplication : id;
}

} // namespace

JsonFields& JsonFields::identifier(std::string_view key, std::optional<std::string_view> identifier)
{
    if (!identifier || !_identifiers) return (*this)(key, identifier);
    return (*this)(key, _identifiers->replacedIdentifier(*identifier));
}

bool JsonFields::hasContext(std::size_t index) const
{
    return index == 0 ? _event.queryId.has_value() : index == 1 ? _event.clientQueryId.has_value() : true;
}

void JsonFields::addContext(std::size_t index)
{
    _contextAdded |= 1u << index;
    const std::string_view key = kContextKeys[index];
    switch (index) {
    case 0: (*this)(key, *_event.queryId); break;
    case 1: (*this)(key, *_event.clientQueryId); break;
    case 2: (*this)(key, eventTypeToString(_event.type)); break;
    default: (*this)(key, _event.timestamp);
    }
}

void JsonFields::readyMade(const platform::ArchivedValue& dictionary)
{
    const platform::Value made = dictionary.value();
    if (!made.asDictionary()) return;
    for (const auto& [key, value] : *made.asDictionary()) {
        const auto index = static_cast<std::size_t>(std::ranges::find(kContextKeys, key) - kContextKeys.begin());
        if (index < kContextKeys.size() && hasContext(index))
            addContext(index);
        else
            (*this)(key, value);
    }
}

void JsonFields::finish()
{
    for (std::size_t index = 0; index < kContextKeys.size(); ++index)
        if (hasContext(index) && (_contextAdded >> index & 1) == 0) addContext(index);
}

void addObject(JsonFields& fields, const ArchivedRecord<ZRSearchResult>& result)
{
    const ResultType type = result["type"_field];
    fields.identifier("id", result["identifier"_field])("score", result["rankingScore"_field]);
    fields("result_type", searchResultTypeEnumToString(type));
    if (type == ResultType::UserActivity) fields("publicly_indexable", result["publiclyIndexable"_field]);
    fields("top_hit", topHitEnumToString(result["topHit"_field]));
    fields("section_bundle_id", result["sectionBundleIdentifier"_field])("bundle_id", bundleId(result));
    if (const auto custom = result["customProperties"_field].as<TAVCustomSearchResult>())
        fields("fbr", custom["fbr"_field]);
    else if (type == ResultType::Tavrin)
        fields("fbr", nullptr);
    if (const auto features = result["localFeatures"_field]; !features.isNull()) fields("local_features", features);
    if (const auto corrected = result["correctedQuery"_field]) fields("corrected_query", corrected);
    fields("static_correction", result["staticCorrection"_field]);
}

void addObject(JsonFields& fields, const ArchivedRecord<ZRSearchSuggestion>& suggestion)
{
    fields.identifier("id", suggestion["identifier"_field]);
    fields("suggestion", suggestion["suggestion"_field])("score", suggestion["score"_field]);
    fields("suggestion_type", suggestionTypeEnumToString(suggestion["type"_field]));
    if (const auto ofService = suggestion.as<TAVSearchSuggestion>()) fields("fbr", ofService["fbr"_field]);
}

void addObject(JsonFields& fields, const ArchivedRecord<ZRResultSection>& section)
{
    fields("id", section["identifier"_field])("score", section["score"_field]);
    fields("bundle_id", section["bundleIdentifier"_field])("results", section["results"_field]);
}

void addObject(JsonFields& fields, const ArchivedRecord<ZRResultRankingFeedback>& ranking)
{
    fields("local_result_position", ranking["localResultPosition"_field]);
    fields("hidden_results", ranking["hiddenResults"_field])("duplicate_results", ranking["duplicateResults"_field]);
}

void addObject(JsonFields& fields, const ArchivedRecord<ZRSectionRankingFeedback>& ranking)
{
    fields("local_section_position", ranking["localSectionPosition"_field])("results", ranking["results"_field]);
}

void encodeErrorForJSON(JsonFields& fields, const platform::Error& error)
{
    const std::string* reason = error.userInfo["reason"].asString();
    fields("code", error.code);
    fields("domain", error.domain.empty() ? std::nullopt : std::optional<std::string_view>(error.domain));
    fields("reason", reason ? std::optional<std::string_view>(*reason) : std::nullopt);
}

std::optional<std::string_view> preferredOpenableURL(const ArchivedRecord<ZRPunchout>& punchout)
{
    const auto urls = punchout["urls"_field];
    return urls.empty() ? std::nullopt : std::optional<std::string_view>(urls.front());
}

std::optional<std::string_view> actionDestinationFromResult(const ArchivedRecord<ZRSearchResult>& result,
                                                            const ArchivedRecord<ZRActionItem>& actionEngaged,
                                                            ResultEngagementDestination destination)
{
    if (actionEngaged) return preferredOpenableURL(actionEngaged["punchout"_field]);
    if (destination != ResultEngagementDestination::Punchout) return std::nullopt;
    return preferredOpenableURL(result["punchout"_field]);
}

} // namespace tavrin
