"""Access control lists for Python: reads, lists, edits and evaluates them through libqzacl. Needs ctypes alone.

    import qzacl

    qzacl.register_expanded("unix", qzacl.domain)       # "e unix .cluster.example": every host of that domain
    live = qzacl.LiveAcl("/etc/service.acl")            # reread when the file changes
    live.refresh()
    alice = qzacl.Requester("unix", "alice@head.cluster.example", ("operators",))
    answer = qzacl.decide(live.snapshot(), alice, qzacl.to_mask("rw"))
    if not answer.allowed:
        print(answer.explain())                         # each entry about her, and which one decides

    with qzacl.Acl.read("service.acl") as acl:          # an ACL to inspect and edit
        for entry in acl:
            print(entry)                                # "u unix alice@head.cluster.example rwxCqle"
        acl.add(qzacl.Entry.create(qzacl.GROUP, qzacl.to_mask("rq"), identity="auditors"))

The loader finds the libraries, unless QZ_LIBRARY_DIR names their folder.

A failure raises qzacl.Error with the code, number and text of the message, and grants nothing. Texts are str here and
UTF-8 in the library. Other bytes of a file become surrogate escapes and are converted back. A NUL in a text raises
ValueError. Permissions are bit masks. to_mask and to_letters convert letters to masks and back, by the library's own
permissions or by the PermissionSet of a service.

Any number of threads may query an Acl at the same time. While one edits or closes it, no other may use it. Handlers are
called in the thread that queries.
"""
from ._acl import Acl, same
from ._decide import Answer, Order, PartyAnswer, Requester, Who, decide, granted, stored_identity
from ._entry import ANY_OTHER, EXPANDED, GROUP, UNAUTHENTICATED, USER, Entry
from ._handlers import domain, exact, register_expanded, register_user
from ._library import Error
from ._live import LiveAcl
from ._permissions import Permission, PermissionSet, to_letters, to_mask

__all__ = [
    "ANY_OTHER", "Acl", "Answer", "EXPANDED", "Entry", "Error", "GROUP", "LiveAcl", "Order", "PartyAnswer",
    "Permission",
    "PermissionSet", "Requester", "UNAUTHENTICATED", "USER", "Who", "decide", "domain", "exact", "granted",
    "register_expanded", "register_user", "same", "stored_identity", "to_letters", "to_mask",
]
