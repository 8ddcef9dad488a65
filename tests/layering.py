"""Checks that includes point down only: see the picture of the house in CONTRIBUTING.md.

usage: layering.py [ROOT]   prints each offending line and exits with 1 when there is one
"""
import graphlib
import re
import sys
from os.path import dirname, normpath
from pathlib import Path

LIB, ACL = "security/ACL/lib/", "security/ACL/lib/qzacl_acl/"
# From the bottom up; each line is a layer, whose files may include each other (not in circles) and what lies below.
LAYERS = [
    ["include/qz/acl", "include/qz/cu", "include/qz/tr"],
    ["platform/libqz_cu/*", "platform/libqz_tr/*"],
    ["security/msg/*"],
    [LIB + name for name in ("report", "owned", "bytes")],
    [LIB + name for name in ("qzacl_trace", "qzacl_utils", "qzacl_init")],
    [ACL + name for name in ("permission", "entry")],
    [ACL + name for name in ("entry_parser", "identity_order", "tree", "buffer_format", "buffer", "packed_identity")],
    [ACL + name for name in ("compile", "validate")],
    [ACL + name for name in ("file_name", "cache_file")],
    [ACL + name for name in ("read_acl", "list", "edit", "id_handlers", "evaluate", "dump")],
    ["security/ACL/cmd/*"],
]
UNITS = {unit: rank for rank, layer in enumerate(LAYERS) for unit in layer}
# Beside the house: what examines it may look everywhere; examples are programs like anybody's.
FREE = ("tests/", "fuzz/", "bench/", "security/msg/check_catalog.cpp")
OUTSIDE, PUBLIC = ("examples/", "packaging/"), "include/qz/"
SHARED_FOLDING = "platform/libqz_cu/posix_fold.h"  # the one private header of a platform library that others use
ROOTS = ("security/ACL/lib", "security/ACL/cmd", "security", "platform", "include")
INCLUDE = re.compile(r'\s*#\s*include\s*([<"])([^">]+)[">]')


def unit_of(path):  # the unit of the house that a file belongs to, or None
    stem, folder = path.rsplit(".", 1)[0], path.rsplit("/", 1)[0] + "/*"
    return stem if stem in UNITS else folder if folder in UNITS else None


def allowed(source, target):  # whether the one file may include the other, by their paths
    if source.startswith(OUTSIDE):
        return target.startswith((PUBLIC, *OUTSIDE))
    if target.endswith(".hpp"):  # what it defines stands beside the house's own definitions
        return False
    here, there = unit_of(source), unit_of(target)
    if source.startswith("platform/"):  # knows of nothing but itself
        return here == there or target == PUBLIC + here.split("/")[1].removeprefix("libqz_") + ".h"
    if target.startswith("platform/") and target != SHARED_FOLDING:
        return False
    return there is not None and UNITS[there] <= UNITS[here]


def faults(root):
    edges = {}  # within a layer; across layers there are no circles when every include points down
    files = {p.relative_to(root).as_posix() for p in root.rglob("*.*") if p.suffix in (".c", ".cpp", ".h", ".hpp")}
    for source in sorted(f for f in files if not f.startswith(("build", ".", *FREE))):
        if not source.startswith(OUTSIDE) and unit_of(source) is None:
            yield f"{source}: is in no layer"
            continue
        for number, line in enumerate((root / source).read_text(encoding="utf-8").splitlines(), 1):
            if not (match := INCLUDE.match(line)):
                continue
            places = [dirname(source), *ROOTS] if match[1] == '"' else ROOTS
            target = next((t for p in places if (t := normpath(f"{p}/{match[2]}")) in files), None)
            if target is None and match[1] == '"' or target is not None and not allowed(source, target):
                yield f"{source}:{number}: {line.strip()}  leads to {target or 'no file of the project'}"
            elif target is not None and UNITS.get(unit_of(source)) == UNITS.get(unit_of(target)):
                edges.setdefault(source, set()).add(target)
    try:
        graphlib.TopologicalSorter(edges).prepare()
    except graphlib.CycleError as error:
        yield "in a circle, backwards: " + " -> ".join(error.args[1])


found = list(faults(Path(sys.argv[1] if sys.argv[1:] else Path(__file__).resolve().parents[1])))
print("\n".join(found) or "every include points down")
sys.exit(bool(found))
