#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/values/ArchivedRecord.h"
#include "searchrecords/ZRResultFeedback.h"

namespace tavrin {

using platform::operator""_field;

/// Replaces the clients' identifiers in one session's events by numbers, and finds results and suggestions that the
/// events refer to but never show.
///
/// One helper serves one pass: process each event in time order, write it with `replacedIdentifier`, then ask what is
/// missing. The events' archives must outlive the helper; they stay as they are. One thread at a time.
class SessionProcessingHelper {
public:
    // For a record that an event shows with all its properties.
    void show(const platform::ArchivedRecord<ZRSearchResult>& result) { _showLeaf(result); }
    void show(const platform::ArchivedRecord<ZRSearchSuggestion>& suggestion) { _showLeaf(suggestion); }
    void show(const platform::ArchivedRecord<ZRResultSection>& section);
    void show(const platform::ArchivedRecord<ZRResultRankingFeedback>& ranking);
    void show(const platform::ArchivedRecord<ZRSectionRankingFeedback>& ranking);
    template <class T> void show(const platform::ArchivedArray<std::shared_ptr<T>>& records)
    {
        for (const auto& record : records) show(record);
    }
    template <class T> void show(const std::optional<T>& records)
    {
        if (records) show(*records);
    }

    // For a result or suggestion that an event only refers to.
    template <class T> void refer(const platform::ArchivedRecord<T>& record)
    {
        if (const auto identifier = record["identifier"_field])
            identifierReferenced(replacementForIdentifier(*identifier), record);
    }
    template <class T> void refer(const std::optional<platform::ArchivedArray<std::shared_ptr<T>>>& records)
    {
        if (!records) return;
        for (const auto& record : *records) refer(record);
    }

    /// Returns the number that replaces an identifier, counted from 1. Equal identifiers get equal numbers.
    std::int32_t replacementForIdentifier(std::string_view identifier);
    /// Returns the number of an identifier that was replaced before, as text.
    [[nodiscard]] std::string replacedIdentifier(std::string_view identifier) const;

    /// Notes that an event refers to a record, by the number that replaces its identifier. Keeps the first reference
    /// until an event shows the identifier.
    void identifierReferenced(std::int32_t replacement, const platform::ArchivedRecord<ZRSearchResult>& result);
    void identifierReferenced(std::int32_t replacement, const platform::ArchivedRecord<ZRSearchSuggestion>& suggestion);
    /// Notes that an event shows the record with this number.
    void identifierExpanded(std::int32_t replacement);

    /// The archives of records, which have the clients' identifiers, by the number.
    using Archives = std::map<std::int32_t, std::string_view>;
    /// Return the records that events refer to but none shows, in the order of their first appearance.
    [[nodiscard]] const Archives& missingResults() const { return _idResultMap; }
    [[nodiscard]] const Archives& missingSuggestions() const { return _idSuggestionMap; }

private:
    template <class T> void _showLeaf(const platform::ArchivedRecord<T>& record)
    {
        if (const auto identifier = record["identifier"_field])
            identifierExpanded(replacementForIdentifier(*identifier));
    }
    [[nodiscard]] bool _isExpanded(std::int32_t replacement) const
    {
        return static_cast<std::size_t>(replacement) < _expandedIdSet.size() &&
               _expandedIdSet[static_cast<std::size_t>(replacement)];
    }
    void _refer(Archives& map, std::int32_t replacement, std::string_view archive);

    std::unordered_map<std::string_view, std::int32_t> _privateIdMapping;
    std::int32_t _nextMappedId = 1;
    Archives _idResultMap;
    Archives _idSuggestionMap;
    std::vector<bool> _expandedIdSet; ///< by the number
};

} // namespace tavrin
