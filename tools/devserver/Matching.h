#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/devserver/Catalogue.h"

namespace devserver {

/// How well an entry matches a query, worst first.
enum class Quality { Words, InsideTitle, TitleStart, WholeTitle };

struct Match {
    const Entry* entry = nullptr;
    Quality quality = Quality::Words;
    /// The query in lower case with its last word completed from the entry; it starts with the query. nullopt if the
    /// entry doesn't complete it.
    std::optional<std::string> completion;
    /// The query in lower case, completed to the end of the title; nullopt if that isn't longer.
    std::optional<std::string> suggestion;
};

/// Returns all matching entries of one section, or of all sections if null, ordered by quality, then popularity, then
/// title. Ignoring case and diacritics, the query starts a run of words of the title, or each of its words starts a
/// word of the title or a keyword. An empty query matches nothing.
[[nodiscard]] std::vector<Match> findMatches(const Catalogue& catalogue, std::string_view query,
                                             const Section* section = nullptr);

} // namespace devserver
