#include "tools/devserver/SearchAnswers.h"

#include <algorithm>
#include <map>
#include <span>

#include <fmt/format.h>

#include "platform/net/Url.h"
#include "platform/values/Dictionary.h"

namespace devserver {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::size_t kSets = 3;
constexpr std::size_t kResultsPerSection = 3;
constexpr std::size_t kSuggestions = 5;
constexpr std::size_t kMoreResults = 10;

double scoreOf(const Match& match)
{
    return static_cast<double>(match.quality) + match.entry->popularity / 1001.0;
}

/// Returns the entry's popularity, from 0 to 1.
double popularityScore(const Entry& entry)
{
    return entry.popularity / 1000.0;
}

/// Returns suggestions, most popular first, without duplicates and without the query itself.
Value suggestionsFrom(std::vector<const Match*> matches, std::string_view query)
{
    std::ranges::stable_sort(matches, std::ranges::greater(), [](const Match* m) { return m->entry->popularity; });
    const std::string typed = lowerCased(query);
    Value::Array suggestions;
    std::vector<std::string> seen{typed};
    for (const Match* match : matches) {
        if (suggestions.size() == kSuggestions) break;
        if (!match->suggestion || std::ranges::find(seen, *match->suggestion) != seen.end()) continue;
        seen.push_back(*match->suggestion);
        suggestions.push_back(Value::dictionaryOf({{"identifier", "suggestion." + match->entry->identifier},
                                                   {"suggestion", *match->suggestion},
                                                   {"query", query},
                                                   {"score", popularityScore(*match->entry)}}));
    }
    return suggestions;
}

std::vector<const Match*> pointersTo(const std::vector<Match>& matches)
{
    std::vector<const Match*> pointers;
    pointers.reserve(matches.size());
    for (const Match& match : matches) pointers.push_back(&match);
    return pointers;
}

Value cardSection(std::string_view type, std::string_view title, Value value)
{
    return Value::dictionaryOf({{"type", type}, {"title", title}, {"text", std::move(value)}});
}

} // namespace

Value SearchAnswers::result(const Entry& entry, double score) const
{
    const std::string image = platform::percentEncodePathSegment(entry.identifier);
    return Value::dictionaryOf({
        {"identifier", entry.identifier},
        {"title", entry.title},
        {"url", entry.url},
        {"description", entry.description},
        {"type", entry.section->type},
        {"score", score},
        {"section_name", entry.section->name},
        {"section_bundle_id", entry.section->bundleIdentifier},
        {"bundle_id", entry.section->bundleIdentifier},
        {"thumbnail", Value::dictionaryOf({{"url", fmt::format("{}/images/{}", _base, image)}})},
        {"icon", Value::dictionaryOf({{"id", fmt::format("section.{}", entry.section->key)}})},
        {"card_url", fmt::format("{}/card?id={}", _base, image)},
        {"fbr", entry.identifier.substr(entry.identifier.find('.') + 1)},
    });
}

std::string SearchAnswers::moreUrl(std::string_view query, const Section& section, std::size_t offset) const
{
    return fmt::format("{}/more?q={}&section={}&offset={}", _base, platform::percentEncodeQueryComponent(query),
                       section.key, offset);
}

/// Groups results by section; the section with the best result comes first.
Value SearchAnswers::resultSet(std::string_view query, const std::vector<const Match*>& matches) const
{
    std::vector<const Section*> order;
    std::map<const Section*, std::vector<const Match*>> bySection;
    for (const Match* match : matches) {
        auto& group = bySection[match->entry->section];
        if (group.empty()) order.push_back(match->entry->section);
        group.push_back(match);
    }
    Value::Array results;
    Value::Array sectionList;
    for (const Section* section : order) {
        const auto& group = bySection[section];
        for (const Match* match : std::span(group).first(std::min(group.size(), kResultsPerSection)))
            results.push_back(result(*match->entry, scoreOf(*match)));
        Dictionary description{{"name", section->name},
                               {"bundle_id", section->bundleIdentifier},
                               {"score", scoreOf(*group.front())},
                               {"count", group.size()},
                               {"glyph", Value::dictionaryOf({{"id", fmt::format("glyph.{}", section->key)}})}};
        if (group.size() > kResultsPerSection)
            description.set("more_results_url", moreUrl(query, *section, kResultsPerSection));
        sectionList.emplace_back(std::move(description));
    }
    return Value::dictionaryOf({{"results", std::move(results)}, {"sections", std::move(sectionList)}});
}

Value SearchAnswers::search(std::string_view query, bool withSuggestions) const
{
    const std::vector<Match> matches = findMatches(_catalogue, query);
    // Matches with the same completion form a set; the set of the best match comes first.
    std::vector<std::pair<std::optional<std::string>, std::vector<const Match*>>> groups;
    for (const Match& match : matches) {
        auto group = std::ranges::find(groups, match.completion, [](const auto& g) { return g.first; });
        if (group == groups.end()) group = groups.insert(groups.end(), {match.completion, {}});
        group->second.push_back(&match);
    }
    if (groups.size() > kSets) groups.resize(kSets);

    Value::Array sets;
    for (const auto& [completion, members] : groups) {
        Value set = resultSet(completion.value_or(std::string(query)), members);
        Dictionary& entries = set.mutableDictionary();
        if (completion) {
            entries.set("query", *completion);
            entries.set("completion_score", popularityScore(*members.front()->entry));
        }
        if (withSuggestions) entries.set("suggestions", suggestionsFrom(members, query));
        sets.push_back(std::move(set));
    }
    if (sets.empty()) sets.push_back(resultSet(query, {}));
    return sets;
}

