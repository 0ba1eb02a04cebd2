"""The records of feedback. Written by clients/python/make-records; don't edit.

Fields have the names that they have for the daemon. A field that is not set is not sent.
"""
from __future__ import annotations

from collections.abc import Mapping
from dataclasses import dataclass, field, fields
from enum import IntEnum
from typing import Any


@dataclass(kw_only=True)
class Record:
    """The base of all records."""

    def to_dict(self) -> dict[str, Any]:
        """Returns the record as a dictionary with its "class" and the fields that are set."""
        values = {each.name: getattr(self, each.name) for each in fields(self)}
        return {"class": type(self).__name__, **{name: value for name, value in values.items() if value or value == ""}}


class SearchViewAppearTrigger(IntEnum):
    """What made the search view appear."""

    UNKNOWN = 0
    SWIPE_DOWN = 1
    TODAY_VIEW = 2
    LOCK_SCREEN = 3
    BREADCRUMB = 4
    KEYBOARD_SHORTCUT = 5
    MOUSE_CLICK_ON_MENU = 6
    APP_LAUNCH = 7
    NEW_TAB = 8
    TAP_TO_INPUT = 9
    NEW_WINDOW = 10
    CLICK = 11
    TAB_SWITCH = 12
    ORB = 13
    CONTEXTUAL_MENU = 14
    LOOKUP_HINT_TAP = 15
    LOOKUP_TAP = 16
    SWIPE_UP = 17
    SWIPE_LEFT = 18
    SWIPE_RIGHT = 19
    START_COMPOSING = 20
    FIND_POPULAR_ITEMS = 21
    PULL_DOWN_HOME_SCREEN = 22
    NOTIFICATION_CENTER = 23
    PARTIAL_PULL_DOWN = 24
    UNLOCK_DEVICE = 25
    DID_ENTER_FOREGROUND = 26


class SearchViewDisappearTrigger(IntEnum):
    """What made the search view disappear."""

    UNKNOWN = 0
    KILLED = 1
    HOME_BUTTON = 2
    TASK_SWITCHER = 3
    CANCEL = 4
    ESCAPE = 5
    CLOSE_WINDOW_BY_KEYBOARD = 6
    CLOSE_WINDOW_BY_MOUSE = 7
    MINIMIZE_WINDOW_BY_KEYBOARD = 8
    MINIMIZE_WINDOW_BY_MOUSE = 9
    SWITCHED_TO_OTHER_APP = 10
    QUIT_APP = 11
    LOCK_BUTTON = 12
    CLICK_NOTIFICATION_BANNER = 13
    PHONE_CALL = 14
    LOST_FOCUS = 15
    DONE = 16
    SWIPE_DOWN = 17
    SWIPE_UP = 18
    SWIPE_LEFT = 19
    SWIPE_RIGHT = 20
    SHARE_BUTTON = 21
    DEVICE_IDLE = 22
    DID_ENTER_BACKGROUND = 23
    GO_TO_SITE = 24


class CardViewDisappearTrigger(IntEnum):
    """What made a card disappear."""

    UNKNOWN = 0
    BACK = 1
    SWIPE = 2
    POP = 3
    DONE = 4
    REPLACED = 5


class StartSearchTrigger(IntEnum):
    """What made a search start."""

    UNKNOWN = 0
    NEW_CHARACTER = 1
    IME_COMMIT = 2
    BACKSPACE = 3
    VOICE_SEARCH = 4
    DICTATION = 5
    COPY_AND_PASTE = 6
    DRAG_AND_DROP = 7
    SUGGESTION = 8
    PREFETCH = 9
    PARTIAL_SUGGESTION = 10
    LOOKUP = 11
    CROSS_BUTTON = 12
    SHOW_MORE = 13
    CARD = 14
    IMAGE_LOAD = 15
    BAG = 16
    UNLOCK_DEVICE = 17
    CORRECTION = 18
    WARM = 19


class EndpointType(IntEnum):
    """The receiver of a network request."""

    UNKNOWN = 0
    TAVRIN = 1
    GOOGLE = 2
    YAHOO = 3
    BING = 4
    DUCK_DUCK_GO = 5
    TAVRIN_SEARCH = 6
    TAVRIN_IMAGE = 7
    YANDEX = 8
    BAIDU = 9
    TAVRIN_BAG = 10
    TAVRIN_CARD = 11
    TAVRIN_WARM = 12


