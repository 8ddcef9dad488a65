"""Access decisions: requesters, the order of answers, and the entry of each answer."""
from __future__ import annotations

import enum
import socket
from collections.abc import Callable
from ctypes import create_string_buffer
from dataclasses import dataclass
from typing import NamedTuple

from ._acl import Acl
from ._entry import ANY_OTHER, EXPANDED, GROUP, UNAUTHENTICATED, USER, Entry, folded
from ._library import OK, cu
from ._permissions import PermissionSet, mask_of, to_letters


@dataclass(frozen=True)
class Requester:
    """The subject of a decision: an identity of a mechanism, in groups; Requester() is unauthenticated.

    An IPv6 host of the identity may be in any form. With through_handler, user entries are compared by the
    mechanism's handler of register_user.
    """

    mechanism: str | None = None
    identity: str | None = None
    groups: tuple[str, ...] = ()
    through_handler: bool = False

    def __post_init__(self) -> None:
        if (self.mechanism is None) != (self.identity is None):
            raise ValueError("mechanism and identity go together")
        if isinstance(self.groups, str):
            raise ValueError("groups are several names")
        if self.groups and self.identity is None:
            raise ValueError("who did not authenticate is in no group")


class Order(enum.Enum):
    """The order in which answers are taken."""

    CLOSEST = "closest"
    """the user's own entry, else the first user-expanded entry that the mechanism's handler accepts, else those of all
    groups together, else any other"""
    SUM = "sum"
    """all of them together"""


class Who(enum.Enum):
    """The party of an answer, and who decided; SUM in the order of that name."""

    USER = "user"
    EXPANDED = "expanded"
    GROUP = "group"
    ANY_OTHER = "any other"
    UNAUTHENTICATED = "unauthenticated"
    SUM = "sum"


class PartyAnswer(NamedTuple):
    """The answer of an ACL about one party."""

    party: Who
    entry: Entry | None  # as it is stored
    decides: bool
    group: str  # of a group: its name, as the requester gave it


class Answer(NamedTuple):
    """A decision: all answers, which of them decide, and the granted permissions.

    A user gets the answers user, expanded, each group in the requester's order, and any other. An unauthenticated
    requester gets the answer unauthenticated alone.
    """

    granted: int
    wanted: int
    decided_by: Who | None
    answers: tuple[PartyAnswer, ...]

    @property
    def allowed(self) -> bool:
        """Whether something was wanted and all of it is granted."""
        return self.wanted != 0 and self.granted & self.wanted == self.wanted

    def explain(self, place: Callable[[PartyAnswer], str] = lambda said: "",
                permissions: PermissionSet | None = None) -> str:
        """Explains the answer, one line per party and then the granted letters.

        A line looks like "expanded: FILE:3: e unix .x rql (decides)". place returns where an entry is, such as
        "FILE:3", or an empty string.
        """
        lines = []
        for said in self.answers:
            name = said.party.value
            if said.entry is None:
                lines.append(f"{name} {said.group}: no entry" if said.party is Who.GROUP else f"{name}: no entry")
                continue
            at = place(said)
            decides = " (decides)" if said.decides else ""
            lines.append(f"{name}: {at + ': ' if at else ''}{said.entry.line(permissions)}{decides}")
        lines.append(f"granted: {to_letters(self.granted, permissions)}".rstrip(" "))
        if self.wanted:
            lines.append(f"wanted {to_letters(self.wanted, permissions)}: {'yes' if self.allowed else 'no'}")
        return "".join(line + "\n" for line in lines)


def stored_identity(mechanism: str, identity: str) -> str:
    """An identity as Entry.create stores it for a user: "unix" and "hba2" have IPv6 hosts in canonical form.

    The host follows the first "@". Identities that Entry.create refuses are returned unchanged."""
    user, at, host = identity.partition("@")
    if not at or folded(mechanism) not in ("unix", "hba2"):
        return identity
    try:
        address = socket.inet_pton(socket.AF_INET6, host)
    except (OSError, ValueError):
        return identity
    formatted = create_string_buffer(46)
    return f"{user}@{formatted.value.decode()}" if cu.cu_ipaddr_ntop_1(address, formatted) == OK else identity


