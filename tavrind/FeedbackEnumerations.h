#pragma once

#include <cstdint>
#include <optional>
#include <string_view>
#include <type_traits>

#include "searchrecords/ZREnums.h"

/// The texts of enumerations as values of an upload. They stand beside the enumerations: those of records in ZREnums.h,
/// of session ends in TavrinSessionFeedback.h. Any thread.
namespace tavrin {

/// Returns the text of a value; nothing for a number without an enumerator, which a client or a damaged file may
/// contain.
template <class E> [[nodiscard]] constexpr std::optional<std::string_view> enumToString(E value)
{
    const auto index = static_cast<std::uint64_t>(value);
    return index < kTexts<E>.size() ? std::optional(kTexts<E>[index]) : std::nullopt;
}

/// `enumToString` under the name of a field's conversion, restricted to the enumerations of that field.
template <class... Enumerations> struct EnumToString {
    template <class E>
        requires(std::is_same_v<E, Enumerations> || ...)
    constexpr std::optional<std::string_view> operator()(E value) const
    {
        return enumToString(value);
    }
};

inline constexpr EnumToString<SearchViewAppearTrigger> appearEventEnumToString;
inline constexpr EnumToString<SearchViewDisappearTrigger, CardViewDisappearTrigger> disappearEventEnumToString;
inline constexpr EnumToString<StartSearchTrigger, VisibleResultsTrigger, ResultEngagementTrigger, CardEngagementTrigger,
                              ClearInputTrigger, SkipSearchTrigger, SectionEngagementTrigger>
    triggerEventEnumToString;
inline constexpr EnumToString<EndpointType> endpointTypeEnumToString;
inline constexpr EnumToString<LookupSelectionType> lookupSelectionTypeEnumToString;
inline constexpr EnumToString<IndexType> indexTypeEnumToString;
inline constexpr EnumToString<ResultType> searchResultTypeEnumToString;
inline constexpr EnumToString<TopHit> topHitEnumToString;
inline constexpr EnumToString<ResultEngagementDestination> destinationTypeEnumToString;
inline constexpr EnumToString<ResultActionTarget, CardActionTarget> actionTargetTypeEnumToString;
inline constexpr EnumToString<CardType> cardTypeEnumToString;
inline constexpr EnumToString<MapsCardFeedback> feedbackTypeEnumToString;
inline constexpr EnumToString<ProductPageResult> productPageResultEnumToString;
inline constexpr EnumToString<SuggestionType> suggestionTypeEnumToString;
inline constexpr EnumToString<SectionHeaderType> headerTypeEnumToString;

} // namespace tavrin
