#pragma once

#include <algorithm>
#include <array>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "CoreTavrin/TAVFeedback.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "searchrecords/ZRRecords.h"
#include "tavrind/StoredSession.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace fuzz {

/// What is uploaded of a session, made the slow way: of records and dictionaries instead of archives and text.
class UploadModel {
public:
    using Value = platform::Value;

    /// Returns the JSON text for a session's events in the order of its file, and the session's `description`.
    static std::string upload(std::vector<std::shared_ptr<tavrin::TavrinFeedback>> events,
                              const std::string& description)
    {
        UploadModel model;
        Value::Array sent;
        std::uint64_t milliseconds = 0;
        tavrin::sortByTimestamp(events);
        for (const auto& event : events) {
            milliseconds = tavrin::mach_duration_to_milliseconds(event->timestamp() - events.front()->timestamp());
            event->relTimestamp = milliseconds;
            const bool replaces = event->feedback() && model.note(*event->feedback());
            const Value whole = event->dictionary();
            const bool namesSuggestion =
                event->feedback() && exactly<tavrin::ZRSuggestionEngagementFeedback>(*event->feedback());
            sent.push_back(replaces ? model.replaced(whole, namesSuggestion) : whole);
        }
        const auto sendMissing = [&](auto missing, auto& list, const auto& records) {
            if (records.empty()) return;
            for (const auto& [number, record] : records) list.push_back(record);
            tavrin::TavrinFeedback event(std::move(missing), 0, "", "");
            event.relTimestamp = milliseconds;
            sent.push_back(model.replaced(event.dictionary(), false));
        };
        const auto results = std::make_shared<tavrin::TavrinSessionMissingResults>();
        sendMissing(results, results->results, model._results);
        const auto suggestions = std::make_shared<tavrin::TavrinSessionMissingSuggestions>();
        sendMissing(suggestions, suggestions->suggestions, model._suggestions);
        return "{\"fb\":" + platform::toJson(sent) + "," + description.substr(1);
    }

private:
    template <class R> static const R* exactly(const tavrin::ZRFeedback& record)
    {
        return record.className() == R::kClass ? dynamic_cast<const R*>(&record) : nullptr;
    }

    /// Numbers the identifiers in a record. Returns false if its event keeps them.
    bool note(const tavrin::ZRFeedback& record)
    {
        using namespace tavrin;
        const auto shown = [this](const auto& part) { return show(part), true; };
        if (const auto* r = exactly<ZRRankingFeedback>(record)) return shown(r->sections);
        if (const auto* r = exactly<TAVRankerFeedback>(record)) return shown(r->sections);
        if (const auto* r = exactly<ZRSectionRankingFeedback>(record)) return shown(*r);
        if (const auto* r = exactly<ZRResultRankingFeedback>(record)) return shown(*r);
        if (const auto* r = exactly<ZRResultsReceivedAfterTimeoutFeedback>(record)) return shown(r->results);
        if (const auto* r = exactly<ZRLateSectionsAppendedFeedback>(record)) return shown(r->sections);
        if (const auto* r = exactly<ZRVisibleSuggestionsFeedback>(record)) return shown(r->suggestions);
        if (const auto* r = exactly<ZRResultEngagementFeedback>(record)) return refer(_results, r->result), true;
        if (const auto* r = exactly<ZRSuggestionEngagementFeedback>(record))
            return refer(_suggestions, r->suggestion), true;
        const auto* visible = exactly<ZRVisibleResultsFeedback>(record);
        if (visible && visible->results)
            for (const auto& result : *visible->results) refer(_results, result);
        return visible != nullptr;
    }

    template <class T> void show(const std::optional<T>& part)
    {
        if (part) show(*part);
    }
    template <class T> void show(const std::vector<T>& parts)
    {
        for (const T& part : parts) show(part);
    }
    template <class T> void show(const std::shared_ptr<T>& part)
    {
        if (part) show(*part);
    }
    void show(const tavrin::ZRSectionRankingFeedback& ranking)
    {
        show(ranking.section);
        show(ranking.results);
    }
    void show(const tavrin::ZRResultRankingFeedback& ranking)
    {
        show(ranking.hiddenResults);
        show(ranking.duplicateResults);
        show(ranking.result);
    }
    void show(const tavrin::ZRResultSection& section) { show(section.results); }
    void show(const tavrin::ZRSearchResult& result) { showLeaf(result.identifier); }
    void show(const tavrin::ZRSearchSuggestion& suggestion) { showLeaf(suggestion.identifier); }
    void showLeaf(const std::optional<std::string>& identifier)
    {
        if (!identifier) return;
        const int number = numberOf(*identifier);
        _shown.insert(number);
        if (_results.erase(number) == 0) _suggestions.erase(number);
    }
    template <class T> void refer(std::map<int, std::shared_ptr<T>>& missing, const std::shared_ptr<T>& record)
    {
        if (!record || !record->identifier) return;
        const int number = numberOf(*record->identifier);
        if (!_shown.contains(number)) missing.emplace(number, record);
    }
    int numberOf(const std::string& identifier)
    {
        return _numbers.emplace(identifier, static_cast<int>(_numbers.size()) + 1).first->second;
    }

    /// Returns the object with numbers in place of the identifiers of results and suggestions in it, and in place of
    /// its own if it stands for one.
    [[nodiscard]] Value replaced(const Value& object, bool isLeaf) const
    {
        constexpr std::array<std::string_view, 5> kLists{"results", "hidden_results", "duplicate_results", "sections",
                                                         "suggestions"};
        const platform::Dictionary* entries = object.asDictionary();
        if (!entries) return object;
        isLeaf = isLeaf || entries->contains("result_type") || entries->contains("suggestion_type");
        platform::Dictionary copy;
        for (const auto& [key, value] : *entries) {
            if (key == "id" && isLeaf && value.asString()) {
                copy.set(key, std::to_string(_numbers.at(*value.asString())));
            } else if (key == "result") {
                copy.set(key, replaced(value, true));
            } else if (value.asArray() && std::ranges::find(kLists, key) != kLists.end()) {
                Value::Array elements;
                for (const Value& element : *value.asArray()) elements.push_back(replaced(element, false));
                copy.set(key, std::move(elements));
            } else {
                copy.set(key, value);
            }
        }
        return copy;
    }

    std::map<std::string, int> _numbers;
    std::map<int, std::shared_ptr<tavrin::ZRSearchResult>> _results; ///< that no event has shown
    std::map<int, std::shared_ptr<tavrin::ZRSearchSuggestion>> _suggestions;
    std::set<int> _shown;
};

} // namespace fuzz
