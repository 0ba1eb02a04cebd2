#include "tavrind/SessionProcessingHelper.h"

namespace tavrin {

using platform::ArchivedRecord;

void SessionProcessingHelper::show(const ArchivedRecord<ZRResultSection>& section)
{
    show(section["results"_field]);
}

void SessionProcessingHelper::show(const ArchivedRecord<ZRResultRankingFeedback>& ranking)
{
    show(ranking["hiddenResults"_field]);
    show(ranking["duplicateResults"_field]);
    show(ranking["result"_field]);
}

void SessionProcessingHelper::show(const ArchivedRecord<ZRSectionRankingFeedback>& ranking)
{
    show(ranking["section"_field]);
    show(ranking["results"_field]);
}

std::int32_t SessionProcessingHelper::replacementForIdentifier(std::string_view identifier)
{
    const auto [entry, isNew] = _privateIdMapping.try_emplace(identifier, _nextMappedId);
    if (isNew) ++_nextMappedId;
    return entry->second;
}

std::string SessionProcessingHelper::replacedIdentifier(std::string_view identifier) const
{
    return std::to_string(_privateIdMapping.at(identifier));
}

void SessionProcessingHelper::_refer(Archives& map, std::int32_t replacement, std::string_view archive)
{
    if (!_isExpanded(replacement)) map.try_emplace(replacement, archive);
}

void SessionProcessingHelper::identifierReferenced(std::int32_t replacement,
                                                   const ArchivedRecord<ZRSearchResult>& result)
{
    _refer(_idResultMap, replacement, result.bytes());
}

void SessionProcessingHelper::identifierReferenced(std::int32_t replacement,
                                                   const ArchivedRecord<ZRSearchSuggestion>& suggestion)
{
    _refer(_idSuggestionMap, replacement, suggestion.bytes());
}

void SessionProcessingHelper::identifierExpanded(std::int32_t replacement)
{
    const auto index = static_cast<std::size_t>(replacement);
    if (index >= _expandedIdSet.size()) _expandedIdSet.resize(index + 1);
    _expandedIdSet[index] = true;
    if (_idResultMap.erase(replacement) == 0) _idSuggestionMap.erase(replacement);
}

} // namespace tavrin
