"""The table: each figure with its reference and, if there is a limit, whether it was kept."""
import os
import platform


def as_time(seconds):
    for unit, scale in (("ns", 1e-9), ("µs", 1e-6), ("ms", 1e-3), ("s", 1)):
        value = seconds / scale
        if value < 999.5 or unit == "s":
            return f"{value:.{0 if value >= 100 else 1 if value >= 10 else 2}f} {unit}"


def as_memory(size):
    return f"{size / 2**20:.1f} MB"


def machine():
    with open("/proc/cpuinfo", encoding="ascii", errors="replace") as info:
        models = [line.split(":", 1)[1].strip() for line in info if line.startswith("model name")]
    return f"{models[0] if models else platform.machine()}, {os.cpu_count()} processors"


def verdict(value, limit, shown_limit):
    return ("–", "") if limit is None else (shown_limit, "met" if value <= limit else "missed")


class Table:
    def __init__(self):
        self.rows = []
        self.grown = []

    def line(self, *cells):
        self.rows.append("| " + " | ".join(cells) + " |")

    def section(self, title):
        self.line(f"**{title}**", "", "", "", "", "")

    def ratio(self, work, figure, reference_name, reference, limit=None, show=as_time):
        """A figure as a multiple of its reference. Omitted if either was not measured."""
        if figure is None or reference is None:
            return
        value = figure / reference
        shown = f"{value:.2f}" if value >= 0.095 else f"{value:.3f}"
        told = verdict(value, limit, f"{limit or 0:.2f}")
        self.line(work, show(figure), f"{reference_name}: {show(reference)}", shown, *told)

    def more(self, work, figure, reference_name, reference, limit=None):
        """A figure as a number of nanoseconds above its reference."""
        if figure is None or reference is None:
            return
        value = (figure - reference) * 1e9
        told = verdict(value, limit, f"{limit} ns more")
        self.line(work, as_time(figure), f"{reference_name}: {as_time(reference)}", f"{value:+.1f} ns", *told)

    def bare(self, work, figure, limit=None):
        if figure is not None:
            self.line(work, as_time(figure), "–", "–", *verdict(figure, limit, as_time(limit or 0)))

    def growth(self, work, figure, reference_name, reference, limit):
        """A figure for much work as a multiple of that for little. Growing faster than the limit fails the run."""
        self.ratio(work, figure, reference_name, reference, limit)
        if figure / reference > limit:
            self.grown.append(f"{work}: {figure / reference:.0f} times {reference_name}")

    def text(self):
        head = f"| Work ({machine()}) | Figure | Reference | Ratio | At most | Verdict |"
        return "\n".join([head, "| --- | --- | --- | --- | --- | --- |", *self.rows])
