"""What can go wrong with a call to the daemon."""
from __future__ import annotations

from collections.abc import Mapping
from typing import TYPE_CHECKING, Any

if TYPE_CHECKING:
    from .client import Answer


class TavrinError(Exception):
    """The base of all errors that this package raises."""


class DaemonAway(TavrinError):
    """No daemon can be reached, or the connection ended during the call. The next call connects again."""


class NoAnswer(TavrinError, TimeoutError):
    """The daemon did not answer within the client's `answer_timeout`."""


class Refused(TavrinError):
    """The daemon could not decode the call: a field has a wrong type, or a limit is exceeded."""

    def __init__(self, name: str, message: str):
        super().__init__(f"{message} ({name})")
        self.name = name  #: of the D-Bus error
        self.message = message


class RequestFailed(TavrinError):
    """The daemon or the service failed to perform a request.

    `domain` and `code` identify the error. In "TAVErrorDomain", 1 means that the daemon has no bag (yet) and 500 that it
    can't make the request; other domains report failures of the network and of the response.
    """

    def __init__(self, domain: str, code: int, user_info: Mapping[str, Any], answer: Answer | None = None):
        reason = user_info.get("reason")
        self.domain = domain
        self.code = code
        self.user_info = user_info
        self.reason = reason if isinstance(reason, str) else ""
        self.answer = answer  #: what came nevertheless: of a response that is not JSON, the status if it is verbose
        super().__init__(f"{self.reason or 'failed'} ({domain} {code})")
