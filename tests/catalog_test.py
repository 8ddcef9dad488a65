"""Translates the messages: compiles the catalog source of the build, whole and changed, and looks at what is shown.

usage: catalog_test.py BUILD-FOLDER [unittest arguments]"""
import errno
import os
import pathlib
import re
import shutil
import subprocess
import sys
import unittest

from command_case import (
    BUILD, IDS, IS_ROOT, NOBODY, SANITIZED, SOURCE, TEXTS, Code, CommandCase, entry, message, rows, run)

ENGLISH = (BUILD / "share" / "qzseclib.msg").read_text("latin-1")
GERMAN = (SOURCE / "translations" / "de.msg").read_text("utf-8")
CHECKER = SOURCE / "tools" / "catalog.py"
EXAMPLE = SOURCE / "examples" / "mistakes.acl"


def changed(source, number, line):
    """A source with another line in place of a message."""
    return re.sub(rf'^{number} "(.*\\\n)*.*$', lambda _: line, source, count=1, flags=re.MULTILINE)


def translated(name, text):
    return changed(ENGLISH, IDS[name], f'{IDS[name]} "{text}"')


@unittest.skipUnless(shutil.which("gencat"), "there is no gencat to compile a catalog with")
class Catalog(CommandCase):
    def setUp(self):
        super().setUp()
        self.catalog = pathlib.Path(self.root, "qzseclib.cat")
        self.write("a", "u unix alice wr\n")

    def compile(self, source):
        self.catalog.unlink(missing_ok=True)  # because gencat would add to it
        source = b"$ codeset=UTF-8\n" + source.encode("latin-1")
        subprocess.run(["gencat", self.catalog, "-"], input=source, check=True)

    def shows(self, arguments, status, errors):
        self.expect(arguments, status, errors, environment={"NLSPATH": self.root + "/%N"})

    def shows_defaults(self):
        self.shows(["-f", "no"], Code.BAD_FILENAME, message("bad_acl_file_name", "{dir}/no", errno.ENOENT))
        self.shows(["-v", "-f", "a"], Code.OK, entry("u", "rw", "unix", "alice"))

    def test_translations_take_arguments_in_any_order(self):
        self.compile(translated("bad_acl_file_name", r"Fehler %2$d bei %1$s\n"))
        self.shows(["-f", "no"], Code.BAD_FILENAME, f"Fehler {errno.ENOENT} bei {{dir}}/no\n\n")
        self.compile(translated("dump_mechanism_acle", r"%5$s|%1$s%4$s|%3$s%%|%2$c\n"))
        self.shows(["-v", "-f", "a"], Code.OK, "rw|alice|unix%|u\n")
        self.compile(ENGLISH.replace("a", "e"))
        self.shows(["-h"], Code.OK, message("help").replace("a", "e"))

    def test_a_part_of_the_texts_is_translated(self):
        self.compile('$set 1\n$quote "\n148 "Welche Datei?"\n654 "?"\n')
        self.shows([], Code.BAD_PARAMETER, "Welche Datei?\n" + message("usage"))
        self.compile('$set 1\n$quote "\n148 ""\n')  # which tells nobody anything
        self.shows([], Code.BAD_PARAMETER, message("file_option_missing") + message("usage"))

    def test_translations_with_other_conversions_are_not_used(self):
        for text in ("nothing", "%1$d %2$s", "%1$s %2$d %n"):
            self.compile(translated("bad_acl_file_name", text))
            self.shows_defaults()

    def test_broken_catalogs_are_not_used(self):
        self.compile(ENGLISH)
        whole = self.catalog.read_bytes()
        for content in (b"", bytes(range(256)) * 20, whole[:40], whole[:len(whole) // 2], whole[:-1]):
            self.catalog.write_bytes(content)
            self.shows_defaults()

    @unittest.skipIf(SANITIZED or not IS_ROOT, "only root can make a program privileged, and the sanitizers mind it")
    def test_privileged_programs(self):
        """A user who runs one with more rights chooses neither its texts nor its trace file."""
        self.compile(ENGLISH.replace("3417-", "Trick-"))
        os.chmod(self.dir, 0o777)
        self.assertEqual(self.shown_by_program(owner=0, mode=0o755), ("no: Trick-", True))
        self.assertEqual(self.shown_by_program(owner=1, mode=0o4755), ("no: 3417-", False))

    def shown_by_program(self, owner, mode):
        """How its text begins, and whether it traced."""
        program = shutil.copy(BUILD / "examples/service", self.dir)
        os.chown(program, owner, owner)
        os.chmod(program, mode)
        trace = f"{self.dir}/{mode}"
        environment = {"NLSPATH": self.root + "/%N", "QZ_TRACE_LEVELS": "_SEL:API=1", "QZ_TRACE_FILE": trace}
        done = subprocess.run([program, "no", "x"], cwd=self.dir, user=NOBODY, group=NOBODY, extra_groups=[],
                              capture_output=True, text=True, check=False, env=environment)
        if done.returncode == 127:
            self.skipTest("the libraries are not where every user can reach them")
        head, dash, _ = done.stderr.partition("-")
        return head + dash, os.path.exists(trace)

    def test_source_is_the_table(self):
        lines = ENGLISH.replace("\\\n", "").splitlines()
        for number, text in TEXTS.items():
            escaped = text.replace("\\", "\\\\").replace("\n", "\\n").replace("\t", "\\t").replace('"', '\\"')
            self.assertIn(f'{number} "{escaped}"', lines)

    def complaints(self, source):
        """What the checker says of a source, by line, and its status."""
        path = self.write("de.msg", source.encode())
        command = [sys.executable, "-B", CHECKER, "check", path]
        done = subprocess.run(command, stdout=subprocess.PIPE, text=True, check=False)
        return done.stdout.replace(path + ":", "").replace(" \n", "\n").splitlines(), done.returncode

    def test_checker(self):
        self.assertEqual(self.complaints(GERMAN), ([], 0))
        self.assertEqual(self.complaints(ENGLISH), ([], 0))
        mistakes = list(rows("catalog.cases"))
        broken = GERMAN
        for number, line, _ in mistakes:
            broken = changed(broken, number, line)
        expected = []
        for _, line, said in mistakes:
            lines_before = broken[:broken.index(line)].count("\n")
            expected.append(f"{lines_before + 1}: {said}")
        lines = broken.count("\n")
        expected += [f"{lines}: message {number} is missing" for number in (81, 84)]
        self.assertEqual(self.complaints(broken), (expected, 1))

    def test_german(self):
        shutil.copy(EXAMPLE, self.dir)
        catalogs = str(BUILD / "share/locale").replace("%", "%%")
        # As under /usr: a folder named by the locale, or by the language alone.
        places = f"{catalogs}/%L/LC_MESSAGES/%N:{catalogs}/%l/LC_MESSAGES/%N"
        for code_set in ("UTF-8", "ISO-8859-1"):
            environment = {**self.locale("de_DE." + code_set), "NLSPATH": places}
            _, shown = run(["-c", "-f", "mistakes.acl"], self.dir, environment)
            self.assertIn("ist länger als die höchstens zuläss", shown.encode("latin-1").decode(code_set))
            self.assertEqual(re.findall(r"(?m)^3417-\d+ (\w+):", shown), ["Fehler"] * 12)


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
