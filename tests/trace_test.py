"""Turns tracing on for the checker as an administrator does, and reads the records that it leaves.

Usage: trace_test.py BUILD_DIR [unittest arguments]."""
import errno
import json
import os
import pathlib
import shutil
import subprocess
import sys
import unittest

from command_test import BUILD, IS_ROOT, NOBODY, SANITIZED, TEXTS, CommandCase, entry, message

ENTRIES = "# n\nn r\nU UNIX alice wr\ng staff q\n"
LONG_LINES = "n" + " " * 1200 + "\nn\n" + "o" + " " * 1200
PRINTED = {  # by each text, in verbose mode or as failures
    ENTRIES: entry("n", "r") + entry("u", "rw", "unix", "alice") + entry("g", "q", "staff"),
    "g \xff r\n": TEXTS[130], LONG_LINES: message(145, 1) + message(145, 3),
}
WIDE = 8  # bytes of an item whose value differs from run to run


def number(value, width=4):
    return value.to_bytes(width, sys.byteorder)


def shows(kind, mask, mechanism, identity, permissions):
    """The records of one line of verbose mode at the level that tells arguments and results."""
    return [(51, WIDE, number(kind), number(mask), mechanism, identity, WIDE, WIDE),
            (54, number(0), mechanism, identity), (99, number(mask), WIDE, ""), (102, number(0), permissions)]


MADE, CALLS = (110, "{dir}/a.cacl"), [(49,), (52,), (97,), (100,)] * 3
RECORDS = [  # levels, options, file text, and each record: its id and its items as a width, exact bytes, or a text
    ("Info=1", "-s", ENTRIES, [MADE]),
    ("Errors=1", "-c", LONG_LINES, [(115, number(line), number(1202, WIDE)) for line in (1, 3)]),
    ("API=1", "-v", ENTRIES, CALLS),
    ("API=2", "-s -v", ENTRIES, []),
    ("API=8", "-s -v", ENTRIES, shows(1, 1, "", "", "r") + shows(4, 3, "unix", "alice", "rw")
     + shows(16, 32, "", "staff", "q")),
    ("API=8", "-v", "g \xff r\n", [(51, WIDE, number(16), number(1), "", b"\xff\0", WIDE, WIDE), (53, number(26))]),
    ("Buffer=8", "-s -v", ENTRIES, []),
    *[(f"Perf={level}", "-s", ENTRIES, [(0, number(level))]) for level in (1, 3, 4, 7, 8)],
    ("Perf=2", "-s", ENTRIES, [(0, number(2)), (6, WIDE, WIDE, WIDE)]),
    *[(f"Perf={level}", "-s", ENTRIES, []) for level in (0, 5, 6, 9)],
    ("Perf=1,Info=255,API=1", "-s -v", ENTRIES, [(0, number(1)), *CALLS, MADE]),
    ("nonsense,Info=256,=,Perf", "-s", ENTRIES, []),
]


RESULT, REFUSED = number(0), number(43)
EDIT = (WIDE, number(4), number(3), "kRb", "Bob", WIDE, number(75), WIDE)
EDIT_AGAIN = EDIT[:6] + (number(100), WIDE)
SHARED = (WIDE, number(182), WIDE)
# What each public operation, called as operations_test does, leaves at the level of arguments and results.
OPERATIONS = [
    (11, None, "", WIDE, number(6), WIDE), (14, RESULT, number(4)), (72, WIDE, number(75), WIDE), (73,),
    (11, None, "", WIDE, number(4), WIDE), (14, RESULT, number(4)),
    (17, number(75), WIDE, WIDE), (19, RESULT),
    (57, number(1), WIDE, number(75), WIDE), (59, RESULT),
    (72, WIDE, number(5), WIDE), (73,),
    (93, "wr", WIDE, WIDE), (96, RESULT, number(3)),
    (99, number(3), WIDE, ""), (102, RESULT, "rw"),
    (42, number(4), number(3), "kRb", "Bob", WIDE), (44, RESULT),
    (51, WIDE, number(4), number(3), "kRb", "Bob", WIDE, WIDE), (54, RESULT, "kRb", "Bob"),
    (62, *EDIT), (64, RESULT), (62, *EDIT_AGAIN), (64, RESULT), (62, *EDIT_AGAIN), (64, REFUSED),
    (24, number(100), WIDE, WIDE), (27, RESULT, number(4)), (38, WIDE, number(4)), (39,),
    (32, number(100), WIDE, number(4), "krb", WIDE), (35, RESULT, number(1)), (38, WIDE, number(1)), (39,),
    (67, *EDIT_AGAIN), (69, RESULT),
    (76, number(1), "kRb5", WIDE), (78, RESULT),
    (81, *SHARED, number(4), "unix", "AL", WIDE), (84, RESULT, number(1)),
    (81, *SHARED, number(8), "krb5", "apple", WIDE), (84, RESULT, number(5)),
    (81, *SHARED, number(4), "unix", "nobody", WIDE), (83, REFUSED),
    (87, *SHARED, number(3), WIDE, WIDE), (90, RESULT, number(0x13)),
    (72, WIDE, number(75), WIDE), (73,), (72, WIDE, number(75), WIDE), (73,),
]
LINES_READ = [(114, number(2), number(1), "", "", number(1)), (114, number(3), number(4), "unix", "alice@h", number(3)),
              (114, number(4), number(16), "", "staff", number(32))]
# What reading, converting, replacing and deciding tell of their decisions and times.
DECISIONS = [(117, None), (118, None, number(errno.ENOENT)), (121, None), *LINES_READ, (110, None),
             (117, None), (119, None), (121, None), *LINES_READ, (104,), (113, "user", "kRb", "Bob")]
