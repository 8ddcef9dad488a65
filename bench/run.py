#!/usr/bin/env python3
"""Measures everything and prints one table: each figure with its reference. See docs/performance.md.

usage: run.py BUILD_FOLDER [quick]   quick: no file above 100,000 lines, fewer repetitions
"""
import json
import os
import platform
import shutil
import statistics
import subprocess
import sys
import tempfile
from pathlib import Path

BENCH = Path(__file__).resolve().parent
ORDERS = ("sorted", "reversed", "bothends", "tworuns")
# The command converts to the locale's code set, so that one must be named; nothing is traced.
ENVIRONMENT = {name: value for name, value in os.environ.items() if not name.startswith(("QZ_", "LC_", "LANG"))}
ENVIRONMENT["PATH"] = os.environ.get("PATH", os.defpath) + ":/usr/sbin:/sbin"


def progress(text):
    print(f"bench: {text}", file=sys.stderr, flush=True)


# ---- Measuring -----------------------------------------------------------------------------------------------------


class Commands:
    """Whole processes: the CPU seconds of each, user and system, and its peak memory in bytes."""

    def __init__(self):
        self.jobs = {}
        self.left_out = []
        self.cpu = {}
        self.memory = {}

    def add(self, name, *command, locale="C.UTF-8", stderr=os.devnull):
        program = shutil.which(str(command[0]), path=ENVIRONMENT["PATH"])
        if program is None:
            self.left_out.append(f"{command[0]} is not installed")
            return
        arguments = [program, *map(str, command[1:])]
        self.jobs[name] = (arguments, {**ENVIRONMENT, "LC_ALL": locale}, stderr)

    @staticmethod
    def run_once(arguments, environment, stderr):
        nothing = os.open(os.devnull, os.O_RDWR)
        # Emptied here, so that the process is not charged for it.
        errors = os.open(stderr, os.O_WRONLY | os.O_CREAT | os.O_TRUNC)
        streams = [(os.POSIX_SPAWN_DUP2, fd, to) for fd, to in ((nothing, 0), (nothing, 1), (errors, 2))]
        child = os.posix_spawn(arguments[0], arguments, environment, file_actions=streams)
        _, status, usage = os.wait4(child, 0)
        os.close(nothing)
        os.close(errors)
        if status != 0:
            sys.exit(f"bench: {' '.join(arguments)}: status {os.waitstatus_to_exitcode(status)}")
        return usage.ru_utime + usage.ru_stime, usage.ru_maxrss * 1024

    def run(self, rounds):
        """Runs each added command once per round, so that a disturbance affects all alike."""
        jobs, self.jobs = list(self.jobs.items()), {}
        cpu = {name: [] for name, _ in jobs}
        memory = {name: [] for name, _ in jobs}
        for number in range(rounds + 1):
            for name, job in jobs if number % 2 == 0 else reversed(jobs):
                seconds, peak = self.run_once(*job)
                if number != 0:  # the first round only warms up
                    cpu[name].append(seconds)
                    memory[name].append(peak)
        self.cpu |= {name: statistics.median(values) for name, values in cpu.items()}
        self.memory |= {name: statistics.median(values) for name, values in memory.items()}


def run_programs(build, folder, repetitions, seconds):
    """The medians of everything that the two programs measure, in seconds, with their counters as NAME:COUNTER."""
    found = {}
    for program in ("service_bench", "acl_bench"):
        command = [
            build / "bin" / program,
            folder,
            "--benchmark_format=json",
            "--benchmark_enable_random_interleaving=true",
            f"--benchmark_repetitions={repetitions}",
            f"--benchmark_min_time={seconds}",
        ]
        output = subprocess.run(command, env=ENVIRONMENT, check=True, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL)
        for run in json.loads(output.stdout)["benchmarks"]:
            if "error_message" in run:
                sys.exit(f"bench: {run['name']}: {run['error_message']}")
            if run["run_type"] != "iteration":
                continue
            name = run["run_name"].removesuffix("/manual_time")
            time = run["real_time" if name != run["run_name"] else "cpu_time"]
            found.setdefault(name, []).append(time * {"ns": 1e-9, "us": 1e-6, "ms": 1e-3, "s": 1}[run["time_unit"]])
            for counter in ("parsing", "inserting", "compiling", "releasing"):
                if counter in run:
                    found.setdefault(f"{name}:{counter}", []).append(run[counter] * 1e-9)
    return {name: statistics.median(values) for name, values in found.items()}


