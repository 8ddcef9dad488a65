"""Turns tracing on for the checker as an administrator does, and reads the records that it leaves.

Usage: trace_test.py BUILD_DIR [unittest arguments].
"""
import errno
import json
import os
import pathlib
import re
import stat
import sys
import unittest

from command_test import IS_ROOT, TEXTS, CommandCase, entry, message

ENTRIES = "# n\nn r\nU UNIX alice wr\ng staff q\n"
LONG_LINES = "n" + " " * 1200 + "\nn\n" + "o" + " " * 1200
PRINTED = {  # by each text, in verbose mode or as failures
    ENTRIES: entry("n", "r") + entry("u", "rw", "unix", "alice") + entry("g", "q", "staff"),
    "n r\n": entry("n", "r"),
    "g \xff r\n": TEXTS[130],
    LONG_LINES: message(145, 1) + message(145, 3),
}
WIDE = 8  # bytes of an item whose value differs from run to run


def number(value, width=4):
    return value.to_bytes(width, sys.byteorder)


def bare(*ids):
    return [(identifier, []) for identifier in ids]


def shows(kind, mask, mechanism, identity, permissions):
    """The records of one line of verbose mode at the level that tells arguments and results."""
    return [(51, [WIDE, kind, mask, mechanism, identity, WIDE, WIDE]), (54, [number(0), mechanism, identity]),
            (99, [mask, WIDE, ""]), (102, [number(0), permissions])]


CACHE_MADE = (110, ["{dir}/a.cacl"])
DETAILS = (shows(number(1), number(1), "", "", "r") + shows(number(4), number(3), "unix", "alice", "rw")
           + shows(number(16), number(32), "", "staff", "q"))

RECORDS = [  # levels, options, file text, and each record with its items: a width, exact bytes, or a text
    ("Info=1", "-s", ENTRIES, [CACHE_MADE]),
    ("Info=255", "-s -v", ENTRIES, [CACHE_MADE]),
    ("Info=1", "-v", ENTRIES, []),
    ("Errors=1", "-c", LONG_LINES, [(115, [number(1), number(1202, WIDE)]), (115, [number(3), number(1202, WIDE)])]),
    ("API=1", "-s", ENTRIES, []),
    ("API=1", "-v", ENTRIES, bare(49, 52, 97, 100) * 3),
    ("API=2", "-v", ENTRIES, []),
    ("API=8", "-s -v", ENTRIES, DETAILS),
    ("API=8", "-v", "g \xff r\n", [(51, [WIDE, number(16), number(1), "", b"\xff\0", WIDE, WIDE]), (53, [number(26)])]),
    ("Buffer=8", "-s -v", ENTRIES, []),
    *[(f"Perf={level}", "-s", ENTRIES, [(0, [number(level)])]) for level in (1, 3, 4, 7, 8)],
    ("Perf=2", "-s", ENTRIES, [(0, [number(2)]), (6, [WIDE, WIDE, WIDE])]),
    *[(f"Perf={level}", "-s", ENTRIES, []) for level in (0, 5, 6, 9)],
    ("Perf=1,Info=1,API=1", "-s -v", "n r\n", [(0, [number(1)]), *bare(49, 52, 97, 100), CACHE_MADE]),
]

LEVELS = [  # how the levels are written, and whether the cache made is recorded
    ("_CT:API=8;;:;_SEL:nonsense,Info=1,=,Perf;_SEL:Info=256", True),
    ("_SEL:Info=256", False),
    ("_SEL:info=1;_SELF:Info=1;Info=1;_SEL", False),
    (":=,;" * 1000, False),
]


