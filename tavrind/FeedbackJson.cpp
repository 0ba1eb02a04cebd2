#include "tavrind/FeedbackJson.h"

#include "CoreTavrin/TAVFeedback.h"
#include "platform/values/Dictionary.h"
#include "searchrecords/ZRRecords.h"
#include "tavrind/FeedbackEnumerations.h"
#include "tavrind/FeedbackTypes.h"
#include "tavrind/NetworkTiming.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {

namespace {

using platform::Dictionary;
using platform::Value;

/// Written for every application that is installed on the device, none of which is to be named.
constexpr std::string_view kLocalApplication = "com.quorvane.application";

Value orNull(const std::string* text)
{
    return text ? Value(*text) : Value();
}

Value orNull(const std::optional<std::string>& text)
{
    return text ? Value(*text) : Value();
}

// Records within events.

Dictionary object(const ZRSearchResult& result);
Dictionary object(const ZRSearchSuggestion& suggestion);
Dictionary object(const ZRResultSection& section);
Dictionary object(const ZRResultRankingFeedback& ranking);
Dictionary object(const ZRSectionRankingFeedback& ranking);

template <class T> Value objects(const std::vector<std::shared_ptr<T>>& records)
{
    Value::Array array;
    array.reserve(records.size());
    for (const auto& record : records) array.push_back(record ? Value(object(*record)) : Value());
    return array;
}

template <class T> Value objects(const RecordArray<T>& records)
{
    return records ? objects(*records) : Value();
}

/// An application's identifier for the service.
Value bundleId(const ZRSearchResult& result)
{
    const auto& id = result.resultBundleId ? result.resultBundleId : result.applicationBundleIdentifier;
    return id && result.isLocalApplicationResult ? Value(kLocalApplication) : orNull(id);
}

Dictionary object(const ZRSearchResult& result)
{
    Dictionary object;
    object.reserve(11);
    object.set("id", orNull(result.identifier));
    object.set("score", result.rankingScore);
    object.set("result_type", searchResultTypeEnumToString(result.type));
    if (result.type == ResultType::UserActivity) object.set("publicly_indexable", result.publiclyIndexable);
    object.set("top_hit", topHitEnumToString(result.topHit));
    object.set("section_bundle_id", orNull(result.sectionBundleIdentifier));
    object.set("bundle_id", bundleId(result));
    if (const auto* custom = dynamic_cast<const TAVCustomSearchResult*>(result.customProperties.get()))
        object.set("fbr", orNull(custom->fbr));
    else if (result.type == ResultType::Tavrin)
        object.set("fbr", nullptr);
    if (!result.localFeatures.isNull()) object.set("local_features", result.localFeatures);
    if (result.correctedQuery) object.set("corrected_query", *result.correctedQuery);
    object.set("static_correction", result.staticCorrection);
    return object;
}

Dictionary object(const ZRSearchSuggestion& suggestion)
{
    Dictionary object;
    object.reserve(5);
    object.set("id", orNull(suggestion.identifier));
    object.set("suggestion", orNull(suggestion.suggestion));
    object.set("score", suggestion.score);
    object.set("suggestion_type", suggestionTypeEnumToString(suggestion.type));
    if (const auto* ofService = dynamic_cast<const TAVSearchSuggestion*>(&suggestion))
        object.set("fbr", orNull(ofService->fbr));
    return object;
}

Dictionary object(const ZRResultSection& section)
{
    Dictionary object;
    object.reserve(4);
    object.set("id", orNull(section.identifier));
    object.set("score", section.score);
    object.set("bundle_id", orNull(section.bundleIdentifier));
    object.set("results", objects(section.results));
    return object;
}

Dictionary object(const ZRResultRankingFeedback& ranking)
{
    Dictionary object;
    object.reserve(3);
    object.set("local_result_position", ranking.localResultPosition);
    object.set("hidden_results", objects(ranking.hiddenResults));
    object.set("duplicate_results", objects(ranking.duplicateResults));
    return object;
}

Dictionary object(const ZRSectionRankingFeedback& ranking)
{
    Dictionary object;
    object.reserve(2);
    object.set("local_section_position", ranking.localSectionPosition);
    object.set("results", objects(ranking.results));
    return object;
}

// What each record adds to its event.

void add(Dictionary& event, const ZRVisibleResultsFeedback& record)
{
    event.set("trigger_event", triggerEventEnumToString(record.triggerEvent));
    event.set("results", objects(record.results));
}

void add(Dictionary& event, const ZRStartNetworkSearchFeedback& record)
{
    event.set("headers", record.headers.asDictionary() ? record.headers : Value());
    event.set("url", orNull(record.url));
    event.set("endpoint_type", endpointTypeEnumToString(record.endpoint));
    if (const auto* lookup = dynamic_cast<const TAVLookupStartNetworkSearchFeedback*>(&record))
        event.set("trigger_event", lookupSelectionTypeEnumToString(lookup->selectionType));
}

void add(Dictionary& event, const ZREndSearchFeedback& record)
{
    event.set("uuid", orNull(record.uuid));
}

void addTiming(Dictionary& event, const Value& timing)
{
    event.set("network_timing_data", formatNetworkTimingData(timing));
    if (timing.isNull()) return;
    event.set("connection_reused", timing["_kCFNTimingDataConnectionReused"].asBool().value_or(false));
    const Value& interface = timing["_kCFNTimingDataConnectionInterfaceIdentifier"];
    if (interface.asString() && !interface.asString()->empty()) event.set("interface", interface);
    if (auto peer = peerAddress(timing)) event.set("peer_address", std::move(*peer));
}

void add(Dictionary& event, const ZREndNetworkSearchFeedback& record)
{
    event.reserve(16);
    add(event, static_cast<const ZREndSearchFeedback&>(record));
    event.set("response_size", record.responseSize);
    event.set("status_code", record.statusCode);
    addTiming(event, record.networkTimingData);
    if (const auto* answered = dynamic_cast<const TAVEndNetworkSearchFeedback*>(&record)) {
        event.set("tavrin_status", orNull(answered->tavrinStatus));
        event.set("tavrin_duration", answered->tavrinDuration);
        event.set("fbq", orNull(answered->fbq));
        event.set("tavrin_partial_client_ip", orNull(answered->partialClientIp));
    }
}

void add(Dictionary& event, const ZRStartLocalSearchFeedback& record)
{
    event.set("index_type", indexTypeEnumToString(record.indexType));
    event.set("uuid", orNull(record.uuid)); // the end of a local search has nothing else to name its start by
}

void add(Dictionary& event, const ZRSearchViewAppearFeedback& record)
{
    event.set("trigger_event", appearEventEnumToString(record.viewAppearEvent));
    event.set("on_lock_screen", record.isOnLockScreen);
    event.set("is_over_app", record.isOverApp);
}

void add(Dictionary& event, const ZRStartSearchFeedback& record)
{
    event.set("trigger_event", triggerEventEnumToString(record.triggerEvent));
    event.set("input", orNull(record.input));
    event.set("uuid", orNull(record.uuid));
}

void add(Dictionary& event, const ZRRankingFeedback& record)
{
    if (const auto* ranker = dynamic_cast<const TAVRankerFeedback*>(&record)) { // of its run alone, not of the ranking
        event.set("ranker_did_rank", true);
        event.set("ranker_timeout", ranker->timedOut);
        event.set("ranker_results", ranker->resultCount);
        event.set("ranker_duration", ranker->duration);
        return;
    }
    event.set("blending_duration", record.blendingDuration);
    event.set("sections", objects(record.sections));
}

bool isOfSearchEngine(ResultType type)
{
    return type >= ResultType::Google && type <= ResultType::Baidu;
}

Value engagedResult(const std::shared_ptr<ZRSearchResult>& result)
{
    if (!result) return nullptr;
    Dictionary object{{"id", orNull(result->identifier)}};
    if (isOfSearchEngine(result->type) && result->title)
        object.set("third_party_suggestion", orNull(result->title->text));
    return object;
}

void add(Dictionary& event, const ZRResultEngagementFeedback& record)
{
    const auto& result = record.result;
    event.set("trigger_event", triggerEventEnumToString(record.triggerEvent));
    event.set("destination", destinationTypeEnumToString(record.destination));
    event.set("result", engagedResult(result));
    if (record.actionEngaged) event.set("action_target", actionTargetTypeEnumToString(record.actionTarget));
    event.set("action_destination",
              result && result->type == ResultType::Tavrin
                  ? orNull(actionDestinationFromResult(*result, record.actionEngaged.get(), record.destination))
                  : Value("non_tavrin_result"));
}

void add(Dictionary& event, const ZRErrorFeedback& record)
{
    const auto& error = record.error;
    event.set("error", error ? Value(encodeErrorForJSON(*error)) : Value());
    if (error && error->underlying) event.set("underlying_error", encodeErrorForJSON(*error->underlying));
}

void addTappedCard(Dictionary& event, CardType type, const Value& actionTarget)
{
    event.set("trigger_event", triggerEventEnumToString(CardEngagementTrigger::Tap));
    event.set("card_type", cardTypeEnumToString(type));
    event.set("action_target", actionTarget);
}

void add(Dictionary& event, const ZRCardSectionEngagementFeedback& record)
{
    if (const auto* maps = dynamic_cast<const ZRMapsCardSectionEngagementFeedback*>(&record))
        return addTappedCard(event, CardType::Maps, feedbackTypeEnumToString(maps->feedbackType));
    if (const auto* store = dynamic_cast<const ZRStoreCardSectionEngagementFeedback*>(&record))
        return addTappedCard(event, CardType::TunrelSheet, productPageResultEnumToString(store->productPageResult));

    event.set("trigger_event", triggerEventEnumToString(record.triggerEvent));
    event.set("card_type", cardTypeEnumToString(record.cardType));
    if (dynamic_cast<const ZRDescriptionCardSection*>(record.cardSection.get())) {
        event.set("action_target", actionTargetTypeEnumToString(CardActionTarget::More));
        return;
    }
    const auto* ofService = dynamic_cast<const TAVPunchout*>(record.destination.get());
    event.set("action_target", ofService && ofService->actionTarget
                                   ? Value(*ofService->actionTarget)
                                   : actionTargetTypeEnumToString(CardActionTarget::Unknown));
    event.set("action_destination", orNull(record.destination ? record.destination->preferredOpenableURL() : nullptr));
}

void add(Dictionary& event, const ZRSuggestionEngagementFeedback& record)
{
    event.set("id", record.suggestion ? orNull(record.suggestion->identifier) : Value());
}

void add(Dictionary& event, const ZRVisibleSuggestionsFeedback& record)
{
    event.set("suggestions", objects(record.suggestions));
    if (!record.suggestions || record.suggestions->empty()) return;
    const auto& first = record.suggestions->front();
    event.set("suggestion_query", first ? orNull(first->query) : Value());
}

void add(Dictionary& event, const TAVSkipSearchFeedback& record)
{
    event.set("trigger_event", triggerEventEnumToString(record.triggerEvent));
    event.set("input", orNull(record.input));
}

void add(Dictionary& event, const ZRSectionEngagementFeedback& record)
{
    event.set("id", record.section ? orNull(record.section->identifier) : Value());
    event.set("trigger_event", triggerEventEnumToString(record.triggerEvent));
}

void add(Dictionary& event, const ZRVisibleSectionHeaderFeedback& record)
{
    event.set("section_id", record.section ? orNull(record.section->identifier) : Value());
    event.set("section_header_type", headerTypeEnumToString(record.headerType));
}

/// A record without an event of its own. Parts of a ranking come here where a client reports one by itself.
Dictionary unknownEvent(const ZRFeedback& record)
{
    if (const auto* hit = dynamic_cast<const TAVCacheHitFeedback*>(&record)) return {{"uuid", orNull(hit->uuid)}};
    if (const auto* section = dynamic_cast<const ZRSectionRankingFeedback*>(&record)) return object(*section);
    if (const auto* result = dynamic_cast<const ZRResultRankingFeedback*>(&record)) return object(*result);
    return {};
}

template <class Record> const Record& as(const ZRFeedback& record)
{
    return static_cast<const Record&>(record);
}

} // namespace