# ---- The table -----------------------------------------------------------------------------------------------------


def as_time(seconds):
    for unit, scale in (("ns", 1e-9), ("µs", 1e-6), ("ms", 1e-3), ("s", 1)):
        value = seconds / scale
        if value < 999.5 or unit == "s":
            return f"{value:.{0 if value >= 100 else 1 if value >= 10 else 2}f} {unit}"


def as_memory(size):
    return f"{size / 2**20:.1f} MB"


class Table:
    def __init__(self):
        self.rows = []

    def line(self, *cells):
        self.rows.append("| " + " | ".join(cells) + " |")

    def section(self, title):
        self.line(f"**{title}**", "", "", "", "", "")

    def ratio(self, work, figure, reference_name, reference, limit=None, show=as_time):
        """A figure as a multiple of its reference; left out when one of them was not measured."""
        if figure is None or reference is None:
            return
        value = figure / reference
        verdict = ("–", "") if limit is None else (f"{limit:.2f}", "met" if value <= limit else "missed")
        shown = f"{value:.2f}" if value >= 0.095 else f"{value:.3f}"
        self.line(work, show(figure), f"{reference_name}: {show(reference)}", shown, *verdict)

    def more(self, work, figure, reference_name, reference, limit=None):
        """A figure as a number of nanoseconds above its reference."""
        if figure is None or reference is None:
            return
        value = (figure - reference) * 1e9
        verdict = ("–", "") if limit is None else (f"{limit} ns more", "met" if value <= limit else "missed")
        self.line(work, as_time(figure), f"{reference_name}: {as_time(reference)}", f"{value:+.1f} ns", *verdict)

    def bare(self, work, figure, limit=None):
        if figure is None:
            return
        verdict = ("–", "") if limit is None else (as_time(limit), "met" if figure <= limit else "missed")
        self.line(work, as_time(figure), "–", "–", *verdict)

    def print(self):
        with open("/proc/cpuinfo", encoding="ascii", errors="replace") as info:
            models = [line.split(":", 1)[1].strip() for line in info if line.startswith("model name")]
        machine = f"{models[0] if models else platform.machine()}, {os.cpu_count()} processors"
        print(f"| Work ({machine}) | Figure | Reference | Ratio | At most | Verdict |")
        print("| --- | --- | --- | --- | --- | --- |")
        print("\n".join(self.rows))


# ---- Whole processes -----------------------------------------------------------------------------------------------


def generate(folder, lines, *options):
    subprocess.run([sys.executable, "-B", BENCH / "generate.py", folder, str(lines), *options], check=True)


def measure_checks(commands, checker, folder, sizes, rounds):
    """The check of every family, order and type at every size, and what is special about some."""

    def file(lines, family="rand", order="random", kind="u"):
        return folder / f"{family}-{order}-{kind}-{lines}.acl"

    for lines in sizes:
        progress(f"checks of {lines:,} lines")
        generate(folder, lines, "--orders", "random", *ORDERS)
        generate(folder, lines, "--orders", "random", *ORDERS, "--family", "prefixed")
        generate(folder, lines, "--types", "e", "g", "mech" if lines == 10_000 else "bad")
        for family in ("rand", "prefixed"):
            for order in ("random", *ORDERS):
                commands.add(f"{family} {order} {lines}", checker, "-s", "-f", file(lines, family, order))
            sort = ("sort", "-f", "-u", "--parallel=1", "-k3,3", file(lines, family))
            commands.add(f"sort {family} {lines}", *sort, locale="C")
        for kind in ("e", "g"):
            commands.add(f"{kind} {lines}", checker, "-s", "-f", file(lines, kind=kind))
        if lines == 10_000:
            commands.add("mech", checker, "-s", "-f", file(lines, kind="mech"))
        if lines == sizes[-1]:
            output = folder / "output"
            commands.add(f"wc {lines}", "wc", "-l", file(lines))
            commands.add(f"cat {lines}", "cat", file(lines))
            commands.add("without -s", checker, "-f", file(lines))
            commands.add("verbose", checker, "-v", "-f", file(lines), stderr=output)
            commands.add("bad", checker, "-c", "-f", file(lines, kind="bad"), stderr=output)
        commands.run(rounds[lines])

    progress("short processes")
    generate(folder, 1000, "--types", "u", "doas", "sudoers")
    empty = folder / "empty.acl"
    empty.touch()
    commands.add("start", checker, "-f", empty)
    commands.add("1000", checker, "-f", file(1000))
    commands.add("1000 -s", checker, "-s", "-f", file(1000))
    commands.add("doas", "doas", "-C", file(1000, kind="doas"))
    commands.add("visudo", "visudo", "-q", "-c", "-f", file(1000, kind="sudoers"))
    commands.run(rounds[1000])


