"""Checks that includes point down only in the picture of the house, which is read in CONTRIBUTING.md. Headers that are
above in another folder are out of reach anyway, by cmake/layers.cmake, but for a path with "../" in it.

usage: layering.py [ROOT]   prints each offending line and exits with 1 when there is one
"""
import re
import sys
from pathlib import Path

ROOT = Path(sys.argv[1] if sys.argv[1:] else Path(__file__).resolve().parents[1])
FILES = {path.relative_to(ROOT).as_posix() for folder in ("security", "platform", "base", "include")
         for path in (ROOT / folder).rglob("*.*") if path.suffix in (".c", ".cpp", ".h", ".hpp")}
# Rows of folders, and for those in LIB of files without their endings.
ROWS = re.findall(r"^ {2,6}((?:[\w/]+  )*[\w/]+)(?:   |$)", (ROOT / "CONTRIBUTING.md").read_text(), re.M)
RANKS = {name: rank for rank, row in enumerate(reversed(ROWS)) for name in row.split()}
LIB, INCLUDE = "security/ACL/lib/", re.compile(r'\s*#\s*include\s*[<"]([^">]+)[">]')
found = []


def rank_of(path):  # a file that is not in the picture is above all that is
    folder, name = path.rsplit("/", 1)
    return RANKS.get(name.split(".")[0] if path.startswith(LIB) else folder + "/", len(ROWS))


for source in sorted(FILES):
    if rank_of(source) == len(ROWS):
        found.append(f"{source}: is in no layer")
    for number, line in enumerate((ROOT / source).read_text().splitlines(), 1):
        name = match[1] if (match := INCLUDE.match(line)) else ""
        folders = (source.rsplit("/", 1)[0] + "/", LIB, "security/", "platform/", "include/", "")
        target = next((folder + name for folder in folders if folder + name in FILES), source)
        is_user = source.endswith(".hpp") or source.startswith("security/ACL/cmd/qzacl/")  # of the layer in C++
        if (rank_of(target) > rank_of(source) or target.endswith(".hpp") > is_user or "../" in name
                or source.startswith("platform/") and target == "include/qz/acl.h"):
            found.append(f"{source}:{number}: {line}  leads to {target}")
print("\n".join(found) or "every include points down")
sys.exit(bool(found))