Dictionary feedbackDictionary(const ZRFeedback& record, EventType type)
{
    Dictionary event;
    event.reserve(8); // most have up to four entries, and an event adds as many
    using enum EventType;
    switch (type) {
    case VisibleResults: add(event, as<ZRVisibleResultsFeedback>(record)); break;
    case NetworkSearchStart: add(event, as<ZRStartNetworkSearchFeedback>(record)); break;
    case NetworkSearchEnd: add(event, as<ZREndNetworkSearchFeedback>(record)); break;
    case LocalSearchStart: add(event, as<ZRStartLocalSearchFeedback>(record)); break;
    case LocalSearchEnd:
    case SearchEnd: add(event, as<ZREndSearchFeedback>(record)); break;
    case SearchViewAppear: add(event, as<ZRSearchViewAppearFeedback>(record)); break;
    case SearchViewDisappear:
        event.set("trigger_event",
                  disappearEventEnumToString(as<ZRSearchViewDisappearFeedback>(record).viewDisappearEvent));
        break;
    case RankSections: add(event, as<ZRRankingFeedback>(record)); break;
    case ResultEngagement: add(event, as<ZRResultEngagementFeedback>(record)); break;
    case CardEngagement: add(event, as<ZRCardSectionEngagementFeedback>(record)); break;
    case EventType::Error: add(event, as<ZRErrorFeedback>(record)); break;
    case SuggestionEngagement: add(event, as<ZRSuggestionEngagementFeedback>(record)); break;
    case CardViewDisappear:
        event.set("trigger_event",
                  disappearEventEnumToString(as<ZRCardViewDisappearFeedback>(record).cardViewDisappearEvent));
        break;
    case SearchStart: add(event, as<ZRStartSearchFeedback>(record)); break;
    case VisibleSuggestions: add(event, as<ZRVisibleSuggestionsFeedback>(record)); break;
    case CustomUnknown:
    case CustomCrowdsourcing:
    case CustomWendralAutofill:
    case CustomVistrelResultFeatures:
        if (const Dictionary* made = as<ZRCustomFeedback>(record).jsonFeedback.asDictionary()) return *made;
        break;
    case ResultsReceivedAfterTimeout:
        event.set("results", objects(as<ZRResultsReceivedAfterTimeoutFeedback>(record).results));
        break;
    case LateSectionsAppended:
        event.set("sections", objects(as<ZRLateSectionsAppendedFeedback>(record).sections));
        break;
    case ClearInput:
        event.set("trigger_event", triggerEventEnumToString(as<ZRClearInputFeedback>(record).triggerEvent));
        break;
    case SessionEnd:
        event.set("reason",
                  TavrinSessionEndFeedback::triggerEventEnumToString(as<TavrinSessionEndFeedback>(record).reason));
        break;
    case SkipTavrinSearch: add(event, as<TAVSkipSearchFeedback>(record)); break;
    case SectionEngagement: add(event, as<ZRSectionEngagementFeedback>(record)); break;
    case VisibleSectionHeader: add(event, as<ZRVisibleSectionHeaderFeedback>(record)); break;
    case SessionMissingResults: event.set("results", objects(as<TavrinSessionMissingResults>(record).results)); break;
    case SessionMissingSuggestions:
        event.set("suggestions", objects(as<TavrinSessionMissingSuggestions>(record).suggestions));
        break;
    case DidGoToSite: event.set("input", orNull(as<ZRDidGoToSiteFeedback>(record).input)); break;
    case EventType::Unknown: return unknownEvent(record);
    case VisibleCard:
    case ConnectionInvalidated: break;
    }
    return event;
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
