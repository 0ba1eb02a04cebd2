#include "tavrind/FeedbackClasses.h"

#include <algorithm>
#include <array>
#include <iterator>

#include "CoreTavrin/TAVFeedback.h"
#include "searchrecords/ZRRecords.h"
#include "tavrind/FeedbackEnumerations.h"
#include "tavrind/FeedbackJson.h"
#include "tavrind/NetworkTiming.h"
#include "tavrind/SessionProcessingHelper.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {

namespace {

using enum EventType;
using platform::Value;

// The cells of the table.

// Parts of a record.
constexpr auto result = [](auto& record) -> auto& { return record.result; };
constexpr auto results = [](auto& record) -> auto& { return record.results; };
constexpr auto section = [](auto& record) -> auto& { return record.section; };
constexpr auto sections = [](auto& record) -> auto& { return record.sections; };
constexpr auto suggestion = [](auto& record) -> auto& { return record.suggestion; };
constexpr auto suggestions = [](auto& record) -> auto& { return record.suggestions; };
constexpr auto itself = [](auto& record) -> auto& { return record; };

// The client's query id: that of the record itself, or of the first result in it.

std::uint64_t queryIdIn(const std::shared_ptr<ZRSearchResult>& found)
{
    return found ? found->queryId : 0;
}
std::uint64_t queryIdIn(const std::shared_ptr<ZRResultSection>& found);
std::uint64_t queryIdIn(const std::shared_ptr<ZRSectionRankingFeedback>& ranking)
{
    return ranking ? queryIdIn(ranking->section) : 0;
}
template <class T> std::uint64_t queryIdIn(const RecordArray<T>& records)
{
    return records && !records->empty() ? queryIdIn(records->front()) : 0;
}
std::uint64_t queryIdIn(const std::shared_ptr<ZRResultSection>& found)
{
    return found ? queryIdIn(found->results) : 0;
}

constexpr auto noQuery = [](const auto&) -> std::uint64_t { return 0; };
constexpr auto ownQuery = [](const auto& record) { return record.queryId; };
template <auto kPart> constexpr auto queryOf = [](const auto& record) { return queryIdIn(kPart(record)); };

// The privacy mapping: which results and suggestions a record shows or refers to.

constexpr auto keepsIdentifiers = [](auto&, SessionProcessingHelper&) {};
template <auto kPart>
constexpr auto shows = [](auto& record, SessionProcessingHelper& helper) { helper.show(kPart(record)); };
template <auto kPart>
constexpr auto refersTo = [](auto& record, SessionProcessingHelper& helper) { helper.refer(kPart(record)); };

// The JSON fields of a record.

constexpr auto noFields = [](JsonFields&, const auto&) {};
constexpr auto addObject = [](JsonFields& fields, const auto& record) { fields.object() = jsonObject(record); };
constexpr auto addInput = [](JsonFields& fields, const auto& record) { fields("input", record.input); };
constexpr auto addResults = [](JsonFields& fields, const auto& record) { fields("results", record.results); };
constexpr auto addSections = [](JsonFields& fields, const auto& record) { fields("sections", record.sections); };
constexpr auto addSuggestions = [](JsonFields& fields, const auto& record) {
    fields("suggestions", record.suggestions);
};
constexpr auto addTrigger = [](JsonFields& fields, const auto& record) {
    fields("trigger_event", triggerEventEnumToString(record.triggerEvent));
};
constexpr auto addSearchEnd = [](JsonFields& fields, const auto& record) { fields("uuid", record.uuid); };

void addSearch(JsonFields& fields, const ZRStartSearchFeedback& record)
{
    addTrigger(fields, record);
    fields("input", record.input)("uuid", record.uuid);
}

void addLocalSearch(JsonFields& fields, const ZRStartLocalSearchFeedback& record)
{
    fields("index_type", indexTypeEnumToString(record.indexType));
    fields("uuid", record.uuid); // only this connects the end of a local search with its start
}

void addSkip(JsonFields& fields, const TAVSkipSearchFeedback& record)
{
    addTrigger(fields, record);
    addInput(fields, record);
}

void addStart(JsonFields& fields, const ZRStartNetworkSearchFeedback& record)
{
    fields("headers", record.headers.asDictionary() ? record.headers : Value())("url", record.url);
    fields("endpoint_type", endpointTypeEnumToString(record.endpoint));
}

void addLookupStart(JsonFields& fields, const TAVLookupStartNetworkSearchFeedback& record)
{
    addStart(fields, record);
    fields("trigger_event", lookupSelectionTypeEnumToString(record.selectionType));
}

void addTiming(JsonFields& fields, const Value& timing)
{
    fields("network_timing_data", formatNetworkTimingData(timing));
    if (timing.isNull()) return;
    fields("connection_reused", timing["_kCFNTimingDataConnectionReused"].asBool().value_or(false));
    const Value& interface = timing["_kCFNTimingDataConnectionInterfaceIdentifier"];
    if (interface.asString() && !interface.asString()->empty()) fields("interface", interface);
    if (const auto peer = peerAddress(timing)) fields("peer_address", peer);
}

void addEnd(JsonFields& fields, const ZREndNetworkSearchFeedback& record)
{
    fields.object().reserve(16);
    fields("uuid", record.uuid)("response_size", record.responseSize)("status_code", record.statusCode);
    addTiming(fields, record.networkTimingData);
}

void addAnsweredEnd(JsonFields& fields, const TAVEndNetworkSearchFeedback& record)
{
    addEnd(fields, record);
    fields("tavrin_status", record.tavrinStatus)("tavrin_duration", record.tavrinDuration);
    fields("fbq", record.fbq)("tavrin_partial_client_ip", record.partialClientIp);
}

void addAppearance(JsonFields& fields, const ZRSearchViewAppearFeedback& record)
{
    fields("trigger_event", appearEventEnumToString(record.viewAppearEvent));
    fields("on_lock_screen", record.isOnLockScreen)("is_over_app", record.isOverApp);
}

void addDisappearance(JsonFields& fields, const ZRSearchViewDisappearFeedback& record)
{
    fields("trigger_event", disappearEventEnumToString(record.viewDisappearEvent));
}

void addCardDisappearance(JsonFields& fields, const ZRCardViewDisappearFeedback& record)
{
    fields("trigger_event", disappearEventEnumToString(record.cardViewDisappearEvent));
}

void addRanking(JsonFields& fields, const ZRRankingFeedback& record)
{
    fields("blending_duration", record.blendingDuration)("sections", record.sections);
}

void addRankerRun(JsonFields& fields, const TAVRankerFeedback& record)
{
    fields("ranker_did_rank", true)("ranker_timeout", record.timedOut);
    fields("ranker_results", record.resultCount)("ranker_duration", record.duration);
}

void addVisibleResults(JsonFields& fields, const ZRVisibleResultsFeedback& record)
{
    addTrigger(fields, record);
    addResults(fields, record);
}

Value engagedResult(const std::shared_ptr<ZRSearchResult>& engaged)
{
    if (!engaged) return nullptr;
    platform::Dictionary object;
    JsonFields fields(object);
    fields("id", engaged->identifier);
    const bool isOfSearchEngine = engaged->type >= ResultType::Google && engaged->type <= ResultType::Baidu;
    if (isOfSearchEngine && engaged->title) fields("third_party_suggestion", engaged->title->text);
    return object;
}

void addEngagement(JsonFields& fields, const ZRResultEngagementFeedback& record)
{
    const ZRSearchResult* engaged = record.result.get();
    addTrigger(fields, record);
    fields("destination", destinationTypeEnumToString(record.destination));
    fields("result", engagedResult(record.result));
    if (record.actionEngaged) fields("action_target", actionTargetTypeEnumToString(record.actionTarget));
    if (engaged && engaged->type == ResultType::Tavrin)
        fields("action_destination",
               actionDestinationFromResult(*engaged, record.actionEngaged.get(), record.destination));
    else
        fields("action_destination", "non_tavrin_result");
}

void addError(JsonFields& fields, const ZRErrorFeedback& record)
{
    const auto& error = record.error;
    fields("error", error ? Value(encodeErrorForJSON(*error)) : Value());
    if (error && error->underlying) fields("underlying_error", encodeErrorForJSON(*error->underlying));
}

void addCard(JsonFields& fields, CardEngagementTrigger trigger, CardType type, const Value& actionTarget)
{
    fields("trigger_event", triggerEventEnumToString(trigger))("card_type", cardTypeEnumToString(type));
    fields("action_target", actionTarget);
}

void addCardEngagement(JsonFields& fields, const ZRCardSectionEngagementFeedback& record)
{
    if (dynamic_cast<const ZRDescriptionCardSection*>(record.cardSection.get()))
        return addCard(fields, record.triggerEvent, record.cardType,
                       actionTargetTypeEnumToString(CardActionTarget::More));
    const auto* ofService = dynamic_cast<const TAVPunchout*>(record.destination.get());
    addCard(fields, record.triggerEvent, record.cardType,
            ofService && ofService->actionTarget ? Value(*ofService->actionTarget)
                                                 : actionTargetTypeEnumToString(CardActionTarget::Unknown));
    fields("action_destination", record.destination ? record.destination->preferredOpenableURL() : nullptr);
}

void addMapsCard(JsonFields& fields, const ZRMapsCardSectionEngagementFeedback& record)
{
    addCard(fields, CardEngagementTrigger::Tap, CardType::Maps, feedbackTypeEnumToString(record.feedbackType));
}

void addStoreCard(JsonFields& fields, const ZRStoreCardSectionEngagementFeedback& record)
{
    addCard(fields, CardEngagementTrigger::Tap, CardType::TunrelSheet,
            productPageResultEnumToString(record.productPageResult));
}

void addSectionEngagement(JsonFields& fields, const ZRSectionEngagementFeedback& record)
{
    fields("id", record.section ? record.section->identifier : std::nullopt);
    addTrigger(fields, record);
}

void addSectionHeader(JsonFields& fields, const ZRVisibleSectionHeaderFeedback& record)
{
    fields("section_id", record.section ? record.section->identifier : std::nullopt);
    fields("section_header_type", headerTypeEnumToString(record.headerType));
}

void addVisibleSuggestions(JsonFields& fields, const ZRVisibleSuggestionsFeedback& record)
{
    addSuggestions(fields, record);
    if (!record.suggestions || record.suggestions->empty()) return;
    const auto& first = record.suggestions->front();
    fields("suggestion_query", first ? first->query : std::nullopt);
}

void addSuggestionEngagement(JsonFields& fields, const ZRSuggestionEngagementFeedback& record)
{
    fields("id", record.suggestion ? record.suggestion->identifier : std::nullopt);
}

void addReason(JsonFields& fields, const TavrinSessionEndFeedback& record)
{
    fields("reason", TavrinSessionEndFeedback::triggerEventEnumToString(record.reason));
}

/// The event consists only of the custom record's JSON.
void addReadyMade(JsonFields& fields, const ZRCustomFeedback& record)
{
    if (const platform::Dictionary* made = record.jsonFeedback.asDictionary()) fields.object() = *made;
}

/// The event types are not in the order of the custom types: autofill and crowdsourcing are swapped.
EventType customEventType(const ZRCustomFeedback& record)
{
    constexpr std::array kTypes{CustomUnknown, CustomWendralAutofill, CustomCrowdsourcing, CustomVistrelResultFeatures};
    const auto type = static_cast<std::uint64_t>(record.feedbackType);
    return type < kTypes.size() ? kTypes[type] : CustomUnknown;
}

/// Returns the row of the class `R`. `kType` is its event type, or a function that returns it.
template <class R, auto kType, auto kFields = noFields, auto kQuery = noQuery, auto kProcess = keepsIdentifiers>
consteval FeedbackClass row()
{
    return {
        .name = R::kClass,
        .eventType =
            [](const ZRFeedback& record) {
                if constexpr (std::is_same_v<decltype(kType), EventType>)
                    return kType;
                else
                    return kType(static_cast<const R&>(record));
            },
        .clientQueryId = [](const ZRFeedback& record) { return kQuery(static_cast<const R&>(record)); },
        .addFields = [](JsonFields& fields,
                        const ZRFeedback& record) { kFields(fields, static_cast<const R&>(record)); },
        .process = [](ZRFeedback& record,
                      SessionProcessingHelper& helper) { kProcess(static_cast<R&>(record), helper); },
    };
}

constexpr FeedbackClass kClasses[] = {
    // class, event type, JSON fields, client's query id, privacy mapping
    row<ZRFeedback, Unknown>(), // also for any class without a row

    row<ZRStartSearchFeedback, SearchStart, addSearch, ownQuery>(),
    row<ZREndSearchFeedback, SearchEnd, addSearchEnd>(),
    row<ZRStartLocalSearchFeedback, LocalSearchStart, addLocalSearch, ownQuery>(),
    row<ZREndLocalSearchFeedback, LocalSearchEnd, addSearchEnd>(),
    row<ZRStartNetworkSearchFeedback, NetworkSearchStart, addStart, ownQuery>(),
    row<TAVLookupStartNetworkSearchFeedback, NetworkSearchStart, addLookupStart, ownQuery>(),
    row<ZREndNetworkSearchFeedback, NetworkSearchEnd, addEnd>(),
    row<TAVEndNetworkSearchFeedback, NetworkSearchEnd, addAnsweredEnd>(),
    row<TAVSkipSearchFeedback, SkipTavrinSearch, addSkip>(),
    row<TAVCacheHitFeedback, Unknown, addSearchEnd>(),

    row<ZRSearchViewAppearFeedback, SearchViewAppear, addAppearance>(),
    row<ZRSearchViewDisappearFeedback, SearchViewDisappear, addDisappearance>(),
    row<ZRClearInputFeedback, ClearInput, addTrigger>(),
    row<ZRDidGoToSiteFeedback, DidGoToSite, addInput>(),

    // A ranker's record extends a ranking: its results count as shown, though its event leaves them out.
    row<ZRRankingFeedback, RankSections, addRanking, queryOf<sections>, shows<sections>>(),
    row<TAVRankerFeedback, RankSections, addRankerRun, queryOf<sections>, shows<sections>>(),
    row<ZRSectionRankingFeedback, Unknown, addObject, noQuery, shows<itself>>(),
    row<ZRResultRankingFeedback, Unknown, addObject, noQuery, shows<itself>>(),

    // An event of visible results only refers to them: the complete results are in the ranking and section events.
    row<ZRVisibleResultsFeedback, VisibleResults, addVisibleResults, queryOf<results>, refersTo<results>>(),
    row<ZRResultsReceivedAfterTimeoutFeedback, ResultsReceivedAfterTimeout, addResults, queryOf<results>,
        shows<results>>(),
    row<ZRLateSectionsAppendedFeedback, LateSectionsAppended, addSections, queryOf<sections>, shows<sections>>(),
    row<ZRResultEngagementFeedback, ResultEngagement, addEngagement, queryOf<result>, refersTo<result>>(),
    row<ZRSectionEngagementFeedback, SectionEngagement, addSectionEngagement, queryOf<section>>(),
    row<ZRVisibleSectionHeaderFeedback, VisibleSectionHeader, addSectionHeader, queryOf<section>>(),
    row<ZRVisibleSuggestionsFeedback, VisibleSuggestions, addVisibleSuggestions, noQuery, shows<suggestions>>(),
    row<ZRSuggestionEngagementFeedback, SuggestionEngagement, addSuggestionEngagement, noQuery, refersTo<suggestion>>(),

    row<ZRCardSectionEngagementFeedback, CardEngagement, addCardEngagement>(),
    row<ZRMapsCardSectionEngagementFeedback, CardEngagement, addMapsCard>(),
    row<ZRStoreCardSectionEngagementFeedback, CardEngagement, addStoreCard>(),
    row<ZRCardViewDisappearFeedback, CardViewDisappear, addCardDisappearance>(),

    row<ZRErrorFeedback, EventType::Error, addError>(),
    row<ZRCustomFeedback, customEventType, addReadyMade>(),

    row<TavrinSessionEndFeedback, SessionEnd, addReason>(),
    row<TavrinSessionMissingResults, SessionMissingResults, addResults>(),
    row<TavrinSessionMissingSuggestions, SessionMissingSuggestions, addSuggestions>(),
    row<TavrinConnectionInvalidated, ConnectionInvalidated>(),
};

} // namespace

const FeedbackClass& feedbackClassOf(const ZRFeedback& record)
{
    const auto* found = std::ranges::find(kClasses, record.className(), &FeedbackClass::name);
    return found == std::end(kClasses) ? kClasses[0] : *found;
}

} // namespace tavrin
