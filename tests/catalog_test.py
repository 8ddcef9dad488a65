"""Translates the messages: compiles the catalog source of the build, whole and changed, and looks at what is shown.
Usage: catalog_test.py BUILD_DIR [unittest arguments]."""
import ctypes
import errno
import os
import pathlib
import re
import shutil
import subprocess
import sys
import unittest

from command_test import BUILD, TABLE, TEXTS, UNKNOWN_X, CommandCase, entry, message, run

SOURCE = (BUILD / "share" / "qzseclib.msg").read_text("latin-1")
TRANSLATIONS = [  # a text, its translation, arguments, status and what is then shown
    (154, "Fehler %2$d bei %1$s\\n", ["-f", "no"], 105, f"Fehler {errno.ENOENT} bei {{dir}}/no\n\n"),
    (85, "%5$s|%1$s%4$s|%3$s%%|%2$c\\n", ["-v", "-f", "a"], 0, "rw|alice|unix%|u\n"),
    (80, "\xc3\xa9\\n", ["-x"], 4, UNKNOWN_X + message(147) + "\xc3\xa9\n\n"),
    (80, "", ["-x"], 4, UNKNOWN_X + message(147) + "\n"),
]
REFUSED = [  # translations of text 154, on a missing file, that do not have its conversions
    "nothing", "%1$s", "%1$d %2$s", "%1$s %2$x", "%1$s %2$d %3$s", "%1$s %1$s %2$d", "%1$s %2$d %n", "%s %d",
    "%1$s %2$d %", "%1$s %2$*1$d", "%1$s %2$ld", "%1$s %2$08d", "%1$s %2$d %0$s"]
GERMAN = (TABLE.parents[2] / "translations" / "de.msg").read_text("utf-8")
BROKEN = [  # what stands in the German source, what in its place, and what is then said; {82}: the line of message 82
    ("$set 1\n", "\n", '{0}: there is no "$set 1"'), ("$set 1", "$set 2", "4: every message is in set 1"),
    ("codeset=UTF-8", "", '{81}: message 81 is not ASCII, and no "$ codeset=" stands before it'),
    ('81 "', '80 "', "{81}: message 80 stands at line {80} already", "{0}: message 81 is missing"),
    ('82 "', '4294967378 "', "{82}: message 4294967378 is not one of the library's", "{0}: message 82 is missing"),
    ('82 "', '82"', "{82}: a blank and a text must follow the id"), ("$quote", "$qoute", "5: unknown directive"),
    ("ungültig!", "ung\\ltig!", '{82}: an escape sequence other than \\n, \\t, \\\\ and \\"'),
    ('ungültig!\\n\\\n"', 'ungültig!"', "{82}: message 82 does not end with a line feed (\\n)"),
    ('ungültig!\\n\\\n"', 'ungültig!\\n"?', "{82}: text behind the closing quotation mark"),
    ("ungültig!\\n\\", "ungültig!\\n", "{82}: no closing quotation mark"),
    ("%4$d\\n", "%4$s\\n", "{83}: message 83 does not have the conversions of the English text"),
    ("3417-101 ", "3417-102 ", "{88}: message 88 does not begin with its number 3417-101 "),
]


def translated(number, text):  # the whole source with one text replaced; a number comes only once in a set
    return re.sub(rf'^{number} "(.*\\\n)*.*$', lambda _: f'{number} "{text}"', SOURCE, count=1, flags=re.MULTILINE)


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
            self.compile(translated(number, text))
            self.shows(*shown)
        self.compile('$set 1\n$quote "\n148 "Welche Datei?"\n654 "?"\n')  # a part of the texts, and one that is none
        self.shows([], 4, "Welche Datei?\n" + message(80))
        for text in REFUSED:
            self.compile(translated(154, text).replace('148 "', '148 "Ach! '))
            self.shows_defaults()
            self.shows([], 4, "Ach! " + message(148) + message(80))

    def test_whole_and_broken_files(self):
        self.compile(SOURCE)
        library = ctypes.CDLL(None)  # the C library reads the catalog as the command does
        library.catopen.restype, library.catgets.restype = ctypes.c_void_p, ctypes.c_char_p
        library.catgets.argtypes = [ctypes.c_void_p, ctypes.c_int, ctypes.c_int, ctypes.c_char_p]
        catalog = library.catopen(str(self.catalog).encode(), 1)
        shown = {number: library.catgets(catalog, 1, number, b"?").decode("latin-1") for number in range(623)}
        self.assertEqual({number: text for number, text in shown.items() if text != "?"}, TEXTS)
        whole = self.catalog.read_bytes()
        for content in (b"", bytes(range(256)) * 20, whole[:40], whole[:len(whole) // 2], whole[:-1]):
            self.catalog.unlink()  # because the C library may still look into the old file
            self.catalog.write_bytes(content)
            self.shows_defaults()


class Translation(CommandCase):
    def complaints(self, source):
        path = self.write("de.msg", source.encode())
        done = subprocess.run([BUILD / "tools/check_catalog", path], stdout=subprocess.PIPE, check=False)
        told = done.stdout.decode().replace(path + ":", "").splitlines()
        self.assertEqual(done.returncode, int(told != []))
        return told

    def test_checker(self):
        self.assertEqual([self.complaints(GERMAN), self.complaints(SOURCE)], [[], []])
        lines = [GERMAN.count("\n", 0, GERMAN.find(f'\n{number} "') + 1) + 1 for number in range(100)]
        lines[0] = GERMAN.count("\n")
        for old, new, *told in BROKEN:
            with self.subTest(new):
                found = self.complaints(GERMAN.replace(old, new, 1))
                self.assertEqual([found[0], found[-1]][:len(told)], [text.format(*lines) for text in told])

    @unittest.skipUnless(shutil.which("gencat") and os.path.exists("/usr/share/i18n/locales/de_DE"), "no German locale")
    def test_german(self):
        for codeset in ("UTF-8", "ISO-8859-1"):
            locale, places = "de_DE." + codeset, [f"{BUILD}/share/locale/%{part}/LC_MESSAGES/%N" for part in "Ll"]
            subprocess.run(["localedef", "-i", "de_DE", "-f", codeset, f"{self.root}/{locale}"], check=True)
            environment = {"LC_ALL": locale, "LOCPATH": self.root, "NLSPATH": ":".join(places)}  # as under /usr
            _, shown = run(["-c", "-f", str(TABLE.parents[2] / "examples/mistakes.acl")], self.root, environment)
            shown = shown.encode("latin-1").decode(codeset)
            self.assertIn("Der ACL-Eintrag in Zeile 5 der ACL-Datei\nist länger als die höchstens zuläss", shown)
            self.assertEqual(re.findall(r"^3417-\d+ (\w+):", shown, re.MULTILINE), ["Fehler"] * 12)


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
