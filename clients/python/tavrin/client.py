"""The client: requests, images, the bag and feedback."""
from __future__ import annotations

import asyncio
import json
import os
import re
import tempfile
from collections.abc import AsyncIterator, Callable, Iterable, Mapping
from contextlib import suppress
from dataclasses import dataclass
from functools import cached_property
from typing import Any, TypedDict, Unpack

from .errors import DaemonAway, RequestFailed, TavrinError
from .records import LookupSelectionType, Record, StartSearchTrigger
from .wire import Connection, entries

DAEMON = "com.quorvane.TAVDaemonXPC"
ENDPOINT = "com.quorvane.TAVEndpointXPC"


def default_address() -> str:
    """Returns the address of the user's daemon, which has the same default."""
    directory = os.environ.get("XDG_RUNTIME_DIR") or f"{tempfile.gettempdir()}/runtime-{os.getuid()}"
    return f"unix:path={directory}/com.quorvane.tavrind/socket"


class RequestOptions(TypedDict, total=False):
    """What every request can have."""

    client_query_id: int  #: the client's own number for the query; feedback on its results has it
    trigger_event: StartSearchTrigger
    uuid: str  #: the client's identifier of the search
    query_items: Mapping[str, str | None]  #: additional items for the HTTP query
    scale: float  #: of the screen, for images; 0 selects the main screen's
    verbose_reply: bool  #: fills in `Answer.http_request` and `Answer.http_response`
    keyboard_input_mode: str
    topics: list | dict  #: the user's top topics


@dataclass(frozen=True)
class Answer:
    """The answer to a request: the service's JSON, an array of result sets.

    The shorthands tolerate a service that sends other types: they have what is of the right type and skip the rest.
    """

    query_id: int  #: the daemon's number of the request; `Client.report` takes it
    raw: bytes | None = None  #: the JSON as sent; None if the answer is empty
    http_request: Mapping[str, Any] | None = None  #: `url`, `method`, `headers`; only if `verbose_reply` is set
    http_response: Mapping[str, Any] | None = None  #: `url`, `statusCode`, `headers`; missing if memory answered

    @property
    def is_empty(self) -> bool:
        """True if there is nothing to show: a later search overtook this one, or the service was not asked.

        The service is not asked if the text is too short, or the bag disables search.
        """
        return self.raw is None

    @cached_property
    def sets(self) -> list[dict[str, Any]]:
        return _dictionaries(_json(self.raw))

    @property
    def results(self) -> list[dict[str, Any]]:
        """The results of all sets, in order."""
        return self._all("results")

    @property
    def sections(self) -> list[dict[str, Any]]:
        return self._all("sections")

    @property
    def suggestions(self) -> list[dict[str, Any]]:
        return self._all("suggestions")

    def _all(self, key: str) -> list[dict[str, Any]]:
        return [each for one in self.sets for each in _dictionaries(one.get(key))]


@dataclass(frozen=True)
class Bag:
    """The service's configuration. A bag that could not be fetched has an `error`, and no `raw` if there is no older one."""

    raw: bytes | None  #: its JSON
    user_agent: str  #: of the client whose view it is
    error: RequestFailed | None = None

    @cached_property
    def values(self) -> dict[str, Any]:
        """All keys, as the service sent them; the object under "clients" overrides them for some clients."""
        values = _json(self.raw)
        return values if isinstance(values, dict) else {}

    @property
    def version(self) -> str:
        return str(self.values.get("version", ""))


