"""The daemon's D-Bus: values, and one connection. Programs use `Client`."""
from __future__ import annotations

import asyncio
import itertools
import select
import urllib.parse
from collections.abc import Callable, Mapping, Sequence
from typing import Any

from jeepney import DBusAddress, HeaderFields, Message, MessageType, Parser, new_method_call
from jeepney.auth import AuthenticationError, Authenticator, BEGIN

from .errors import DaemonAway, NoAnswer, Refused
from .records import Record

NAME = "com.quorvane.tavrind"  # required by the library; the daemon accepts any
PATH = "/com/quorvane/tavrind"
CONNECT_TIMEOUT = 30.0  # seconds: the socket may have to start the daemon
MAXIMUM_CALL = 8 << 20  # bytes; the daemon ends the connection beyond it
MAXIMUM_ANSWER = 64 << 20  # bytes; images in one answer have 16 MiB


def entries(record: Mapping[str, Any] | Record) -> dict[str, tuple[str, Any]]:
    """Encodes a dictionary or record as a{sv}. Entries that are None are left out."""
    if isinstance(record, Record):
        record = record.to_dict()
    return {_text(key): variant(value) for key, value in record.items() if value is not None}


def variant(value: Any) -> tuple[str, Any]:
    """Encodes a value as a variant. Raises TypeError or ValueError if D-Bus has no such value."""
    if value is None:
        return "a{sv}", {}
    if isinstance(value, bool):
        return "b", value
    if isinstance(value, int):
        if not -(1 << 63) <= value < 1 << 64:
            raise ValueError(f"{value} has more than 64 bits")
        return ("x", int(value)) if value < 1 << 63 else ("t", int(value))
    if isinstance(value, float):
        return "d", value
    if isinstance(value, str):
        return "s", _text(value)
    if isinstance(value, (bytes, bytearray, memoryview)):
        return "ay", bytes(value)
    if isinstance(value, (Mapping, Record)):
        return "a{sv}", entries(value)
    if isinstance(value, Sequence):
        return "av", [variant(each) for each in value]
    raise TypeError(f"the daemon's values have no {type(value).__name__}")


def _text(value: str) -> str:
    if not isinstance(value, str):
        raise TypeError(f"a name or text is a str, not {type(value).__name__}")
    if "\0" in value or not value.isascii() and any("\ud800" <= character <= "\udfff" for character in value):
        raise ValueError("a text for the daemon may have neither NUL nor single surrogates")
    return value


def plain(value: Any) -> Any:
    """Decodes what the library parsed: variants lose their types."""
    if isinstance(value, tuple):
        return plain(value[1])
    if isinstance(value, dict):
        return {key: plain(each) for key, each in value.items()}
    if isinstance(value, list):
        return [plain(each) for each in value]
    return value


def socket_path(address: str) -> str:
    """Returns the path in a D-Bus address "unix:path=…"."""
    for alternative in address.split(";"):
        transport, _, options = alternative.partition(":")
        for option in options.split(",") if transport == "unix" else ():
            key, _, value = option.partition("=")
            if key == "path" and value:
                return urllib.parse.unquote(value)
    raise ValueError(f"{address!r} is no address of a Unix socket; expected unix:path=…")