class LookupSelectionType(IntEnum):
    """How the words of a lookup were chosen."""

    DEFAULT = 0
    EXPLICIT = 1
    HINT_TAP = 2


class IndexType(IntEnum):
    """The index that a local search uses."""

    UNKNOWN = 0
    VISTREL = 1
    CALCULATOR = 2
    CORE_MIRVA = 3
    WENDRAL_BOOKMARKS = 4
    WENDRAL_HISTORY = 5
    LOOKUP_DICTIONARY = 6


class ResultType(IntEnum):
    """Where a result comes from."""

    UNKNOWN = 0
    TAVRIN = 1
    LOCAL = 2
    CORE_VISTREL = 3
    USER_ACTIVITY = 4
    WENDRAL_TOP_HIT = 5
    CALCULATOR = 6
    CONVERSION = 7
    DICTIONARY_DEFINITION = 8
    GOOGLE = 9
    YAHOO = 10
    BING = 11
    DUCK_DUCK_GO = 12
    YANDEX = 13
    BAIDU = 14


class TopHit(IntEnum):
    """Whether a result is shown above all others."""

    NO = 0
    SHOULD_BE = 1
    MUST_BE = 2


class VisibleResultsTrigger(IntEnum):
    """What brought results into view."""

    UNKNOWN = 0
    RESULT_LIST_UPDATED = 1
    SCROLL = 2
    SHOW_MORE = 3
    PEEK = 4
    POP = 5
    SHOW_LESS = 6
    CARD_SWIPE = 7
    CLICK = 8
    VIEW_RESIZED = 9
    SCROLL_UP = 10
    SCROLL_DOWN = 11
    RESUME_SEARCH = 12
    ARROW_UP = 13
    ARROW_DOWN = 14


class ResultEngagementTrigger(IntEnum):
    """How a result was engaged."""

    UNKNOWN = 0
    ENTER = 1
    TAP = 2
    CLICK = 3
    DOUBLE_CLICK = 4
    PEEK = 5
    POP = 6
    REVEAL = 7
    ARROW_UP = 8
    ARROW_DOWN = 9
    THREE_FINGERS_TAP = 10
    SWIPE = 11
    FORCED_AFTER_LIST_UPDATE = 12
    SHORTCUT = 13


class ResultEngagementDestination(IntEnum):
    """Where the engagement of a result led."""

    UNKNOWN = 0
    CARD = 1
    PUNCHOUT = 2
    NONE = 3
    INSERT = 4
    FIND_ON_PAGE = 5
    LAST_SEARCH = 6
    MAPS_CARD = 7
    TUNREL_SHEET = 8
    HOSTED_HTML_PAGE = 9


class ResultActionTarget(IntEnum):
    """What the engaged action of a result does."""

    UNKNOWN = 0
    DIRECTIONS = 1
    CALL = 2
    MESSAGE = 3
    PLAY = 4
    VIEW = 5
    OPEN = 6


class CardEngagementTrigger(IntEnum):
    """How a card was engaged."""

    UNKNOWN = 0
    ENTER = 1
    TAP = 2
    CLICK = 3
    DOUBLE_CLICK = 4
    PEEK = 5
    POP = 6
    REVEAL = 7
    ARROW_UP = 8
    ARROW_DOWN = 9


class CardType(IntEnum):
    """The kind of an engaged card."""

    UNKNOWN = 0
    NORMAL = 1
    MAPS = 2
    TUNREL_SHEET = 3
    HOSTED_HTML_PAGE = 4


class MapsCardFeedback(IntEnum):
    """The part of a maps card that was engaged."""

    UNKNOWN = 0
    PHONE_NUMBER = 1
    WEBSITE = 2
    ADD_CONTACT = 3
    SHARE = 4
    DIRECTIONS_TO_HERE = 5
    DIRECTIONS_FROM_HERE = 6
    DISMISSED = 7
    REPORT_APROBLEM = 8
    EDIT_CONTACT = 9
    DELETE_CONTACT = 10
    SKELDOR_TOUR = 11
    ALL_PHOTOS = 12
    PHOTO = 13
    ADD_PHOTO = 14
    ALL_REVIEWS = 15
    REVIEW = 16
    WRITE_REVIEW = 17
    DEAL = 18
    CHECKIN = 19
    MORE_INFO = 20
    POSTAL_ADDRESS = 21