class Client:
    """A client of the daemon. One event loop uses it.

    `identifier` and `user_agent` ("Example/1") name the program; the service gets the latter. Connections with the same
    identifier share the daemon's cache and session. `preload_images` lets the daemon fetch the images of answers ahead.
    `request_timeout` (seconds; 0 selects the service's) limits a request of the daemon to the service, `answer_timeout`
    each call to the daemon.

    The client connects with its first call, or as the context of `async with`. If the daemon stops, calls in progress
    raise `DaemonAway`, except for requests, which are made once more; the next call connects again.
    """

    def __init__(self, identifier: str, user_agent: str, *, address: str | None = None, preload_images: bool = True,
                 request_timeout: float = 0.0, answer_timeout: float | None = 60.0):
        if not identifier or not user_agent:
            raise ValueError("a client needs an identifier (\"com.example.app\") and a user agent (\"Example/1\")")
        self.address = address or default_address()
        self._configuration = entries({
            "class": "TAVSessionConfiguration", "identifier": identifier, "userAgent": user_agent,
            "dontPreloadImages": not preload_images, "timeoutIntervalForRequest": float(request_timeout)})
        self._answer_timeout = answer_timeout
        self._query_id = 0
        self._bag: Bag | None = None
        self._bag_listeners: list[Callable[[Bag | None], None]] = []
        self._connecting = asyncio.Lock()  # passes callers in order, so that calls keep theirs
        self._failure: TavrinError | None = None  # of the last attempt to connect
        self._connection: Connection | None = None
        self._endpoint_address = ""
        self._endpoint: Connection | None = None
        self._closed = False

    async def __aenter__(self) -> Client:
        await self.connect()
        return self

    async def __aexit__(self, *_: object) -> None:
        await self.close()

    async def connect(self) -> None:
        """Connects, unless the client is connected. Raises `DaemonAway`, with what to do."""
        await self._connected()

    async def close(self) -> None:
        """Ends the connection. Further calls raise `DaemonAway`; so does one that is connecting, when its attempt ends."""
        self._closed = True
        for connection in filter(None, (self._connection, self._endpoint)):
            await connection.close()
        for listener in list(self._bag_listeners):
            listener(None)

    @property
    def is_connected(self) -> bool:
        return self._connection is not None and self._connection.is_open

    # ---- Requests

    async def search(self, text: str, **options: Unpack[RequestOptions]) -> Answer:
        """Searches for what the user has typed so far; call it for every key.

        If a later search is made before the answer arrives, the answer is empty.
        """
        options.setdefault("trigger_event", StartSearchTrigger.NEW_CHARACTER)
        return await self._request("TAVSearchRequest", options, queryString=text)

    async def zero_keyword(self, **options: Unpack[RequestOptions]) -> Answer:
        """Returns what to show before the user has typed: popular results and suggestions."""
        return await self._request("TAVZeroKeywordRequest", options)

    async def more(self, url: str, **options: Unpack[RequestOptions]) -> Answer:
        """Returns more results of a section, from the `more_results_url` of the section."""
        return await self._request("TAVMoreResultsRequest", options, moreResultsURL=url)

    async def card(self, url: str, **options: Unpack[RequestOptions]) -> Answer:
        """Returns a result with its card, from the `card_url` of the result."""
        return await self._request("TAVCardRequest", options, cardURL=url)

    async def lookup(self, words: str, *, client_context: str | None = None, query_context: str | None = None,
                     hint_domain: str | None = None, selection_type: LookupSelectionType = LookupSelectionType.DEFAULT,
                     **options: Unpack[RequestOptions]) -> Answer:
        """Looks up words of a text. `client_context` says what the text is in, `query_context` is the text around."""
        return await self._request("TAVLookupRequest", options, queryString=words, clientContext=client_context,
                                   queryContext=query_context, hintDomain=hint_domain, selectionType=selection_type)

    async def flight(self, number: str, **options: Unpack[RequestOptions]) -> Answer:
        """Returns one flight, by its number."""
        return await self._request("TAVFlightLookupRequest", options, queryString=number)

    async def flights(self, text: str, **options: Unpack[RequestOptions]) -> Answer:
        """Returns the flights that match a text."""
        return await self._request("TAVFlightSearchRequest", options, queryString=text)

    async def _request(self, kind: str, options: RequestOptions, **fields: Any) -> Answer:
        request = {"class": kind, **fields}
        for name, value in options.items():
            if name not in RequestOptions.__annotations__:
                raise TypeError(f"a request has no option {name}")
            if name == "query_items":
                value = [{"class": "TAVQueryItem", "name": key, "value": each} for key, each in value.items()]
            request[re.sub("_(.)", lambda found: found[1].upper(), name)] = value
        encoded = entries(request)
        connection = await self._connected()
        self._query_id += 1
        encoded["queryId"] = ("x", self._query_id)

        async def ask() -> tuple:
            return await connection.call(DAEMON, "Request", "a{sv}", encoded, timeout=self._answer_timeout)
        try:
            query_id, reply, error = await ask()
        except DaemonAway:
            # The daemon was restarted. With the same number: a later search that was sent first stays the later one.
            connection = await self._connected()
            query_id, reply, error = await ask()
        answer = Answer(query_id, reply.get("rawResponse"), reply.get("httpRequest") or None,
                        reply.get("httpResponse") or None)
        if error:
            raise _failure(error, answer)
        return answer

    # ---- Images

    async def images(self, descriptions: Iterable[Mapping[str, Any]], *, within: float = 5.0) -> dict[str, bytes]:
        """Returns the bytes of images by "url" or "id": those that are there within so many seconds, at most 60.

        A description is what a result has under "thumbnail", "icon" and so on. The bytes are as the host sent them:
        check that they are an image.
        """
        wanted = [entries({key: each[key] for key in ("url", "id") if isinstance(each.get(key), str)})
                  for each in descriptions]
        within = min(max(within, 0.0), 60.0)
        connection = await self._connected_endpoint()
        timeout = None if self._answer_timeout is None else within + self._answer_timeout
        loaded, = await connection.call(ENDPOINT, "LoadImages", "aa{sv}t", wanted, int(within * 1e9), timeout=timeout)
        return loaded

    # ---- The bag

    async def bag(self) -> Bag:
        """Returns the bag. Waits up to a second for the first one; raises `RequestFailed` if it doesn't come."""
        connection = await self._connected()
        bag = _bag(await connection.call(DAEMON, "Bag", timeout=self._answer_timeout))
        if bag.raw is None and bag.error:
            raise bag.error
        return bag

    def on_bag(self, callback: Callable[[Bag], None]) -> Callable[[], None]:
        """Calls back with every bag that the daemon sends, and with the last one at once if there is one.

        After a restart of the daemon there are bags again from the client's next call on: a program that only listens calls
        `connect` from time to time. Returns a function that ends it.
        """
        def listener(bag: Bag | None) -> None:
            if bag:
                callback(bag)
        return self._listen(listener)

    async def bags(self) -> AsyncIterator[Bag]:
        """Yields the bag whenever the daemon sends one; a reader that is slow gets the newest. Ends with `close`.

        After a restart of the daemon it goes on with the client's next call, as `on_bag` does.
        """
        newest: asyncio.Queue[Bag | None] = asyncio.Queue(1)

        def listener(bag: Bag | None) -> None:
            with suppress(asyncio.QueueEmpty):
                newest.get_nowait()
            newest.put_nowait(bag)
        end = self._listen(listener)
        try:
            while bag := await newest.get():
                yield bag
        finally:
            end()

    def _listen(self, listener: Callable[[Bag | None], None]) -> Callable[[], None]:
        self._bag_listeners.append(listener)
        if self._bag:
            listener(self._bag)
        if self._closed:
            listener(None)

        def end() -> None:
            if listener in self._bag_listeners:
                self._bag_listeners.remove(listener)
        return end

    def _pushed(self, member: str, arguments: tuple) -> None:
        if member != "BagDidLoad":
            return
        self._bag = _bag(arguments)
        for listener in list(self._bag_listeners):
            try:
                listener(self._bag)
            except Exception as problem:
                asyncio.get_running_loop().call_exception_handler(
                    {"message": "a listener to bags failed", "exception": problem})

    # ---- Feedback

    async def report(self, feedback: Record | Mapping[str, Any], *, query_id: int = 0, event: str = "") -> None:
        """Reports what the user saw or did; returns once the event is recorded, or dropped as the service wants.

        `feedback` is a record of `tavrin.records`, or a dictionary with its "class" and fields. `query_id` is that of the
        answer that it is about. `event` is a text for people.
        """
        connection = await self._connected()
        await connection.call(DAEMON, "ReportEvent", "sxa{sv}", event, query_id, entries(feedback),
                              timeout=self._answer_timeout)

    # ---- Connections

    async def _connected(self) -> Connection:
        failure = self._failure
        async with self._connecting:
            if self._closed:
                raise DaemonAway("the client is closed")
            if self._connection is None or not self._connection.is_open:
                if self._failure and self._failure is not failure:  # what this call waited for; to try again may take as long
                    raise self._failure
                try:
                    self._connection = await self._connect()
                except TavrinError as problem:
                    self._failure = problem
                    raise
            return self._connection

    async def _connect(self) -> Connection:
        connection = await Connection.open(self.address, self._pushed)
        try:
            self._endpoint_address, = await connection.call(DAEMON, "Configure", "a{sv}", self._configuration,
                                                            timeout=self._answer_timeout)
            if self._closed:
                raise DaemonAway("the client is closed")
        except BaseException:
            await connection.close()
            raise
        return connection

    async def _connected_endpoint(self) -> Connection:
        await self._connected()
        async with self._connecting:
            if self._closed:
                raise DaemonAway("the client is closed")
            if not self._endpoint_address:
                raise DaemonAway("the daemon can't create the socket for this; its log says why. Connect again once that is mended")
            if self._endpoint is None or not self._endpoint.is_open:
                self._endpoint = await Connection.open(self._endpoint_address)
                if self._closed:
                    await self._endpoint.close()
            return self._endpoint


def _json(raw: bytes | None) -> Any:
    """Reads the service's JSON. Numbers that can't have 64 bits become floats, infinite ones if need be: an int of more than 4,300
    digits would be an error."""
    return json.loads(raw, parse_int=lambda text: int(text) if len(text) <= 20 else float(text)) if raw else None


def _dictionaries(values: Any) -> list[dict[str, Any]]:
    return [each for each in values if isinstance(each, dict)] if isinstance(values, list) else []


def _failure(error: Mapping[str, Any], answer: Answer | None = None) -> RequestFailed:
    return RequestFailed(error.get("domain", ""), error.get("code", 0), error.get("userInfo", {}), answer)


def _bag(arguments: tuple) -> Bag:
    bag, error = arguments
    return Bag(bag.get("rawBag"), bag.get("userAgent", ""), _failure(error) if error else None)
