"""The client for programs without an event loop.

    from tavrin import blocking

    with blocking.Client("com.example.app", "Example/1") as client:
        print(client.search("weather").results)
"""
from __future__ import annotations

import asyncio
import functools
import inspect
from typing import Any

from . import client, errors


class Client:
    """A `tavrin.Client` whose methods block: same arguments, results and errors. One thread uses it.

    It listens to the daemon only during its calls; programs that want pushed bags use `tavrin.Client`.
    """

    def __init__(self, *arguments: Any, **options: Any):
        self._closed = False
        self._runner = asyncio.Runner()
        try:
            self._client = self._runner.run(_make(*arguments, **options))
        except BaseException:
            self._runner.close()
            raise

    def __enter__(self) -> Client:
        return self

    def __exit__(self, *_: object) -> None:
        self.close()

    def __getattr__(self, name: str) -> Any:
        member = getattr(self._client, name)
        if not inspect.iscoroutinefunction(member):
            return member

        @functools.wraps(member)
        def blocking(*arguments: Any, **options: Any) -> Any:
            if self._closed:
                raise errors.DaemonAway("the client is closed")
            return self._runner.run(member(*arguments, **options))
        return blocking

    def close(self) -> None:
        """Ends the connection. Further calls raise `DaemonAway`. May be called twice."""
        if self._closed:
            return
        self._closed = True
        self._runner.run(self._client.close())
        self._runner.close()


async def _make(*arguments: Any, **options: Any) -> client.Client:
    made = client.Client(*arguments, **options)
    await made.connect()
    return made
