"""The check as whole processes: what is run, and what the table says of it."""
import math

from measure import generate, progress
from table import as_memory

ORDERS = ("sorted", "reversed", "bothends", "tworuns")
FAMILIES = ("rand", "prefixed")
LARGE = 100_000  # from here on the start of a process counts for little
MILLION = 1_000_000
# At most so many times the time of sort, and of its memory.
TIME_OF_SORT = {("rand", LARGE): 0.48, ("rand", MILLION): 0.35, ("prefixed", MILLION): 0.33}
MEMORY_OF_SORT = {"rand": 0.9, "prefixed": 1.1}


class Files:
    """The files of generate.py in a folder."""

    def __init__(self, folder):
        self.folder = folder

    def __call__(self, lines, family="rand", order="random", kind="u"):
        return self.folder / f"{family}-{order}-{kind}-{lines}.acl"


def add_orders(commands, checker, file, lines):
    for family in FAMILIES:
        for order in ("random", *ORDERS):
            commands.add(f"{family} {order} {lines}", checker, "-s", "-f", file(lines, family, order))
        sort = ("sort", "-f", "-u", "--parallel=1", "-k3,3", file(lines, family))
        commands.add(f"sort {family} {lines}", *sort, locale="C")
    for kind in ("e", "g"):
        commands.add(f"{kind} {lines}", checker, "-s", "-f", file(lines, kind=kind))


def add_largest(commands, checker, file, lines):
    """What is special about the largest size."""
    output = file.folder / "output"
    commands.add("wc", "wc", "-l", file(lines))
    commands.add("cat", "cat", file(lines))
    commands.add("without -s", checker, "-f", file(lines))
    commands.add("verbose", checker, "-v", "-f", file(lines), stderr=output)
    commands.add("bad", checker, "-c", "-f", file(lines, kind="bad"), stderr=output)
    # The first two have nothing to print, and their status may say so.
    questioner = checker.with_name("qzacl")
    commands.add("ask", questioner, "ask", "-m", "unix", file(lines), "nobody@nowhere", statuses=(0, 1))
    commands.add("who", questioner, "who", file(lines), "rwcxCqledvsao", statuses=(0, 1))
    commands.add("show", questioner, "show", file(lines))
    commands.add("show --json", questioner, "show", "--json", file(lines))
    commands.add("diff", questioner, "diff", file(lines), file(lines, order="sorted"), statuses=(1,))


def measure_short(commands, checker, file, rounds):
    progress("short processes")
    generate(file.folder, 1000, "--types", "u", "doas", "sudoers")
    empty = file.folder / "empty.acl"
    empty.touch()
    commands.add("start", checker, "-f", empty)
    commands.add("1000", checker, "-f", file(1000))
    commands.add("1000 -s", checker, "-s", "-f", file(1000))
    commands.add("doas", "doas", "-C", file(1000, kind="doas"))
    commands.add("visudo", "visudo", "-q", "-c", "-f", file(1000, kind="sudoers"))
    commands.run(rounds)


def measure_checks(commands, checker, folder, sizes, rounds):
    """The check of every family, order and type at every size."""
    file = Files(folder)
    for lines in sizes:
        progress(f"checks of {lines:,} lines")
        generate(folder, lines, "--orders", "random", *ORDERS)
        generate(folder, lines, "--orders", "random", *ORDERS, "--family", "prefixed")
        generate(folder, lines, "--types", "e", "g", "mech" if lines == 10_000 else "bad")
        add_orders(commands, checker, file, lines)
        if lines == 10_000:
            commands.add("mech", checker, "-s", "-f", file(lines, kind="mech"))
        if lines == sizes[-1]:
            add_largest(commands, checker, file, lines)
        commands.run(rounds[lines])
    measure_short(commands, checker, file, rounds[1000])