class ProductPageResult(IntEnum):
    """How a store's product page ended."""

    CANCELED_PRODUCT_PAGE = 0
    CLOSED_PRODUCT_PAGE = 1
    PRODUCT_PAGE_DOWNLOAD_FINISHED = 2
    USER_HIT_GOTO_STORE_BUTTON = 3
    USER_PURCHASED_ITEM = 4
    USER_HIT_CUSTOM_RIGHT_BAR_BUTTON = 5


class SuggestionType(IntEnum):
    """Where a suggestion comes from."""

    UNKNOWN = 0
    TAVRIN = 1
    PROACTIVE = 2
    RECENTS = 3


class ClearInputTrigger(IntEnum):
    """What emptied the input field."""

    UNKNOWN = 0
    CROSS_BUTTON = 1
    CUT = 2
    BACKSPACE = 3


class SkipSearchTrigger(IntEnum):
    """Why a request was not sent to the service."""

    UNKNOWN = 0
    LESS_THAN_MINIMUM_QUERY_LENGTH = 1
    BAG_DISABLED = 2
    BAG_FETCH_FAILED = 3
    CACHE_HIT = 4
    EMPTY_QUERY_INPUT = 5
    QUERY_INPUT_WITH_URI_SCHEME_PREFIX = 6


class SectionEngagementTrigger(IntEnum):
    """How a section was engaged."""

    UNKNOWN = 0
    SEARCH_IN_APP = 1
    SHOW_MORE = 2
    SHOW_LESS = 3


class SectionHeaderType(IntEnum):
    """What a section's header offers."""

    UNKNOWN = 0
    SEARCH_IN_APP = 1
    SHOW_MORE = 2
    NORMAL = 3


class CustomFeedbackType(IntEnum):
    """What a custom record is about."""

    UNKNOWN = 0
    WENDRAL_AUTOFILL = 1
    CROWDSOURCING = 2
    VISTREL_RESULT_FEATURES = 3


@dataclass(kw_only=True)
class ZRFeedback(Record):
    """Something happened; there are no details."""

    timestamp: int = 0  #: nanoseconds of CLOCK_MONOTONIC; 0 is the time of arrival


@dataclass(kw_only=True)
class ZRSearchViewAppearFeedback(ZRFeedback):
    """The search view appeared."""

    viewAppearEvent: SearchViewAppearTrigger | int = 0
    isOnLockScreen: bool = False
    isOverApp: bool = False


@dataclass(kw_only=True)
class ZRSearchViewDisappearFeedback(ZRFeedback):
    """The search view disappeared."""

    viewDisappearEvent: SearchViewDisappearTrigger | int = 0


@dataclass(kw_only=True)
class ZRClearInputFeedback(ZRFeedback):
    """The input field was emptied."""

    triggerEvent: ClearInputTrigger | int = 0


@dataclass(kw_only=True)
class ZRDidGoToSiteFeedback(ZRFeedback):
    """The user opened the typed site without a search."""

    input: str | None = None


@dataclass(kw_only=True)
class ZRCustomFeedback(ZRFeedback):
    """An event whose JSON the client defines."""

    feedbackType: CustomFeedbackType | int = 0
    jsonFeedback: Any = None  #: a dictionary, sent unchanged


@dataclass(kw_only=True)
class ZRStartSearchFeedback(ZRFeedback):
    """A search began."""

    input: str | None = None  #: what the user had typed
    triggerEvent: StartSearchTrigger | int = 0
    uuid: str | None = None  #: of this search
    queryId: int = 0  #: the client's own number for the query, 0 for none


@dataclass(kw_only=True)
class ZREndSearchFeedback(ZRFeedback):
    """A search ended; `uuid` identifies its start."""

    uuid: str | None = None  #: of the search that ends


@dataclass(kw_only=True)
class ZRStartLocalSearchFeedback(ZRStartSearchFeedback):
    """A search of an index on the device began."""

    indexType: IndexType | int = 0


@dataclass(kw_only=True)
class ZREndLocalSearchFeedback(ZREndSearchFeedback):
    """A search of an index on the device ended."""


@dataclass(kw_only=True)
class ZRStartNetworkSearchFeedback(ZRStartSearchFeedback):
    """The client sent a request to a service on the network."""

    url: str | None = None
    headers: Any = None  #: dictionary of strings
    endpoint: EndpointType | int = 0


