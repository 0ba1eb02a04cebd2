"""A client of tavrind, the search daemon.

    import asyncio
    import tavrin

    async def main():
        async with tavrin.Client("com.example.app", "Example/1") as client:
            answer = await client.search("weather")
            for result in answer.results:
                print(result["title"], result["url"])

    asyncio.run(main())

`tavrin.blocking` has the same client for programs without an event loop, `tavrin.records` the records of feedback.
"""
from .client import Answer, Bag, Client, RequestOptions, default_address
from .errors import DaemonAway, NoAnswer, Refused, RequestFailed, TavrinError
from .records import StartSearchTrigger

__all__ = ["Answer", "Bag", "Client", "DaemonAway", "NoAnswer", "Refused", "RequestFailed", "RequestOptions",
           "StartSearchTrigger", "TavrinError", "default_address"]