Value SearchAnswers::zeroKeyword() const
{
    std::vector<const Entry*> entries;
    for (const Entry& entry : _catalogue.entries()) entries.push_back(&entry);
    std::ranges::stable_sort(entries, std::ranges::greater(), &Entry::popularity);
    std::vector<Match> best;
    best.reserve(entries.size());
    for (const Entry* entry : entries) best.push_back({entry, Quality::WholeTitle, {}, lowerCased(entry->title)});

    Value set = resultSet("", pointersTo(best));
    Value::Array sectionList;
    for (const Value& section : *set["sections"].asArray()) { // without a query there are no more results
        Value copy = section;
        copy.mutableDictionary().remove("more_results_url");
        sectionList.push_back(std::move(copy));
    }
    set.mutableDictionary().set("sections", std::move(sectionList));
    std::vector<const Match*> bestOfSections;
    for (const Match& match : best)
        if (std::ranges::find(bestOfSections, match.entry->section, [](const Match* m) { return m->entry->section; }) ==
            bestOfSections.end())
            bestOfSections.push_back(&match);
    set.mutableDictionary().set("suggestions", suggestionsFrom(std::move(bestOfSections), ""));
    return Value::Array{std::move(set)};
}

Value SearchAnswers::moreResults(std::string_view query, const Section& section, std::size_t offset) const
{
    const std::vector<Match> matches = findMatches(_catalogue, query, &section);
    const std::size_t begin = std::min(offset, matches.size());
    const std::size_t end = std::min(begin + kMoreResults, matches.size());
    Value::Array results;
    for (std::size_t i = begin; i < end; ++i) results.push_back(result(*matches[i].entry, scoreOf(matches[i])));
    Dictionary set{{"results", std::move(results)}};
    if (end < matches.size()) set.set("more_results_url", moreUrl(query, section, end));
    return Value::Array{std::move(set)};
}

Value SearchAnswers::lookup(std::string_view words, std::string_view domain) const
{
    std::vector<Match> matches = findMatches(_catalogue, words);
    std::ranges::stable_partition(matches, [&](const Match& match) { return match.entry->section->key == domain; });
    Value::Array results;
    for (const Match& match : matches) {
        if (results.size() == kMoreResults) break;
        Value found = result(*match.entry, scoreOf(match));
        Value::Array keywords;
        for (const std::string& keyword : match.entry->foldedKeywords)
            keywords.push_back(Value::dictionaryOf({{"word", keyword}, {"weight", 0.5}}));
        found.mutableDictionary().set("lookup_instructions",
                                      Value::dictionaryOf({{"min_keywords_score", 0.0},
                                                           {"completion", lowerCased(words)},
                                                           {"keywords", std::move(keywords)},
                                                           {"min_subject_score", 0.0},
                                                           {"subject", match.entry->description}}));
        results.push_back(std::move(found));
    }
    return Value::Array{Value::dictionaryOf({{"results", std::move(results)}})};
}

std::optional<Value> SearchAnswers::card(std::string_view identifier) const
{
    const Entry* entry = _catalogue.find(identifier);
    if (!entry) return std::nullopt;
    Value found = result(*entry, popularityScore(*entry));
    Value::Array posters; // by URL and, as a fallback, by identifier
    for (const char* view : {"front", "back"})
        posters.push_back(
            Value::dictionaryOf({{"url", fmt::format("{}/images/{}.{}", _base,
                                                     platform::percentEncodePathSegment(entry->identifier), view)},
                                 {"id", fmt::format("{}.{}", entry->identifier, view)}}));
    found.mutableDictionary().set("posters", std::move(posters));
    found.mutableDictionary().set(
        "card",
        Value::dictionaryOf({{"title", entry->title},
                             {"card_sections", Value::Array{cardSection("description", "About", entry->description),
                                                            cardSection("row", "Filed under", entry->section->name),
                                                            cardSection("row", "Keywords", entry->keywords),
                                                            cardSection("link", "Open", entry->url)}}}));
    return Value::Array{Value::dictionaryOf({{"results", Value::Array{std::move(found)}}})};
}

Value SearchAnswers::flights(std::string_view query) const
{
    return moreResults(query, *findSection("flights"), 0);
}

void stamp(Value& answer, const Stamp& stamp)
{
    for (Value& set : answer.mutableArray()) {
        Dictionary& entries = set.mutableDictionary();
        entries.set("status", "OK");
        entries.set("fbq", stamp.fbq);
        entries.set("partial_client_ip", stamp.partialClientIp);
        entries.set("duration", stamp.duration);
        if (stamp.maxAge > 0) entries.set("max_age", stamp.maxAge);
    }
}

std::string partialAddress(std::string_view address)
{
    if (const std::size_t dot = address.rfind('.'); dot != address.npos)
        return std::string(address.substr(0, dot)) + ".0";
    std::size_t end = 0;
    for (int group = 0; group < 3 && end != address.npos; ++group) end = address.find(':', end == 0 ? 0 : end + 1);
    return end == address.npos ? std::string(address) : std::string(address.substr(0, end)) + "::";
}

} // namespace devserver
