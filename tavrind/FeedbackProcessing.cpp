#include "tavrind/FeedbackProcessing.h"

#include "searchrecords/ZRResultFeedback.h"
#include "tavrind/FeedbackTypes.h"
#include "tavrind/SessionProcessingHelper.h"

namespace tavrin {

namespace {

template <class T> using Shared = std::shared_ptr<T>;

/// Copies records with the identifiers of their results and suggestions replaced, and tells the helper of these.
class Processor {
public:
    explicit Processor(SessionProcessingHelper& helper) : _helper(helper) {}

    // A record that its event shows whole.

    Shared<ZRSearchResult> shown(const Shared<ZRSearchResult>& result) { return shownLeaf(result); }
    Shared<ZRSearchSuggestion> shown(const Shared<ZRSearchSuggestion>& suggestion) { return shownLeaf(suggestion); }
    Shared<ZRResultSection> shown(const Shared<ZRResultSection>& section)
    {
        return changed(section, [this](ZRResultSection& copy) { showAll(copy.results); });
    }
    Shared<ZRResultRankingFeedback> shown(const Shared<ZRResultRankingFeedback>& ranking)
    {
        return changed(ranking, [this](ZRResultRankingFeedback& copy) {
            showAll(copy.hiddenResults);
            showAll(copy.duplicateResults);
            copy.result = shown(copy.result);
        });
    }
    Shared<ZRSectionRankingFeedback> shown(const Shared<ZRSectionRankingFeedback>& ranking)
    {
        return changed(ranking, [this](ZRSectionRankingFeedback& copy) {
            copy.section = shown(copy.section);
            showAll(copy.results);
        });
    }

    template <class T> void showAll(std::vector<Shared<T>>& records)
    {
        for (auto& record : records) record = shown(record);
    }
    template <class T> void showAll(RecordArray<T>& records)
    {
        if (records) showAll(*records);
    }

    /// A result or suggestion that its event only refers to.
    template <class T> Shared<T> referenced(const Shared<T>& record)
    {
        const Shared<T> copy = replaced(record);
        if (copy && copy->identifier) _helper.identifierReferenced(*copy->identifier, copy);
        return copy;
    }

    void referToAll(RecordArray<ZRSearchResult>& results)
    {
        if (!results) return;
        for (auto& result : *results) result = referenced(result);
    }

    /// A copy of `record` that went through `change`; null for null.
    template <class T, class Change> static Shared<T> changed(const Shared<T>& record, Change change)
    {
        if (!record) return nullptr;
        const Shared<T> copy = copyOf(*record);
        change(*copy);
        return copy;
    }

private:
    template <class T> Shared<T> shownLeaf(const Shared<T>& record)
    {
        const Shared<T> copy = replaced(record);
        if (copy && copy->identifier) _helper.identifierExpanded(*copy->identifier);
        return copy;
    }

    template <class T> Shared<T> replaced(const Shared<T>& record)
    {
        if (!record || !record->identifier) return record;
        return changed(record,
                       [this](T& copy) { copy.identifier = _helper.replacementForIdentifier(*copy.identifier); });
    }

    SessionProcessingHelper& _helper;
};

/// The same for a whole record, which is an `R`.
template <class R, class Change> Shared<ZRFeedback> changedAs(const Shared<ZRFeedback>& record, Change change)
{
    return Processor::changed(std::static_pointer_cast<R>(record), change);
}

} // namespace

std::shared_ptr<ZRFeedback> processedFeedback(const std::shared_ptr<ZRFeedback>& record,
                                              SessionProcessingHelper& helper)
{
    if (!record) return record;
    Processor processor(helper);
    switch (eventType(*record)) {
    case EventType::VisibleResults: // whole results come with the ranking
        return changedAs<ZRVisibleResultsFeedback>(record, [&](auto& copy) { processor.referToAll(copy.results); });
    case EventType::RankSections:
        return changedAs<ZRRankingFeedback>(record, [&](auto& copy) { processor.showAll(copy.sections); });
    case EventType::ResultsReceivedAfterTimeout:
        return changedAs<ZRResultsReceivedAfterTimeoutFeedback>(record,
                                                                [&](auto& copy) { processor.showAll(copy.results); });
    case EventType::LateSectionsAppended:
        return changedAs<ZRLateSectionsAppendedFeedback>(record, [&](auto& copy) { processor.showAll(copy.sections); });
    case EventType::VisibleSuggestions:
        return changedAs<ZRVisibleSuggestionsFeedback>(record,
                                                       [&](auto& copy) { processor.showAll(copy.suggestions); });
    case EventType::ResultEngagement:
        return changedAs<ZRResultEngagementFeedback>(
            record, [&](auto& copy) { copy.result = processor.referenced(copy.result); });
    case EventType::SuggestionEngagement:
        return changedAs<ZRSuggestionEngagementFeedback>(
            record, [&](auto& copy) { copy.suggestion = processor.referenced(copy.suggestion); });
    case EventType::Unknown: // parts of a ranking, each on its own
        if (const auto section = std::dynamic_pointer_cast<ZRSectionRankingFeedback>(record))
            return processor.shown(section);
        if (const auto result = std::dynamic_pointer_cast<ZRResultRankingFeedback>(record))
            return processor.shown(result);
        return record;
    default: return record;
    }
}

} // namespace tavrin
