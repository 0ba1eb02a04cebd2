#include "tavrind/FeedbackClasses.h"

#include <array>
#include <unordered_map>

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
using platform::operator""_field;
using platform::ArchivedRecord;
using platform::FieldName;
using platform::FieldNameText;

// The cells of the table.

// The client's query id: that of the record itself, or of the first result in a part of it.

constexpr auto result = [](const auto& record) -> const auto& { return record.result; };
constexpr auto results = [](const auto& record) -> const auto& { return record.results; };
constexpr auto section = [](const auto& record) -> const auto& { return record.section; };
constexpr auto sections = [](const auto& record) -> const auto& { return record.sections; };

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

constexpr std::nullptr_t keepsIdentifiers = nullptr;
constexpr auto showsItself = [](const auto& record, SessionProcessingHelper& helper) { helper.show(record); };
template <FieldNameText part>
constexpr auto shows =
    [](const auto& record, SessionProcessingHelper& helper) { helper.show(record[FieldName<part>()]); };
template <FieldNameText part>
constexpr auto refersTo =
    [](const auto& record, SessionProcessingHelper& helper) { helper.refer(record[FieldName<part>()]); };

// The JSON fields of a record.

constexpr auto noFields = [](JsonFields&, const auto&) {};
constexpr auto addItself = [](JsonFields& fields, const auto& record) { addObject(fields, record); };
constexpr auto addInput = [](JsonFields& fields, const auto& record) { fields("input", record["input"_field]); };
constexpr auto addResults = [](JsonFields& fields, const auto& record) { fields("results", record["results"_field]); };
constexpr auto addSections = [](JsonFields& fields, const auto& record) {
    fields("sections", record["sections"_field]);
};
constexpr auto addSuggestions = [](JsonFields& fields, const auto& record) {
    fields("suggestions", record["suggestions"_field]);
};
constexpr auto addTrigger = [](JsonFields& fields, const auto& record) {
    fields("trigger_event", triggerEventEnumToString(record["triggerEvent"_field]));
};
constexpr auto addSearchEnd = [](JsonFields& fields, const auto& record) { fields("uuid", record["uuid"_field]); };

void addSearch(JsonFields& fields, const ArchivedRecord<ZRStartSearchFeedback>& record)
{
    addTrigger(fields, record);
    fields("input", record["input"_field])("uuid", record["uuid"_field]);
}

void addLocalSearch(JsonFields& fields, const ArchivedRecord<ZRStartLocalSearchFeedback>& record)
{
    fields("index_type", indexTypeEnumToString(record["indexType"_field]));
    fields("uuid", record["uuid"_field]); // only this connects the end of a local search with its start
}

void addSkip(JsonFields& fields, const ArchivedRecord<TAVSkipSearchFeedback>& record)
{
    addTrigger(fields, record);
    addInput(fields, record);
}

constexpr auto addStart = [](JsonFields& fields, const auto& record) {
    const auto headers = record["headers"_field];
    if (headers.type() == platform::Value::Type::Dictionary)
        fields("headers", headers);
    else
        fields("headers", nullptr);
    fields("url", record["url"_field])("endpoint_type", endpointTypeEnumToString(record["endpoint"_field]));
};

void addLookupStart(JsonFields& fields, const ArchivedRecord<TAVLookupStartNetworkSearchFeedback>& record)
{
    addStart(fields, record);
    fields("trigger_event", lookupSelectionTypeEnumToString(record["selectionType"_field]));
}

void addTiming(JsonFields& fields, const platform::Value& timing)
{
    fields("network_timing_data", formatNetworkTimingData(timing));
    if (timing.isNull()) return;
    fields("connection_reused", timing["_kCFNTimingDataConnectionReused"].asBool().value_or(false));
    const platform::Value& interface = timing["_kCFNTimingDataConnectionInterfaceIdentifier"];
    if (interface.asString() && !interface.asString()->empty()) fields("interface", interface);
    if (const auto peer = peerAddress(timing)) fields("peer_address", *peer);
}

constexpr auto addEnd = [](JsonFields& fields, const auto& record) {
    fields("uuid", record["uuid"_field])("response_size", record["responseSize"_field]);
    fields("status_code", record["statusCode"_field]);
    addTiming(fields, record["networkTimingData"_field].value());
};

void addAnsweredEnd(JsonFields& fields, const ArchivedRecord<TAVEndNetworkSearchFeedback>& record)
{
    addEnd(fields, record);
    fields("tavrin_status", record["tavrinStatus"_field])("tavrin_duration", record["tavrinDuration"_field]);
    fields("fbq", record["fbq"_field])("tavrin_partial_client_ip", record["partialClientIp"_field]);
}

void addAppearance(JsonFields& fields, const ArchivedRecord<ZRSearchViewAppearFeedback>& record)
{
    fields("trigger_event", appearEventEnumToString(record["viewAppearEvent"_field]));
    fields("on_lock_screen", record["isOnLockScreen"_field])("is_over_app", record["isOverApp"_field]);
}

