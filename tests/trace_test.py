"""Turns tracing on for the checker as an administrator does, and reads the records that it leaves.
Usage: trace_test.py BUILD_DIR [unittest arguments]."""
import errno
import json
import os
import pathlib
import subprocess
import sys
import unittest

from command_test import BUILD, IS_ROOT, TEXTS, CommandCase, message

WIDE = 8  # bytes of an item whose value differs from run to run


def number(value, width=4):
    return value.to_bytes(width, sys.byteorder)


RESULT, REFUSED = number(0), number(43)
EDIT = (WIDE, number(4), number(3), "kRb", "Bob", WIDE, number(75), WIDE)
EDIT_AGAIN = EDIT[:6] + (number(100), WIDE)
SHARED = (WIDE, number(182), WIDE)
# What each public operation, called as operations_test does, leaves at the level of arguments and results.
OPERATIONS = [
    (11, None, "", WIDE, number(6), WIDE), (14, RESULT, number(4)), (72, WIDE, number(75), WIDE), (73,),
    (11, None, "", WIDE, number(4), WIDE), (14, RESULT, number(4)),
    (17, number(75), WIDE, WIDE), (19, RESULT), (57, number(1), WIDE, number(75), WIDE), (59, RESULT),
    (72, WIDE, number(5), WIDE), (73,), (93, "wr", WIDE, WIDE), (96, RESULT, number(3)),
    (99, number(3), WIDE, ""), (102, RESULT, "rw"),
    (42, number(4), number(3), "kRb", "Bob", WIDE), (44, RESULT),
    (51, WIDE, number(4), number(3), "kRb", "Bob", WIDE, WIDE), (54, RESULT, "kRb", "Bob"),
    (62, *EDIT), (64, RESULT), (62, *EDIT_AGAIN), (64, RESULT), (62, *EDIT_AGAIN), (64, REFUSED),
    (24, number(100), WIDE, WIDE), (27, RESULT, number(4)), (38, WIDE, number(4)), (39,),
    (32, number(100), WIDE, number(4), "krb", WIDE), (35, RESULT, number(1)), (38, WIDE, number(1)), (39,),
    (67, *EDIT_AGAIN), (69, RESULT), (76, number(1), "kRb5", WIDE), (78, RESULT),
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
BARE = [9, 12, 70, 73, 9, 12, 15, 18, 55, 58, 70, 73, 91, 94, 97, 100, 40, 43, 49, 52, 60, 63, 60, 63, 60, 63, 20, 25,
        36, 39, 28, 33, 36, 39, 65, 68, 74, 77, 79, 82, 79, 82, 79, 82, 85, 88, 70, 73, 70, 73]
RUNS = [  # what is traced, and what that leaves of the operations
    ("API=1", [(each,) for each in BARE]), ("API=8", OPERATIONS), ("API=5", [(73,), (73,), (39,), (39,), (73,), (73,)]),
    ("Errors=1,Info=8", DECISIONS), ("Info=1", [each for each in DECISIONS if each[0] != 114]),
    ("Perf=1", TIMES[1]), ("Perf=2", TIMES[2]), *[(f"Perf={level}", [(0, number(level))]) for level in (3, 4, 7, 8)],
    *[(levels, []) for levels in ("Perf=0", "Perf=5", "Perf=6", "Perf=9", "Buffer=8", "nonsense,Info=256,=,Perf")],
]


class Trace(CommandCase):
    def traced(self, levels):
        return {"QZ_TRACE_LEVELS": "_SEL:" + levels, "QZ_TRACE_FILE": self.dir + ".trace"}

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

    def test_every_operation(self):
        program = [BUILD / "tests" / "operations_test", "--gtest_filter=*answer_once"]
        for levels, expected in RUNS:
            with self.subTest(levels):
                self.fresh()
                subprocess.run(program, check=True, stdout=subprocess.DEVNULL, env=os.environ | self.traced(levels))
                self.expect_records(expected)

    def records_of(self, test, levels):
        self.fresh()
        name, _, cases = test.partition(":")
        subprocess.run([BUILD / f"tests/{name}_test", "--gtest_filter=" + cases], check=True, stdout=subprocess.DEVNULL,
                       env=os.environ | self.traced(levels))
        return [json.loads(line) for line in pathlib.Path(self.dir + ".trace").read_text("utf-8").splitlines()]

    def test_released_trees(self):
        """Below each node the left side goes first, then the right one, then the node."""
        released = [record["items"][4]["text"] for record in self.records_of("tree:*leaves_up", "API=8")
                    if record["id"] == 47]
        self.assertEqual(released, [*"cifpwtm", *"cba", *"tfm"])

    def test_replaced_entries(self):
        """A mechanism that fills its array is told without what stands behind it."""
        replaced = [record["items"][1] for record in self.records_of("tree:*leaves_up", "Info=1")]
        self.assertEqual([(item["len"], bytes.fromhex(item["hex"])) for item in replaced],
                         [(17, b"sixteen-bytes-xxx")] * 3)

    def test_entries_that_nobody_gets(self):
        """They are not told to be released."""
        records = self.records_of("entry:*DeathTest.*", "API=1")
        numbers = [record["id"] for record in records if record["id"] in (40, 43, 45)]
        self.assertEqual(numbers.count(40), 8)
        self.assertNotIn((40, 45), zip(numbers, numbers[1:]))

    def test_other_tests_pass_with_everything_traced(self):
        """Whatever is handed to an operation, null pointers included, can be told."""
        for name in "buffer", "entry", "evaluate", "read_acl":
            subprocess.run([BUILD / f"tests/{name}_test"], check=True, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL,
                           env=os.environ | self.traced("API=8,Errors=8,Info=8,Perf=2"))

    def test_failures(self):
        def check(options, text, status, errors):
            self.write("a", text)
            self.expect([options, "-f", "a"], status, errors, environment=self.traced("Errors=1,API=8"))
        check("-cv", "g \xff r\nn" + " " * 1200, 0, TEXTS[130] + message(145, 2))
        expected = [(51, WIDE, number(16), number(1), "", b"\xff\0", WIDE, WIDE), (53, number(26)),
                    (115, number(2), number(1202, WIDE))]
        self.write("a.cacl", "", 0o600)
        check("-s", "n", 37, message(137, "{dir}/a"))
        expected.append((111, "{dir}/a.cacl", number(0o600), number(0o644)))
        for owner, group in ((7, 0), (0, 8)) if IS_ROOT else ():
            os.chown(self.dir + "/a.cacl", owner, group)
            check("-s", "n", 37, message(136, "{dir}/a"))
            expected.append((111, "{dir}/a.cacl", number(owner), number(group), number(0), number(0)))
        os.unlink(self.dir + "/a.cacl")
        os.symlink("a.cacl", self.dir + "/a.cacl")
        check("-s", "n", 37, message(122, "{dir}/a", errno.ELOOP))
        self.expect_records([*expected, (109, "{dir}/a.cacl", "stat()", number(errno.ELOOP))])


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