def granted(acl: Acl, whom: Requester, order: Order = Order.CLOSEST) -> int:
    """Returns what decide would grant, and queries no more than the order needs."""
    if whom.mechanism is None or whom.identity is None:
        return acl.unauthenticated() or 0
    mechanism, identity = whom.mechanism, stored_identity(whom.mechanism, whom.identity)
    questions: tuple[Callable[[], int | None], ...] = (
        lambda: acl.user(mechanism, identity, through_handler=whom.through_handler),
        lambda: acl.expanded(mechanism, identity), lambda: acl.groups(whom.groups), acl.any_other)
    total = 0
    for ask in questions:
        mask = ask()
        if mask is not None and order is Order.CLOSEST:
            return mask
        total |= mask or 0
    return total


def decide(acl: Acl, whom: Requester, wanted: int = 0, order: Order = Order.CLOSEST) -> Answer:
    """Decides what a requester may do, and returns every answer with its entry. wanted is a mask, 0 for nothing.

    The first call after a change of the Acl lists the sub-ACLs that concern the requester. To find the user-expanded
    entry that a handler accepted, the handler is called again for one entry after the other. If it then accepts none,
    the entry has no identity.
    """
    answers = _all_answers(acl, whom)
    deciding = next((said.party for said in answers if said.entry is not None), None)
    adds = order is Order.SUM and deciding not in (None, Who.UNAUTHENTICATED)
    total = 0
    weighed = []
    for said in answers:
        decides = said.entry is not None and (adds or said.party is deciding)
        weighed.append(said._replace(decides=decides))
        if said.entry is not None and decides:
            total |= said.entry.permissions
    return Answer(total, mask_of(wanted), Who.SUM if adds else deciding, tuple(weighed))


def _all_answers(acl: Acl, whom: Requester) -> list[PartyAnswer]:
    if whom.mechanism is None or whom.identity is None:
        return [_simple(Who.UNAUTHENTICATED, UNAUTHENTICATED, acl.unauthenticated())]
    mechanism, identity = whom.mechanism, stored_identity(whom.mechanism, whom.identity)

    def user(of: Acl) -> int | None:
        return of.user(mechanism, identity, through_handler=whom.through_handler)

    def expanded(of: Acl) -> int | None:
        return of.expanded(mechanism, identity)

    named = [(group, acl.groups([group])) for group in whom.groups]
    if whom.through_handler:
        own = _accepted(acl, USER, mechanism, user)
    else:
        own = _named(acl, USER, mechanism, identity, user(acl))
    return [PartyAnswer(Who.USER, own, False, ""),
            PartyAnswer(Who.EXPANDED, _accepted(acl, EXPANDED, mechanism, expanded), False, ""),
            *(PartyAnswer(Who.GROUP, _named(acl, GROUP, "", group, mask), False, group) for group, mask in named),
            _simple(Who.ANY_OTHER, ANY_OTHER, acl.any_other())]


def _simple(party: Who, type: int, mask: int | None) -> PartyAnswer:
    return PartyAnswer(party, None if mask is None else Entry(type, mask), False, "")


def _named(acl: Acl, type: int, mechanism: str, identity: str, mask: int | None) -> Entry | None:
    """The entry of a name, with the permissions that the library answered."""
    if mask is None:
        return None
    stored = acl._entries_by_name(type, mechanism).get(folded(identity), Entry(type, mask, mechanism, ""))
    return stored._replace(permissions=mask)


def _accepted(acl: Acl, type: int, mechanism: str, ask: Callable[[Acl], int | None]) -> Entry | None:
    """The entry that a handler, which only the library knows, accepted: the first that it accepts by itself."""
    mask = ask(acl)
    if mask is None:
        return None
    for entry in acl._entries_by_name(type, mechanism).values():
        with Acl() as alone:
            alone.add(entry)
            if ask(alone) is not None:
                return entry._replace(permissions=mask)
    return Entry(type, mask, mechanism, "")
