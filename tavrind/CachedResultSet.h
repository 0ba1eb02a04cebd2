#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <span>
#include <string>

#include "platform/base/Bytes.h"
#include "platform/base/Uuid.h"
#include "platform/net/UrlSession.h"
#include "platform/values/Value.h"

namespace tavrin {

/// One result set of an answer of the service, as the query cache keeps it: as the text that answers, so that a hit
/// makes nothing. Immutable and shared.
struct CachedResultSet : std::enable_shared_from_this<CachedResultSet> {
    /// `input` is what the user had typed, `resultSet` an element of the answer to `request`, `uuid` that of the
    /// request's start record. The set is usable from `now` for the seconds of its "max_age": without end for none.
    CachedResultSet(std::string_view input, std::shared_ptr<const platform::UrlRequest> request,
                    const platform::Value& resultSet, std::string uuid, platform::Date now);

    const std::string input; ///< in lower case
    const std::shared_ptr<const platform::UrlRequest> request;
    const platform::Bytes answer; ///< JSON of an array that holds the result set alone
    const std::string uuid;
    const std::optional<platform::Date> expireTime;

    // Derived from the above.
    const std::string query;       ///< the completed query that the set is for, in lower case; may be empty
    const std::size_t inputLength; ///< in UTF-16 units
    const std::size_t queryLength; ///< in UTF-16 units
    const float completionScore;   ///< the service's; 0 for none
    const float uiScale;           ///< of the client's screen, as the service was told; 0 for none
    [[nodiscard]] std::optional<platform::Uuid> userGuid() const; ///< as the service was told
    [[nodiscard]] platform::Value resultSet() const;              ///< read from the answer
    [[nodiscard]] std::size_t resultSetSize() const;              ///< in bytes of JSON
};

/// What a look-up does with a set whose query begins with what was typed.
enum class CachedUse {
    Expired,    ///< drop it
    OtherScale, ///< its images are for another screen
    OtherInput, ///< more had been typed when it was fetched
    Candidate,
};
/// `typedLength` is in UTF-16 units, `scale` that of the client's screen; 0 takes any.
[[nodiscard]] CachedUse useOf(const CachedResultSet& set, std::size_t typedLength, double scale, platform::Date now);

/// The set that answers: of the shortest query; of those that with the highest score, if that is positive; of those the
/// first. Null for no candidates.
[[nodiscard]] const CachedResultSet* pickCompletion(std::span<const CachedResultSet* const> candidates);

} // namespace tavrin
