#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "searchrecords/ZRResultFeedback.h"

namespace tavrin {

/// Replaces the clients' identifiers in one session's events by numbers, and finds results and suggestions that the
/// events refer to but never show.
///
/// One helper serves one pass: process each event in time order, then ask what is missing. Identifiers are replaced in
/// the records themselves; the missing records are shared with the events. One thread at a time.
class SessionProcessingHelper {
public:
    // For a record that an event shows with all its properties.
    void show(ZRSearchResult& result) { _showLeaf(result); }
    void show(ZRSearchSuggestion& suggestion) { _showLeaf(suggestion); }
    void show(ZRResultSection& section) { show(section.results); }
    void show(ZRResultRankingFeedback& ranking);
    void show(ZRSectionRankingFeedback& ranking);
    template <class T> void show(const std::shared_ptr<T>& record)
    {
        if (record) show(*record);
    }
    template <class T> void show(const std::vector<std::shared_ptr<T>>& records)
    {
        for (const auto& record : records) show(record);
    }
    template <class T> void show(const RecordArray<T>& records)
    {
        if (records) show(*records);
    }

    // For a result or suggestion that an event only refers to.
    template <class T> void refer(const std::shared_ptr<T>& record)
    {
        if (record && _replaceIdentifier(*record)) identifierReferenced(*record->identifier, record);
    }
    template <class T> void refer(const RecordArray<T>& records)
    {
        if (!records) return;
        for (const auto& record : *records) refer(record);
    }

    /// Returns the number that replaces an identifier, counted from "1". Equal identifiers get equal numbers. The
    /// reference is valid as long as the helper.
    [[nodiscard]] const std::string& replacementForIdentifier(const std::string& identifier);

    /// Notes that an event refers to a record, by its replaced identifier. Keeps the first reference until an event
    /// shows the identifier.
    void identifierReferenced(const std::string& replacement, std::shared_ptr<ZRSearchResult> result);
    void identifierReferenced(const std::string& replacement, std::shared_ptr<ZRSearchSuggestion> suggestion);
    /// Notes that an event shows the record with this replaced identifier.
    void identifierExpanded(const std::string& replacement);

    /// Return the records that events refer to but none shows, with replaced identifiers, in the order of their first
    /// appearance.
    [[nodiscard]] std::vector<std::shared_ptr<ZRSearchResult>> missingResults() const;
    [[nodiscard]] std::vector<std::shared_ptr<ZRSearchSuggestion>> missingSuggestions() const;

private:
    /// Orders replaced identifiers as numbers.
    struct ByNumber {
        bool operator()(const std::string& a, const std::string& b) const
        {
            return a.size() != b.size() ? a.size() < b.size() : a < b;
        }
    };

    /// Returns false for a record without an identifier.
    template <class T> bool _replaceIdentifier(T& record)
    {
        if (record.identifier) record.identifier = replacementForIdentifier(*record.identifier);
        return record.identifier.has_value();
    }
    template <class T> void _showLeaf(T& record)
    {
        if (_replaceIdentifier(record)) identifierExpanded(*record.identifier);
    }

    std::unordered_map<std::string, std::string> _privateIdMapping;
    std::int32_t _nextMappedId = 1;
    std::map<std::string, std::shared_ptr<ZRSearchResult>, ByNumber> _idResultMap;
    std::map<std::string, std::shared_ptr<ZRSearchSuggestion>, ByNumber> _idSuggestionMap;
    std::unordered_set<std::string> _expandedIdSet;
};

} // namespace tavrin
