"""What the two programs measure inside a process, and how the table shows it."""
from measure import PHASES, generate, medians, progress, run_program

FAMILIES = ("rand", "prefixed")
PROGRAMS = ("service_bench", "acl_bench")


def measure_programs(build, folder, repetitions, seconds):
    """The median of every figure, in seconds. The folder already contains the larger files."""
    progress("inside a process")
    for lines in (10, 100, 1000):
        for family in FAMILIES:
            generate(folder, lines, "--family", family)
    generate(folder, 10, "--types", "e")
    generate(folder, 1000, "--types", "g")
    found = {}
    for program in PROGRAMS:
        found |= medians(run_program(build / "bin" / program, folder, repetitions, seconds))
    return found


def decision_rows(table, get):
    # What a decision of ten may cost above the fold table, and an edit as a multiple of a decision there.
    above_table = {"rand": 13, "prefixed": 0}
    table.section("Decisions, as a service calls them")
    for lines in (10, 100, 1000, 100_000):
        for family in FAMILIES:
            here = f"{family}/{lines}"
            work, decision = f"in the middle of {lines:,}, {family}", get(f"decision/{here}")
            table.ratio(work, decision, "bare walk", get(f"walk/{here}"), 1.0 if lines == 1000 else None)
            if lines == 10:
                table.more(work, decision, "fold table", get(f"table_scan/{here}"), above_table[family])
            else:
                table.ratio(work, decision, "fold table", get(f"table_scan/{here}"))
            table.ratio(work, decision, "`strcasecmp`", get(f"strcasecmp_scan/{here}"))
    for family in FAMILIES:
        for where, name in (("denial_in_middle", "ending in the middle"), ("denial_at_end", "walking over all")):
            work, figure = f"denial over 10, {name}, {family}", get(f"{where}/{family}/10")
            table.more(work, figure, "decision", get(f"decision/{family}/10"), 10)
    # 50 ns where the fold table takes 12.
    table.ratio("with a handler, the last of 10", get("handler/10"), "fold table", get("table_scan/rand/10"), 50 / 12)
    end = get("decision_at_end/rand/1000")
    table.ratio("32 groups against 1,000 entries", get("groups/1000"), "decision at the end", end, 6)
    look_up = get("posix_look_up/1000")
    table.ratio("in the middle of 1,000, rand", get("decision/rand/1000"), "libacl look-up", look_up)


def thread_rows(table, get):
    table.section("The same decision in 2 threads on one buffer; by the clock, the best is 0.50")
    for what, name in (("threads", "in the middle of 10"), ("handler_threads", "with a handler, the last of 10")):
        alone, both = f"{what}/threads:1", f"{what}/threads:2"
        table.ratio(f"{name}, by the clock", get(both), "1 thread", get(alone))
        table.ratio(f"{name}, CPU time", get(f"{both}:cpu"), "1 thread", get(f"{alone}:cpu"))
    table.ratio("a lock and its release, CPU time", get("lock/threads:2:cpu"), "1 thread", get("lock/threads:1:cpu"))
    handler, lock = get("handler_threads/threads:1:cpu"), get("lock/threads:1:cpu")
    table.ratio("a lock and its release", lock, "decision with a handler, 1 thread", handler)


def edit_and_read_rows(table, get):
    table.section("Edits, as a service calls them")
    for family, limit in (("rand", 3.2), ("prefixed", 3.8)):
        for edit in ("adding", "deleting"):
            figure, decision = get(f"{edit}/{family}/100000"), get(f"decision/{family}/100000")
            table.ratio(f"{edit} in the middle of 100,000, {family}", figure, "decision there", decision, limit)

    table.section("Reads, as a service calls them")
    for lines, of_text, of_plain in ((1000, 0.25, 1.8), (100_000, 0.1, None), (1_000_000, 0.1, 3)):
        work, cached = f"{lines:,} from the cache, checked", get(f"cached_read/{lines}")
        table.ratio(work, cached, "text", get(f"text_read/{lines}"), of_text)
        table.ratio(work, cached, "plain read", get(f"plain_read/{lines}"), of_plain)
    table.ratio("1,000 from the text", get("text_read/1000"), "libacl parse", get("posix_parse/1000"))


def program_rows(table, found):
    get = found.get
    decision_rows(table, get)
    thread_rows(table, get)
    edit_and_read_rows(table, get)
    table.section("Inside the library")
    table.bare("a disabled trace point", get("trace_point"), 2e-9)
    for lines in (1000, 100_000, 1_000_000):
        for phase in PHASES:
            table.bare(f"{phase}, a line of {lines:,}", get(f"phases/{lines}:{phase}"))
