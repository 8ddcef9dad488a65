"""Permissions: their bits, and their letters in ACL files."""
from __future__ import annotations

import ctypes
from collections.abc import Iterable
from ctypes import byref, c_uint32
from typing import Any, NamedTuple

from ._library import PermSet, PermTemplate, check, lib, to_utf8


class Permission(NamedTuple):
    """A permission of a service: one bit, one letter (a byte), and two texts for people, of 13 and 64 bytes at most."""

    bit: int
    letter: str
    name: str = ""
    description: str = ""


class PermissionSet:
    """The permissions of a service that has its own. Of those that share a bit or a letter, the first is used.

    A set never changes, so any number of threads may use it. ACLs do not keep it: pass it to every operation that
    reads or writes letters. A cache file does not record the set that compiled it: see Acl.read.
    """

    def __init__(self, permissions: Iterable[Permission | tuple[int, str] | tuple[int, str, str, str]]) -> None:
        self.permissions = tuple(Permission(*each) for each in permissions)
        self._templates = (PermTemplate * len(self.permissions))()
        for template, each in zip(self._templates, self.permissions):
            letter = to_utf8(each.letter)
            if len(letter) != 1 or each.bit.bit_count() != 1 or each.bit >> 32:
                raise ValueError(f"not one bit and one letter: {each}")
            template.bit, template.letter = each.bit, letter
            template.name, template.description = _fitting(each.name, 13), _fitting(each.description, 64)
        self._record = PermSet(len(self.permissions), self._templates)


def _fitting(text: str, most: int) -> bytes:
    encoded = to_utf8(text)
    if len(encoded) > most:
        raise ValueError(f"longer than {most} bytes: {text}")
    return encoded


def in_c(permissions: PermissionSet | None) -> Any:
    """The set as the C interface takes it: null for its own."""
    return None if permissions is None else ctypes.pointer(permissions._record)


def to_mask(letters: str, permissions: PermissionSet | None = None) -> int:
    """The mask of permission letters, in any order and also repeated. A letter that is none raises Error 36."""
    mask = c_uint32()
    check(lib.sec_translate_perms(to_utf8(letters), in_c(permissions), byref(mask)))
    return mask.value


def to_letters(mask: int, permissions: PermissionSet | None = None) -> str:
    """The letters of a mask, from the lowest bit to the highest. A bit that has none raises Error 36."""
    letters = ctypes.create_string_buffer(33)
    check(lib.sec_translate_bitmask(mask_of(mask), in_c(permissions), letters))
    return letters.value.decode(errors="surrogateescape")


def mask_of(mask: int) -> int:
    """The mask, which ctypes would cut to 32 bits."""
    if not 0 <= mask < 1 << 32:
        raise ValueError(f"not a mask of 32 bits: {mask}")
    return mask
