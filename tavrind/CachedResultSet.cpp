#include "tavrind/CachedResultSet.h"

#include <algorithm>
#include <cstdlib>

#include <fmt/format.h>

#include "platform/text/Text.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"

namespace tavrin {

namespace {

using platform::Date;
using platform::JsonView;
using platform::Value;

std::optional<Date> expireTimeOf(JsonView resultSet, Date now)
{
    constexpr double kLongest = 1e9; // seconds, about 30 years: keeps the sum within the range of a Date
    const double maxAge = resultSet["max_age"].value().asDouble().value_or(0);
    if (maxAge == 0) return std::nullopt;
    return now + platform::durationFromSeconds(std::clamp(maxAge, -kLongest, kLongest));
}

/// Returns the text of a reply with this set alone. It is stored, so it has no spare capacity.
platform::Bytes answerWith(JsonView resultSet)
{
    std::string text = '[' + resultSet.json() + ']';
    text.shrink_to_fit();
    return platform::Bytes(std::move(text));
}

std::string queryOf(JsonView resultSet)
{
    const auto query = resultSet["query"].asString();
    return query ? platform::lowerCased(*query) : "";
}

float uiScaleOf(const platform::UrlRequest& request)
{
    const std::string* header = request.headers.find("X-Quorvane-UI-Scale");
    return header ? std::strtof(header->c_str(), nullptr) : 0;
}

} // namespace

CachedResultSet::CachedResultSet(std::string_view input_, std::shared_ptr<const platform::UrlRequest> request_,
                                 JsonView resultSet, std::string uuid_, Date now)
    : input(platform::lowerCased(input_)), request(std::move(request_)), answer(answerWith(resultSet)),
      uuid(std::move(uuid_)), expireTime(expireTimeOf(resultSet, now)), storeTime(now), query(queryOf(resultSet)),
      inputLength(platform::utf16Length(input)), queryLength(platform::utf16Length(query)),
      completionScore(static_cast<float>(resultSet["completion_score"].value().asDouble().value_or(0))),
      uiScale(uiScaleOf(*request))
{}

std::optional<platform::Uuid> CachedResultSet::userGuid() const
{
    const std::string* header = request->headers.find("X-Quorvane-UserGuid");
    return header ? platform::Uuid::parse(*header) : std::nullopt;
}

Value CachedResultSet::resultSet() const
{
    return platform::parseJson(answer.view()).value_or(Value())[0];
}

std::size_t CachedResultSet::resultSetSize() const
{
    return answer.size() - std::string_view("[]").size();
}

float scaleAsSent(double scale)
{
    return scale > 0 ? std::strtof(fmt::format("{:.1f}", scale).c_str(), nullptr) : 0;
}

CachedUse useOf(const CachedResultSet& set, std::size_t typedLength, float scale, Date now)
{
    const bool clockWasSetBack = now < set.storeTime;
    if (set.expireTime && (*set.expireTime <= now || clockWasSetBack)) return CachedUse::Expired;
    if (scale > 0 && scale != set.uiScale) return CachedUse::OtherScale;
    return typedLength >= set.inputLength ? CachedUse::Candidate : CachedUse::OtherInput;
}

const CachedResultSet* pickCompletion(std::span<const CachedResultSet* const> candidates)
{
    const CachedResultSet* pick = nullptr;
    for (const CachedResultSet* candidate : candidates) {
        const bool shorter = !pick || candidate->queryLength < pick->queryLength;
        const bool better = pick && candidate->queryLength == pick->queryLength && candidate->completionScore > 0 &&
                            candidate->completionScore > pick->completionScore;
        if (shorter || better) pick = candidate;
    }
    return pick;
}

} // namespace tavrin
