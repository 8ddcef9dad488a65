"""Measures whole processes, and runs the two programs that measure inside one."""
import json
import os
import shutil
import statistics
import subprocess
import sys
from pathlib import Path

BENCH = Path(__file__).resolve().parent
# The command converts to the locale's code set, so the locale is fixed. Tracing is off.
ENVIRONMENT = {name: value for name, value in os.environ.items() if not name.startswith(("QZ_", "LC_", "LANG"))}
ENVIRONMENT["PATH"] = os.environ.get("PATH", os.defpath) + ":/usr/sbin:/sbin"
SECONDS = {"ns": 1e-9, "us": 1e-6, "ms": 1e-3, "s": 1}
PHASES = ("parsing", "inserting", "compiling", "releasing")


def progress(text):
    print(f"bench: {text}", file=sys.stderr, flush=True)


def generate(folder, lines, *options):
    subprocess.run([sys.executable, "-B", BENCH / "generate.py", folder, str(lines), *options], check=True)


def in_turn(things, number):
    """Every second round goes backwards, so that disturbances affect all figures equally."""
    return things if number % 2 == 0 else things[::-1]


def run_once(arguments, environment, stderr, statuses):
    """Runs a process and returns its CPU seconds, user and system, and its peak memory in bytes."""
    nothing = os.open(os.devnull, os.O_RDWR)
    # Emptied here, so that the process is not charged for it.
    errors = os.open(stderr, os.O_WRONLY | os.O_CREAT | os.O_TRUNC)
    streams = [(os.POSIX_SPAWN_DUP2, fd, to) for fd, to in ((nothing, 0), (nothing, 1), (errors, 2))]
    child = os.posix_spawn(arguments[0], arguments, environment, file_actions=streams)
    _, status, usage = os.wait4(child, 0)
    os.close(nothing)
    os.close(errors)
    if os.waitstatus_to_exitcode(status) not in statuses:
        sys.exit(f"bench: {' '.join(arguments)}: status {os.waitstatus_to_exitcode(status)}")
    return usage.ru_utime + usage.ru_stime, usage.ru_maxrss * 1024


class Commands:
    """Whole processes: all figures of each, by the name under which it was added."""

    def __init__(self):
        self.jobs = {}
        self.left_out = []
        self.cpu_figures = {}
        self.memory_figures = {}

    def add(self, name, *command, locale="C.UTF-8", stderr=os.devnull, statuses=(0,)):
        program = shutil.which(str(command[0]), path=ENVIRONMENT["PATH"])
        if program is None:
            self.left_out.append(f"{Path(command[0]).name} is not installed")
            return
        arguments = [program, *map(str, command[1:])]
        self.jobs[name] = (arguments, {**ENVIRONMENT, "LC_ALL": locale}, stderr, statuses)

    def run(self, rounds):
        """Runs each process once per round."""
        jobs, self.jobs = list(self.jobs.items()), {}
        for number in range(rounds + 1):
            for name, job in in_turn(jobs, number):
                seconds, peak = run_once(*job)
                if number != 0:  # the first round only warms up
                    self.cpu_figures.setdefault(name, []).append(seconds)
                    self.memory_figures.setdefault(name, []).append(peak)

    def cpu(self):
        return {name: statistics.median(values) for name, values in self.cpu_figures.items()}

    def memory(self):
        return {name: statistics.median(values) for name, values in self.memory_figures.items()}


def figures_of(run):
    """The names and seconds of one run: its time and, for some, the CPU time and the phases."""
    scale = SECONDS[run["time_unit"]]
    name = run["run_name"]
    if "/real_time" in name:
        name = name.replace("/real_time", "")
        yield f"{name}:cpu", run["cpu_time"] * scale
        yield name, run["real_time"] * scale
    elif name.endswith("/manual_time"):
        yield name.removesuffix("/manual_time"), run["real_time"] * scale
    else:
        yield name, run["cpu_time"] * scale
    for phase in PHASES:
        if phase in run:
            yield f"{name}:{phase}", run[phase] * 1e-9


def run_program(program, folder, repetitions, seconds, *options):
    """Every figure that a program measures, by name."""
    command = [
        program,
        folder,
        "--benchmark_format=json",
        "--benchmark_enable_random_interleaving=true",
        f"--benchmark_repetitions={repetitions}",
        f"--benchmark_min_time={seconds}",
        *options,
    ]
    output = subprocess.run(command, env=ENVIRONMENT, check=True, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL)
    found = {}
    for run in json.loads(output.stdout)["benchmarks"]:
        if "error_message" in run:
            sys.exit(f"bench: {run['name']}: {run['error_message']}")
        if run["run_type"] == "iteration":
            for name, time in figures_of(run):
                found.setdefault(name, []).append(time)
    return found


def medians(found):
    return {name: statistics.median(values) for name, values in found.items()}
