"""The ACL library for Python: reads an ACL file, lists its entries, and asks what it grants. Needs ctypes alone.

    with qzacl.Acl.read("service.acl") as acl:
        for entry in acl:
            print(entry)
        mask = acl.user("unix", "alice@host")  # None: no entry matches her

The libraries are those that the loader finds, or those in the folder named by QZ_LIBRARY_DIR. The C header
<qz/acl.h> is the manual; a failure raises qzacl.Error.

usage: qzacl.py FILE USER@HOST [GROUP...]   prints the entries, and what they grant to a user of the mechanism "unix"
"""
import ctypes
import os
import sys
from ctypes import POINTER, byref, c_char, c_char_p, c_int, c_int32, c_uint8, c_uint32, c_uint64, c_void_p
from typing import NamedTuple

UNAUTHENTICATED, ANY_OTHER, USER, EXPANDED, GROUP = 1, 2, 4, 8, 16
TYPE_LETTERS = {UNAUTHENTICATED: "n", ANY_OTHER: "o", USER: "u", EXPANDED: "e", GROUP: "g"}
READ_TEXT, READ_CACHE, READ_CONVERT = 1, 2, 4
_HANDLER_EXPANDED = 1
OK, NO_ENTRY = 0, 43


class _Acle(ctypes.Structure):
    _fields_ = [("perm_mask", c_uint32), ("mechanism", c_char * 17), ("type", c_uint8), ("identity", c_char_p)]


class _List(ctypes.Structure):
    _fields_ = [("count", c_int32), ("acles", POINTER(POINTER(_Acle)))]


class _Buffer(ctypes.Structure):
    _fields_ = [("length", c_int32), ("data", c_void_p)]


class _Group(ctypes.Structure):
    _fields_ = [("id", c_uint64), ("name", c_char_p)]


class _RecordedError(ctypes.Structure):  # its public fields; the library makes and releases it
    _fields_ = [("code", c_int), ("message_id", c_int)]


_Compare = ctypes.CFUNCTYPE(c_int, c_char_p, c_char_p)
_PermSet = c_void_p  # always null here: the permissions of acl__default_perm_set


def _load(library, functions):
    folder = os.environ.get("QZ_LIBRARY_DIR")
    loaded = ctypes.CDLL(os.path.join(folder, library) if folder else library)
    for name, (result, *arguments) in functions.items():
        function = getattr(loaded, name)
        function.restype, function.argtypes = result, arguments
    return loaded


_cu = _load("libqz_cu.so.1", {
    "cu_get_error_1": (c_int, POINTER(POINTER(_RecordedError))),
    "cu_get_errmsg_1": (c_int, POINTER(_RecordedError), POINTER(c_void_p)),
    "cu_rel_error_1": (None, POINTER(_RecordedError)),
    "cu_rel_errmsg_1": (None, c_void_p),
})
_acl = _load("libqzacl.so.1", {
    "sec_read_acl_file": (c_int, c_char_p, c_char_p, _PermSet, c_uint32, POINTER(_Buffer), POINTER(c_uint32)),
    "sec_release_acl": (c_int, POINTER(_Buffer)),
    "sec_list_acl": (c_int, POINTER(_Buffer), POINTER(_List)),
    "sec_release_aclelist": (None, POINTER(_List)),
    "sec_translate_perms": (c_int, c_char_p, _PermSet, POINTER(c_uint32)),
    "sec_translate_bitmask": (c_int, c_uint32, _PermSet, c_char_p),
    "sec__register_id_handler": (c_int, c_uint32, c_char_p, _Compare),
    "sec__single_acle_perm": (c_int, POINTER(_Buffer), c_uint8, c_char_p, c_char_p, c_char_p, POINTER(c_uint32)),
    "sec__group_acles_perm": (c_int, POINTER(_Buffer), c_int32, POINTER(_Group), POINTER(c_uint32)),
})


class Error(Exception):
    """A failed call: its code, the index of its message (0: none), and the message text with its number."""

    def __init__(self, code, message_id, text):
        super().__init__(text.rstrip() or f"code {code}")
        self.code, self.message_id, self.text = code, message_id, text

    @classmethod
    def recorded(cls, code):
        """The error recorded by this thread's last call, which returned the given code."""
        error, text = POINTER(_RecordedError)(), c_void_p()
        try:
            if _cu.cu_get_error_1(byref(error)) != OK or _cu.cu_get_errmsg_1(error, byref(text)) != OK:
                return cls(code, 0, "")
            return cls(code, error.contents.message_id, ctypes.string_at(text.value).decode(errors="replace"))
        finally:
            _cu.cu_rel_errmsg_1(text)
            _cu.cu_rel_error_1(error)


def _check(code):
    if code != OK:
        raise Error.recorded(code)


def _utf8(text):  # bytes that are not UTF-8 are kept as they are; a NUL would cut the text short
    encoded = text.encode(errors="surrogateescape")
    if b"\0" in encoded:
        raise ValueError("embedded NUL")
    return encoded


