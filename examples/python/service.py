"""The service of service.c in Python: the same rules, with the reason for each decision.

usage: service.py FILE USER@HOST [GROUP...]   needs the package qzacl of bindings/python
"""
import sys

import qzacl


def main(path: str, user: str, *groups: str) -> None:
    qzacl.register_expanded("unix", qzacl.domain)
    live = qzacl.LiveAcl(path)
    live.refresh()  # a service does this before each request, or by a timer
    answer = qzacl.decide(live.snapshot(), qzacl.Requester("unix", user, groups))
    print(answer.explain(), end="")
    if answer.decided_by is None:
        print("nothing is granted")
    else:
        print(f"granted by {answer.decided_by.value}: {qzacl.to_letters(answer.granted) or 'nothing'}")


if __name__ == "__main__":
    if len(sys.argv) < 3:
        sys.exit("usage: service.py FILE USER@HOST [GROUP...]")
    sys.stdout.reconfigure(errors="surrogateescape")  # identities are printed byte for byte
    try:
        main(*sys.argv[1:])
    except qzacl.Error as failure:
        sys.exit(f"{sys.argv[1]}: {failure}")
