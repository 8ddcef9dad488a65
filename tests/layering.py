"""Checks that includes only point down in the picture of the source layout in CONTRIBUTING.md. Headers above in another
folder are out of reach anyway, because of cmake/layers.cmake, except by a path with "../" in it.

usage: layering.py [ROOT]   prints each offending line and exits with 1 when there is one
"""
import re
import sys
from pathlib import Path

ROOT = Path(sys.argv[1] if sys.argv[1:] else Path(__file__).resolve().parents[1])
PICTURE = (ROOT / "CONTRIBUTING.md").read_text()
# Its rows name folders, and those of the library's files these without their endings.
ROWS = re.findall(r"^ {2,6}((?:[\w/]+  )*[\w/]+)(?:   |$)", PICTURE, re.M)
RANKS = {name: rank for rank, row in enumerate(reversed(ROWS)) for name in row.split()}
ABOVE_ALL = len(ROWS)  # where a file is that the picture does not show

LIBRARY = "security/ACL/lib/"
COMPANION = "security/ACL/cmd/qzacl/"
SEARCHED = (LIBRARY, "security/", "platform/", "include/", "")
INCLUDE = re.compile(r'\s*#\s*include\s*[<"]([^">]+)[">]')
FILES = {path.relative_to(ROOT).as_posix() for folder in ("security", "platform", "base", "include")
         for path in (ROOT / folder).rglob("*.*") if path.suffix in (".c", ".cpp", ".h", ".hpp")}


def rank_of(path):
    folder, name = path.rsplit("/", 1)
    return RANKS.get(name.split(".")[0] if path.startswith(LIBRARY) else folder + "/", ABOVE_ALL)


def file_named(name, source):
    """The file of ours that a source includes by a name, or none."""
    own_folder = source.rsplit("/", 1)[0] + "/"
    return next((folder + name for folder in (own_folder, *SEARCHED) if folder + name in FILES), None)


def may_include(source, target):
    uses_cxx_layer = source.endswith(".hpp") or source.startswith(COMPANION)
    if target.endswith(".hpp") and not uses_cxx_layer:
        return False
    if target == "include/qz/acl.h" and source.startswith("platform/"):
        return False
    return rank_of(target) <= rank_of(source)


def faults_of(source):
    if rank_of(source) == ABOVE_ALL:
        yield f"{source}: is in no layer"
    for number, line in enumerate((ROOT / source).read_text().splitlines(), 1):
        match = INCLUDE.match(line)
        target = match and file_named(match[1], source)
        if match and ("../" in match[1] or target and not may_include(source, target)):
            yield f"{source}:{number}: {line}  leads to {target}"


found = [fault for source in sorted(FILES) for fault in faults_of(source)]
print("\n".join(found) or "every include points down")
sys.exit(bool(found))
