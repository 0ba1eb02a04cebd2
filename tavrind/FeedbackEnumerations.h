#pragma once

#include <array>
#include <cstdint>
#include <span>
#include <type_traits>
#include <utility>

#include "platform/values/Value.h"
#include "searchrecords/ZREnums.h"

/// The texts of enumerations as values of an upload. They stand beside the enumerations: those of records in ZREnums.h,
/// of session ends in TavrinSessionFeedback.h. Any thread.
namespace tavrin {

/// Returns the texts of an enumeration, by value. They are created on first use; copies share the text.
template <class E> [[nodiscard]] std::span<const platform::Value> enumStrings()
{
    static const auto strings = []<std::size_t... I>(std::index_sequence<I...>) {
        return std::array{platform::Value(kTexts<E>[I])...};
    }(std::make_index_sequence<kTexts<E>.size()>());
    return strings;
}

/// Returns the text of a value; null for a number without an enumerator, which a client or a damaged file may contain.
template <class E> [[nodiscard]] const platform::Value& enumToString(E value)
{
    static const platform::Value kNone;
    const auto strings = enumStrings<E>();
    const auto index = static_cast<std::uint64_t>(value);
    return index < strings.size() ? strings[index] : kNone;
}

/// `enumToString` under the name of a field's conversion, restricted to the enumerations of that field.
template <class... Enumerations> struct EnumToString {
    template <class E>
        requires(std::is_same_v<E, Enumerations> || ...)
    const platform::Value& operator()(E value) const
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
