"""Identity handlers: what user-expanded entries of a mechanism mean, and how its user entries are compared."""
from __future__ import annotations

import sys
from collections.abc import Callable
from typing import Any

from ._entry import folded
from ._library import HANDLER_EXPANDED, HANDLER_USER, Compare, check, from_utf8, lib, to_utf8

_kept: list[Any] = []  # registered for the life of the process, so these are never let go


def register_expanded(mechanism: str, matches: Callable[[str, str], bool]) -> None:
    """Defines what user-expanded entries of the mechanism match: matches(requested, entry) returns whether they do.

    Without a handler they match nobody. If a mechanism has several handlers, the first one counts. If it raises, the
    entry does not match, and sys.excepthook shows the exception.
    """
    _register(HANDLER_EXPANDED, mechanism, lambda requested, entry: 0 if matches(requested, entry) else 1)


def register_user(mechanism: str, compare: Callable[[str, str], int]) -> None:
    """Compares user entries of the mechanism where an evaluation asks for it (through_handler): 0 is a match.

    The sign of any other result of compare(requested, entry) is their order, which must agree with that of the stored
    entries (ascending, A to Z folded): a negative one ends the search. Otherwise as register_expanded.
    """
    _register(HANDLER_USER, mechanism, compare)


def _register(kind: int, mechanism: str, compare: Callable[[str, str], int]) -> None:
    def guarded(requested: bytes, entry: bytes) -> int:
        try:
            return max(-1, min(1, compare(from_utf8(requested), from_utf8(entry))))
        except BaseException:  # whatever left this function would be a match to its caller
            sys.excepthook(*sys.exc_info())
            return 1

    _kept.append(Compare(guarded))
    check(lib.sec__register_id_handler(kind, to_utf8(mechanism), _kept[-1]))


def domain(requested: str, entry: str) -> bool:
    """For register_expanded: the host equals the entry, or the entry begins with a dot and the host ends with it.

    The host follows the last "@"; an identity without one matches nothing. The case of A to Z does not matter."""
    _, at, host = folded(requested).rpartition("@")
    end = folded(entry)
    return bool(at and host) and (host == end or end.startswith(".") and host.endswith(end))


def exact(requested: str, entry: str) -> bool:
    """For register_expanded: the identity equals the entry, except for the case of A to Z."""
    return folded(requested) == folded(entry)
