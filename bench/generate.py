#!/usr/bin/env python3
"""Writes ACL files for measurements. The same arguments give the same bytes on every machine.

One file for every order and type that is asked for, named FAMILY-ORDER-TYPE-LINES.acl in the folder. Besides the
entry types u, e and g there are: bad (lines of which each has one of four mistakes), mech (user entries whose
mechanisms all differ), doas and sudoers (as many rules of those programs), and posix (entries for setfacl).
"""
import argparse
import random
import string
from pathlib import Path

FAMILIES = ("rand", "prefixed")
ORDERS = ("random", "sorted", "reversed", "bothends", "tworuns")
PERMISSIONS = ("r", "rw", "rwx", "", "q", "rl")
FIRST_USER = 100_000
# The fields of a line: a name, permissions, its number, the name in lower case, and a user number.
LINES = {
    "u": ("u unix {0} {1}\n",),
    "e": ("e unix {0} {1}\n",),
    "g": ("g {0} {1}\n",),
    "mech": ("u m{2:07} {0} {1}\n",),
    "bad": ("u unix\n", "x unix {0} {1}\n", "u unix {0} z\n", "u unix {0} r more\n"),
    "doas": ("permit {3} as root\n",),
    "sudoers": ("{3} ALL=(ALL) ALL\n",),
    "posix": ("user:{4}:r-x\n",),
}


def random_names(source, count):
    """Words of 6 to 12 letters in both cases that differ in more than case."""
    longest, lengths = 12, range(6, 13)
    to_letter = bytes(ord(string.ascii_letters[value % 52]) for value in range(256))
    names = {}
    while len(names) < count:
        wanted = count - len(names)
        letters = source.randbytes(wanted * longest).translate(to_letter).decode()
        for at, value in enumerate(source.randbytes(wanted)):
            name = letters[at * longest : at * longest + lengths[value % len(lengths)]]
            names.setdefault(name.lower(), name)
    return list(names.values())


def prefixed_names(source, count):
    names = [f"user{number:07}@corp.example.com" for number in range(count)]
    source.shuffle(names)
    return names


def in_order(names, order):
    """The names, given in random order, in the requested order."""
    half = len(names) // 2
    if order == "random":
        return names
    if order == "tworuns":  # the second half sorts among the first
        return sorted(names[:half], key=str.lower) + sorted(names[half:], key=str.lower)
    ascending = sorted(names, key=str.lower)
    if order == "sorted":
        return ascending
    if order == "reversed":
        return ascending[::-1]
    ends = [name for pair in zip(ascending[:half], ascending[::-1]) for name in pair]  # first, last, second, ...
    return ends + ascending[half : len(names) - half]


def text(names, kind, source):
    templates, chosen = LINES[kind], source.randbytes(len(names))
    permissions = [PERMISSIONS[value % len(PERMISSIONS)] for value in chosen]
    return "".join(
        templates[at % len(templates)].format(name, letters, at, name.lower(), FIRST_USER + at)
        for at, (name, letters) in enumerate(zip(names, permissions))
    )


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("folder", type=Path)
    parser.add_argument("lines", type=int)
    parser.add_argument("--family", choices=FAMILIES, default="rand")
    parser.add_argument("--orders", nargs="+", choices=ORDERS, default=["random"])
    parser.add_argument("--types", nargs="+", choices=LINES, default=["u"])
    wanted = parser.parse_args()

    make_names = random_names if wanted.family == "rand" else prefixed_names
    names = make_names(random.Random(wanted.lines), wanted.lines)
    for order in wanted.orders:
        ordered = in_order(names, order)
        for kind in wanted.types:
            file = wanted.folder / f"{wanted.family}-{order}-{kind}-{wanted.lines}.acl"
            file.write_text(text(ordered, kind, random.Random(kind)), encoding="ascii")


if __name__ == "__main__":
    main()
