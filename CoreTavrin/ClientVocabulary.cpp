#include "CoreTavrin/ClientVocabulary.h"

#include <algorithm>
#include <array>
#include <string>

#include "platform/text/Text.h"

namespace tavrin {

using platform::lowerCased;

FeatureType featureTypeFromString(OptionalText text)
{
    if (text == "domain" || text == "tld") return FeatureType::Domain;
    if (text && lowerCased(*text) == "mediatype") return FeatureType::MediaType;
    if (text == "mt") return FeatureType::MediaType;
    if (text == "topic") return FeatureType::Topic;
    return FeatureType::Unknown;
}

std::string_view stringFromFeatureType(FeatureType type)
{
    switch (type) {
    case FeatureType::Domain: return "domain";
    case FeatureType::MediaType: return "mediaType";
    case FeatureType::Topic: return "topic";
    default: return "unkonwn"; // the service's spelling
    }
}

ClientType clientTypeFromString(OptionalText text)
{
    if (text == "wendral") return ClientType::Wendral;
    if (text == "vistrel") return ClientType::Vistrel;
    return ClientType::Unknown;
}

std::string_view stringFromClientType(ClientType type)
{
    switch (type) {
    case ClientType::Wendral: return "wendral";
    case ClientType::Vistrel: return "vistrel";
    default: return "unknown";
    }
}

FunctionType funcTypeFromString(OptionalText text)
{
    if (text == "eng") return FunctionType::Engagements;
    if (text == "engrate" || text == "eng/render") return FunctionType::EngagementRate;
    return FunctionType::Unknown;
}

std::string_view stringFromFunctionType(FunctionType type)
{
    switch (type) {
    case FunctionType::Engagements: return "eng";
    case FunctionType::EngagementRate: return "eng/render";
    default: return "unknown";
    }
}

ResultPlacement resultPlacementFromString(OptionalText text)
{
    if (text == "top") return ResultPlacement::Top;
    if (text == "bottom") return ResultPlacement::Bottom;
    return ResultPlacement::Unknown;
}

std::string_view stringFromResultPlacement(ResultPlacement placement)
{
    switch (placement) {
    case ResultPlacement::Top: return "top";
    case ResultPlacement::Bottom: return "bottom";
    default: return "unkonw"; // the service's spelling
    }
}

std::string_view getClientFromUserAgent(OptionalText userAgent)
{
    if (!userAgent) return "unknown";
    const std::string agent = lowerCased(*userAgent);
    if (agent.contains("wendral")) return "wendral";
    if (agent.contains("vistrel")) return "vistrel";
    return "unknown";
}

std::optional<std::string_view> extractClientNameFromString(OptionalText text)
{
    static constexpr std::array<std::string_view, 7> kNames{"wendral",  "vistrel", "kivo",   "lookup",
                                                            "messages", "news",    "tavrind"};
    if (!text) return std::nullopt;
    const std::string lowered = lowerCased(*text);
    const auto* found = std::ranges::find_if(kNames, [&](std::string_view name) { return lowered.contains(name); });
    return found == kNames.end() ? std::nullopt : std::optional(*found);
}

bool tavrin_caseInsensitiveContainsString(std::string_view text, std::string_view part)
{
    return lowerCased(text).contains(lowerCased(part));
}

} // namespace tavrin
