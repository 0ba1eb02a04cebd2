#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/devserver/Catalogue.h"

namespace devserver {

/// How well an entry fits a query, worst first.
enum class Quality { Words, InsideTitle, TitleStart, WholeTitle };

struct Match {
    const Entry* entry = nullptr;
    Quality quality = Quality::Words;
    /// The query in lower case with its last word completed from the entry; begins with the query. None where the entry
    /// doesn't tell how the query goes on.
    std::optional<std::string> completion;
    /// The query in lower case, completed to the end of the title; only where that is longer than the query.
    std::optional<std::string> suggestion;
};

/// Compares without case and diacritics. The query begins a run of words of the title, or each of its words begins a
/// word of the title or a keyword. Nothing for an empty query.
[[nodiscard]] std::optional<Match> matchEntry(const Entry& entry, std::string_view query);

/// Every entry that fits, of one section or (null) of all: by quality, then popularity, then title.
[[nodiscard]] std::vector<Match> findMatches(const Catalogue& catalogue, std::string_view query,
                                             const Section* section = nullptr);

} // namespace devserver