class Trace(CommandCase):
    def fresh(self):
        super().fresh()
        self.trace = self.dir + ".trace"

    def traced(self, levels, options, status=0, errors="", **how):
        environment = {"QZ_TRACE_LEVELS": levels, "QZ_TRACE_FILE": how.pop("file", self.trace)}
        makes = ["a.cacl"] if "-s" in options and status == 0 else []
        self.expect([*options.split(), "-f", "a"], status, errors, environment=environment, makes=makes, **how)

    def records(self):
        """What was recorded, as (id, [bytes of each item]); each line is checked to be a record by itself."""
        trace = pathlib.Path(self.trace)
        found = []
        for line in trace.read_text("utf-8").splitlines() if trace.exists() else []:
            record = json.loads(line)
            self.assertEqual(list(record), ["time", "pid", "tid", "component", "id", "items"])
            self.assertRegex(record["time"], r"^\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{9}Z$")
            self.assertEqual((record["component"], record["pid"]), ("_SEL", record["tid"]))
            items = [bytes.fromhex(item["hex"]) for item in record["items"]]
            self.assertEqual([item["len"] for item in record["items"]], [len(data) for data in items])
            self.assertEqual([item.get("text") for item in record["items"]],
                             [data[:-1].decode() if re.fullmatch(rb"[ -~]*\0", data) else None for data in items])
            # Whether trees let go of their entries one by one is not seen from outside.
            if record["id"] not in (45, 47, 48):
                found.append((record["id"], items))
        return found

    def expect_records(self, expected):
        got = self.records()
        self.assertEqual([identifier for identifier, _ in got], [identifier for identifier, _ in expected])
        for (identifier, items), (_, wanted) in zip(got, expected):
            wanted = [item.replace("{dir}", self.dir).encode("latin-1") + b"\0" if isinstance(item, str) else item
                      for item in wanted]
            shown = [len(item) if isinstance(want, int) else item for item, want in zip(items, wanted)]
            self.assertEqual((identifier, len(items), shown), (identifier, len(wanted), wanted))

    def test_records(self):
        for levels, options, text, expected in RECORDS:
            with self.subTest(levels, options=options):
                self.fresh()
                self.write("a", text)
                errors = PRINTED[text] if "-v" in options or "-c" in options else ""
                self.traced("_SEL:" + levels, options, 0, errors)
                self.expect_records(expected)

    def test_failures_of_caching(self):
        self.write("a", "n\n")
        self.write("a.cacl", "", 0o600)
        self.traced("_SEL:Errors=1", "-s", 37, message(137, "{dir}/a"))
        expected = [(111, ["{dir}/a.cacl", number(0o600), number(0o644)])]
        if IS_ROOT:
            os.chown(self.dir + "/a.cacl", 7, 8)
            self.traced("_SEL:Errors=1", "-s", 37, message(136, "{dir}/a"))
            expected.append((111, ["{dir}/a.cacl", number(7), number(8), number(0), number(0)]))
        os.unlink(self.dir + "/a.cacl")
        os.symlink("a.cacl", self.dir + "/a.cacl")
        self.traced("_SEL:Errors=1", "-s", 37, message(122, "{dir}/a", errno.ELOOP))
        expected.append((109, ["{dir}/a.cacl", "stat()", number(errno.ELOOP)]))
        self.expect_records(expected)

    def test_level_settings(self):
        for levels, is_on in LEVELS:
            with self.subTest(levels[:40]):
                self.fresh()
                self.write("a", "n\n")
                self.traced(levels, "-s")
                self.assertEqual(os.path.exists(self.trace), is_on)  # no file where nothing is traced
                self.expect_records([CACHE_MADE] if is_on else [])

    def test_file_is_private_and_appended_to(self):
        self.write("a", ENTRIES)
        self.traced("_SEL:Perf=1", "", child=lambda: os.umask(0))
        self.assertEqual(stat.S_IMODE(os.stat(self.trace).st_mode), 0o600)
        os.chmod(self.trace, 0o640)
        self.traced("_SEL:Perf=3", "")
        self.assertEqual(stat.S_IMODE(os.stat(self.trace).st_mode), 0o640)
        self.expect_records([(0, [number(1)]), (0, [number(3)])])

    def test_unusable_files_are_harmless(self):
        self.write("a", "n rz\n")
        self.write("target", "kept\n")
        os.symlink("target", self.dir + "/link")
        os.symlink("nowhere", self.dir + "/dangling")
        os.mkfifo(self.dir + "/fifo")
        os.mkdir(self.dir + "/directory")
        for file in ("link", "dangling", "fifo", "directory", "directory/missing/x", "/dev/full", "x" * 5000, ""):
            with self.subTest(file[:40]):
                self.traced("_SEL:Errors=1,Info=8,API=8,Perf=2", "-v -s", 36, message(166, 1, "rz") + message(162),
                            file=file)


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