@dataclass(kw_only=True)
class ZREndNetworkSearchFeedback(ZREndSearchFeedback):
    """The response arrived, or the request failed."""

    responseSize: int = 0  #: bytes of the body
    statusCode: int = 0  #: 0 without a response
    networkTimingData: Any = None  #: marks of the load by name ([timing.md](../timing.md))


@dataclass(kw_only=True)
class ZRVisibleResultsFeedback(ZRFeedback):
    """Results came into view."""

    triggerEvent: VisibleResultsTrigger | int = 0
    results: list[ZRSearchResult] = field(default_factory=list)


@dataclass(kw_only=True)
class ZRResultRankingFeedback(ZRFeedback):
    """How one result was ranked; part of `ZRSectionRankingFeedback`."""

    result: ZRSearchResult | None = None
    localResultPosition: int = 0  #: within the section, before the service's ranking
    hiddenResults: list[ZRSearchResult] = field(default_factory=list)  #: left out in favour of this one
    duplicateResults: list[ZRSearchResult] = field(default_factory=list)  #: the same thing from elsewhere


@dataclass(kw_only=True)
class ZRSectionRankingFeedback(ZRFeedback):
    """How one section was ranked; part of `ZRRankingFeedback`."""

    section: ZRResultSection | None = None
    localSectionPosition: int = 0  #: before the service's ranking
    results: list[ZRResultRankingFeedback] = field(default_factory=list)


@dataclass(kw_only=True)
class ZRRankingFeedback(ZRFeedback):
    """Sections were ranked."""

    sections: list[ZRSectionRankingFeedback] = field(default_factory=list)
    blendingDuration: float = 0.0  #: seconds that local and remote results took to blend


@dataclass(kw_only=True)
class ZRResultEngagementFeedback(ZRFeedback):
    """The user chose a result, or one of its actions."""

    result: ZRSearchResult | None = None
    triggerEvent: ResultEngagementTrigger | int = 0
    destination: ResultEngagementDestination | int = 0
    actionEngaged: ZRActionItem | None = None  #: missing for the result itself
    actionTarget: ResultActionTarget | int = 0  #: what that action does


@dataclass(kw_only=True)
class ZRResultsReceivedAfterTimeoutFeedback(ZRFeedback):
    """Results arrived too late to be shown."""

    results: list[ZRSearchResult] = field(default_factory=list)


@dataclass(kw_only=True)
class ZRLateSectionsAppendedFeedback(ZRFeedback):
    """Sections arrived late and were appended to those shown."""

    sections: list[ZRResultSection] = field(default_factory=list)


@dataclass(kw_only=True)
class ZRSectionEngagementFeedback(ZRFeedback):
    """The user chose something in a section's header."""

    section: ZRResultSection | None = None
    triggerEvent: SectionEngagementTrigger | int = 0


@dataclass(kw_only=True)
class ZRVisibleSectionHeaderFeedback(ZRFeedback):
    """A section's header came into view."""

    section: ZRResultSection | None = None
    headerType: SectionHeaderType | int = 0


@dataclass(kw_only=True)
class ZRVisibleSuggestionsFeedback(ZRFeedback):
    """Suggestions came into view."""

    suggestions: list[ZRSearchSuggestion] = field(default_factory=list)


@dataclass(kw_only=True)
class ZRSuggestionEngagementFeedback(ZRFeedback):
    """The user chose a suggestion."""

    suggestion: ZRSearchSuggestion | None = None


@dataclass(kw_only=True)
class ZRCardSectionEngagementFeedback(ZRFeedback):
    """The user chose something in a card."""

    triggerEvent: CardEngagementTrigger | int = 0
    cardType: CardType | int = 0
    cardSection: ZRCardSection | None = None
    destination: ZRPunchout | None = None  #: what was opened: a `TAVPunchout` in cards of the service


@dataclass(kw_only=True)
class ZRMapsCardSectionEngagementFeedback(ZRCardSectionEngagementFeedback):
    """The same in a card of the maps application."""

    feedbackType: MapsCardFeedback | int = 0


@dataclass(kw_only=True)
class ZRStoreCardSectionEngagementFeedback(ZRCardSectionEngagementFeedback):
    """The same in a store's product page."""

    productPageResult: ProductPageResult | int = 0


@dataclass(kw_only=True)
class ZRCardViewDisappearFeedback(ZRFeedback):
    """A card disappeared."""

    cardViewDisappearEvent: CardViewDisappearTrigger | int = 0


