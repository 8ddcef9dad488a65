"""Runs ./dev with stand-ins for the programs that it calls: what it asks for, where it looks, and what it shows.

usage: dev_test.py BUILD-FOLDER [unittest arguments]"""
import os
import re
import shutil
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

SOURCE = Path(__file__).resolve().parent.parent
# Programs on every Debian, and those that the build needs as well.
ESSENTIAL = "bash cat cut dirname env mktemp readlink realpath rm sed stty tee xargs".split()
BUILD_TOOLS = "g++ cmake ninja python3".split()
NAMED = [  # a verb, and packages that a bare machine lacks for it
    ("build", "g++ cmake ninja-build python3"),
    ("test", "g++ cmake ninja-build python3 clang libclang-rt-dev libgtest-dev libgmock-dev jq git"),
    ("lint", "g++ cmake ninja-build python3 clang libclang-rt-dev clang-tidy shellcheck abigail-tools"),
    ("package", "g++ cmake ninja-build python3 clang libclang-rt-dev build-essential debhelper fakeroot lintian"),
]


class Dev(unittest.TestCase):
    def setUp(self):
        self.dir = Path(tempfile.mkdtemp()).resolve()
        self.addCleanup(shutil.rmtree, self.dir)
        for name in ESSENTIAL:
            (self.dir / name).symlink_to(shutil.which(name))

    def stand_in(self, name, script):
        (self.dir / name).write_text(f"#!/bin/sh\n{script}\n")
        (self.dir / name).chmod(0o755)

    def dev(self, *arguments, path=SOURCE / "dev", **more):
        """Runs it where there are no other programs; returns the status and the output of each stream."""
        environment = {"PATH": str(self.dir), "TERM": "xterm", **more.pop("env", {})}
        done = subprocess.run([path, *arguments], env=environment, stdout=subprocess.PIPE, check=False,
                              **{"cwd": self.dir, "stderr": subprocess.PIPE, **more})
        return done.returncode, done.stdout.decode(), (done.stderr or b"").decode()

    def test_names_at_once_what_is_missing(self):
        for verb, packages in NAMED:
            status, _, told = self.dev(verb)
            self.assertEqual(status, 1, told)
            self.assertLessEqual(set(packages.split()), set(told.split()), verb)
            self.assertEqual(len(told.splitlines()), 1, told)

    def test_finds_its_folder_through_links_and_whatever_cd_searches(self):
        (self.dir / "link").symlink_to(SOURCE / "dev")
        searching = {"CDPATH": str(SOURCE.parent)}
        for path, folder in (("./link", self.dir), (f"{SOURCE.name}/dev", SOURCE.parent)):
            status, shown, told = self.dev("help", path=path, cwd=folder, env=searching)
            self.assertEqual((status, told), (0, ""), path)
            self.assertIn("  test [quick]", shown)

    def test_fails_where_git_refuses_the_folder(self):
        self.stand_in("clang-format", "exit 0")
        self.stand_in("git", "exit 128")
        self.assertNotEqual(self.dev("format")[0], 0)

    def test_shows_on_a_terminal_alone_how_far_it_is(self):
        for name in BUILD_TOOLS:
            self.stand_in(name, "echo '[1/2] Building'; echo '[2/2] Linking'")
        self.assertEqual(self.dev("build"), (0, "", ""))
        terminal, its_end = os.openpty()
        self.assertEqual(self.dev("build", stderr=its_end), (0, "", ""))
        os.close(its_end)
        shown = os.read(terminal, 10000).decode()
        os.close(terminal)
        self.assertIn("\r\033[Kbuild/release: [1/2] Building\r\033[Kbuild/release: [2/2] Linking\r\033[K", shown)

    def test_installs_for_everybody(self):
        for name in BUILD_TOOLS:
            self.stand_in(name, "umask >mask")
        self.assertEqual(self.dev("install", "p", preexec_fn=lambda: os.umask(0o077)), (0, "", ""))
        self.assertEqual((self.dir / "mask").read_text(), "0022\n")

    def test_lines_end_as_committed_whatever_git_prefers(self):
        cloned = subprocess.run(["git", "-c", "core.autocrlf=true", "clone", "-q", SOURCE, self.dir / "clone"],
                                stderr=subprocess.DEVNULL, check=False) if shutil.which("git") else None
        if not cloned or cloned.returncode:
            self.skipTest("no git, or no repository that it may read")
        listed = subprocess.check_output(["git", "-C", self.dir / "clone", "ls-files", "--eol"], text=True)
        self.assertEqual(re.findall(r"w/(?:crlf|mixed)\s.*", listed), [])


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
