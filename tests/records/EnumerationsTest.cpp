#include <algorithm>
#include <cctype>
#include <iterator>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "searchrecords/ZREnums.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {
namespace {

/// The compiler's text for a value: "…kValue = tavrin::CardType::Maps;…", or a number where no enumerator has it.
template <auto kValue> std::string enumeratorName()
{
    std::string text = __PRETTY_FUNCTION__;
    text.erase(0, text.find("kValue = ") + 9);
    text.erase(text.find_first_of(";]"));
    return text.starts_with('(') ? "" : text.substr(text.rfind(':') + 1);
}

/// The enumerators of E by value, from 0 up to the first value that none has.
template <class E> std::vector<std::string> enumerators()
{
    constexpr std::size_t kMore = 64;
    std::vector<std::string> names = []<std::size_t... i>(std::index_sequence<i...>)
    {
        return std::vector{enumeratorName<static_cast<E>(i)>()...};
    }
    (std::make_index_sequence<kMore>());
    names.erase(std::ranges::find(names, ""), names.end());
    return names;
}

/// "swipe_down" and "SwipeDown" alike.
std::string plain(std::string name)
{
    std::erase(name, '_');
    std::ranges::transform(name, name.begin(), [](unsigned char c) { return std::tolower(c); });
    return name;
}

/// Checks the enumerators of E against the names that the service reads at their positions. The service's name may
/// begin with more than ours has: "tophit_no" is No.
template <class E> void expectPositions(const std::string& serviceNames)
{
    std::istringstream stream(serviceNames);
    const std::vector<std::string> expected(std::istream_iterator<std::string>(stream), {});
    const std::vector<std::string> names = enumerators<E>();
    EXPECT_EQ(names.size(), expected.size()) << serviceNames;
    for (std::size_t i = 0; i < std::min(names.size(), expected.size()); ++i)
        EXPECT_TRUE(plain(expected[i]).ends_with(plain(names[i]))) << names[i] << " stands for " << expected[i];
}

TEST(Enumerations, StandAtThePositionsThatTheServiceReads)
{
    expectPositions<SearchViewAppearTrigger>(
        "unknown swipe_down today_view lock_screen breadcrumb keyboard_shortcut mouse_click_on_menu app_launch new_tab "
        "tap_to_input new_window click tab_switch orb contextual_menu lookup_hint_tap lookup_tap swipe_up swipe_left "
        "swipe_right start_composing find_popular_items pull_down_home_screen notification_center partial_pull_down "
        "unlock_device did_enter_foreground");
    expectPositions<SearchViewDisappearTrigger>(
        "unknown killed home_button task_switcher cancel escape close_window_by_keyboard close_window_by_mouse "
        "minimize_window_by_keyboard minimize_window_by_mouse switched_to_other_app quit_app lock_button "
        "click_notification_banner phone_call lost_focus done swipe_down swipe_up swipe_left swipe_right share_button "
        "device_idle did_enter_background go_to_site");
    expectPositions<CardViewDisappearTrigger>("unknown back swipe pop done replaced");
    expectPositions<StartSearchTrigger>(
        "unknown new_character ime_commit backspace voice_search dictation copy_and_paste drag_and_drop suggestion "
        "prefetch partial_suggestion lookup cross_button show_more card image_load bag unlock_device correction warm");
    expectPositions<EndpointType>("unknown tavrin google yahoo bing duckduckgo tavrin_search tavrin_image yandex baidu "
                                  "tavrin_bag tavrin_card tavrin_warm");
    expectPositions<LookupSelectionType>("lookup_default lookup_explicit lookup_hint_tap");
    expectPositions<IndexType>(
        "unknown vistrel calculator core_mirva wendral_bookmarks wendral_history lookup_dictionary");
    expectPositions<ResultType>(
        "unknown tavrin local core_vistrel ns_user_activity wendral_tophit calculator conversion "
        "dictionary_definition google yahoo bing duckduckgo yandex baidu");
    expectPositions<TopHit>("tophit_no tophit_should_be tophit_must_be");
    expectPositions<VisibleResultsTrigger>(
        "unknown result_list_updated scroll show_more peek pop show_less card_swipe click view_resized scroll_up "
        "scroll_down resume_search arrow_up arrow_down");
    expectPositions<ResultEngagementTrigger>(
        "unknown enter tap click double_click peek pop reveal arrow_up arrow_down three_fingers_tap swipe "
        "forced_after_list_update shortcut");
    expectPositions<ResultEngagementDestination>(
        "unknown card punchout none insert find_on_page last_search maps_card tunrel_sheet hosted_html_page");
    expectPositions<ResultActionTarget>("unknown directions call message play view open");
    expectPositions<CardEngagementTrigger>("unknown enter tap click double_click peek pop reveal arrow_up arrow_down");
    expectPositions<CardType>("unknown normal maps tunrel_sheet hosted_html_page");
    expectPositions<CardActionTarget>(
        "unknown body phone home_page address directions_to_here directions_from_here business_photo business_review "
        "write_a_review more_info report_a_problem preview details play buy rent artist reviews related more trailer "
        "season episode");
    expectPositions<MapsCardFeedback>(
        "unknown phone_number website add_contact share directions_to_here directions_from_here dismissed "
        "report_a_problem edit_contact delete_contact skeldor_tour all_photos photo add_photo all_reviews review "
        "write_review deal checkin more_info postal_address");
    expectPositions<ProductPageResult>(
        "canceled_product_page closed_product_page product_page_download_finished user_hit_goto_store_button "
        "user_purchased_item user_hit_custom_right_bar_button");
    expectPositions<SuggestionType>("unknown tavrin proactive recents");
    expectPositions<ClearInputTrigger>("unknown cross_button cut backspace");
    expectPositions<SkipSearchTrigger>("unknown less_than_minimum_query_length bag_disabled bag_fetch_failed cache_hit "
                                       "empty_query_input query_input_with_uri_scheme_prefix");
    expectPositions<SectionEngagementTrigger>("unknown search_in_app show_more show_less");
    expectPositions<SectionHeaderType>("unknown search_in_app show_more normal");
    expectPositions<CustomFeedbackType>("unknown wendral_autofill crowdsourcing vistrel_result_features");
}

TEST(Enumerations, SessionEndReasonsHaveTheirTexts)
{
    const std::pair<SessionEndReason, std::string_view> cases[] = {
        {SessionEndReason::NoPreviousSession, "no previous session"},
        {SessionEndReason::ExternalRequest, "external request"},
        {SessionEndReason::SessionIdle, "session idle"},
        {SessionEndReason::MaxSessionTime, "max session time passed"},
        {SessionEndReason::GuidChanged, "guid changed"},
        {SessionEndReason::CriticalMemory, "critical memory"},
        {SessionEndReason::EngagementReceived, "engagement received"},
        {static_cast<SessionEndReason>(7), "no previous session"},
        {static_cast<SessionEndReason>(-1), "no previous session"},
    };
    for (const auto& [reason, text] : cases)
        EXPECT_EQ(TavrinSessionEndFeedback::triggerEventEnumToString(reason), text);
    EXPECT_EQ(enumerators<SessionEndReason>().size(), TavrinSessionEndFeedback::eventTypes().size());
}

} // namespace
} // namespace tavrin
