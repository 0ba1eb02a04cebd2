#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <span>
#include <string>

#include "platform/base/Bytes.h"
#include "platform/base/Uuid.h"
#include "platform/net/UrlSession.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"

namespace tavrin {

/// One result set of an answer of the service. It keeps the JSON text of the reply, so that a cache hit shares bytes
/// and encodes nothing. Immutable; any thread.
struct CachedResultSet : std::enable_shared_from_this<CachedResultSet> {
    /// `input` is what the user had typed, `resultSet` an element of the answer to `request`, `uuid` that of the
    /// request's start record. The set expires "max_age" seconds after `now`; without "max_age", or with 0, never.
    CachedResultSet(std::string_view input, std::shared_ptr<const platform::UrlRequest> request,
                    platform::JsonView resultSet, std::string uuid, platform::Date now);

    const std::string input; ///< in lower case
    const std::shared_ptr<const platform::UrlRequest> request;
    const platform::Bytes answer; ///< JSON of an array that holds the result set alone
    const std::string uuid;
    const std::optional<platform::Date> expireTime;
    const platform::Date storeTime; ///< its creation

    // Derived from the above.
    const std::string query;       ///< "query", the completed query that the set is for, in lower case; may be empty
    const std::size_t inputLength; ///< in UTF-16 units
    const std::size_t queryLength; ///< in UTF-16 units
    const float completionScore;   ///< "completion_score"; 0 if missing
    const float uiScale;           ///< header "X-Quorvane-UI-Scale" of the request; 0 if missing
    [[nodiscard]] std::optional<platform::Uuid> userGuid() const; ///< header "X-Quorvane-UserGuid" of the request
    [[nodiscard]] platform::Value resultSet() const;              ///< each call parses `answer`
    [[nodiscard]] std::size_t resultSetSize() const;              ///< in bytes of JSON
};

/// What a look-up does with a set whose query begins with the text typed.
enum class CachedUse {
    Expired,    ///< remove it
    OtherScale, ///< skip it: its images are for another screen
    OtherInput, ///< skip it: it was fetched for a longer input
    Candidate,  ///< the set fits
};
/// Returns a screen scale as a request's header has it, with one decimal: scales that the service can't tell apart are
/// equal. 0 for none.
[[nodiscard]] float scaleAsSent(double scale);
/// `typedLength` is in UTF-16 units. `scale` is what `scaleAsSent` returns; 0 accepts any set.
[[nodiscard]] CachedUse useOf(const CachedResultSet& set, std::size_t typedLength, float scale, platform::Date now);

/// Returns the candidate with the shortest query. Among equally short ones, prefers the highest positive score, then
/// the first. Returns null if there are no candidates.
[[nodiscard]] const CachedResultSet* pickCompletion(std::span<const CachedResultSet* const> candidates);

} // namespace tavrin
