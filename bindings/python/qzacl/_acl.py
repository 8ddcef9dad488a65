"""An ACL in memory: reading, writing, listing, editing, comparing, and the questions of the C interface."""
from __future__ import annotations

import ctypes
import fcntl
import itertools
import os
import weakref
from collections.abc import Callable, Iterable, Iterator
from ctypes import byref, c_uint32
from types import TracebackType
from typing import Any

from . import _library as c
from ._entry import ANY_OTHER, EXPANDED, GROUP, UNAUTHENTICATED, USER, Entry, folded
from ._library import Buffer, Error, check, lib, to_utf8
from ._permissions import PermissionSet, in_c, to_letters, to_mask

_LONGEST_LINE = 1096  # bytes, with its end
_SPACES = " \t\n\v\f\r"


class Acl:
    """An ACL, empty or from a file, a text or bytes. close, the end of a with block, or its last use releases it."""

    def __init__(self) -> None:
        self._buffer = Buffer()
        self._release = weakref.finalize(self, c.release, self._buffer)
        self._frozen = False
        self._listed: dict[tuple[int, str], dict[str, Entry]] = {}

    # ---- Reading and writing ----

    @classmethod
    def read(cls, path: str | os.PathLike[str], user: str | None = None, *, permissions: PermissionSet | None = None,
             cache: bool = False, write_cache: bool = False) -> Acl:
        """Reads a file, or with a user a bare file name in that user's home directory.

        cache permits reading the compiled cache file, whose bytes are checked. write_cache also writes a missing or
        stale one. Use neither unless every program reads the file with the library's own permissions: a cache file does
        not record the set that compiled it, and with another set its bits mean something else.
        """
        acl, name = cls(), os.fsencode(path)
        if b"\0" in name:
            raise ValueError("embedded NUL")
        flags = c.READ_CONVERT if cache or write_cache else c.READ_TEXT
        if write_cache:
            flags |= c.READ_CACHE
        check(lib.sec_read_acl_file(name, None if user is None else to_utf8(user), in_c(permissions), flags,
                                    byref(acl._buffer), None))
        return acl

    @classmethod
    def from_text(cls, lines: str | bytes, permissions: PermissionSet | None = None) -> Acl:
        """Reads the text of an ACL file from memory. Needs /proc."""
        encoded = lines if isinstance(lines, bytes) else lines.encode(errors="surrogateescape")
        with os.fdopen(_memory_file(), "wb") as file:
            file.write(encoded)
            file.flush()
            return cls.read(f"/proc/self/fd/{file.fileno()}", permissions=permissions)

    @classmethod
    def from_bytes(cls, data: bytes) -> Acl:
        """Takes compiled bytes from elsewhere, in either byte order, and checks them. None at all are an empty ACL."""
        acl = cls()
        if not data:
            return acl
        check(lib.sec_read_acl_from_data(len(data), data, byref(acl._buffer)))
        check(lib.sec_convert_acl_to_host(0, byref(acl._buffer)))
        check(lib.sec_convert_acl_to_host(1, byref(acl._buffer)))
        return acl

    def __bytes__(self) -> bytes:
        """The compiled bytes; none for an ACL to which nothing was added."""
        return ctypes.string_at(self._buffer.data, self._buffer.length) if self._buffer.length else b""

    def to_text(self, permissions: PermissionSet | None = None) -> str:
        """Returns a text that compiles to the same bytes. Raises Error 43 for an entry that no line can hold."""
        subacls = [list(entries) for _, entries in itertools.groupby(self, lambda e: (e.type, folded(e.mechanism)))]
        return "".join(_line_of(entry, permissions) for entries in reversed(subacls) for entry in entries)

    def close(self) -> None:
        """Releases the bytes. The ACL is empty then."""
        self._changing()
        c.release(self._buffer)

    def __enter__(self) -> Acl:
        return self

    def __exit__(self, kind: type[BaseException] | None, value: BaseException | None,
                 trace: TracebackType | None) -> None:
        self.close()

    # ---- Listing and editing ----

    def __iter__(self) -> Iterator[Entry]:
        """The entries, copied when the iteration starts: sub-ACL after sub-ACL, as sec_list_acl orders them."""
        return iter(self._taken(lambda found: int(lib.sec_list_acl(byref(self._buffer), found))))

    def entries(self, type: int, mechanism: str | None = None) -> list[Entry]:
        """The entries of one type, of one mechanism or of all."""
        named = None if mechanism is None else to_utf8(mechanism)
        return self._taken(lambda found: int(lib.sec_list_acl_by_type(byref(self._buffer), type, named, found)))

    @staticmethod
    def _taken(list_into: Callable[[Any], int]) -> list[Entry]:
        found = c.AcleList()
        check(list_into(byref(found)))
        try:
            return [Entry.from_c(found.acles[at].contents) for at in range(found.count)]
        finally:
            lib.sec_release_aclelist(byref(found))

    def add(self, entry: Entry) -> None:
        """Adds an entry, or gives an existing one the new permissions."""
        self._changing()
        check(lib.sec_add_acle_to_acl(byref(entry.to_c()), byref(self._buffer)))

    def add_new(self, entry: Entry) -> None:
        """Adds an entry; raises Error 43 for a duplicate."""
        self._changing()
        check(lib.sec_add_acle_to_acl2(byref(entry.to_c()), byref(self._buffer)))

    def remove(self, entry: Entry) -> None:
        """Deletes an entry, whatever its permissions; raises Error 18 if there is none."""
        self._changing()
        check(lib.sec_del_acle_from_acl(byref(entry.to_c()), byref(self._buffer)))

    def _changing(self) -> None:
        if self._frozen:
            raise ValueError("a snapshot does not change")
        self._listed.clear()

    def _entries_by_name(self, type: int, mechanism: str) -> dict[str, Entry]:
        """Those of one sub-ACL in their order, by folded identity; listed once, until the next edit."""
        key = type, folded(mechanism)
        if key not in self._listed:
            found = self.entries(type, mechanism) if type in (USER, EXPANDED) else self.entries(type)
            self._listed[key] = {folded(entry.identity): entry for entry in found}
        return self._listed[key]

    # ---- The questions of the C interface: a mask, or None when no entry speaks of the party ----

    def unauthenticated(self) -> int | None:
        return self._single(UNAUTHENTICATED)

    def any_other(self) -> int | None:
        return self._single(ANY_OTHER)

    def user(self, mechanism: str, identity: str, *, through_handler: bool = False) -> int | None:
        return self._single(USER | (c.USE_HANDLER if through_handler else 0), to_utf8(mechanism), to_utf8(identity))

    def expanded(self, mechanism: str, identity: str) -> int | None:
        return self._single(EXPANDED, to_utf8(mechanism), to_utf8(identity))

    def groups(self, names: Iterable[str]) -> int | None:
        """What groups are granted together."""
        groups = [c.Group(0, to_utf8(name)) for name in names]
        if not groups:
            return None
        return self._ask(lib.sec__group_acles_perm, len(groups), (c.Group * len(groups))(*groups))

    def _single(self, kind: int, mechanism: bytes | None = None, identity: bytes | None = None) -> int | None:
        return self._ask(lib.sec__single_acle_perm, kind, mechanism, None, identity)

    def _ask(self, function: Any, *arguments: Any) -> int | None:
        if not self._buffer.length:  # that of a file without entries
            return None
        mask = c_uint32()
        code = function(byref(self._buffer), *arguments, byref(mask))
        if code == c.NO_ENTRY:
            return None
        check(code)
        return mask.value