void addDisappearance(JsonFields& fields, const ArchivedRecord<ZRSearchViewDisappearFeedback>& record)
{
    fields("trigger_event", disappearEventEnumToString(record["viewDisappearEvent"_field]));
}

void addCardDisappearance(JsonFields& fields, const ArchivedRecord<ZRCardViewDisappearFeedback>& record)
{
    fields("trigger_event", disappearEventEnumToString(record["cardViewDisappearEvent"_field]));
}

void addRanking(JsonFields& fields, const ArchivedRecord<ZRRankingFeedback>& record)
{
    fields("blending_duration", record["blendingDuration"_field])("sections", record["sections"_field]);
}

void addRankerRun(JsonFields& fields, const ArchivedRecord<TAVRankerFeedback>& record)
{
    fields("ranker_did_rank", true)("ranker_timeout", record["timedOut"_field]);
    fields("ranker_results", record["resultCount"_field])("ranker_duration", record["duration"_field]);
}

void addVisibleResults(JsonFields& fields, const ArchivedRecord<ZRVisibleResultsFeedback>& record)
{
    addTrigger(fields, record);
    addResults(fields, record);
}

void addEngagedResult(JsonFields& fields, const ArchivedRecord<ZRSearchResult>& engaged)
{
    if (!engaged) {
        fields("result", nullptr);
        return;
    }
    fields("result", [&engaged](JsonFields& object) {
        object.identifier("id", engaged["identifier"_field]);
        const ResultType type = engaged["type"_field];
        const bool isOfSearchEngine = type >= ResultType::Google && type <= ResultType::Baidu;
        if (const auto title = engaged["title"_field]; isOfSearchEngine && title)
            object("third_party_suggestion", title["text"_field]);
    });
}

void addEngagement(JsonFields& fields, const ArchivedRecord<ZRResultEngagementFeedback>& record)
{
    const auto engaged = record["result"_field];
    const auto action = record["actionEngaged"_field];
    const ResultEngagementDestination destination = record["destination"_field];
    addTrigger(fields, record);
    fields("destination", destinationTypeEnumToString(destination));
    addEngagedResult(fields, engaged);
    if (action) fields("action_target", actionTargetTypeEnumToString(record["actionTarget"_field]));
    if (engaged && engaged["type"_field] == ResultType::Tavrin)
        fields("action_destination", actionDestinationFromResult(engaged, action, destination));
    else
        fields("action_destination", "non_tavrin_result");
}

void addError(JsonFields& fields, const ArchivedRecord<ZRErrorFeedback>& record)
{
    const auto archived = record["error"_field];
    const auto error = archived ? platform::errorFromDictionary(archived->value()) : std::nullopt;
    if (!error) {
        fields("error", nullptr);
        return;
    }
    fields("error", [&error](JsonFields& object) { encodeErrorForJSON(object, *error); });
    if (error->underlying)
        fields("underlying_error", [&error](JsonFields& object) { encodeErrorForJSON(object, *error->underlying); });
}

void addCard(JsonFields& fields, CardEngagementTrigger trigger, CardType type,
             std::optional<std::string_view> actionTarget)
{
    fields("trigger_event", triggerEventEnumToString(trigger))("card_type", cardTypeEnumToString(type));
    fields("action_target", actionTarget);
}

void addCardEngagement(JsonFields& fields, const ArchivedRecord<ZRCardSectionEngagementFeedback>& record)
{
    const bool isDescription = static_cast<bool>(record["cardSection"_field].as<ZRDescriptionCardSection>());
    const auto destination = record["destination"_field];
    const auto ofService = destination.as<TAVPunchout>();
    std::optional<std::string_view> target = ofService ? ofService["actionTarget"_field] : std::nullopt;
    if (isDescription || !target)
        target = actionTargetTypeEnumToString(isDescription ? CardActionTarget::More : CardActionTarget::Unknown);
    addCard(fields, record["triggerEvent"_field], record["cardType"_field], target);
    if (!isDescription) fields("action_destination", preferredOpenableURL(destination));
}

void addMapsCard(JsonFields& fields, const ArchivedRecord<ZRMapsCardSectionEngagementFeedback>& record)
{
    addCard(fields, CardEngagementTrigger::Tap, CardType::Maps, feedbackTypeEnumToString(record["feedbackType"_field]));
}

void addStoreCard(JsonFields& fields, const ArchivedRecord<ZRStoreCardSectionEngagementFeedback>& record)
{
    addCard(fields, CardEngagementTrigger::Tap, CardType::TunrelSheet,
            productPageResultEnumToString(record["productPageResult"_field]));
}

void addSectionEngagement(JsonFields& fields, const ArchivedRecord<ZRSectionEngagementFeedback>& record)
{
    fields("id", record["section"_field]["identifier"_field]);
    addTrigger(fields, record);
}

void addSectionHeader(JsonFields& fields, const ArchivedRecord<ZRVisibleSectionHeaderFeedback>& record)
{
    fields("section_id", record["section"_field]["identifier"_field]);
    fields("section_header_type", headerTypeEnumToString(record["headerType"_field]));
}

