#pragma once

#include <cstdint>
#include <span>
#include <type_traits>

#include "platform/values/Value.h"
#include "searchrecords/ZREnums.h"

/// The strings that stand for the values of the records' enumerations in uploads. They are format. Any thread.
namespace tavrin {

/// The strings of an enumeration, by value. Made on first use; copies of them share the text.
template <class E> [[nodiscard]] std::span<const platform::Value> enumStrings();

template <> std::span<const platform::Value> enumStrings<SearchViewAppearTrigger>();
template <> std::span<const platform::Value> enumStrings<SearchViewDisappearTrigger>();
template <> std::span<const platform::Value> enumStrings<CardViewDisappearTrigger>();
template <> std::span<const platform::Value> enumStrings<StartSearchTrigger>();
template <> std::span<const platform::Value> enumStrings<EndpointType>();
template <> std::span<const platform::Value> enumStrings<LookupSelectionType>();
template <> std::span<const platform::Value> enumStrings<IndexType>();
template <> std::span<const platform::Value> enumStrings<ResultType>();
template <> std::span<const platform::Value> enumStrings<TopHit>();
template <> std::span<const platform::Value> enumStrings<VisibleResultsTrigger>();
template <> std::span<const platform::Value> enumStrings<ResultEngagementTrigger>();
template <> std::span<const platform::Value> enumStrings<ResultEngagementDestination>();
template <> std::span<const platform::Value> enumStrings<ResultActionTarget>();
template <> std::span<const platform::Value> enumStrings<CardEngagementTrigger>();
template <> std::span<const platform::Value> enumStrings<CardType>();
template <> std::span<const platform::Value> enumStrings<CardActionTarget>();
template <> std::span<const platform::Value> enumStrings<MapsCardFeedback>();
template <> std::span<const platform::Value> enumStrings<ProductPageResult>();
template <> std::span<const platform::Value> enumStrings<SuggestionType>();
template <> std::span<const platform::Value> enumStrings<ClearInputTrigger>();
template <> std::span<const platform::Value> enumStrings<SkipSearchTrigger>();
template <> std::span<const platform::Value> enumStrings<SectionEngagementTrigger>();
template <> std::span<const platform::Value> enumStrings<SectionHeaderType>();

/// The string of a value of any of the enumerations. A number that is none of its enumeration's, as a client may send,
/// reads as the first.
template <class... Enumerations> struct EnumToString {
    template <class E>
        requires(std::is_same_v<E, Enumerations> || ...)
    const platform::Value& operator()(E value) const
    {
        const auto strings = enumStrings<E>();
        const auto index = static_cast<std::uint64_t>(value);
        return strings[index < strings.size() ? index : 0];
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
