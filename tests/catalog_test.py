"""Translates the messages: compiles the catalog source of the build, whole and changed, and looks at what is shown.
Usage: catalog_test.py BUILD_DIR [unittest arguments]."""
import errno
import os
import pathlib
import re
import shutil
import subprocess
import sys
import unittest

from command_test import BUILD, IS_ROOT, NOBODY, SANITIZED, TABLE, TEXTS, UNKNOWN_X, CommandCase, entry, message, run

SOURCE = (BUILD / "share" / "qzseclib.msg").read_text("latin-1")
TRANSLATIONS = [  # a text, its translation, arguments, status and what is then shown
    (154, "Fehler %2$d bei %1$s\\n", ["-f", "no"], 105, f"Fehler {errno.ENOENT} bei {{dir}}/no\n\n"),
    (85, "%5$s|%1$s%4$s|%3$s%%|%2$c\\n", ["-v", "-f", "a"], 0, "rw|alice|unix%|u\n"),
    (80, "\xc3\xa9\\n", ["-x"], 4, UNKNOWN_X + message(147) + "\xc3\xa9\n\n"),
]
CHECKER = TABLE.parents[2] / "tools" / "catalog.py"
GERMAN = (TABLE.parents[2] / "translations" / "de.msg").read_text("utf-8")
BROKEN = [  # a message of the German source, what stands in its place, and what is said of that line
    (81, '80 "?\\n"', "message 80 stands at line 6 already"), (82, '82"?\\n"', "a blank and a text must follow the id"),
    (83, '83 "%1$s %2$s %3$s\\n"', "message 83 does not have the conversions of the English text"),
    (84, '4294967380 "?\\n"', "message 4294967380 is not one of the library's"),
    (147, '147 "\\l"', 'an escape sequence other than \\n, \\t, \\\\ and \\"'),
    (148, '148 "3417-"?', "text behind the closing quotation mark"), (149, '149 "\\n', "no closing quotation mark"),
    (150, '150 "3417-164 "', "message 150 does not end with a line feed (\\n)"),
    (162, '162 "3417-164 \\n"', "message 162 does not begin with its number 3417-176 "),
]


def changed(source, number, line):  # a number comes only once in a set
    return re.sub(rf'^{number} "(.*\\\n)*.*$', lambda _: line, source, count=1, flags=re.MULTILINE)


@unittest.skipUnless(shutil.which("gencat"), "there is no gencat to compile a catalog with")
class Catalog(CommandCase):
    def setUp(self):
        super().setUp()
        self.catalog = pathlib.Path(self.root, "qzseclib.cat")
        self.write("a", "u unix alice wr\n")

    def compile(self, source):
        self.catalog.unlink(missing_ok=True)  # because gencat would add to it
        subprocess.run(["gencat", self.catalog, "-"], input=b"$ codeset=UTF-8\n" + source.encode("latin-1"), check=True)

    def shows(self, arguments, status, errors):
        self.expect(arguments, status, errors, environment={"NLSPATH": self.root + "/%N"})

    def shows_defaults(self):
        self.shows(["-f", "no"], 105, message(154, "{dir}/no", errno.ENOENT))
        self.shows(["-v", "-f", "a"], 0, entry("u", "rw", "unix", "alice"))

    def test_translations(self):
        for number, text, *shown in TRANSLATIONS:
            self.compile(changed(SOURCE, number, f'{number} "{text}"'))
            self.shows(*shown)
        self.compile('$set 1\n$quote "\n148 "Welche Datei?"\n654 "?"\n')  # a part of the texts, and one that is none
        self.shows([], 4, "Welche Datei?\n" + message(80))
        self.compile('$set 1\n$quote "\n148 ""\n')  # which tells nobody anything
        self.shows([], 4, message(148) + message(80))
        for text in ("nothing", "%1$d %2$s", "%1$s %2$d %n"):  # which are not the conversions of the text
            self.compile(changed(SOURCE, 154, f'154 "{text}"'))
            self.shows_defaults()
        self.compile(SOURCE.replace("a", "e"))
        self.shows(["-h"], 0, message(81).replace("a", "e"))
        self.compile(SOURCE)
        whole = self.catalog.read_bytes()
        for content in (b"", bytes(range(256)) * 20, whole[:40], whole[:len(whole) // 2], whole[:-1]):
            self.catalog.write_bytes(content)
            self.shows_defaults()

    @unittest.skipIf(SANITIZED or not IS_ROOT, "only root can make a program privileged, and the sanitizers mind it")
    def test_privileged_programs(self):
        """Who runs one with more rights than his own chooses neither its texts nor a file for it to trace into."""
        self.compile(SOURCE.replace("3417-", "Trick-"))
        program = shutil.copy(BUILD / "examples/service", self.dir)
        os.chmod(self.dir, 0o777)
        for owner, mode, shown in ((0, 0o755, "Trick-"), (1, 0o4755, "3417-")):
            os.chown(program, owner, owner)
            os.chmod(program, mode)
            trace = self.dir + "/" + shown
            named = {"NLSPATH": self.root + "/%N", "QZ_TRACE_LEVELS": "_SEL:API=1", "QZ_TRACE_FILE": trace}
            done = subprocess.run([program, "no", "x"], cwd=self.dir, user=NOBODY, group=NOBODY, extra_groups=[],
                                  capture_output=True, text=True, check=False, env=named)
            if done.returncode == 127:
                self.skipTest("the libraries are not where every user can reach them")
            self.assertEqual((done.stderr[:len(shown) + 4], os.path.exists(trace)), ("no: " + shown, owner == 0))

    def test_source_is_the_table(self):
        lines = SOURCE.replace("\\\n", "").splitlines()
        for number, text in TEXTS.items():
            escaped = text.replace("\\", "\\\\").replace("\n", "\\n").replace("\t", "\\t").replace('"', '\\"')
            self.assertIn(f'{number} "{escaped}"', lines)

    def test_checker(self):
        broken = GERMAN
        for number, line, _ in BROKEN:
            broken = changed(broken, number, line)
        complaints = [f"{broken[:broken.index(line)].count(chr(10)) + 1}: {said}" for _, line, said in BROKEN]
        complaints += [f"{broken.count(chr(10))}: message {number} is missing" for number in (81, 84)]
        for source, told in ((GERMAN, []), (SOURCE, []), (broken, complaints)):
            path = self.write("de.msg", source.encode())
            done = subprocess.run([sys.executable, "-B", CHECKER, "check", path], stdout=subprocess.PIPE, check=False)
            self.assertEqual(done.stdout.decode().replace(path + ":", "").splitlines(), told)
            self.assertEqual(done.returncode, int(told != []))

    def test_german(self):
        for code_set in ("UTF-8", "ISO-8859-1"):
            catalogs = str(BUILD / "share/locale").replace("%", "%%")
            places = ":".join(f"{catalogs}/%{part}/LC_MESSAGES/%N" for part in "Ll")  # as under /usr
            shutil.copy(TABLE.parents[2] / "examples/mistakes.acl", self.dir)
            _, shown = run(["-c", "-f", "mistakes.acl"], self.dir,
                           {**self.locale("de_DE." + code_set), "NLSPATH": places})
            self.assertIn("ist länger als die höchstens zuläss", shown.encode("latin-1").decode(code_set))
            self.assertEqual(re.findall(r"(?m)^3417-\d+ (\w+):", shown), ["Fehler"] * 12)


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
