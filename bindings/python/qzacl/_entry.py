"""Entries of an ACL."""
from __future__ import annotations

import locale
from ctypes import POINTER, byref
from typing import NamedTuple

from ._library import Acle, Error, NO_ENTRY, check, from_utf8, lib, to_utf8
from ._permissions import PermissionSet, mask_of, to_letters

UNAUTHENTICATED, ANY_OTHER, USER, EXPANDED, GROUP = 1, 2, 4, 8, 16
TYPE_LETTERS = {UNAUTHENTICATED: "n", ANY_OTHER: "o", USER: "u", EXPANDED: "e", GROUP: "g"}


class Entry(NamedTuple):
    """An entry: its type, mechanism and identity, and its permissions as a mask. str() returns its line of a file."""

    type: int  # UNAUTHENTICATED, ANY_OTHER, USER, EXPANDED or GROUP
    permissions: int
    mechanism: str = ""  # of types USER and EXPANDED
    identity: str = ""  # of types USER, EXPANDED and GROUP

    @classmethod
    def create(cls, type: int, permissions: int, mechanism: str = "", identity: str = "") -> Entry:
        """An entry as sec_create_acle makes it: checked, and with an IPv6 host of "unix" and "hba2" in its one form.

        The texts must be ones that the locale's code set has; else UnicodeEncodeError is raised.
        """
        made = POINTER(Acle)()
        code_set = locale.nl_langinfo(locale.CODESET)
        to_utf8(mechanism + identity)  # refuses NUL
        check(lib.sec_create_acle(type, mask_of(permissions), mechanism.encode(code_set), identity.encode(code_set),
                                  byref(made)))
        try:
            return cls.from_c(made.contents)
        finally:
            lib.sec_release_acle(made)

    @classmethod
    def from_c(cls, record: Acle) -> Entry:
        return cls(record.type, record.perm_mask, from_utf8(record.mechanism), from_utf8(record.identity))

    def to_c(self) -> Acle:
        mechanism = to_utf8(self.mechanism)
        if len(mechanism) > 16:
            raise Error(NO_ENTRY, reason=f"a mechanism of more than 16 bytes: {self.mechanism}")
        return Acle(mask_of(self.permissions), mechanism, self.type, to_utf8(self.identity) if self.identity else None)

    def line(self, permissions: PermissionSet | None = None) -> str:
        """The words of a line: single blanks, mechanism in lower case, letters in the order of their bits."""
        letters = to_letters(self.permissions, permissions)
        words = (TYPE_LETTERS[self.type], folded(self.mechanism), self.identity, letters)
        return " ".join(word for word in words if word)

    def __str__(self) -> str:
        return self.line()


_FOLDING = str.maketrans("ABCDEFGHIJKLMNOPQRSTUVWXYZ", "abcdefghijklmnopqrstuvwxyz")


def folded(name: str) -> str:
    """A name as it is compared: A to Z without regard to case, everything else as it is."""
    return name.translate(_FOLDING)