class Connection:
    """A connection to a socket of the daemon, on one event loop.

    It is open from `open` until `close`, or until the daemon ends it; then `lost` says why, and all pending and further
    calls raise `DaemonAway`. Calls are sent in the order in which they are made.
    """

    def __init__(self, reader: asyncio.StreamReader, writer: asyncio.StreamWriter,
                 on_signal: Callable[[str, tuple], None] | None):
        self.lost: str | None = None
        self._reader, self._writer, self._on_signal = reader, writer, on_signal
        self._serials = itertools.count(1)
        self._pending: dict[int, asyncio.Future[Message]] = {}
        self._receiver: asyncio.Task[None] | None = None
        self._hangup = select.poll()
        self._hangup.register(writer.get_extra_info("socket"), select.POLLRDHUP)

    @classmethod
    async def open(cls, address: str, on_signal: Callable[[str, tuple], None] | None = None) -> Connection:
        """Connects and authenticates. `on_signal` is called with a signal's member and arguments; it must not raise.

        Raises `DaemonAway`, which says how to start the daemon.
        """
        path = socket_path(address)
        try:
            async with asyncio.timeout(CONNECT_TIMEOUT):
                reader, writer = await asyncio.open_unix_connection(path)
                try:
                    await _authenticate(reader, writer)
                except BaseException:
                    writer.close()
                    raise
        except (OSError, EOFError, AuthenticationError) as problem:
            cause = getattr(problem, "strerror", None) or str(problem) or f"nothing within {CONNECT_TIMEOUT:g} s"
            raise DaemonAway(f"no daemon answers at {path} ({cause}). Start it with "
                             '"systemctl --user start tavrind.socket", or run tavrind.') from problem
        connection = cls(reader, writer, on_signal)
        connection._receiver = asyncio.create_task(connection._receive())
        return connection

    @property
    def is_open(self) -> bool:
        """False once the daemon has gone, even if the loop has not run since and `lost` is not set yet."""
        return not self.lost and not self._hangup.poll(0)

    async def close(self) -> None:
        """Ends the connection. May be called twice."""
        self._end("the connection is closed")
        if self._receiver:
            self._receiver.cancel()
            await asyncio.gather(self._receiver, return_exceptions=True)

    async def call(self, interface: str, member: str, signature: str | None = None, *arguments: Any,
                   timeout: float | None) -> tuple:
        """Calls a method and returns its results; variants in them have lost their types. `timeout` is in seconds.

        Raises `DaemonAway`, `Refused` or `NoAnswer`; ValueError for a message that is too large.
        """
        if self.lost:
            raise DaemonAway(f"{member} was not sent: {self.lost}")
        serial = next(self._serials)
        data = new_method_call(DBusAddress(PATH, NAME, interface), member, signature, arguments).serialise(serial)
        if len(data) > MAXIMUM_CALL:
            raise ValueError(f"{member} has {len(data)} bytes; the daemon accepts {MAXIMUM_CALL}")
        answer = self._pending[serial] = asyncio.get_running_loop().create_future()
        try:
            async with asyncio.timeout(timeout):
                self._writer.write(data)
                await self._writer.drain()
                message = await answer
        except TimeoutError as expired:
            raise NoAnswer(f"no answer to {member} within {timeout:g} s") from expired
        except (OSError, EOFError) as problem:
            answer.cancel()  # its exception, if any, was just taken
            self._end("the daemon closed the connection")
            raise DaemonAway(f"the daemon closed the connection during {member}") from problem
        finally:
            del self._pending[serial]
        if message.header.message_type is MessageType.error:
            text = message.body[0] if message.body and isinstance(message.body[0], str) else "no reason given"
            raise Refused(message.header.fields.get(HeaderFields.error_name, ""), text)
        return tuple(plain(each) for each in message.body)

    async def _receive(self) -> None:
        parser = Parser()
        try:
            while data := await self._reader.read(1 << 18):
                for message in parser.feed(data):
                    self._dispatch(message)
                if parser.bytes_desired() > MAXIMUM_ANSWER:
                    raise ValueError("a message is too large")
            self._end("the daemon closed the connection")
        except OSError as problem:
            self._end(f"the connection broke: {problem.strerror}")
        except Exception as problem:  # whatever the parser raises for bytes that are no message
            self._end(f"the daemon sent what is no D-Bus message: {problem}")

    def _dispatch(self, message: Message) -> None:
        if message.header.message_type is MessageType.signal:
            if self._on_signal:
                self._on_signal(message.header.fields[HeaderFields.member], tuple(plain(each) for each in message.body))
        elif answer := self._pending.get(message.header.fields.get(HeaderFields.reply_serial)):
            if not answer.done():
                answer.set_result(message)

    def _end(self, reason: str) -> None:
        self.lost = self.lost or reason
        for answer in self._pending.values():
            if not answer.done():
                answer.set_exception(EOFError(reason))
        self._writer.close()


async def _authenticate(reader: asyncio.StreamReader, writer: asyncio.StreamWriter) -> None:
    authenticator = Authenticator()
    for line in authenticator:
        writer.write(line)
        data = await reader.read(1024)
        if not data:
            raise EOFError("it closed the connection")
        authenticator.feed(data)
    writer.write(BEGIN)