def size_rows(table, cpu, lines, is_largest):
    size, start = f"{lines:,}", cpu[f"rand random {lines}"]
    limit = 1.0 if lines >= LARGE else None
    for family, prefix in (("rand", ""), ("prefixed", "prefixed, ")):
        random = cpu[f"{family} random {lines}"]
        of_sort = TIME_OF_SORT.get((family, lines))
        table.ratio(f"{size} {prefix}random", random, "`sort`", cpu[f"sort {family} {lines}"], of_sort)
        for order in ORDERS:
            figure = cpu[f"{family} {order} {lines}"]
            table.ratio(f"{size} {prefix}{order}", figure, f"{prefix}random", random, limit)
    table.ratio(f"{size} prefixed, random", cpu[f"prefixed random {lines}"], "rand", start, 1.5)
    for kind, name in (("e", "expanded entries"), ("g", "groups")):
        table.ratio(f"{size} {name}", cpu[f"{kind} {lines}"], "users", start, 1.3 if is_largest else None)


def growth_rows(table, cpu, sizes):
    """From the smallest to the largest size nothing may grow faster than n log n."""
    small, large = sizes[0], sizes[-1]
    limit = large * math.log(large) / (small * math.log(small))
    table.section(f"Growth from {small:,} to {large:,} lines, at most n log n")
    works = [f"{family} {order}" for family in FAMILIES for order in ("random", *ORDERS)] + ["e", "g"]
    for work in works:
        table.growth(work, cpu[f"{work} {large}"], f"{small:,}", cpu[f"{work} {small}"], limit)


def check_rows(table, commands, sizes):
    cpu, memory, largest, small = commands.cpu(), commands.memory(), sizes[-1], sizes[0]
    table.section("The check with `-s`, whole process, CPU time")
    for lines in sizes:
        size_rows(table, cpu, lines, lines == largest)
    start = cpu[f"rand random {largest}"]
    table.ratio(f"{largest:,} random", start, "`wc -l`", cpu["wc"])
    table.ratio(f"{largest:,} random", start, "`cat`", cpu["cat"])
    a_line, a_small_line = [cpu[f"rand random {lines}"] / lines for lines in (largest, small)]
    table.ratio(f"a line of {largest:,}", a_line, f"a line of {small:,}", a_small_line, 2.2)
    of_start = [(cpu[f"rand random {lines}"] - cpu["start"]) / lines for lines in (largest, small)]
    table.ratio("the same without the start of the process", of_start[0], f"a line of {small:,}", of_start[1])
    # The kernel counts a process from the size of the one that starts it, so that only large ones can be told apart.
    if largest == MILLION:
        for family, limit in MEMORY_OF_SORT.items():
            peak, sort_peak = memory[f"{family} random {largest}"], memory[f"sort {family} {largest}"]
            table.ratio(f"peak memory, {largest:,} {family}", peak, "`sort`", sort_peak, limit, as_memory)
    table.ratio("10,000 mechanisms", cpu["mech"], "10,000 entries of one", cpu["rand random 10000"], 1.3)
    growth_rows(table, cpu, sizes)

    table.section("The check without `-s`, whole process, CPU time")
    table.ratio("1,000 entries", cpu["1000"], "`doas -C`", cpu.get("doas"), 1.3)
    table.ratio("1,000 entries", cpu["1000"], "`visudo -c`", cpu.get("visudo"))
    table.ratio("1,000 entries", cpu["1000"], "an empty file", cpu["start"])
    table.ratio("1,000 entries with `-s`", cpu["1000 -s"], "`doas -C`", cpu.get("doas"))
    good = cpu["without -s"]
    table.ratio(f"{largest:,} with `-v` into a file", cpu["verbose"], "without", good, 3)
    table.ratio(f"{largest:,} bad lines with `-c` into a file", cpu["bad"], "good lines", good, 2.5)
    for verb, limit in (("ask", 1.5), ("who", 1.5), ("show", 2), ("show --json", 2.5), ("diff", 4)):
        table.ratio(f"`qzacl {verb}`, {largest:,}", cpu.get(verb), "`qzaclfck -f`", good, limit)
