"""An ACL file that is reread when it changes."""
from __future__ import annotations

import os
import threading
import time
import weakref
from typing import NamedTuple

from ._acl import Acl
from ._library import FILE_ERROR, Error
from ._permissions import PermissionSet

_SECOND = 10**9
_TICK = _SECOND // 50  # more than the coarse clock's, from which the system takes the time of a change
_EXCHANGES = 100
_COARSE_CLOCK = 5  # CLOCK_REALTIME_COARSE, which the module time does not name


class _Stamp(NamedTuple):
    """Distinguishes two states of a file."""

    device: int
    number: int
    size: int
    modified: int
    changed: int

    def is_settled(self, now: int) -> bool:
        """Whether every change from now on gives another stamp. Whole seconds may come from a file system that keeps no
        more, and those of some have two."""
        reach = _TICK if self.changed % _SECOND else 2 * _SECOND
        return abs(now - self.changed) > reach


class LiveAcl:
    """The current state of an ACL file: any number of threads decide by the snapshot, while one or several of them call
    refresh, which rereads the file when it has changed. The child of os.fork can use it, too."""

    def __init__(self, path: str | os.PathLike[str], permissions: PermissionSet | None = None, *,
                 default_permissions: bool = False) -> None:
        """Follows a file, which the first refresh reads.

        It reads the text, never a cache file, which does not record the set that compiled it. default_permissions
        states that every program reads the file with the library's own permissions; then its cache may be read, too."""
        if default_permissions and permissions is not None:
            raise ValueError("a set of one's own is not the default one")
        self._path, self._permissions, self._cache = os.fspath(path), permissions, default_permissions
        self._refreshing = threading.Lock()
        self._seen: _Stamp | None = None  # before the last reading that was tried
        self._stamp: _Stamp | None = None  # of the current snapshot, once it has settled
        self._current: Acl | None = None
        self._problem: Error | None = Error(FILE_ERROR, reason="not read yet")
        _all.add(self)

    def refresh(self) -> bool:
        """Reads the file if it has changed, and returns whether there is a new snapshot.

        A changed file differs in its device, number, size or times from the last reading. It is also read again if it
        changed so shortly before that reading that a further change might have the same times. Equal bytes make no new
        snapshot.

        Raises Error if the file cannot be read. The last good snapshot stays, and the next refresh tries again.
        """
        with self._refreshing:
            try:
                changed = self._refresh()
            except Error as problem:
                self._problem = problem
                raise
            self._problem = None
            return changed

    @property
    def problem(self) -> Error | None:
        """The error of the last refresh in any thread; None after a good one."""
        return self._problem

    def snapshot(self) -> Acl:
        """The last good reading, which does not change and must not be closed. Raises Error before the first."""
        current, problem = self._current, self._problem
        if current is None:
            raise problem or Error(FILE_ERROR)
        return current

    def _refresh(self) -> bool:
        for _ in range(_EXCHANGES):
            try:
                return self._refresh_once()
            except Error as problem:
                # A file that is exchanged between the looks that are taken at it is no trouble of the new one.
                if problem.code != FILE_ERROR or self._look() in (None, self._seen):
                    raise
        return self._refresh_once()

    def _refresh_once(self) -> bool:
        # Both before the reading, so that a change during it shows the next time.
        now = time.clock_gettime_ns(_COARSE_CLOCK)
        self._seen = self._look()
        if self._seen is not None and self._seen == self._stamp:
            return False
        read = Acl.read(self._path, permissions=self._permissions, cache=self._cache)
        self._stamp = self._seen if self._seen is not None and self._seen.is_settled(now) else None
        if self._current is not None and bytes(self._current) == bytes(read):
            return False
        read._frozen = True
        self._current = read
        return True

    def _look(self) -> _Stamp | None:
        try:
            status = os.stat(self._path)
        except OSError:
            return None
        return _Stamp(status.st_dev, status.st_ino, status.st_size, status.st_mtime_ns, status.st_ctime_ns)


_all: weakref.WeakSet[LiveAcl] = weakref.WeakSet()


def _free_locks() -> None:
    """The child lacks the thread that was in a refresh at the fork, and would wait for it forever."""
    for live in _all:
        live._refreshing = threading.Lock()
        live._stamp = None


os.register_at_fork(after_in_child=_free_locks)