def _text(encoded):
    return (encoded or b"").decode(errors="surrogateescape")


def to_mask(letters):
    """The mask of permission letters."""
    mask = c_uint32()
    _check(_acl.sec_translate_perms(_utf8(letters), None, byref(mask)))
    return mask.value


def to_letters(mask):
    """The permission letters of a mask, from the lowest bit to the highest."""
    letters = ctypes.create_string_buffer(33)
    _check(_acl.sec_translate_bitmask(mask, None, letters))
    return letters.value.decode()


_handlers = []  # registered for the life of the process, so never released


def register_expanded(mechanism, matches):
    """Registers matches(requested, entry): whether a user-expanded entry of the mechanism accepts an identity.

    If it raises, the entry does not match, and the exception is printed on standard error.
    """
    def compare(requested, entry):
        try:
            return 0 if matches(_text(requested), _text(entry)) else 1
        except BaseException:  # an exception that left this function would count as a match
            sys.excepthook(*sys.exc_info())
            return 1

    _handlers.append(_Compare(compare))
    _check(_acl.sec__register_id_handler(_HANDLER_EXPANDED, _utf8(mechanism), _handlers[-1]))


class Entry(NamedTuple):
    type: int
    mechanism: str  # empty if the type takes none; so is the identity
    identity: str
    permissions: int

    def __str__(self):
        texts = [f"{name} = {text}; " for name, text in (("mech", self.mechanism), ("id", self.identity)) if text]
        return f"type = {TYPE_LETTERS[self.type]}; {''.join(texts)}permission = {to_letters(self.permissions)}"


class Acl:
    """An ACL in memory, released by close() or at the end of a with block. Threads may evaluate it at the same time."""

    def __init__(self):
        self._buffer = _Buffer()

    @classmethod
    def read(cls, path, user=None, flags=0):
        """Reads a file; with a user, a bare file name in that user's home directory. A cache is always checked."""
        acl = cls()
        _check(_acl.sec_read_acl_file(os.fsencode(path), None if user is None else _utf8(user), None,
                                      flags | READ_CONVERT, byref(acl._buffer), None))
        return acl

    def close(self):
        _check(_acl.sec_release_acl(byref(self._buffer)))

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    def __iter__(self):
        """The entries, copied when the iteration starts."""
        found = _List()
        _check(_acl.sec_list_acl(byref(self._buffer), byref(found)))
        try:
            entries = [found.acles[at].contents for at in range(found.count)]
            return iter([Entry(e.type, _text(e.mechanism), _text(e.identity), e.perm_mask) for e in entries])
        finally:
            _acl.sec_release_aclelist(byref(found))

    def unauthenticated(self):
        return self._single(UNAUTHENTICATED)

    def any_other(self):
        return self._single(ANY_OTHER)

    def user(self, mechanism, identity):
        return self._single(USER, _utf8(mechanism), _utf8(identity))

    def expanded(self, mechanism, identity):
        return self._single(EXPANDED, _utf8(mechanism), _utf8(identity))

    def groups(self, names):
        """The permissions of all these groups together."""
        names = [_utf8(name) for name in names]
        if not names:
            return None
        return self._ask(_acl.sec__group_acles_perm, len(names), (_Group * len(names))(*((0, n) for n in names)))

    def _single(self, kind, mechanism=None, identity=None):
        return self._ask(_acl.sec__single_acle_perm, kind, mechanism, None, identity)

    def _ask(self, function, *arguments):
        """The permissions as a mask; None if no entry matches."""
        if not self._buffer.length:  # a file without entries
            return None
        mask = c_uint32()
        code = function(byref(self._buffer), *arguments, byref(mask))
        if code == NO_ENTRY:
            return None
        _check(code)
        return mask.value


def at_host(requested, entry):
    """Whether a user-expanded entry, a host or, with a dot in front, a domain, accepts USER@HOST."""
    _, at, host = requested.partition("@")
    host, entry = (_utf8(name).lower() for name in (host, entry))  # in bytes, only A to Z have another case
    return bool(at) and (host == entry or entry.startswith(b".") and host.endswith(entry))


def _main(path, user, *groups):
    register_expanded("unix", at_host)
    with Acl.read(path) as acl:
        for entry in acl:
            print(entry)
        # The most specific match decides: the user, the user's domain, the groups together, any other.
        for by, ask in (("user", lambda: acl.user("unix", user)), ("domain", lambda: acl.expanded("unix", user)),
                        ("groups", lambda: acl.groups(groups)), ("any other", acl.any_other)):
            if (mask := ask()) is not None:
                print(f"granted by {by}: {to_letters(mask) or 'nothing'}")
                return
        print("nothing is granted")


if __name__ == "__main__":
    if len(sys.argv) < 3:
        sys.exit("usage: qzacl.py FILE USER@HOST [GROUP...]")
    sys.stdout.reconfigure(errors="surrogateescape")  # identities are printed byte for byte
    try:
        _main(*sys.argv[1:])
    except Error as failure:
        sys.exit(f"{sys.argv[1]}: {failure}")
