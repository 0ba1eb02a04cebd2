#include "tavrind/FeedbackJson.h"

#include "CoreTavrin/TAVFeedback.h"
#include "searchrecords/ZRResultFeedback.h"
#include "tavrind/FeedbackEnumerations.h"

namespace tavrin {

using platform::Dictionary;
using platform::Value;

namespace {

/// Written instead of the identifier of any application on the device.
constexpr std::string_view kLocalApplication = "com.quorvane.application";

Value bundleId(const ZRSearchResult& result)
{
    const auto& id = result.resultBundleId ? result.resultBundleId : result.applicationBundleIdentifier;
    return id && result.isLocalApplicationResult ? Value(kLocalApplication) : jsonValue(id);
}

} // namespace

Dictionary jsonObject(const ZRSearchResult& result)
{
    Dictionary object;
    object.reserve(11);
    JsonFields fields(object);
    fields("id", result.identifier)("score", result.rankingScore);
    fields("result_type", searchResultTypeEnumToString(result.type));
    if (result.type == ResultType::UserActivity) fields("publicly_indexable", result.publiclyIndexable);
    fields("top_hit", topHitEnumToString(result.topHit));
    fields("section_bundle_id", result.sectionBundleIdentifier)("bundle_id", bundleId(result));
    if (const auto* custom = dynamic_cast<const TAVCustomSearchResult*>(result.customProperties.get()))
        fields("fbr", custom->fbr);
    else if (result.type == ResultType::Tavrin)
        fields("fbr", nullptr);
    if (!result.localFeatures.isNull()) fields("local_features", result.localFeatures);
    if (result.correctedQuery) fields("corrected_query", result.correctedQuery);
    fields("static_correction", result.staticCorrection);
    return object;
}

Dictionary jsonObject(const ZRSearchSuggestion& suggestion)
{
    Dictionary object;
    object.reserve(5);
    JsonFields fields(object);
    fields("id", suggestion.identifier)("suggestion", suggestion.suggestion)("score", suggestion.score);
    fields("suggestion_type", suggestionTypeEnumToString(suggestion.type));
    if (const auto* ofService = dynamic_cast<const TAVSearchSuggestion*>(&suggestion)) fields("fbr", ofService->fbr);
    return object;
}

Dictionary jsonObject(const ZRResultSection& section)
{
    Dictionary object;
    object.reserve(4);
    JsonFields fields(object);
    fields("id", section.identifier)("score", section.score);
    fields("bundle_id", section.bundleIdentifier)("results", section.results);
    return object;
}

Dictionary jsonObject(const ZRResultRankingFeedback& ranking)
{
    Dictionary object;
    object.reserve(3);
    JsonFields fields(object);
    fields("local_result_position", ranking.localResultPosition);
    fields("hidden_results", ranking.hiddenResults)("duplicate_results", ranking.duplicateResults);
    return object;
}

Dictionary jsonObject(const ZRSectionRankingFeedback& ranking)
{
    Dictionary object;
    object.reserve(2);
    JsonFields fields(object);
    fields("local_section_position", ranking.localSectionPosition)("results", ranking.results);
    return object;
}

Dictionary encodeErrorForJSON(const platform::Error& error)
{
    const Value& reason = error.userInfo["reason"];
    return {{"code", error.code},
            {"domain", error.domain.empty() ? Value() : Value(error.domain)},
            {"reason", reason.asString() ? reason : Value()}};
}

const std::string* actionDestinationFromResult(const ZRSearchResult& result, const ZRActionItem* actionEngaged,
                                               ResultEngagementDestination destination)
{
    const ZRPunchout* punchout = nullptr;
    if (actionEngaged)
        punchout = actionEngaged->punchout.get();
    else if (destination == ResultEngagementDestination::Punchout)
        punchout = result.punchout.get();
    return punchout ? punchout->preferredOpenableURL() : nullptr;
}

} // namespace tavrin
