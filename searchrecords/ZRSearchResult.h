#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/values/Record.h"
#include "searchrecords/ZREnums.h"

/// What a search finds: results, sections and suggestions.
namespace tavrin {

/// An array of records, or nothing; a missing array differs from an empty one.
template <class T> using RecordArray = std::optional<std::vector<std::shared_ptr<T>>>;

/// A displayed text.
struct ZRText : platform::RecordOf<ZRText> {
    static constexpr std::string_view kClass = "ZRText";
    std::optional<std::string> text;
    static constexpr auto fields() { return std::tuple{platform::field("text", &ZRText::text)}; }
};

/// A destination outside the search view.
struct ZRPunchout : platform::RecordOf<ZRPunchout> {
    static constexpr std::string_view kClass = "ZRPunchout";
    std::optional<std::string> bundleIdentifier; ///< of the application that opens it
    std::vector<std::string> urls;               ///< ways to open it, in the client's order of preference

    static constexpr auto fields()
    {
        return std::tuple{platform::field("bundleIdentifier", &ZRPunchout::bundleIdentifier),
                          platform::field("urls", &ZRPunchout::urls)};
    }
};

/// An action offered beside a result: call, directions, play.
struct ZRActionItem : platform::RecordOf<ZRActionItem> {
    static constexpr std::string_view kClass = "ZRActionItem";
    std::optional<std::string> label;
    std::shared_ptr<ZRPunchout> punchout; ///< what the action opens
    static constexpr auto fields()
    {
        return std::tuple{platform::field("label", &ZRActionItem::label),
                          platform::field("punchout", &ZRActionItem::punchout)};
    }
};

/// One result.
struct ZRSearchResult : platform::RecordOf<ZRSearchResult> {
    static constexpr std::string_view kClass = "ZRSearchResult";

    std::optional<std::string> identifier;
    std::uint64_t queryId = 0; ///< the client's number of the query that found it; 0 for none
    ResultType type = ResultType::Unknown;
    double rankingScore = 0;
    TopHit topHit = TopHit::No;
    std::shared_ptr<ZRText> title;
    std::optional<std::string> sectionBundleIdentifier;
    std::optional<std::string> resultBundleId;
    std::optional<std::string> applicationBundleIdentifier; ///< of the application that the result is in
    bool isLocalApplicationResult = false;                  ///< the result is an application installed here
    bool publiclyIndexable = false;
    std::optional<std::string> correctedQuery; ///< the query that found it, if not the typed one
    bool staticCorrection = false;             ///< the correction came from a fixed list
    std::shared_ptr<ZRPunchout> punchout;      ///< what engaging the result opens
    platform::Value localFeatures;             ///< what the device's ranking knows about it, or null
    /// What the source of the result added: a `TAVCustomSearchResult` for results of the service.
    std::shared_ptr<platform::Record> customProperties;

    static constexpr auto fields()
    {
        using Self = ZRSearchResult;
        return std::tuple{platform::field("identifier", &Self::identifier),
                          platform::field("queryId", &Self::queryId),
                          platform::field("type", &Self::type),
                          platform::field("rankingScore", &Self::rankingScore),
                          platform::field("topHit", &Self::topHit),
                          platform::field("title", &Self::title),
                          platform::field("sectionBundleIdentifier", &Self::sectionBundleIdentifier),
                          platform::field("resultBundleId", &Self::resultBundleId),
                          platform::field("applicationBundleIdentifier", &Self::applicationBundleIdentifier),
                          platform::field("isLocalApplicationResult", &Self::isLocalApplicationResult),
                          platform::field("publiclyIndexable", &Self::publiclyIndexable),
                          platform::field("correctedQuery", &Self::correctedQuery),
                          platform::field("staticCorrection", &Self::staticCorrection),
                          platform::field("punchout", &Self::punchout),
                          platform::field("localFeatures", &Self::localFeatures),
                          platform::field("customProperties", &Self::customProperties)};
    }
};

/// Results under one header.
struct ZRResultSection : platform::RecordOf<ZRResultSection> {
    static constexpr std::string_view kClass = "ZRResultSection";

    std::optional<std::string> identifier;
    std::optional<std::string> bundleIdentifier;
    double score = 0;
    RecordArray<ZRSearchResult> results;

    static constexpr auto fields()
    {
        using Self = ZRResultSection;
        return std::tuple{platform::field("identifier", &Self::identifier),
                          platform::field("bundleIdentifier", &Self::bundleIdentifier),
                          platform::field("score", &Self::score), platform::field("results", &Self::results)};
    }
};

/// A suggested query.
struct ZRSearchSuggestion : platform::RecordOf<ZRSearchSuggestion> {
    static constexpr std::string_view kClass = "ZRSearchSuggestion";

    std::optional<std::string> identifier;
    std::optional<std::string> suggestion; ///< the words
    std::optional<std::string> query;      ///< what the user had typed
    double score = 0;
    SuggestionType type = SuggestionType::Unknown;

    static constexpr auto fields()
    {
        using Self = ZRSearchSuggestion;
        return std::tuple{platform::field("identifier", &Self::identifier),
                          platform::field("suggestion", &Self::suggestion), platform::field("query", &Self::query),
                          platform::field("score", &Self::score), platform::field("type", &Self::type)};
    }
};

} // namespace tavrin
