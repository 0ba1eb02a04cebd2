#pragma once

#include <memory>

#include "searchrecords/ZREnums.h"
#include "searchrecords/ZRFeedback.h"
#include "searchrecords/ZRSearchResult.h"

/// Cards: results opened in place, in sections.
namespace tavrin {

/// A section of a card. Feedback distinguishes sections by class only.
struct ZRCardSection : platform::RecordOf<ZRCardSection> {
    static constexpr std::string_view kClass = "ZRCardSection";
    static constexpr auto fields() { return std::tuple<>{}; }
};

/// A section of text that expands when it is engaged.
struct ZRDescriptionCardSection : platform::RecordOf<ZRDescriptionCardSection, ZRCardSection> {
    static constexpr std::string_view kClass = "ZRDescriptionCardSection";
    static constexpr auto fields() { return std::tuple<>{}; }
};

/// The user chose something in a card.
struct ZRCardSectionEngagementFeedback : platform::RecordOf<ZRCardSectionEngagementFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRCardSectionEngagementFeedback";
    CardEngagementTrigger triggerEvent = CardEngagementTrigger::Unknown;
    CardType cardType = CardType::Unknown;
    std::shared_ptr<ZRCardSection> cardSection;
    std::shared_ptr<ZRPunchout> destination; ///< what was opened: a `TAVPunchout` in cards of the service
    static constexpr auto fields()
    {
        using Self = ZRCardSectionEngagementFeedback;
        return std::tuple{
            platform::field("triggerEvent", &Self::triggerEvent), platform::field("cardType", &Self::cardType),
            platform::field("cardSection", &Self::cardSection), platform::field("destination", &Self::destination)};
    }
};

/// The user chose something in a card of the maps application.
struct ZRMapsCardSectionEngagementFeedback
    : platform::RecordOf<ZRMapsCardSectionEngagementFeedback, ZRCardSectionEngagementFeedback> {
    static constexpr std::string_view kClass = "ZRMapsCardSectionEngagementFeedback";
    MapsCardFeedback feedbackType = MapsCardFeedback::Unknown;
    static constexpr auto fields()
    {
        return std::tuple{platform::field("feedbackType", &ZRMapsCardSectionEngagementFeedback::feedbackType)};
    }
};

/// The user did something in a store's product page.
struct ZRStoreCardSectionEngagementFeedback
    : platform::RecordOf<ZRStoreCardSectionEngagementFeedback, ZRCardSectionEngagementFeedback> {
    static constexpr std::string_view kClass = "ZRStoreCardSectionEngagementFeedback";
    ProductPageResult productPageResult = ProductPageResult::CanceledProductPage;
    static constexpr auto fields()
    {
        return std::tuple{
            platform::field("productPageResult", &ZRStoreCardSectionEngagementFeedback::productPageResult)};
    }
};

/// A card disappeared.
struct ZRCardViewDisappearFeedback : platform::RecordOf<ZRCardViewDisappearFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRCardViewDisappearFeedback";
    CardViewDisappearTrigger cardViewDisappearEvent = CardViewDisappearTrigger::Unknown;
    static constexpr auto fields()
    {
        return std::tuple{
            platform::field("cardViewDisappearEvent", &ZRCardViewDisappearFeedback::cardViewDisappearEvent)};
    }
};

} // namespace tavrin