def check_rows(table, commands, sizes):
    cpu, largest = commands.cpu, sizes[-1]
    table.section("The check with `-s`, whole process, CPU time")
    for lines in sizes:
        is_large = lines >= 100_000
        size, start = f"{lines:,}", cpu[f"rand random {lines}"]
        table.ratio(f"{size} random", start, "`sort`", cpu[f"sort rand {lines}"], 0.9 if is_large else None)
        for order in ORDERS:
            table.ratio(f"{size} {order}", cpu[f"rand {order} {lines}"], "random", start, 1.0 if is_large else None)
        prefixed = cpu[f"prefixed random {lines}"]
        table.ratio(f"{size} prefixed, random", prefixed, "rand", start, 1.5)
        table.ratio(f"{size} prefixed, random", prefixed, "`sort`", cpu[f"sort prefixed {lines}"])
        for order in ORDERS:
            figure = cpu[f"prefixed {order} {lines}"]
            table.ratio(f"{size} prefixed, {order}", figure, "prefixed, random", prefixed, 1.0 if is_large else None)
        for kind, name in (("e", "expanded entries"), ("g", "groups")):
            table.ratio(f"{size} {name}", cpu[f"{kind} {lines}"], "users", start, 1.3 if lines == largest else None)
    table.ratio(f"{largest:,} random", start, "`wc -l`", cpu[f"wc {largest}"])
    table.ratio(f"{largest:,} random", start, "`cat`", cpu[f"cat {largest}"])
    small = sizes[0]
    a_line, a_small_line = cpu[f"rand random {largest}"] / largest, cpu[f"rand random {small}"] / small
    table.ratio(f"a line of {largest:,}", a_line, f"a line of {small:,}", a_small_line, 2.2)
    of_start = [(cpu[f"rand random {lines}"] - cpu["start"]) / lines for lines in (largest, small)]
    table.ratio("the same without the start of the process", of_start[0], f"a line of {small:,}", of_start[1])
    # The kernel counts a process from the size of the one that starts it, so that only large ones can be told apart.
    if largest == 1_000_000:
        peak, sort_peak = commands.memory[f"rand random {largest}"], commands.memory[f"sort rand {largest}"]
        table.ratio(f"peak memory, {largest:,} random", peak, "`sort`", sort_peak, 2.5, as_memory)
    table.ratio("10,000 mechanisms", cpu["mech"], "10,000 entries of one", cpu["rand random 10000"], 2)

    table.section("The check without `-s`, whole process, CPU time")
    table.ratio("1,000 entries", cpu["1000"], "`doas -C`", cpu.get("doas"), 1.3)
    table.ratio("1,000 entries", cpu["1000"], "`visudo -c`", cpu.get("visudo"))
    table.ratio("1,000 entries", cpu["1000"], "an empty file", cpu["start"])
    table.ratio("1,000 entries with `-s`", cpu["1000 -s"], "`doas -C`", cpu.get("doas"))
    table.ratio(f"{largest:,} with `-v` into a file", cpu["verbose"], "without", cpu["without -s"], 3)
    table.ratio(f"{largest:,} bad lines with `-c` into a file", cpu["bad"], "good lines", cpu["without -s"], 4)


