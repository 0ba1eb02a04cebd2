#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

/// The names of ranking features, kinds of client, engagement functions and result placements, and which client a user
/// agent or an identifier belongs to. Pure functions, any thread.
///
/// The two directions of a pair are not exact inverses, and some names are misspelled: the service relies on both. A
/// missing or unknown text reads as `Unknown`. Returned views point to string literals.
namespace tavrin {

enum class FeatureType : std::uint64_t { Domain = 0, MediaType = 1, Topic = 2, Unknown = 3 };
enum class ClientType : std::uint64_t { Wendral = 0, Vistrel = 1, Unknown = 2 };
enum class FunctionType : std::uint64_t { Engagements = 0, EngagementRate = 1, Unknown = 2 };
enum class ResultPlacement : std::uint64_t { Unknown = 0, Top = 1, Bottom = 2 };

using OptionalText = std::optional<std::string_view>;

/// Accepts "domain" and "tld"; "mt", and "mediatype" in any case; "topic".
[[nodiscard]] FeatureType featureTypeFromString(OptionalText text);
[[nodiscard]] std::string_view stringFromFeatureType(FeatureType type);
[[nodiscard]] ClientType clientTypeFromString(OptionalText text);
[[nodiscard]] std::string_view stringFromClientType(ClientType type);
/// Accepts "eng"; "engrate" and "eng/render", which name the same function. That prints as "eng/render".
[[nodiscard]] FunctionType funcTypeFromString(OptionalText text);
[[nodiscard]] std::string_view stringFromFunctionType(FunctionType type);
[[nodiscard]] ResultPlacement resultPlacementFromString(OptionalText text);
[[nodiscard]] std::string_view stringFromResultPlacement(ResultPlacement placement);

/// Returns "wendral" or "vistrel" if the agent contains it in any case, else "unknown". "wendral" wins over "vistrel".
[[nodiscard]] std::string_view getClientFromUserAgent(OptionalText userAgent);

/// Returns the first of "wendral", "vistrel", "kivo", "lookup", "messages", "news", "tavrind", in this order, that the
/// text contains in any case. Returns nothing if it contains none.
[[nodiscard]] std::optional<std::string_view> extractClientNameFromString(OptionalText text);

/// Returns true if `text` contains `part`, ignoring case.
[[nodiscard]] bool tavrin_caseInsensitiveContainsString(std::string_view text, std::string_view part);

} // namespace tavrin
