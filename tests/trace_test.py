"""Turns tracing on for the checker and for other tests' programs, and reads the records that they leave.

usage: trace_test.py BUILD-FOLDER [unittest arguments]"""
import errno
import itertools
import json
import os
import pathlib
import subprocess
import sys
import unittest

from command_case import BUILD, IS_ROOT, SOURCE, Code, CommandCase, message

# The rows of records that are expected, by the setting of the levels.
EXPECTED = {}
for line in (SOURCE / "tests/operations.trace").read_text("utf-8").splitlines():
    if line.startswith("["):
        rows = EXPECTED.setdefault(line.strip("[]"), [])
    elif line and not line.startswith("#"):
        rows.append(line)

# Whether trees release their entries one by one is not visible from outside.
RELEASES_OF_ENTRIES = (45, 47, 48)
CREATES_ENTRY = 40
CREATED_ENTRY = 43
RELEASES_ENTRY = 45
RELEASES_TOLD_ENTRY = 47
KEYS = ["time", "pid", "tid", "component", "id", "items"]


def number_of(row):
    return int(row.split()[0])


def wanted_items(row):
    """The last word of each item of a row, which says what the item holds."""
    _, _, items = row.partition(": ")
    return [item.split()[-1] for item in items.split(", ")] if items else []


def is_as_wanted(item, wanted):
    """Whether the bytes of an item match its row; see operations.trace."""
    if wanted == "any":
        return True
    if wanted == "wide":
        return len(item) == 8
    if wanted.startswith('"'):
        return item == wanted.strip('"').encode("latin-1") + b"\0"
    value, _, width = wanted.partition(":")
    return item == int(value, 0).to_bytes(int(width or 4), sys.byteorder, signed=value.startswith("-"))


def bytes_of(item):
    return bytes.fromhex(item["hex"])


class Trace(CommandCase):
    def traced(self, levels):
        return {"QZ_TRACE_LEVELS": "_SEL:" + levels, "QZ_TRACE_FILE": self.dir + ".trace"}

    def run_test(self, name, cases, levels):
        """Runs some cases of a test program, and returns the records."""
        self.fresh()
        program = [BUILD / f"tests/{name}_test", "--gtest_filter=" + cases]
        environment = os.environ | self.traced(levels)
        subprocess.run(program, check=True, capture_output=True, env=environment)
        return self.records()

    def records(self):
        trace = pathlib.Path(self.dir + ".trace")
        lines = trace.read_text("utf-8").splitlines() if trace.exists() else []
        return [json.loads(line) for line in lines]

    def expect_records(self, records, rows):
        records = [record for record in records if record["id"] not in RELEASES_OF_ENTRIES]
        self.assertEqual([record["id"] for record in records], [number_of(row) for row in rows])
        for record, row in zip(records, rows):
            self.assertEqual(list(record), KEYS)
            self.assertEqual(record["component"], "_SEL")
            items = [bytes_of(item) for item in record["items"]]
            wanted = wanted_items(row.replace("{dir}", self.dir))
            self.assertEqual(len(items), len(wanted), row)
            for item, what in zip(items, wanted):
                self.assertTrue(is_as_wanted(item, what), f"{item} in the record {row}")

    def test_every_operation(self):
        for levels, rows in EXPECTED.items():
            with self.subTest(levels):
                self.expect_records(self.run_test("operations", "*answer_once", levels), rows)

    def test_released_trees(self):
        """Below each node the left side goes first, then the right one, then the node."""
        records = self.run_test("tree", "*leaves_up", "API=8")
        released = [record["items"][4]["text"] for record in records if record["id"] == RELEASES_TOLD_ENTRY]
        self.assertEqual("".join(released), "cifpwtm" + "dcba" + "abcd" + "cbda" + "tfm")

    def test_a_text_with_a_duplicate(self):
        """Nothing shows the lines after it: neither the trees, nor a line that is too long."""
        errors = message("duplicate_group", "g", "B") + message("cache_skipped_after_errors")
        self.check("-s", "g c\ng b\ng B\ng a\n", Code.BAD_ACLE, errors)
        released = [record["items"][4]["text"] for record in self.records() if record["id"] == RELEASES_TOLD_ENTRY]
        self.assertEqual(released, ["b", "c"])

        self.write("a", "g b\ng B\n" + "x" * 1200)
        pathlib.Path(self.dir + ".trace").unlink()
        self.expect(["-sf", "a"], Code.BAD_ACLE, errors, environment=self.traced("Errors=1"))
        self.assertEqual(self.records(), [])

    def test_replaced_entries(self):
        """A mechanism that fills its array is recorded without the bytes after it."""
        records = self.run_test("tree", "*leaves_up", "Info=1")
        mechanisms = [bytes_of(record["items"][1]) for record in records]
        self.assertEqual(mechanisms, [b"sixteen-bytes-xxx"] * 5)

    def test_entries_that_nobody_gets(self):
        """Their release is not recorded."""
        records = self.run_test("entry", "*DeathTest.*", "API=1")
        shown = (CREATES_ENTRY, CREATED_ENTRY, RELEASES_ENTRY)
        numbers = [record["id"] for record in records if record["id"] in shown]
        self.assertEqual(numbers.count(CREATES_ENTRY), 8)
        self.assertNotIn((CREATES_ENTRY, RELEASES_ENTRY), itertools.pairwise(numbers))

    def test_other_tests_pass_with_everything_traced(self):
        """All arguments of operations can be recorded, null pointers included."""
        for name in "buffer", "entry", "evaluate", "read_acl":
            self.run_test(name, "*", "API=8,Errors=8,Info=8,Perf=2")

    def check(self, options, text, status, errors):
        self.write("a", text)
        self.expect([options, "-f", "a"], status, errors, environment=self.traced("Errors=1,API=8"))

    def test_entries_that_cannot_be_shown_and_lines_that_are_too_long(self):
        unshown = message("conversion_failed").removesuffix("\n")
        self.check("-cv", "g \xff r\nn" + " " * 1200, Code.OK, unshown + message("line_too_long", 2))
        shows = '51 sec_display_acle_id begins: entry wide, type 16, mask 1, mechanism "", identity "\xff"'
        rows = [
            shows + ", output wide, output wide",
            f"53 sec_display_acle_id ends: code {Code.CODESET:d}",
            "115 line is too long: line 2, length 1202:8",
        ]
        self.expect_records(self.records(), rows)

    def refuse(self, name, *values):
        self.check("-s", "n", Code.FILE_ERROR, message(name, "{dir}/a", *values))

    def test_caches_that_cannot_be_written(self):
        cache = self.write("a.cacl", "", 0o600)
        self.refuse("cache_mode_differs")
        rows = ['111 mode differs: name "{dir}/a.cacl", of the cache 0o600, of the text 0o644']
        for user, group in ((7, 0), (0, 8)) if IS_ROOT else ():
            os.chown(cache, user, group)
            self.refuse("cache_owner_differs")
            of_cache = f'name "{{dir}}/a.cacl", user of the cache {user}, group {group}'
            rows.append(f"111 owner differs: {of_cache}, user of the text 0, group 0")
        os.unlink(cache)
        os.symlink("a.cacl", cache)
        self.refuse("bad_file_name", errno.ELOOP)
        rows.append(f'109 query fails: name "{{dir}}/a.cacl", call "stat()", errno {errno.ELOOP}')
        self.expect_records(self.records(), rows)


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
