"""Draws docs/*.svg: checks by number of lines, with checkers of other texts; decisions by number of entries."""
import os
import statistics
import subprocess
import tempfile
from pathlib import Path

import matplotlib

matplotlib.use("svg")
from matplotlib import pyplot  # after choosing the backend

from checks import Files
from measure import BENCH, ENVIRONMENT, generate, medians, progress, run_once, run_program

DOCUMENTS = BENCH.parent / "docs"
LINES = (1000, 3000, 10_000, 30_000, 100_000, 300_000, 1_000_000)
ENTRIES = (10, 100, 1000, 10_000, 100_000)
ROUNDS = 5
TOO_LONG = 10  # seconds; a program that takes longer is run only once, and not with more lines
# A small process that measures memory: the kernel counts the parent's size with its children.
SMALL_PARENT = "/usr/bin/time"
# Readable on white and on black: no background is drawn, and no colour is close to either.
GREY = "#7f868e"
COLOURS = ("#1f8fe0", "#e0761f", "#2aa35a", "#b56be0", "#d9455f")
MARKS = "os^Dv"
STYLE = {
    "axes.edgecolor": GREY,
    "axes.labelcolor": GREY,
    "axes.titlecolor": GREY,
    "font.size": 11,
    "grid.color": GREY,
    "grid.alpha": 0.3,
    "legend.framealpha": 0,
    "legend.labelcolor": GREY,
    "savefig.transparent": True,
    "svg.hashsalt": "qzacl",
    "text.color": GREY,
    "xtick.color": GREY,
    "ytick.color": GREY,
}


def checkers(build, file, lines):
    """The programs to draw, by name: the command and its locale."""
    return {
        "qzaclfck -s": ([build / "bin" / "qzaclfck", "-s", "-f", file(lines)], "C.UTF-8"),
        "sort -f -u": (["/usr/bin/sort", "-f", "-u", "--parallel=1", "-k3,3", file(lines)], "C"),
        "doas -C": (["/usr/bin/doas", "-C", file(lines, kind="doas")], "C.UTF-8"),
        "visudo -c": (["/usr/sbin/visudo", "-q", "-c", "-f", file(lines, kind="sudoers")], "C.UTF-8"),
        "setfacl --test": (["/usr/bin/setfacl", "--test", "-M", file(lines, kind="posix"), file.folder], "C.UTF-8"),
    }


def peak_memory(command, environment):
    """The peak memory of a process in bytes."""
    with tempfile.NamedTemporaryFile("r") as told:
        arguments = [SMALL_PARENT, "-f", "%M", "-o", told.name, *command]
        nothing = subprocess.DEVNULL
        subprocess.run(arguments, env=environment, stdin=nothing, stdout=nothing, stderr=nothing, check=True)
        return int(told.read()) * 1024


def measure_checkers(build, folder):
    """For each program, the points (lines, seconds) and (lines, bytes)."""
    file, slow = Files(folder), set()
    times, memories = {}, {}
    for lines in LINES:
        progress(f"plot: {lines:,} lines")
        generate(folder, lines, "--types", "u", "doas", "sudoers", "posix")
        jobs = {name: job for name, job in checkers(build, file, lines).items() if name not in slow}
        for name, (command, locale) in jobs.items():
            if not os.access(command[0], os.X_OK):
                continue
            arguments, environment = list(map(str, command)), {**ENVIRONMENT, "LC_ALL": locale}
            took = [run_once(arguments, environment, os.devnull, (0,))[0]]
            if took[0] > TOO_LONG:
                slow.add(name)
            else:
                took = [run_once(arguments, environment, os.devnull, (0,))[0] for _ in range(ROUNDS)]
            times.setdefault(name, []).append((lines, statistics.median(took)))
            memories.setdefault(name, []).append((lines, peak_memory(arguments, environment)))
    return times, memories


def measure_decisions(build, folder):
    for lines in ENTRIES:
        generate(folder, lines)
    wanted = "--benchmark_filter=^(decision|walk|table_scan)/rand/|^posix_look_up/"
    found = medians(run_program(build / "bin" / "service_bench", folder, 5, 0.05, wanted))
    names = {
        "decision": "decision/rand/",
        "fold table": "table_scan/rand/",
        "bare walk": "walk/rand/",
        "libacl look-up": "posix_look_up/",
    }
    return {
        name: [(count, found[start + str(count)]) for count in ENTRIES if start + str(count) in found]
        for name, start in names.items()
    }


def draw(axes, title, x_label, y_label, series, scale):
    for (name, points), colour, mark in zip(series.items(), COLOURS, MARKS):
        xs, ys = zip(*points)
        axes.plot(xs, [y / scale for y in ys], color=colour, marker=mark, markersize=5, linewidth=1.8, label=name)
    axes.set(title=title, xlabel=x_label, ylabel=y_label, xscale="log", yscale="log")
    axes.grid(True)
    axes.xaxis.set_major_formatter("{x:,.0f}")
    axes.yaxis.set_major_formatter("{x:,g}")
    axes.legend()


def save(figure, name):
    figure.tight_layout()
    figure.savefig(DOCUMENTS / f"{name}.svg", metadata={"Date": None})


def plot(build):
    pyplot.rcParams.update(STYLE)
    with tempfile.TemporaryDirectory(prefix="qzacl-bench-") as name:
        times, memories = measure_checkers(build, Path(name))
        decisions = measure_decisions(build, Path(name))
    figure, (left, right) = pyplot.subplots(1, 2, figsize=(11, 4.6))
    draw(left, "Checking a file: time", "lines", "CPU time, ms", times, 1e-3)
    draw(right, "Checking a file: memory", "lines", "peak memory, MB", memories, 2**20)
    save(figure, "checks")
    figure, axes = pyplot.subplots(figsize=(7, 4.6))
    draw(axes, "A decision in the middle of the entries", "entries", "CPU time, ns", decisions, 1e-9)
    save(figure, "decisions")