# ---- Inside a process ----------------------------------------------------------------------------------------------


def program_rows(table, found):
    get = found.get
    table.section("Decisions, as a service calls them")
    for lines in (10, 100, 1000, 100_000):
        for family in ("rand", "prefixed"):
            here = f"{family}/{lines}"
            work, decision = f"in the middle of {lines:,}, {family}", get(f"decision/{here}")
            table.ratio(work, decision, "bare walk", get(f"walk/{here}"), 1.3 if lines == 1000 else None)
            if lines == 10:
                table.more(work, decision, "fold table", get(f"table_scan/{here}"), 40)
            else:
                table.ratio(work, decision, "fold table", get(f"table_scan/{here}"))
            table.ratio(work, decision, "`strcasecmp`", get(f"strcasecmp_scan/{here}"))
    for family in ("rand", "prefixed"):
        for where, name in (("denial_in_middle", "ending in the middle"), ("denial_at_end", "walking over all")):
            work, figure = f"denial over 10, {name}, {family}", get(f"{where}/{family}/10")
            table.more(work, figure, "decision", get(f"decision/{family}/10"), 25)
    end = get("decision_at_end/rand/1000")
    table.ratio("32 groups against 1,000 entries", get("groups/1000"), "decision at the end", end, 6)
    look_up = get("posix_look_up/1000")
    table.ratio("in the middle of 1,000, rand", get("decision/rand/1000"), "libacl look-up", look_up)

    table.section("Edits, as a service calls them")
    for edit in ("adding", "deleting"):
        decision = get("decision/rand/100000")
        table.ratio(f"{edit} in the middle of 100,000", get(f"{edit}/100000"), "decision there", decision, 2)

    table.section("Reads, as a service calls them")
    for lines, limit in ((1000, 1 / 4), (100_000, 1 / 10), (1_000_000, 1 / 10)):
        cached, plain = get(f"cached_read/{lines}"), get(f"plain_read/{lines}")
        table.ratio(f"{lines:,} from the cache, checked", cached, "text", get(f"text_read/{lines}"), limit)
        table.ratio(
            f"{lines:,} from the cache, checked", cached, "plain read", plain, 3 if lines == 1_000_000 else None
        )
    table.ratio("1,000 from the text", get("text_read/1000"), "libacl parse", get("posix_parse/1000"))

    table.section("Inside the library")
    table.bare("a disabled trace point", get("trace_point"), 2e-9)
    for lines in (1000, 100_000, 1_000_000):
        for phase in ("parsing", "inserting", "compiling", "releasing"):
            table.bare(f"{phase}, a line of {lines:,}", get(f"phases/{lines}:{phase}"))


def main():
    build, is_quick = Path(sys.argv[1]), sys.argv[2:] == ["quick"]
    if sys.argv[2:] and not is_quick:
        sys.exit("usage: ./dev bench [quick]")
    sizes = (10_000, 100_000) if is_quick else (10_000, 100_000, 1_000_000)
    rounds = {1000: 11, 10_000: 5, 100_000: 3} if is_quick else {1000: 51, 10_000: 25, 100_000: 11, 1_000_000: 7}
    table, commands = Table(), Commands()
    with tempfile.TemporaryDirectory(prefix="qzacl-bench-") as name:
        folder = Path(name)
        measure_checks(commands, build / "bin" / "qzaclfck", folder, sizes, rounds)
        progress("inside a process")
        for lines in (10, 100, 1000):
            for family in ("rand", "prefixed"):
                generate(folder, lines, "--family", family)
        generate(folder, 1000, "--types", "g")
        found = run_programs(build, folder, *((3, 0.01) if is_quick else (9, 0.1)))
    if "posix_parse/1000" not in found:
        commands.left_out.append("libacl was not there when the programs were built (Debian: libacl1-dev)")
    check_rows(table, commands, sizes)
    program_rows(table, found)
    table.print()
    if commands.left_out:
        print("\nLeft out: " + "; ".join(commands.left_out) + ".")


if __name__ == "__main__":
    main()
