"""Compares two builds: runs them alternately and reports figures that differ by more than the noise."""
import math
import statistics
import tempfile
from pathlib import Path

from checks import FAMILIES, Files
from measure import Commands, generate, progress, run_program
from table import as_time

ROUNDS = 6
LEAST_CHANGE = 0.01  # smaller changes are not reported
# A process measures each figure once for this many seconds.
SECONDS = 0.02
LINES = (1000, 100_000)


def generate_files(folder):
    for lines in (10, 100, 1000, 100_000):
        for family in FAMILIES:
            generate(folder, lines, "--family", family, "--orders", "random", "reversed")
    generate(folder, 10, "--types", "e")
    generate(folder, 1000, "--types", "g")
    generate(folder, 10_000, "--types", "mech")
    generate(folder, 100_000, "--types", "bad", "e", "g")


def measure_checks(build, file):
    """The CPU seconds of some runs of each check."""
    checker, commands = build / "bin" / "qzaclfck", Commands()
    for lines in LINES:
        for family in FAMILIES:
            for order in ("random", "reversed"):
                commands.add(f"check {family} {order} {lines:,}", checker, "-s", "-f", file(lines, family, order))
    for kind in ("e", "g"):
        commands.add(f"check {kind} 100,000", checker, "-s", "-f", file(100_000, kind=kind))
    commands.add("check of 10,000 mechanisms", checker, "-s", "-f", file(10_000, kind="mech"))
    output = file.folder / "output"
    commands.add("100,000 bad lines with -c", checker, "-c", "-f", file(100_000, kind="bad"), stderr=output)
    commands.add("100,000 with -v", checker, "-v", "-f", file(100_000), stderr=output)
    commands.run(3)
    return commands.cpu()


def measure(build, file):
    found = measure_checks(build, file)
    for program in ("service_bench", "acl_bench"):
        for name, times in run_program(build / "bin" / program, file.folder, 1, SECONDS).items():
            found[name] = statistics.median(times)
    return found


def noise_of(pairs):
    """The noise between runs of one build: three quarters of the pairs differ by less."""
    differences = sorted(abs(math.log(first / second)) for first, second in pairs)
    return differences[len(differences) * 3 // 4]


def row(name, old, new):
    """Old and new are the pairs of figures of each round. Their medians are compared, because these vary less."""
    before, after = (statistics.median([figure for pair in pairs for figure in pair]) for pairs in (old, new))
    change, noise = math.log(after / before), max(noise_of(old + new), LEAST_CHANGE)
    said = "" if abs(change) <= noise else "faster" if change < 0 else "**slower**"
    shown = [f"{math.expm1(part) * 100:{sign}.1f} %" for part, sign in ((change, "+"), (noise, ""))]
    return said, f"| {name} | {as_time(before)} | {as_time(after)} | {shown[0]} | {shown[1]} | {said} |"


def compare(build, other):
    """Each round runs old, new, old, new, so that slow changes of the machine affect all of them equally."""
    figures = {other: {}, build: {}}
    with tempfile.TemporaryDirectory(prefix="qzacl-bench-") as folder:
        file = Files(Path(folder))
        generate_files(file.folder)
        for number in range(ROUNDS):
            progress(f"round {number + 1} of {ROUNDS}")
            taken = {other: [], build: []}
            for which in (other, build, other, build):
                taken[which].append(measure(which, file))
            for which, (first, second) in taken.items():
                for name in first:
                    figures[which].setdefault(name, []).append((first[name], second[name]))
    rows = [row(name, old, figures[build][name]) for name, old in figures[other].items() if name in figures[build]]
    print("| Work | Before | Now | Change | Noise | |\n| --- | --- | --- | --- | --- | --- |")
    print("\n".join(text for _, text in rows))
    counts = [sum(word in said for said, _ in rows) for word in ("slower", "faster")]
    print(f"\n{counts[0]} slower, {counts[1]} faster, {len(rows) - sum(counts)} within their noise.")
