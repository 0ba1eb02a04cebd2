#pragma once

#include <optional>
#include <string>

#include "searchrecords/ZREnums.h"
#include "searchrecords/ZRFeedback.h"

/// Events of the search view and its input field, and custom records.
namespace tavrin {

struct ZRSearchViewAppearFeedback : platform::RecordOf<ZRSearchViewAppearFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRSearchViewAppearFeedback";
    SearchViewAppearTrigger viewAppearEvent = SearchViewAppearTrigger::Unknown;
    bool isOnLockScreen = false;
    bool isOverApp = false;
    static constexpr auto fields()
    {
        using Self = ZRSearchViewAppearFeedback;
        return std::tuple{platform::field("viewAppearEvent", &Self::viewAppearEvent),
                          platform::field("isOnLockScreen", &Self::isOnLockScreen),
                          platform::field("isOverApp", &Self::isOverApp)};
    }
};

struct ZRSearchViewDisappearFeedback : platform::RecordOf<ZRSearchViewDisappearFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRSearchViewDisappearFeedback";
    SearchViewDisappearTrigger viewDisappearEvent = SearchViewDisappearTrigger::Unknown;
    static constexpr auto fields()
    {
        return std::tuple{platform::field("viewDisappearEvent", &ZRSearchViewDisappearFeedback::viewDisappearEvent)};
    }
};

struct ZRClearInputFeedback : platform::RecordOf<ZRClearInputFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRClearInputFeedback";
    ClearInputTrigger triggerEvent = ClearInputTrigger::Unknown;
    static constexpr auto fields()
    {
        return std::tuple{platform::field("triggerEvent", &ZRClearInputFeedback::triggerEvent)};
    }
};

/// The user opened the typed site without a search.
struct ZRDidGoToSiteFeedback : platform::RecordOf<ZRDidGoToSiteFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRDidGoToSiteFeedback";
    std::optional<std::string> input;
    static constexpr auto fields() { return std::tuple{platform::field("input", &ZRDidGoToSiteFeedback::input)}; }
};

/// A record whose content is JSON made by the client.
struct ZRCustomFeedback : platform::RecordOf<ZRCustomFeedback, ZRFeedback> {
    static constexpr std::string_view kClass = "ZRCustomFeedback";
    CustomFeedbackType feedbackType = CustomFeedbackType::Unknown;
    platform::Value jsonFeedback; ///< a dictionary, uploaded unchanged
    static constexpr auto fields()
    {
        using Self = ZRCustomFeedback;
        return std::tuple{platform::field("feedbackType", &Self::feedbackType),
                          platform::field("jsonFeedback", &Self::jsonFeedback)};
    }
};

} // namespace tavrin
