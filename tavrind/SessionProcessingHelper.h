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

/// Replaces the clients' identifiers in one session's events by numbers, and finds what the events refer to but never
/// show.
///
/// One helper serves one pass: process each event in time order, then ask what is missing. Identifiers are replaced in
/// the records themselves; those that stay missing are shared with the events. One thread at a time.
class SessionProcessingHelper {
public:
    // What an event shows whole.
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

    // What an event only refers to: a result or a suggestion.
    template <class T> void refer(const std::shared_ptr<T>& record)
    {
        if (record && _replaceIdentifier(*record)) identifierReferenced(*record->identifier, record);
    }
    template <class T> void refer(const RecordArray<T>& records)
    {
        if (!records) return;
        for (const auto& record : *records) refer(record);
    }

    /// The number that replaces an identifier: the same for the same identifier, else the next, from "1". Lives as long
    /// as the helper.
    [[nodiscard]] const std::string& replacementForIdentifier(const std::string& identifier);

    /// An event refers to a result or suggestion, by its replaced identifier. The first reference is kept until an
    /// event shows the identifier.
    void identifierReferenced(const std::string& replacement, std::shared_ptr<ZRSearchResult> result);
    void identifierReferenced(const std::string& replacement, std::shared_ptr<ZRSearchSuggestion> suggestion);
    /// An event shows what has this replaced identifier.
    void identifierExpanded(const std::string& replacement);

    /// What events refer to and none shows, with replaced identifiers, in the order of their first appearance.
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
