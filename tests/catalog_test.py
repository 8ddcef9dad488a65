"""Translates the messages: compiles the catalog source of the build, whole and changed, and looks at what is shown.

Usage: catalog_test.py BUILD_DIR [unittest arguments].
"""
import ctypes
import errno
import os
import random
import re
import shutil
import subprocess
import sys
import unittest

from command_test import BUILD, TEXTS, CommandCase, complaint, entry, message

SOURCE = (BUILD / "share" / "qzseclib.msg").read_text("latin-1")
NL_CAT_LOCALE = 1
USAGE = 80
MISSING_OPTION = 148
MISSING_FILE = 154
ENTRY_LINE = 85

TRANSLATIONS = [  # a text, its translation, arguments, status and what is then shown
    (MISSING_FILE, "Fehler %2$d bei %1$s\\n", ["-f", "no"], 105, f"Fehler {errno.ENOENT} bei {{dir}}/no\n\n"),
    (MISSING_FILE, "%1$s%%: %2$d", ["-f", "no"], 105, f"{{dir}}/no%: {errno.ENOENT}\n"),
    (ENTRY_LINE, "%5$s|%1$s%4$s|%3$s|%2$c\\n", ["-v", "-f", "a"], 0, "rw|alice|unix|u\n"),
    (USAGE, "\xc3\xa9\\n", ["-x"], 4, complaint("invalid option -- 'x'") + message(147) + "\xc3\xa9\n\n"),
    (USAGE, "", ["-x"], 4, complaint("invalid option -- 'x'") + message(147) + "\n"),
]

REFUSED = [  # translations of the text on a missing file that do not have its conversions
    "nothing", "%1$s", "%2$d", "%1$d %2$d", "%1$s %2$s", "%2$s %1$d", "%1$s %2$x", "%1$s %2$d %3$s", "%1$s %1$s %2$d",
    "%1$s %2$d %n", "%s %d", "%1$s %2$d %", "%1$s %2$*1$d", "%1$s %2$ld", "%1$s %2$08d", "%1$s %2$d %0$s",
]


def translated(number, text):
    """The source with one text replaced; a number comes only once in a set."""
    return re.sub(rf'^{number} "(.*\\\n)*.*$', lambda _: f'{number} "{text}"', SOURCE, count=1, flags=re.MULTILINE)


@unittest.skipUnless(shutil.which("gencat"), "there is no gencat to compile a catalog with")
class Catalog(CommandCase):
    def setUp(self):
        super().setUp()
        self.catalog = os.path.join(self.root, "qzseclib.cat")
        self.write("a", "u unix alice wr\n")

    def compile(self, source):
        if os.path.exists(self.catalog):
            os.unlink(self.catalog)  # gencat would add to it
        subprocess.run(["gencat", self.catalog, "-"], input=b"$ codeset=UTF-8\n" + source.encode("latin-1"), check=True)

    def shows(self, arguments, status, errors):
        self.expect(arguments, status, errors, environment={"NLSPATH": self.root + "/%N"})

    def shows_defaults(self):
        self.shows(["-h"], 0, message(81))
        self.shows(["-f", "no"], 105, message(MISSING_FILE, "{dir}/no", errno.ENOENT))
        self.shows(["-v", "-f", "a"], 0, entry("u", "rw", "unix", "alice"))

    def test_source_holds_every_text(self):
        self.compile(SOURCE)
        library = ctypes.CDLL(None)  # the C library reads the catalog as the command does
        library.catopen.restype = ctypes.c_void_p
        library.catgets.argtypes = [ctypes.c_void_p, ctypes.c_int, ctypes.c_int, ctypes.c_char_p]
        library.catgets.restype = ctypes.c_char_p
        catalog = library.catopen(self.catalog.encode(), NL_CAT_LOCALE)
        shown = {number: library.catgets(catalog, 1, number, b"?") for number in range(623)}
        self.assertEqual({number: text.decode("latin-1") for number, text in shown.items() if text != b"?"}, TEXTS)
        self.shows_defaults()

    def test_translations(self):
        for number, text, arguments, status, errors in TRANSLATIONS:
            with self.subTest(text):
                self.compile(translated(number, text))
                self.shows(arguments, status, errors)
                self.shows(["-h"], 0, message(81))

    def test_catalog_of_a_part_of_the_texts(self):
        self.compile(f'$set 1\n$quote "\n{MISSING_OPTION} "Welche Datei?"\n{MISSING_FILE + 500} "?"\n')
        self.shows([], 4, "Welche Datei?\n" + message(USAGE))
        self.shows_defaults()

    def test_refused_translations(self):
        for text in REFUSED:
            with self.subTest(text):
                self.compile(translated(MISSING_FILE, text).replace(f'{MISSING_OPTION} "', f'{MISSING_OPTION} "Ach! '))
                self.shows_defaults()
                self.shows([], 4, "Ach! " + message(MISSING_OPTION) + message(USAGE))

    def test_files_that_are_no_catalogs(self):
        self.compile(SOURCE)
        with open(self.catalog, "rb") as good:
            whole = good.read()
        numbers = random.Random(20261124)
        for content in (b"", numbers.randbytes(11), numbers.randbytes(5000), SOURCE.encode("latin-1"), whole[:40],
                        whole[:len(whole) // 2], whole[:-1]):
            with self.subTest(content[:20]):
                with open(self.catalog, "wb") as bad:
                    bad.write(content)
                self.shows_defaults()
        os.unlink(self.catalog)
        os.mkdir(self.catalog)
        self.shows_defaults()


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
