#include "tavrind/SessionProcessingHelper.h"

#include <ranges>

namespace tavrin {

namespace {

template <class Map> std::vector<typename Map::mapped_type> valuesOf(const Map& map)
{
    const auto values = map | std::views::values;
    return {values.begin(), values.end()};
}

} // namespace

void SessionProcessingHelper::show(ZRResultRankingFeedback& ranking)
{
    show(ranking.hiddenResults);
    show(ranking.duplicateResults);
    show(ranking.result);
}

void SessionProcessingHelper::show(ZRSectionRankingFeedback& ranking)
{
    show(ranking.section);
    show(ranking.results);
}

const std::string& SessionProcessingHelper::replacementForIdentifier(const std::string& identifier)
{
    const auto [entry, isNew] = _privateIdMapping.try_emplace(identifier);
    if (isNew) entry->second = std::to_string(_nextMappedId++);
    return entry->second;
}

void SessionProcessingHelper::identifierReferenced(const std::string& replacement,
                                                   std::shared_ptr<ZRSearchResult> result)
{
    if (!_expandedIdSet.contains(replacement)) _idResultMap.try_emplace(replacement, std::move(result));
}

void SessionProcessingHelper::identifierReferenced(const std::string& replacement,
                                                   std::shared_ptr<ZRSearchSuggestion> suggestion)
{
    if (!_expandedIdSet.contains(replacement)) _idSuggestionMap.try_emplace(replacement, std::move(suggestion));
}

void SessionProcessingHelper::identifierExpanded(const std::string& replacement)
{
    _expandedIdSet.insert(replacement);
    if (_idResultMap.erase(replacement) == 0) _idSuggestionMap.erase(replacement);
}

std::vector<std::shared_ptr<ZRSearchResult>> SessionProcessingHelper::missingResults() const
{
    return valuesOf(_idResultMap);
}

std::vector<std::shared_ptr<ZRSearchSuggestion>> SessionProcessingHelper::missingSuggestions() const
{
    return valuesOf(_idSuggestionMap);
}

} // namespace tavrin