def _memory_file() -> int:
    """A file in memory, on a descriptor above those of the standard streams, so that nothing is printed into it."""
    made = os.memfd_create("acl")
    if made > 2:
        return made
    try:
        return fcntl.fcntl(made, fcntl.F_DUPFD_CLOEXEC, 3)
    finally:
        os.close(made)


def _line_of(entry: Entry, permissions: PermissionSet | None) -> str:
    """The entry as a line of an ACL file. White space is what the C locale takes for it."""
    letters = to_letters(entry.permissions, permissions)
    words = [letters] if letters else []
    words += [entry.mechanism] if entry.type in (USER, EXPANDED) else []
    words += [entry.identity] if entry.type in (USER, EXPANDED, GROUP) else []
    line = entry.line(permissions) + "\n"
    holds = all(word and word[0] != "#" and not any(each in word for each in _SPACES) for word in words)
    if not holds or len(line.encode(errors="surrogateescape")) > _LONGEST_LINE:
        raise Error(c.NO_ENTRY, reason=f"no line can hold the entry: {line!r}")
    if to_mask(letters, permissions) != entry.permissions:
        raise Error(c.NO_ENTRY, reason=f"its letters do not lead back to its permissions: {line!r}")
    return line


def same(a: Acl, b: Acl) -> bool:
    """Whether two ACLs are equivalent, ignoring letter case and order, except that of the user-expanded entries of a
    mechanism, of which the first match decides."""
    def said(acl: Acl) -> list[tuple[int, str, str, int]]:
        keys = [(e.type, folded(e.mechanism), folded(e.identity), e.permissions) for e in acl]
        return sorted(keys, key=lambda key: (key[0], key[1], "" if key[0] == EXPANDED else key[2]))

    return said(a) == said(b)
