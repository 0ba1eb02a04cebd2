"""Results and suggestions as the service sent them, whatever their types, and the records of feedback about them."""
from __future__ import annotations

from collections.abc import Mapping
from typing import Any
from urllib.parse import urlsplit

from . import records

MAXIMUM_TEXT = 1000  # characters of a title or description; an address may have twice as many


def text_in(entry: Mapping[str, Any], key: str) -> str:
    """Returns the beginning of a text; "" if there is none."""
    value = entry.get(key)
    return value[:MAXIMUM_TEXT] if isinstance(value, str) else ""


def number_in(entry: Mapping[str, Any], key: str) -> float:
    value = entry.get(key)
    return float(value) if isinstance(value, (int, float)) and abs(value) < 1e300 else 0.0


def address_in(entry: Mapping[str, Any]) -> str:
    """Returns the URL of a result; "" if it is missing or too long: a part of an address is another address."""
    value = entry.get("url")
    return value if isinstance(value, str) and len(value) <= 2 * MAXIMUM_TEXT else ""


def is_web_address(text: str) -> bool:
    """Returns whether a text is an http or https URL without blanks and control characters: one that may be opened."""
    try:
        parts = urlsplit(text)
    except ValueError:
        return False
    return parts.scheme in ("http", "https") and bool(parts.hostname) and text.isprintable() and " " not in text


def sendable(text: str) -> str:
    """Replaces what D-Bus has no characters for."""
    return text.replace("\0", "\ufffd").encode("utf-8", "replace").decode()


def result_record(result: Mapping[str, Any], client_query_id: int = 0) -> records.ZRSearchResult:
    """Returns the record of a result of an answer. `client_query_id` is the number that the client gave the search."""
    optional = {name: sendable(text_in(result, key)) or None for name, key in
                [("identifier", "identifier"), ("sectionBundleIdentifier", "section_bundle_id"), ("resultBundleId", "bundle_id")]}
    return records.ZRSearchResult(
        **optional, queryId=client_query_id, type=records.ResultType.TAVRIN, rankingScore=number_in(result, "score"),
        title=records.ZRText(text=sendable(text_in(result, "title"))),
        punchout=records.ZRPunchout(urls=[sendable(address_in(result))]),
        customProperties=records.TAVCustomSearchResult(fbr=sendable(text_in(result, "fbr")) or None))


def suggestion_record(suggestion: Mapping[str, Any], query: str) -> records.TAVSearchSuggestion:
    """Returns the record of a suggestion for what the user had typed."""
    return records.TAVSearchSuggestion(
        identifier=sendable(text_in(suggestion, "identifier")) or None, suggestion=sendable(text_in(suggestion, "suggestion")),
        query=sendable(query), score=number_in(suggestion, "score"), type=records.SuggestionType.TAVRIN,
        fbr=sendable(text_in(suggestion, "fbr")) or None)