TIMES = {1: [(0, number(1)), *[(1, None, WIDE, WIDE, WIDE), (2, None, WIDE, WIDE, WIDE),
                               (3, None, number(4), WIDE, WIDE, WIDE)] * 2],
         2: [(0, number(2)), *[(4, None, WIDE, WIDE, WIDE), (6, WIDE, WIDE, WIDE)] * 2,
             (7, number(2), number(4), "unix", "AL", WIDE, WIDE, WIDE),
             (7, number(0xffffffff), number(8), "krb5", "apple", WIDE, WIDE, WIDE),
             (7, number(2), number(4), "unix", "nobody", WIDE, WIDE, WIDE), (8, WIDE, WIDE, WIDE)]}
# The bare numbers of entry and exit of the same calls.
BARE = [9, 12, 70, 73, 9, 12, 15, 18, 55, 58, 70, 73, 91, 94, 97, 100, 40, 43, 49, 52, 60, 63, 60, 63, 60, 63, 20, 25, 36, 39, 28, 33, 36, 39,
        65, 68, 74, 77, 79, 82, 79, 82, 79, 82, 85, 88, 70, 73, 70, 73]


class Trace(CommandCase):
    def traced(self, levels, options, status, errors, makes=()):
        environment = {"QZ_TRACE_LEVELS": "_SEL:" + levels, "QZ_TRACE_FILE": self.dir + ".trace"}
        self.expect([*options.split(), "-f", "a"], status, errors, makes, environment=environment)

    def expect_records(self, expected):
        """Compares ids and items, as far as these are told; each line is checked to be a record by itself."""
        trace = pathlib.Path(self.dir + ".trace")
        records = map(json.loads, trace.read_text("utf-8").splitlines() if trace.exists() else [])
        # Whether trees let go of their entries one by one is not seen from outside.
        records = [record for record in records if record["id"] not in (45, 47, 48)]
        self.assertEqual([record["id"] for record in records], [identifier for identifier, *_ in expected])
        for record, (_, *wanted) in zip(records, expected):
            self.assertEqual((*record, record["component"]), ("time", "pid", "tid", "component", "id", "items", "_SEL"))
            items = [bytes.fromhex(item["hex"]) for item in record["items"]]
            wanted = [item.replace("{dir}", self.dir).encode("latin-1") + b"\0" if isinstance(item, str) else item
                      for item in wanted]
            shown = [len(item) if want == WIDE else want and item for item, want in zip(items, wanted)]
            self.assertEqual((len(items), shown), (len(wanted), wanted))

    def test_records(self):
        for levels, options, text, expected in RECORDS:
            with self.subTest(levels, options=options):
                self.fresh()
                self.write("a", text)
                self.traced(levels, options, 0, "" if options == "-s" else PRINTED[text],
                            [("a.cacl", None)] if "-s" in options else [])
                self.expect_records(expected)

    def test_every_operation(self):
        program = [BUILD / "tests" / "operations_test", "--gtest_filter=*answer_once"]
        releases = [(73,), (73,), (39,), (39,), (73,), (73,)]
        for levels, expected in [("API=1", [(bare,) for bare in BARE]), ("API=8", OPERATIONS), ("API=5", releases),
                                 ("Info=8,Errors=1", DECISIONS), ("Perf=1", TIMES[1]), ("Perf=2", TIMES[2])]:
            with self.subTest(levels):
                self.fresh()
                subprocess.run(program, check=True, stdout=subprocess.DEVNULL, env=os.environ | {
                    "QZ_TRACE_LEVELS": "_SEL:" + levels, "QZ_TRACE_FILE": self.dir + ".trace"})
                self.expect_records(expected)

    @unittest.skipIf(SANITIZED or not IS_ROOT, "only root can make a program privileged, and the sanitizers mind it")
    def test_privileged_programs_are_not_traced(self):
        os.chmod(self.dir, 0o777)
        program = shutil.copy(BUILD / "tests" / "operations_test", self.dir)
        for owner, mode in ((0, 0o755), (1, 0o4755)):
            os.chown(program, owner, owner)
            os.chmod(program, mode)
            trace = pathlib.Path(f"{self.dir}/{mode:o}")
            done = subprocess.run([program, "--gtest_filter=*answer_once"], cwd=self.dir, user=NOBODY, group=NOBODY,
                                  extra_groups=[], capture_output=True, check=False, env={
                                      "QZ_TRACE_LEVELS": "_SEL:API=1", "QZ_TRACE_FILE": str(trace)})
            if done.returncode == 127:
                self.skipTest("the libraries are not where every user can reach them")
            self.assertEqual((done.returncode, trace.exists()), (0, owner == 0))

    def test_failures_of_caching(self):
        self.write("a", "n\n")
        self.write("a.cacl", "", 0o600)
        self.traced("Errors=1", "-s", 37, message(137, "{dir}/a"))
        expected = [(111, "{dir}/a.cacl", number(0o600), number(0o644))]
        if IS_ROOT:
            os.chown(self.dir + "/a.cacl", 7, 8)
            self.traced("Errors=1", "-s", 37, message(136, "{dir}/a"))
            expected.append((111, "{dir}/a.cacl", number(7), number(8), number(0), number(0)))
        os.unlink(self.dir + "/a.cacl")
        os.symlink("a.cacl", self.dir + "/a.cacl")
        self.traced("Errors=1", "-s", 37, message(122, "{dir}/a", errno.ELOOP))
        self.expect_records([*expected, (109, "{dir}/a.cacl", "stat()", number(errno.ELOOP))])


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