@dataclass(kw_only=True)
class ZRErrorFeedback(ZRFeedback):
    """Something failed."""

    error: Mapping[str, Any] | None = None


@dataclass(kw_only=True)
class TAVSkipSearchFeedback(ZRFeedback):
    """A request was not sent to the service."""

    input: str | None = None  #: what the user had typed
    triggerEvent: SkipSearchTrigger | int = 0
    uuid: str | None = None  #: of the search whose answer was used again


@dataclass(kw_only=True)
class TAVLookupStartNetworkSearchFeedback(ZRStartNetworkSearchFeedback):
    """A lookup was sent."""

    selectionType: LookupSelectionType | int = 0


@dataclass(kw_only=True)
class TAVEndNetworkSearchFeedback(ZREndNetworkSearchFeedback):
    """The service's response arrived; it has information about itself."""

    tavrinStatus: str | None = None  #: "OK", "ERROR"
    tavrinDuration: float = 0.0  #: time that the service took, in its own unit
    fbq: str | None = None  #: the service's opaque note on the query, sent back to it
    partialClientIp: str | None = None


@dataclass(kw_only=True)
class TAVRankerFeedback(ZRRankingFeedback):
    """The client's ranker ranked a response."""

    timedOut: bool = False
    resultCount: int = 0  #: results ranked
    duration: int = 0  #: in the client's own unit


@dataclass(kw_only=True)
class TAVCacheHitFeedback(ZRFeedback):
    """The client answered a search from its own memory."""

    uuid: str | None = None  #: of the search whose answer was used again


@dataclass(kw_only=True)
class ZRCardSection(Record):
    """A section of a card. Feedback distinguishes sections by their class only."""


@dataclass(kw_only=True)
class ZRDescriptionCardSection(ZRCardSection):
    """A section of running text, which expands when it is engaged."""


@dataclass(kw_only=True)
class ZRText(Record):
    """A text, as shown to the user."""

    text: str | None = None


@dataclass(kw_only=True)
class ZRPunchout(Record):
    """A destination outside the search view that an engagement opens."""

    bundleIdentifier: str | None = None  #: of the application that opens it
    urls: list[str] = field(default_factory=list)  #: ways to open it, the one the client prefers first


@dataclass(kw_only=True)
class ZRActionItem(Record):
    """An action of a result: call, directions, play."""

    label: str | None = None
    punchout: ZRPunchout | None = None  #: what the action opens


@dataclass(kw_only=True)
class ZRSearchResult(Record):
    """One result."""

    identifier: str | None = None
    queryId: int = 0  #: the client's number of the query that found it, 0 for none
    type: ResultType | int = 0
    rankingScore: float = 0.0
    topHit: TopHit | int = 0
    title: ZRText | None = None
    sectionBundleIdentifier: str | None = None
    resultBundleId: str | None = None
    applicationBundleIdentifier: str | None = None  #: of the application that the result is in
    isLocalApplicationResult: bool = False  #: the result is an application installed here
    publiclyIndexable: bool = False
    correctedQuery: str | None = None  #: the query that found it, if it isn't the one typed
    staticCorrection: bool = False  #: that correction came from a fixed list
    punchout: ZRPunchout | None = None  #: what engaging the result opens
    localFeatures: Any = None  #: what the device's ranking knows of it
    customProperties: Record | None = None


@dataclass(kw_only=True)
class ZRResultSection(Record):
    """Results that are shown under one header."""

    identifier: str | None = None
    bundleIdentifier: str | None = None
    score: float = 0.0
    results: list[ZRSearchResult] = field(default_factory=list)


@dataclass(kw_only=True)
class ZRSearchSuggestion(Record):
    """A text that the user can search for instead of the typed one."""

    identifier: str | None = None
    suggestion: str | None = None  #: the words
    query: str | None = None  #: what the user had typed
    score: float = 0.0
    type: SuggestionType | int = 0


@dataclass(kw_only=True)
class TAVSearchSuggestion(ZRSearchSuggestion):
    """A suggestion of the service."""

    fbr: str | None = None  #: the service's opaque note on the suggestion, sent back to it


@dataclass(kw_only=True)
class TAVCustomSearchResult(Record):
    """The custom properties of a result of the service."""

    fbr: str | None = None  #: the service's opaque note on the result, sent back to it


@dataclass(kw_only=True)
class TAVPunchout(ZRPunchout):
    """A destination in a card of the service."""

    actionTarget: str | None = None
