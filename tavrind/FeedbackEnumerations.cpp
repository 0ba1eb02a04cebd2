#include "tavrind/FeedbackEnumerations.h"

#include <array>

namespace tavrin {

namespace {

/// Makes the table of an enumeration, with the strings made once, so that every event shares them.
template <class... S> auto tableOf(S... strings)
{
    return std::array{platform::Value(strings)...};
}

} // namespace

template <> std::span<const platform::Value> enumStrings<SearchViewAppearTrigger>()
{
    static const auto kTable =
        tableOf("unknown", "swipe_down", "today_view", "lock_screen", "breadcrumb", "keyboard_shortcut",
                "mouse_click_on_menu", "app_launch", "new_tab", "tap_to_input", "new_window", "click", "tab_switch",
                "orb", "contextual_menu", "lookup_hint_tap", "lookup_tap", "swipe_up", "swipe_left", "swipe_right",
                "start_composing", "find_popular_items", "pull_down_home_screen", "notification_center",
                "partial_pull_down", "unlock_device", "did_enter_foreground");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<SearchViewDisappearTrigger>()
{
    static const auto kTable = tableOf(
        "unknown", "killed", "home_button", "task_switcher", "cancel", "escape", "close_window_by_keyboard",
        "close_window_by_mouse", "minimize_window_by_keyboard", "minimize_window_by_mouse", "switched_to_other_app",
        "quit_app", "lock_button", "click_notification_banner", "phone_call", "lost_focus", "done", "swipe_down",
        "swipe_up", "swipe_left", "swipe_right", "share_button", "device_idle", "did_enter_background", "go_to_site");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<CardViewDisappearTrigger>()
{
    static const auto kTable = tableOf("unknown", "back", "swipe", "pop", "done", "replaced");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<StartSearchTrigger>()
{
    static const auto kTable =
        tableOf("unknown", "new_character", "ime_commit", "backspace", "voice_search", "dictation", "copy_and_paste",
                "drag_and_drop", "suggestion", "prefetch", "partial_suggestion", "lookup", "cross_button", "show_more",
                "card", "image_load", "bag", "unlock_device", "correction", "warm");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<EndpointType>()
{
    static const auto kTable = tableOf("unknown", "tavrin", "google", "yahoo", "bing", "duckduckgo", "tavrin_search",
                                       "tavrin_image", "yandex", "baidu", "tavrin_bag", "tavrin_card", "tavrin_warm");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<LookupSelectionType>()
{
    static const auto kTable = tableOf("lookup_default", "lookup_explicit", "lookup_hint_tap");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<IndexType>()
{
    static const auto kTable = tableOf("unknown", "vistrel", "calculator", "core_mirva", "wendral_bookmarks",
                                       "wendral_history", "lookup_dictionary");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<ResultType>()
{
    static const auto kTable =
        tableOf("unknown", "tavrin", "local", "core_vistrel", "ns_user_activity", "wendral_tophit", "calculator",
                "conversion", "dictionary_definition", "google", "yahoo", "bing", "duckduckgo", "yandex", "baidu");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<TopHit>()
{
    static const auto kTable = tableOf("tophit_no", "tophit_should_be", "tophit_must_be");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<VisibleResultsTrigger>()
{
    static const auto kTable =
        tableOf("unknown", "result_list_updated", "scroll", "show_more", "peek", "pop", "show_less", "card_swipe",
                "click", "view_resized", "scroll_up", "scroll_down", "resume_search", "arrow_up", "arrow_down");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<ResultEngagementTrigger>()
{
    static const auto kTable =
        tableOf("unknown", "enter", "tap", "click", "double_click", "peek", "pop", "reveal", "arrow_up", "arrow_down",
                "three_fingers_tap", "swipe", "forced_after_list_update", "shortcut");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<ResultEngagementDestination>()
{
    static const auto kTable = tableOf("unknown", "card", "punchout", "none", "insert", "find_on_page", "last_search",
                                       "maps_card", "tunrel_sheet", "hosted_html_page");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<ResultActionTarget>()
{
    static const auto kTable = tableOf("unknown", "directions", "call", "message", "play", "view", "open");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<CardEngagementTrigger>()
{
    static const auto kTable =
        tableOf("unknown", "enter", "tap", "click", "double_click", "peek", "pop", "reveal", "arrow_up", "arrow_down");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<CardType>()
{
    static const auto kTable = tableOf("unknown", "normal", "maps", "tunrel_sheet", "hosted_html_page");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<CardActionTarget>()
{
    static const auto kTable = tableOf("unknown", "body", "phone", "home_page", "address", "directions_to_here",
                                       "directions_from_here", "business_photo", "business_review", "write_a_review",
                                       "more_info", "report_a_problem", "preview", "details", "play", "buy", "rent",
                                       "artist", "reviews", "related", "more", "trailer", "season", "episode");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<MapsCardFeedback>()
{
    static const auto kTable = tableOf(
        "unknown", "phone_number", "website", "add_contact", "share", "directions_to_here", "directions_from_here",
        "dismissed", "report_a_problem", "edit_contact", "delete_contact", "skeldor_tour", "all_photos", "photo",
        "add_photo", "all_reviews", "review", "write_review", "deal", "checkin", "more_info", "postal_address");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<ProductPageResult>()
{
    static const auto kTable =
        tableOf("canceled_product_page", "closed_product_page", "product_page_download_finished",
                "user_hit_goto_store_button", "user_purchased_item", "user_hit_custom_right_bar_button");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<SuggestionType>()
{
    static const auto kTable = tableOf("unknown", "tavrin", "proactive", "recents");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<ClearInputTrigger>()
{
    static const auto kTable = tableOf("unknown", "cross_button", "cut", "backspace");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<SkipSearchTrigger>()
{
    static const auto kTable = tableOf("unknown", "less_than_minimum_query_length", "bag_disabled", "bag_fetch_failed",
                                       "cache_hit", "empty_query_input", "query_input_with_uri_scheme_prefix");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<SectionEngagementTrigger>()
{
    static const auto kTable = tableOf("unknown", "search_in_app", "show_more", "show_less");
    return kTable;
}

template <> std::span<const platform::Value> enumStrings<SectionHeaderType>()
{
    static const auto kTable = tableOf("unknown", "search_in_app", "show_more", "normal");
    return kTable;
}

} // namespace tavrin
