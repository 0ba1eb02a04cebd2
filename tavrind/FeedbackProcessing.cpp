#include "tavrind/FeedbackProcessing.h"

#include "searchrecords/ZRResultFeedback.h"
#include "tavrind/FeedbackTypes.h"
#include "tavrind/SessionProcessingHelper.h"

namespace tavrin {

namespace {

template <class T> using Shared = std::shared_ptr<T>;

/// Replaces the identifiers of results and suggestions, and tells the helper of these.
class Processor {
public:
    explicit Processor(SessionProcessingHelper& helper) : _helper(helper) {}

    // What the event shows whole.

    void show(ZRSearchResult& result) { showLeaf(result); }
    void show(ZRSearchSuggestion& suggestion) { showLeaf(suggestion); }
    void show(ZRResultSection& section) { showAll(section.results); }
    void show(ZRResultRankingFeedback& ranking)
    {
        showAll(ranking.hiddenResults);
        showAll(ranking.duplicateResults);
        if (ranking.result) show(*ranking.result);
    }
    void show(ZRSectionRankingFeedback& ranking)
    {
        if (ranking.section) show(*ranking.section);
        showAll(ranking.results);
    }
    template <class T> void showAll(const std::vector<Shared<T>>& records)
    {
        for (const auto& record : records)
            if (record) show(*record);
    }
    template <class T> void showAll(const RecordArray<T>& records)
    {
        if (records) showAll(*records);
    }

    /// A result or suggestion that the event only refers to.
    template <class T> void refer(const Shared<T>& record)
    {
        if (record && replaceIdentifier(*record)) _helper.identifierReferenced(*record->identifier, record);
    }
    void referToAll(const RecordArray<ZRSearchResult>& results)
    {
        if (!results) return;
        for (const auto& result : *results) refer(result);
    }

private:
    template <class T> void showLeaf(T& record)
    {
        if (replaceIdentifier(record)) _helper.identifierExpanded(*record.identifier);
    }

    /// False where there is none.
    template <class T> bool replaceIdentifier(T& record)
    {
        if (record.identifier) record.identifier = _helper.replacementForIdentifier(*record.identifier);
        return record.identifier.has_value();
    }

    SessionProcessingHelper& _helper;
};

template <class R> R& as(ZRFeedback& record)
{
    return static_cast<R&>(record);
}

} // namespace

void process(ZRFeedback& record, SessionProcessingHelper& helper)
{
    Processor processor(helper);
    switch (eventType(record)) {
    case EventType::VisibleResults: // whole results come with the ranking
        return processor.referToAll(as<ZRVisibleResultsFeedback>(record).results);
    case EventType::RankSections: // a ranker's record, too, though its event has no sections
        return processor.showAll(as<ZRRankingFeedback>(record).sections);
    case EventType::ResultsReceivedAfterTimeout:
        return processor.showAll(as<ZRResultsReceivedAfterTimeoutFeedback>(record).results);
    case EventType::LateSectionsAppended: return processor.showAll(as<ZRLateSectionsAppendedFeedback>(record).sections);
    case EventType::VisibleSuggestions: return processor.showAll(as<ZRVisibleSuggestionsFeedback>(record).suggestions);
    case EventType::ResultEngagement: return processor.refer(as<ZRResultEngagementFeedback>(record).result);
    case EventType::SuggestionEngagement: return processor.refer(as<ZRSuggestionEngagementFeedback>(record).suggestion);
    case EventType::Unknown: // parts of a ranking, each on its own
        if (auto* section = dynamic_cast<ZRSectionRankingFeedback*>(&record)) return processor.show(*section);
        if (auto* result = dynamic_cast<ZRResultRankingFeedback*>(&record)) return processor.show(*result);
        return;
    default: return;
    }
}

} // namespace tavrin
