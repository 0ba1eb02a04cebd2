#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

namespace tavrin {

struct ZRSearchResult;
struct ZRSearchSuggestion;

/// What one pass over a session's events learns while it makes them fit for upload: which small number stands for
/// which identifier of a client, and which results and suggestions events refer to though none showed them.
///
/// One helper for one pass, `TavrinFeedback::process` for each event in time order, then the two questions about what
/// is missing. Not shared between threads.
class SessionProcessingHelper {
public:
    /// The number that stands for an identifier: that of before, or the next, from "1" on. Lives as long as the helper.
    [[nodiscard]] const std::string& replacementForIdentifier(const std::string& identifier);

    /// An event refers to a result or suggestion, by its replaced identifier. The first reference to what no event
    /// showed yet is kept, until one shows it.
    void identifierReferenced(const std::string& replacement, std::shared_ptr<ZRSearchResult> result);
    void identifierReferenced(const std::string& replacement, std::shared_ptr<ZRSearchSuggestion> suggestion);
    /// An event showed what has this replaced identifier.
    void identifierExpanded(const std::string& replacement);

    /// What events referred to and none showed, with replaced identifiers, in the order in which these first appeared.
    [[nodiscard]] std::vector<std::shared_ptr<ZRSearchResult>> missingResults() const;
    [[nodiscard]] std::vector<std::shared_ptr<ZRSearchSuggestion>> missingSuggestions() const;

private:
    /// Orders replaced identifiers as the numbers that they are.
    struct ByNumber {
        bool operator()(const std::string& a, const std::string& b) const
        {
            return a.size() != b.size() ? a.size() < b.size() : a < b;
        }
    };

    std::unordered_map<std::string, std::string> _privateIdMapping;
    std::int32_t _nextMappedId = 1;
    std::map<std::string, std::shared_ptr<ZRSearchResult>, ByNumber> _idResultMap;
    std::map<std::string, std::shared_ptr<ZRSearchSuggestion>, ByNumber> _idSuggestionMap;
    std::unordered_set<std::string> _expandedIdSet;
};

} // namespace tavrin
