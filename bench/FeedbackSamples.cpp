#include <fmt/format.h>

#include "bench/Feedback.h"
#include "CoreTavrin/TAVFeedback.h"
#include "searchrecords/ZRRecords.h"
#include "tavrind/TavrinFeedback.h"

namespace tavrin::bench {

namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;

std::shared_ptr<ZRSearchResult> result(std::uint64_t search, std::uint64_t position)
{
    auto result = std::make_shared<ZRSearchResult>();
    result->identifier = fmt::format("{}-{}-6f1c2a", search, position);
    result->queryId = search;
    result->type = ResultType::Tavrin;
    result->rankingScore = 0.9 - 0.13 * static_cast<double>(position);
    result->sectionBundleIdentifier = "com.quorvane.section.web";
    result->resultBundleId = "com.quorvane.wendral";
    auto custom = std::make_shared<TAVCustomSearchResult>();
    custom->fbr = fmt::format("{:x}", search * 7919 + position);
    result->customProperties = std::move(custom);
    return result;
}

std::vector<std::shared_ptr<ZRSearchResult>> results(std::uint64_t search, std::uint64_t count)
{
    std::vector<std::shared_ptr<ZRSearchResult>> results;
    for (std::uint64_t i = 0; i < count; ++i) results.push_back(result(search, i));
    return results;
}

std::shared_ptr<ZRFeedback> ranking(std::uint64_t search)
{
    auto section = std::make_shared<ZRSectionRankingFeedback>();
    section->section = std::make_shared<ZRResultSection>();
    section->section->identifier = "web";
    section->results.emplace();
    for (const auto& each : results(search, 2)) {
        auto ranked = std::make_shared<ZRResultRankingFeedback>();
        ranked->result = each;
        section->results->push_back(std::move(ranked));
    }
    auto record = std::make_shared<ZRRankingFeedback>();
    record->sections.emplace({std::move(section)});
    record->blendingDuration = 0.0125;
    return record;
}

std::shared_ptr<ZRFeedback> suggestions(std::uint64_t search)
{
    auto record = std::make_shared<ZRVisibleSuggestionsFeedback>();
    record->suggestions.emplace();
    for (const char* words : {"weather", "weather in paris", "weather tomorrow"}) {
        auto suggestion = std::make_shared<ZRSearchSuggestion>();
        suggestion->identifier = fmt::format("{}-{}", search, words);
        suggestion->suggestion = words;
        suggestion->query = "weath";
        record->suggestions->push_back(std::move(suggestion));
    }
    return record;
}

} // namespace

std::shared_ptr<TavrinFeedback> kilobyteEvent()
{
    auto record = std::make_shared<ZRVisibleResultsFeedback>();
    record->triggerEvent = VisibleResultsTrigger::Scroll;
    record->results = results(1, 2);
    record->timestamp = kSecond;
    return std::make_shared<TavrinFeedback>(std::move(record), 12, "01234567-89AB-4DEF-8123-456789ABCDEF", "bench/1",
                                            3);
}

std::vector<std::shared_ptr<ZRFeedback>> eventsOfSearch(std::uint64_t number)
{
    auto start = std::make_shared<ZRStartSearchFeedback>();
    start->input = "weath";
    start->triggerEvent = StartSearchTrigger::NewCharacter;
    start->uuid = fmt::format("01234567-89AB-4DEF-8123-{:012X}", number);
    start->queryId = number;
    auto end = std::make_shared<ZREndSearchFeedback>();
    end->uuid = start->uuid;
    auto visible = std::make_shared<ZRVisibleResultsFeedback>();
    visible->triggerEvent = VisibleResultsTrigger::ResultListUpdated;
    visible->results = results(number, 3);
    auto engagement = std::make_shared<ZRResultEngagementFeedback>();
    engagement->result = visible->results->front();
    engagement->triggerEvent = ResultEngagementTrigger::Tap;
    engagement->destination = ResultEngagementDestination::Punchout;
    auto clear = std::make_shared<ZRClearInputFeedback>();
    clear->triggerEvent = ClearInputTrigger::CrossButton;

    std::vector<std::shared_ptr<ZRFeedback>> events{start, ranking(number), visible, suggestions(number),
                                                    end,   engagement,      clear};
    for (std::size_t i = 0; i < events.size(); ++i) events[i]->timestamp = number * kSecond + i * kSecond / 10;
    return events;
}

} // namespace tavrin::bench
