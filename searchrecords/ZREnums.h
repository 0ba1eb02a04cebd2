#pragma once

#include <cstdint>

/// The enumerations of search and feedback records. Values are positions: clients send the number, the service reads
/// the name at that position, so order is format and new values go to the end. A record read from outside may hold a
/// number beyond the last value; it is kept as it is.
namespace tavrin {

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

/// What made a card disappear.
enum class CardViewDisappearTrigger : std::int64_t { Unknown, Back, Swipe, Pop, Done, Replaced };

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

/// Whom a network request goes to.
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

/// How the words of a lookup were chosen.
enum class LookupSelectionType : std::int64_t { Default, Explicit, HintTap };

/// The index behind a local search.
enum class IndexType : std::int64_t {
    Unknown,
    Vistrel,
    Calculator,
    CoreMirva,
    WendralBookmarks,
    WendralHistory,
    LookupDictionary,
};

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

/// Whether a result stands above all others.
enum class TopHit : std::int64_t { No, ShouldBe, MustBe };

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

/// What the engaged action of a result does.
enum class ResultActionTarget : std::int64_t { Unknown, Directions, Call, Message, Play, View, Open };

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

/// The kind of an engaged card.
enum class CardType : std::int64_t { Unknown, Normal, Maps, TunrelSheet, HostedHtmlPage };

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

/// How a store's product page ended.
enum class ProductPageResult : std::int64_t {
    CanceledProductPage,
    ClosedProductPage,
    ProductPageDownloadFinished,
    UserHitGotoStoreButton,
    UserPurchasedItem,
    UserHitCustomRightBarButton,
};

/// Where a suggestion comes from.
enum class SuggestionType : std::int64_t { Unknown, Tavrin, Proactive, Recents };

/// What emptied the input field.
enum class ClearInputTrigger : std::int64_t { Unknown, CrossButton, Cut, Backspace };

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

/// How a section was engaged.
enum class SectionEngagementTrigger : std::int64_t { Unknown, SearchInApp, ShowMore, ShowLess };

/// What a section's header offers.
enum class SectionHeaderType : std::int64_t { Unknown, SearchInApp, ShowMore, Normal };

/// What a custom record is about.
enum class CustomFeedbackType : std::int64_t { Unknown, WendralAutofill, Crowdsourcing, VistrelResultFeatures };

} // namespace tavrin
