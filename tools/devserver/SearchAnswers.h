#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Value.h"
#include "tools/devserver/Catalogue.h"
#include "tools/devserver/Matching.h"

namespace devserver {

/// Builds answers from the catalogue: JSON arrays of result sets, before `stamp`. Immutable: any thread.
class SearchAnswers {
public:
    /// `base` is the service's own HTTPS address. The catalogue must outlive this.
    SearchAnswers(const Catalogue& catalogue, std::string base) : _catalogue(catalogue), _base(std::move(base)) {}

    /// Returns one set for each of the best completions of the query, or one empty set without "query" if nothing
    /// matches.
    [[nodiscard]] platform::Value search(std::string_view query, bool withSuggestions = true) const;
    /// Returns popular results of every section, and popular queries as suggestions.
    [[nodiscard]] platform::Value zeroKeyword() const;
    /// Returns the next results of one section, from `offset` on.
    [[nodiscard]] platform::Value moreResults(std::string_view query, const Section& section, std::size_t offset) const;
    /// Returns results with "lookup_instructions"; those of the section with the key `domain` come first.
    [[nodiscard]] platform::Value lookup(std::string_view words, std::string_view domain) const;
    /// Returns nullopt for an unknown identifier.
    [[nodiscard]] std::optional<platform::Value> card(std::string_view identifier) const;
    [[nodiscard]] platform::Value flights(std::string_view query) const;

private:
    [[nodiscard]] platform::Value result(const Entry& entry, double score) const;
    [[nodiscard]] platform::Value resultSet(std::string_view query, const std::vector<const Match*>& matches) const;
    [[nodiscard]] std::string moreUrl(std::string_view query, const Section& section, std::size_t offset) const;

    const Catalogue& _catalogue;
    std::string _base;
};

/// The values that `stamp` adds to every result set of an answer.
struct Stamp {
    std::string fbq;             ///< opaque; returned in feedback
    std::string partialClientIp; ///< the client's address without its last part
    double duration = 0;         ///< time to make the answer, in milliseconds
    std::uint64_t maxAge = 0;    ///< how long a set may be cached, in seconds; 0 is left out and means no limit
};
void stamp(platform::Value& answer, const Stamp& stamp);

/// Returns an address without its end: "192.0.2.0" for "192.0.2.7", the first three groups of an IPv6 address.
[[nodiscard]] std::string partialAddress(std::string_view address);

} // namespace devserver
