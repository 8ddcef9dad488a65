"""The C interface as ctypes sees it, and its failures as exceptions. The names and records are those of <qz/acl.h>."""
from __future__ import annotations

import ctypes
import os
from ctypes import POINTER, byref, c_char, c_char_p, c_int, c_int32, c_uint8, c_uint32, c_uint64, c_void_p
from typing import Any

OK, NO_ENTRY, BAD_ACL, FILE_ERROR = 0, 43, 42, 37
READ_TEXT, READ_CACHE, READ_CONVERT = 1, 2, 4
HANDLER_EXPANDED, HANDLER_USER = 1, 2
USE_HANDLER = 0x80


class Acle(ctypes.Structure):
    _fields_ = [("perm_mask", c_uint32), ("mechanism", c_char * 17), ("type", c_uint8), ("identity", c_char_p)]


class AcleList(ctypes.Structure):
    _fields_ = [("count", c_int32), ("acles", POINTER(POINTER(Acle)))]


class Buffer(ctypes.Structure):
    _fields_ = [("length", c_int32), ("data", c_void_p)]


class Group(ctypes.Structure):
    _fields_ = [("id", c_uint64), ("name", c_char_p)]


class PermTemplate(ctypes.Structure):
    _fields_ = [("bit", c_uint32), ("letter", c_char), ("name", c_char * 14), ("description", c_char * 65)]


class PermSet(ctypes.Structure):
    _fields_ = [("count", c_int32), ("templates", POINTER(PermTemplate))]


class _RecordedError(ctypes.Structure):  # the public fields at its start; the library makes and releases it
    _fields_ = [("code", c_int), ("message_id", c_int)]


Compare = ctypes.CFUNCTYPE(c_int, c_char_p, c_char_p)
_in_acl = POINTER(Buffer)


def _load(library: str, functions: dict[str, tuple[Any, ...]]) -> ctypes.CDLL:
    folder = os.environ.get("QZ_LIBRARY_DIR")
    loaded = ctypes.CDLL(os.path.join(folder, library) if folder else library)
    for name, (result, *arguments) in functions.items():
        function = getattr(loaded, name)
        function.restype, function.argtypes = result, arguments
    return loaded


cu = _load("libqz_cu.so.1", {
    "cu_get_error_1": (c_int, POINTER(POINTER(_RecordedError))),
    "cu_get_errmsg_1": (c_int, POINTER(_RecordedError), POINTER(c_void_p)),
    "cu_rel_error_1": (None, POINTER(_RecordedError)),
    "cu_rel_errmsg_1": (None, c_void_p),
    "cu_ipaddr_ntop_1": (c_int, c_char_p, c_char_p),
})
lib = _load("libqzacl.so.1", {
    "sec_create_empty_acl": (c_int, _in_acl),
    "sec_read_acl_file": (c_int, c_char_p, c_char_p, POINTER(PermSet), c_uint32, _in_acl, POINTER(c_uint32)),
    "sec_read_acl_from_data": (c_int, c_int, c_char_p, _in_acl),
    "sec_convert_acl_to_host": (c_int, c_int, _in_acl),
    "sec_list_acl": (c_int, _in_acl, POINTER(AcleList)),
    "sec_list_acl_by_type": (c_int, _in_acl, c_uint8, c_char_p, POINTER(AcleList)),
    "sec_release_aclelist": (None, POINTER(AcleList)),
    "sec_create_acle": (c_int, c_uint8, c_uint32, c_char_p, c_char_p, POINTER(POINTER(Acle))),
    "sec_release_acle": (None, POINTER(Acle)),
    "sec_add_acle_to_acl": (c_int, POINTER(Acle), _in_acl),
    "sec_add_acle_to_acl2": (c_int, POINTER(Acle), _in_acl),
    "sec_del_acle_from_acl": (c_int, POINTER(Acle), _in_acl),
    "sec_translate_perms": (c_int, c_char_p, POINTER(PermSet), POINTER(c_uint32)),
    "sec_translate_bitmask": (c_int, c_uint32, POINTER(PermSet), c_char_p),
    "sec__register_id_handler": (c_int, c_uint32, c_char_p, Compare),
    "sec__single_acle_perm": (c_int, _in_acl, c_uint8, c_char_p, c_char_p, c_char_p, POINTER(c_uint32)),
    "sec__group_acles_perm": (c_int, _in_acl, c_int32, POINTER(Group), POINTER(c_uint32)),
})
_libc = ctypes.CDLL(None)
_libc.free.restype, _libc.free.argtypes = None, [c_void_p]


class Error(Exception):
    """A failed operation: the code SEC_S_..., and the number ("3417-135") and text of its message.

    Where this package itself finds what is wrong there is no message: number and text are empty.
    """

    def __init__(self, code: int, text: str = "", reason: str = "") -> None:
        super().__init__(text.rstrip() or reason or f"code {code}")
        self.code = code
        self.number = text.split(" ", 1)[0]
        self.text = text

    @classmethod
    def recorded(cls, code: int) -> Error:
        """The error that the last call of this thread recorded, for the code that it returned."""
        error, text = POINTER(_RecordedError)(), c_void_p()
        try:
            if cu.cu_get_error_1(byref(error)) != OK or cu.cu_get_errmsg_1(error, byref(text)) != OK or not text.value:
                return cls(code)
            return cls(code, ctypes.string_at(text.value).decode(errors="replace"))
        finally:
            cu.cu_rel_errmsg_1(text)
            cu.cu_rel_error_1(error)


def check(code: int) -> None:
    if code != OK:
        raise Error.recorded(code)


def to_utf8(text: str) -> bytes:  # bytes that are no UTF-8 come out as they went in; a NUL would cut the text short
    encoded = text.encode(errors="surrogateescape")
    if b"\0" in encoded:
        raise ValueError("embedded NUL")
    return encoded


def from_utf8(encoded: bytes | None) -> str:
    return (encoded or b"").decode(errors="surrogateescape")


def release(buffer: Buffer) -> None:
    """Frees a buffer's bytes, also those that are no ACL."""
    _libc.free(buffer.data)
    buffer.length, buffer.data = 0, None