void addVisibleSuggestions(JsonFields& fields, const ArchivedRecord<ZRVisibleSuggestionsFeedback>& record)
{
    addSuggestions(fields, record);
    const auto suggestions = record["suggestions"_field];
    if (suggestions && !suggestions->empty()) fields("suggestion_query", suggestions->front()["query"_field]);
}

void addSuggestionEngagement(JsonFields& fields, const ArchivedRecord<ZRSuggestionEngagementFeedback>& record)
{
    fields.identifier("id", record["suggestion"_field]["identifier"_field]);
}

void addReason(JsonFields& fields, const ArchivedRecord<TavrinSessionEndFeedback>& record)
{
    fields("reason", TavrinSessionEndFeedback::triggerEventEnumToString(record["reason"_field]));
}

/// The event consists only of the custom record's JSON.
void addReadyMade(JsonFields& fields, const ArchivedRecord<ZRCustomFeedback>& record)
{
    fields.readyMade(record["jsonFeedback"_field]);
}

/// The event types are not in the order of the custom types: autofill and crowdsourcing are swapped.
EventType customEventType(CustomFeedbackType custom)
{
    constexpr std::array kTypes{CustomUnknown, CustomWendralAutofill, CustomCrowdsourcing, CustomVistrelResultFeatures};
    const auto type = static_cast<std::uint64_t>(custom);
    return type < kTypes.size() ? kTypes[type] : CustomUnknown;
}

CustomFeedbackType customTypeOf(const ArchivedFeedback& record)
{
    return record.as<ZRCustomFeedback>()["feedbackType"_field];
}

/// Returns the row of the class `R`. `kType` is its event type, or a function of the record's custom type.
template <class R, auto kType, auto kFields = noFields, auto kQuery = noQuery, auto kProcess = keepsIdentifiers>
consteval FeedbackClass row()
{
    constexpr bool kIsFixed = std::is_same_v<decltype(kType), EventType>;
    FeedbackClass row{
        .name = R::kClass,
        .eventType =
            [](const ZRFeedback& record) {
                if constexpr (kIsFixed)
                    return kType;
                else
                    return kType(static_cast<const R&>(record).feedbackType);
            },
        .archivedEventType =
            [](const ArchivedFeedback& record) {
                if constexpr (kIsFixed)
                    return kType;
                else
                    return kType(customTypeOf(record));
            },
        .clientQueryId = [](const ZRFeedback& record) { return kQuery(static_cast<const R&>(record)); },
        .addFields = [](JsonFields& fields,
                        const ArchivedFeedback& record) { kFields(fields, record.template as<R>()); },
        .process = nullptr,
    };
    if constexpr (!std::is_null_pointer_v<decltype(kProcess)>)
        row.process = [](const ArchivedFeedback& record, SessionProcessingHelper& helper) {
            kProcess(record.template as<R>(), helper);
        };
    return row;
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
    row<ZRRankingFeedback, RankSections, addRanking, queryOf<sections>, shows<"sections">>(),
    row<TAVRankerFeedback, RankSections, addRankerRun, queryOf<sections>, shows<"sections">>(),
    row<ZRSectionRankingFeedback, Unknown, addItself, noQuery, showsItself>(),
    row<ZRResultRankingFeedback, Unknown, addItself, noQuery, showsItself>(),

    // An event of visible results only refers to them: the complete results are in the ranking and section events.
    row<ZRVisibleResultsFeedback, VisibleResults, addVisibleResults, queryOf<results>, refersTo<"results">>(),
    row<ZRResultsReceivedAfterTimeoutFeedback, ResultsReceivedAfterTimeout, addResults, queryOf<results>,
        shows<"results">>(),
    row<ZRLateSectionsAppendedFeedback, LateSectionsAppended, addSections, queryOf<sections>, shows<"sections">>(),
    row<ZRResultEngagementFeedback, ResultEngagement, addEngagement, queryOf<result>, refersTo<"result">>(),
    row<ZRSectionEngagementFeedback, SectionEngagement, addSectionEngagement, queryOf<section>>(),
    row<ZRVisibleSectionHeaderFeedback, VisibleSectionHeader, addSectionHeader, queryOf<section>>(),
    row<ZRVisibleSuggestionsFeedback, VisibleSuggestions, addVisibleSuggestions, noQuery, shows<"suggestions">>(),
    row<ZRSuggestionEngagementFeedback, SuggestionEngagement, addSuggestionEngagement, noQuery,
        refersTo<"suggestion">>(),

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

const FeedbackClass& classNamed(std::string_view name)
{
    static const auto rows = [] {
        std::unordered_map<std::string_view, const FeedbackClass*> byName;
        for (const FeedbackClass& row : kClasses) byName.emplace(row.name, &row);
        return byName;
    }();
    const auto found = rows.find(name);
    return found == rows.end() ? kClasses[0] : *found->second;
}

} // namespace

const FeedbackClass& feedbackClassOf(const ZRFeedback& record)
{
    return classNamed(record.className());
}

const FeedbackClass& feedbackClassOf(const ArchivedFeedback& record)
{
    return classNamed(record.className());
}

} // namespace tavrin
