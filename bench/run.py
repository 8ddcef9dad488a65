#!/usr/bin/env python3
"""Measures everything and prints one table: each figure with its reference. See docs/performance.md.

usage: run.py BUILD_FOLDER [quick | --plot | compare OTHER_BUILD_FOLDER]
  quick     no file above 100,000 lines, fewer repetitions
  --plot    draws docs/*.svg instead
  compare   says instead what differs from another build
"""
import sys
import tempfile
from pathlib import Path

from checks import check_rows, measure_checks
from measure import BENCH, Commands
from programs import measure_programs, program_rows
from table import Table

MILLION = 1_000_000
LAST = BENCH / "last.md"


def measure_all(build, is_quick):
    sizes = (10_000, 100_000) if is_quick else (10_000, 100_000, MILLION)
    rounds = {1000: 11, 10_000: 5, 100_000: 3} if is_quick else {1000: 51, 10_000: 25, 100_000: 11, MILLION: 7}
    table, commands = Table(), Commands()
    with tempfile.TemporaryDirectory(prefix="qzacl-bench-") as name:
        folder = Path(name)
        measure_checks(commands, build / "bin" / "qzaclfck", folder, sizes, rounds)
        found = measure_programs(build, folder, *((3, 0.01) if is_quick else (9, 0.1)))
    if "posix_parse/1000" not in found:
        commands.left_out.append("libacl was not there when the programs were built (Debian: libacl1-dev)")
    check_rows(table, commands, sizes)
    program_rows(table, found)
    text = table.text() + "\n"
    if commands.left_out:
        text += "\nLeft out: " + "; ".join(dict.fromkeys(commands.left_out)) + ".\n"
    return text, table.grown


def main():
    if len(sys.argv) < 2:
        sys.exit(__doc__)
    build, verb = Path(sys.argv[1]), sys.argv[2:]
    if verb[:1] == ["compare"] and len(verb) == 2:
        from compare import compare  # each mode imports only what it needs

        compare(build, Path(verb[1]))
        return
    if verb == ["--plot"]:
        from plot import plot

        plot(build)
        return
    if verb not in ([], ["quick"]):
        sys.exit("usage: ./dev bench [quick | --plot | compare REVISION]")
    text, grown = measure_all(build, verb == ["quick"])
    print(text, end="")
    if not verb:
        head = ("# The last table\n\n"
                "Of `./dev bench`, which writes this file; docs/performance.md says how to read it.\n\n")
        LAST.write_text(head + text, encoding="utf-8")
    if grown:
        sys.exit("bench: faster than n log n grows " + "; ".join(grown))


if __name__ == "__main__":
    main()
