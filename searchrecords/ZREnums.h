#pragma once

#include <array>
#include <cstdint>
#include <string_view>

/// The enumerations of search and feedback records, each with its texts.
///
/// Clients send the number of a value; the service receives the text at that index. Both are part of the format: append
/// new values at the end. A client's record may hold a number without an enumerator; the number is kept.
namespace tavrin {

/// The texts of an enumeration, by value.
template <class E> inline constexpr std::array<std::string_view, 0> kTexts{};

template <class... Text> consteval std::array<std::string_view, sizeof...(Text)> texts(Text... text)
{
    return {text...};
}

/// What made the search view appear.
enum class SearchViewAppearTrigger : std::int64_t {
    Unknown,
    SwipeDown,
    TodayView,
    LockScreen,
    Breadcrumb,
    KeyboardShortcut,
    MouseClickOnMenu,
    AppLaunch,
    NewTab,
    TapToInput,
    NewWindow,
    Click,
    TabSwitch,
    Orb,
    ContextualMenu,
    LookupHintTap,
    LookupTap,
    SwipeUp,
    SwipeLeft,
    SwipeRight,
    StartComposing,
    FindPopularItems,
    PullDownHomeScreen,
    NotificationCenter,
    PartialPullDown,
    UnlockDevice,
    DidEnterForeground,
};
template <>
inline constexpr auto kTexts<SearchViewAppearTrigger> =
    texts("unknown", "swipe_down", "today_view", "lock_screen", "breadcrumb", "keyboard_shortcut",
          "mouse_click_on_menu", "app_launch", "new_tab", "tap_to_input", "new_window", "click", "tab_switch", "orb",
          "contextual_menu", "lookup_hint_tap", "lookup_tap", "swipe_up", "swipe_left", "swipe_right",
          "start_composing", "find_popular_items", "pull_down_home_screen", "notification_center", "partial_pull_down",
          "unlock_device", "did_enter_foreground");

/// What made the search view disappear.
enum class SearchViewDisappearTrigger : std::int64_t {
    Unknown,
    Killed,
    HomeButton,
    TaskSwitcher,
    Cancel,
    Escape,
    CloseWindowByKeyboard,
    CloseWindowByMouse,
    MinimizeWindowByKeyboard,
    MinimizeWindowByMouse,
    SwitchedToOtherApp,
    QuitApp,
    LockButton,
    ClickNotificationBanner,
    PhoneCall,
    LostFocus,
    Done,
    SwipeDown,
    SwipeUp,
    SwipeLeft,
    SwipeRight,
    ShareButton,
    DeviceIdle,
    DidEnterBackground,
    GoToSite,
};
template <>
inline constexpr auto kTexts<SearchViewDisappearTrigger> =
    texts("unknown", "killed", "home_button", "task_switcher", "cancel", "escape", "close_window_by_keyboard",
          "close_window_by_mouse", "minimize_window_by_keyboard", "minimize_window_by_mouse", "switched_to_other_app",
          "quit_app", "lock_button", "click_notification_banner", "phone_call", "lost_focus", "done", "swipe_down",
          "swipe_up", "swipe_left", "swipe_right", "share_button", "device_idle", "did_enter_background", "go_to_site");

/// What made a card disappear.
enum class CardViewDisappearTrigger : std::int64_t { Unknown, Back, Swipe, Pop, Done, Replaced };
template <>
inline constexpr auto kTexts<CardViewDisappearTrigger> = texts("unknown", "back", "swipe", "pop", "done", "replaced");

/// What made a search start.
enum class StartSearchTrigger : std::int64_t {
    Unknown,
    NewCharacter,
    ImeCommit,
    Backspace,
    VoiceSearch,
    Dictation,
    CopyAndPaste,
    DragAndDrop,
    Suggestion,
    Prefetch,
    PartialSuggestion,
    Lookup,
    CrossButton,
    ShowMore,
    Card,
    ImageLoad,
    Bag,
    UnlockDevice,
    Correction,
    Warm,
};
template <>
inline constexpr auto kTexts<StartSearchTrigger> =
    texts("unknown", "new_character", "ime_commit", "backspace", "voice_search", "dictation", "copy_and_paste",
          "drag_and_drop", "suggestion", "prefetch", "partial_suggestion", "lookup", "cross_button", "show_more",
          "card", "image_load", "bag", "unlock_device", "correction", "warm");

/// The destination of a network request.
enum class EndpointType : std::int64_t {
    Unknown,
    Tavrin,
    Google,
    Yahoo,
    Bing,
    DuckDuckGo,
    TavrinSearch,
    TavrinImage,
    Yandex,
    Baidu,
    TavrinBag,
    TavrinCard,
    TavrinWarm,
};
template <>
inline constexpr auto kTexts<EndpointType> =
    texts("unknown", "tavrin", "google", "yahoo", "bing", "duckduckgo", "tavrin_search", "tavrin_image", "yandex",
          "baidu", "tavrin_bag", "tavrin_card", "tavrin_warm");

/// How the words of a lookup were chosen.
enum class LookupSelectionType : std::int64_t { Default, Explicit, HintTap };
template <>
inline constexpr auto kTexts<LookupSelectionType> = texts("lookup_default", "lookup_explicit", "lookup_hint_tap");

/// The index that a local search uses.
enum class IndexType : std::int64_t {
    Unknown,
    Vistrel,
    Calculator,
    CoreMirva,
    WendralBookmarks,
    WendralHistory,
    LookupDictionary,
};
template <>
inline constexpr auto kTexts<IndexType> = texts("unknown", "vistrel", "calculator", "core_mirva", "wendral_bookmarks",
                                                "wendral_history", "lookup_dictionary");

/// Where a result comes from.
enum class ResultType : std::int64_t {
    Unknown,
    Tavrin,
    Local,
    CoreVistrel,
    UserActivity,
    WendralTopHit,
    Calculator,
    Conversion,
    DictionaryDefinition,
    Google,
    Yahoo,
    Bing,
    DuckDuckGo,
    Yandex,
    Baidu,
};
template <>
inline constexpr auto kTexts<ResultType> =
    texts("unknown", "tavrin", "local", "core_vistrel", "ns_user_activity", "wendral_tophit", "calculator",
          "conversion", "dictionary_definition", "google", "yahoo", "bing", "duckduckgo", "yandex", "baidu");

/// Whether a result stands above all others.
enum class TopHit : std::int64_t { No, ShouldBe, MustBe };
template <> inline constexpr auto kTexts<TopHit> = texts("tophit_no", "tophit_should_be", "tophit_must_be");

/// What brought results into view.
enum class VisibleResultsTrigger : std::int64_t {
    Unknown,
    ResultListUpdated,
    Scroll,
    ShowMore,
    Peek,
    Pop,
    ShowLess,
    CardSwipe,
    Click,
    ViewResized,
    ScrollUp,
    ScrollDown,
    ResumeSearch,
    ArrowUp,
    ArrowDown,
};
template <>
inline constexpr auto kTexts<VisibleResultsTrigger> =
    texts("unknown", "result_list_updated", "scroll", "show_more", "peek", "pop", "show_less", "card_swipe", "click",
          "view_resized", "scroll_up", "scroll_down", "resume_search", "arrow_up", "arrow_down");

/// How a result was engaged.
enum class ResultEngagementTrigger : std::int64_t {
    Unknown,
    Enter,
    Tap,
    Click,
    DoubleClick,
    Peek,
    Pop,
    Reveal,
    ArrowUp,
    ArrowDown,
    ThreeFingersTap,
    Swipe,
    ForcedAfterListUpdate,
    Shortcut,
};
template <>
inline constexpr auto kTexts<ResultEngagementTrigger> =
    texts("unknown", "enter", "tap", "click", "double_click", "peek", "pop", "reveal", "arrow_up", "arrow_down",
          "three_fingers_tap", "swipe", "forced_after_list_update", "shortcut");

/// Where the engagement of a result led.
enum class ResultEngagementDestination : std::int64_t {
    Unknown,
    Card,
    Punchout,
    None,
    Insert,
    FindOnPage,
    LastSearch,
    MapsCard,
    TunrelSheet,
    HostedHtmlPage,
};
template <>
inline constexpr auto kTexts<ResultEngagementDestination> =
    texts("unknown", "card", "punchout", "none", "insert", "find_on_page", "last_search", "maps_card", "tunrel_sheet",
          "hosted_html_page");

/// What the engaged action of a result does.
enum class ResultActionTarget : std::int64_t { Unknown, Directions, Call, Message, Play, View, Open };
template <>
inline constexpr auto kTexts<ResultActionTarget> =
    texts("unknown", "directions", "call", "message", "play", "view", "open");

/// How a card was engaged.
enum class CardEngagementTrigger : std::int64_t {
    Unknown,
    Enter,
    Tap,
    Click,
    DoubleClick,
    Peek,
    Pop,
    Reveal,
    ArrowUp,
    ArrowDown,
};
template <>
inline constexpr auto kTexts<CardEngagementTrigger> =
    texts("unknown", "enter", "tap", "click", "double_click", "peek", "pop", "reveal", "arrow_up", "arrow_down");

/// The kind of an engaged card.
enum class CardType : std::int64_t { Unknown, Normal, Maps, TunrelSheet, HostedHtmlPage };
template <>
inline constexpr auto kTexts<CardType> = texts("unknown", "normal", "maps", "tunrel_sheet", "hosted_html_page");

/// The part of a card that was engaged.
enum class CardActionTarget : std::int64_t {
    Unknown,
    Body,
    Phone,
    HomePage,
    Address,
    DirectionsToHere,
    DirectionsFromHere,
    BusinessPhoto,
    BusinessReview,
    WriteAReview,
    MoreInfo,
    ReportAProblem,
    Preview,
    Details,
    Play,
    Buy,
    Rent,
    Artist,
    Reviews,
    Related,
    More,
    Trailer,
    Season,
    Episode,
};
template <>
inline constexpr auto kTexts<CardActionTarget> =
    texts("unknown", "body", "phone", "home_page", "address", "directions_to_here", "directions_from_here",
          "business_photo", "business_review", "write_a_review", "more_info", "report_a_problem", "preview", "details",
          "play", "buy", "rent", "artist", "reviews", "related", "more", "trailer", "season", "episode");

/// The part of a maps card that was engaged.
enum class MapsCardFeedback : std::int64_t {
    Unknown,
    PhoneNumber,
    Website,
    AddContact,
    Share,
    DirectionsToHere,
    DirectionsFromHere,
    Dismissed,
    ReportAProblem,
    EditContact,
    DeleteContact,
    SkeldorTour,
    AllPhotos,
    Photo,
    AddPhoto,
    AllReviews,
    Review,
    WriteReview,
    Deal,
    Checkin,
    MoreInfo,
    PostalAddress,
};
template <>
inline constexpr auto kTexts<MapsCardFeedback> =
    texts("unknown", "phone_number", "website", "add_contact", "share", "directions_to_here", "directions_from_here",
          "dismissed", "report_a_problem", "edit_contact", "delete_contact", "skeldor_tour", "all_photos", "photo",
          "add_photo", "all_reviews", "review", "write_review", "deal", "checkin", "more_info", "postal_address");

/// How a store's product page ended.
enum class ProductPageResult : std::int64_t {
    CanceledProductPage,
    ClosedProductPage,
    ProductPageDownloadFinished,
    UserHitGotoStoreButton,
    UserPurchasedItem,
    UserHitCustomRightBarButton,
};
template <>
inline constexpr auto kTexts<ProductPageResult> =
    texts("canceled_product_page", "closed_product_page", "product_page_download_finished",
          "user_hit_goto_store_button", "user_purchased_item", "user_hit_custom_right_bar_button");

/// Where a suggestion comes from.
enum class SuggestionType : std::int64_t { Unknown, Tavrin, Proactive, Recents };
template <> inline constexpr auto kTexts<SuggestionType> = texts("unknown", "tavrin", "proactive", "recents");

/// What emptied the input field.
enum class ClearInputTrigger : std::int64_t { Unknown, CrossButton, Cut, Backspace };
template <> inline constexpr auto kTexts<ClearInputTrigger> = texts("unknown", "cross_button", "cut", "backspace");

/// Why a request was not sent to the service.
enum class SkipSearchTrigger : std::int64_t {
    Unknown,
    LessThanMinimumQueryLength,
    BagDisabled,
    BagFetchFailed,
    CacheHit,
    EmptyQueryInput,
    QueryInputWithUriSchemePrefix,
};
template <>
inline constexpr auto kTexts<SkipSearchTrigger> =
    texts("unknown", "less_than_minimum_query_length", "bag_disabled", "bag_fetch_failed", "cache_hit",
          "empty_query_input", "query_input_with_uri_scheme_prefix");

/// How a section was engaged.
enum class SectionEngagementTrigger : std::int64_t { Unknown, SearchInApp, ShowMore, ShowLess };
template <>
inline constexpr auto kTexts<SectionEngagementTrigger> = texts("unknown", "search_in_app", "show_more", "show_less");

/// What a section's header offers.
enum class SectionHeaderType : std::int64_t { Unknown, SearchInApp, ShowMore, Normal };
template <> inline constexpr auto kTexts<SectionHeaderType> = texts("unknown", "search_in_app", "show_more", "normal");

/// What a custom record is about.
enum class CustomFeedbackType : std::int64_t { Unknown, WendralAutofill, Crowdsourcing, VistrelResultFeatures };

} // namespace tavrin
