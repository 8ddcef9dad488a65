"""Compares the caches that two builds for different machines write, and lets the example services of both read both.

usage: cross_caches.py BUILD_DIR OTHER_BUILD_DIR [EMULATOR...]   the emulator runs what the other one built
"""
import os
import pathlib
import random
import struct
import subprocess
import sys
import tempfile

BUILDS = [(pathlib.Path(sys.argv[1]).resolve(), []), (pathlib.Path(sys.argv[2]).resolve(), sys.argv[3:])]
EXAMPLE = pathlib.Path(__file__).resolve().parents[1] / "examples/service.acl"
ORDERS = {1: ">", 2: "<"}  # what byte 2 says


def program(build, name, *arguments):
    folder, emulator = build
    done = subprocess.run([*emulator, folder / name, *arguments], capture_output=True, text=True, check=False)
    if done.returncode != 0 or done.stderr:
        sys.exit(f"{folder / name}: {done.returncode} {done.stderr}")
    return done.stdout


def many_entries():
    """A text of all types, with names around the sizes that are compared at once."""
    numbers = random.Random(1)
    names = ["".join(numbers.choices("aAbBz_", k=numbers.randrange(1, 40))) + "@host" for _ in range(300)]
    lines = {f"{key} {name}".lower(): f"{key} {name} {numbers.choice(('', 'r', 'rwc', 'oav'))}"
             for name in names for key in ("u unix", "u krb5", "e unix", "g")}
    return "n r\no w\n" + "\n".join(lines.values()) + "\n", [*names[:10], "nobody@host"]


def turned(cache, order):
    """The bytes of a cache in the given order."""
    made, at, was = bytearray(cache), 3, ORDERS[cache[2]]
    made[2] = order

    def number(kind):
        nonlocal at
        value, = struct.unpack_from(was + kind, cache, at)
        struct.pack_into(ORDERS[order] + kind, made, at, value)
        at += struct.calcsize(was + kind)
        return value

    for _ in range(number("H")):
        for kind in "IB":
            number(kind)
        entries, mechanism = number("I"), number("B")
        at += mechanism
        for _ in range(entries):
            for kind in "BI":
                number(kind)
            identity = number("H")
            at += identity
    return bytes(made)


def compare(text, users):
    with tempfile.TemporaryDirectory() as folder:
        caches, answers = [], set()
        for writer in BUILDS:
            path = pathlib.Path(folder, f"acl{len(caches)}")
            path.write_text(text)
            os.utime(path, (1000000000, 1000000000))
            program(writer, "bin/qzaclfck", "-s", "-f", path)
            caches.append(pathlib.Path(f"{path}.cacl").read_bytes())
            answers |= {"".join(program(reader, "examples/service", path, user, "staff", user) for user in users)
                        for reader in BUILDS}
    here, there = caches
    if turned(there, here[2]) != here or len(answers) != 1 or "read from the text" in answers.pop():
        sys.exit(f"the caches of these {len(text)} bytes differ, or what is read from them")
    print(f"{len(here)} bytes, byte 2 is {here[2]} and {there[2]}: written alike, and read by both")


if __name__ == "__main__":
    compare(EXAMPLE.read_text(), ["alice@head.cluster.example", "x@node.cluster.example", "nobody@nowhere"])
    compare(*many_entries())
