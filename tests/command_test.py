"""Runs the checker as an administrator does and compares what it prints, answers and leaves behind, to the byte.

usage: command_test.py BUILD-FOLDER [unittest arguments]"""
import contextlib
import errno
import itertools
import os
import pathlib
import pwd
import random
import re
import resource
import signal
import socket
import subprocess
import sys
import tempfile
import time
import unittest

from command_case import (
    COMMAND, ENTRIES, INHERITED, IS_MUSL, IS_ROOT, NOBODY, ORDINARY, SANITIZED, WRITER, Code, CommandCase,
    entry, message, posix_acl, run)

A_TEXT = "u abcd xyz wr\n"
A_CACHE = bytes.fromhex("8501020100 1a000000 04 01000000 05 6162636400 01 03000000 0400 78797a00")
A_NEW_CACHE = [("a.cacl", A_CACHE)]
NO_CACHE = message("cache_skipped_after_errors")


def started(options, cwd, **how):
    """The running command."""
    return subprocess.Popen([COMMAND, options, "-f", "a"], cwd=cwd, env={"LC_ALL": "C"}, **how)


class Output(CommandCase):
    def test_transcripts(self):
        self.expect_transcripts("command.cases")

    def test_a_locale_says_nothing_about_letters(self):
        same_user = "u UNIX I@Host r\nu unix i@hoSt w\n"
        other_letters = "u kI \u0130 r\nu k\xa0i x\xa0 r\n"
        two_groups = "g \xc7 r\ng \xe7 w\n"
        self.write("a", (same_user + other_letters + two_groups).encode("utf-8"))
        duplicate = message("duplicate_acle", "u", "UNIX", "I@Host").split(" ", maxsplit=1)[0]
        told = run(["-c", "-f", "a"], self.dir)
        self.assertEqual(told[1].count(duplicate), 1)
        for environment in self.locale("tr_TR.ISO-8859-9"), self.locale("tr_TR.UTF-8"), {"LC_ALL": "not.known"}:
            self.assertEqual(run(["-c", "-f", "a"], self.dir, environment), told)

    @unittest.skipIf(IS_MUSL, "the C library knows no such locales")
    def test_a_locale_says_what_ends_a_word(self):
        """White space that only the locale has ends a word, but may not precede one."""
        rules = pathlib.Path("/usr/share/i18n/locales/i18n_ctype").read_text("utf-8")
        rules = rules.replace("\nspace /", "\nspace /\n<U00A0>;/")
        pathlib.Path(self.root, "blanks").write_text(rules, "utf-8")
        localedef = ["localedef", "-ci", "blanks", "-f", "ISO-8859-1", "./x"]
        subprocess.run(localedef, cwd=self.root, capture_output=True, check=False)
        self.write("a", "g a\xa0r\no \xa0r\n")
        told = entry("g", "r", "a") + message("tokens_in_excess", 2)
        environment = {"LC_ALL": "", "LC_CTYPE": "x", "LOCPATH": self.root}
        self.expect(["-cv", "-f", "a"], Code.OK, told, environment=environment)

    def test_entries_are_gathered_into_one_write(self):
        self.write("a", "n\no\ng a\n")
        reader, writer = socket.socketpair(type=socket.SOCK_SEQPACKET)  # which keeps writes apart
        with reader, writer:
            self.expect(["-v", "-f", "a"], Code.OK, "", child=lambda: os.dup2(writer.fileno(), 2))
            first_write = reader.recv(1 << 20).decode()
        self.assertEqual(first_write, entry("n", "") + entry("o", "") + entry("g", "", "a"))

    @unittest.skipUnless(os.path.exists("/proc/self/io"), "the system does not count writes")
    def test_failures_are_flushed_one_by_one_on_a_terminal_only(self):
        self.write("a", "x\nn r\ny\no w\n")
        terminal, its_end = os.openpty()
        self.addCleanup(os.close, terminal)
        self.addCleanup(os.close, its_end)
        log = pathlib.Path(self.root, "log")
        with open(log, "wb") as file:
            for stream, options, writes in ((its_end, "-c", 2), (its_end, "-cv", 3), (file, "-cvs", 2)):
                with started(options, self.dir, stderr=stream) as child:
                    os.waitid(os.P_PID, child.pid, os.WEXITED | os.WNOWAIT)
                    counts = pathlib.Path(f"/proc/{child.pid}/io").read_text("ascii")
                self.assertIn(f"\nsyscw: {writes}\n", counts, options)
        first, second = message("bad_type_token", 1, "x"), message("bad_type_token", 3, "y")
        told = first + entry("n", "r") + second + entry("o", "w") + NO_CACHE
        self.assertEqual(log.read_text("latin-1"), told)

    def test_a_signal_loses_nothing_that_was_gathered(self):
        for number in (signal.SIGHUP, signal.SIGINT, signal.SIGQUIT, signal.SIGTERM):
            with self.subTest(number):
                status, printed, whole = self.printed_until(number, signal.SIG_DFL)
                self.assertEqual(status, -number)
                self.assertNotEqual(printed, whole)
                self.assertTrue(whole.startswith(printed))
                self.assertTrue(printed.endswith("\n\n"))
                self.assertEqual(self.printed_until(number, signal.SIG_IGN), (0, whole, whole))

    def printed_until(self, number, action):
        """The status, what the pipe holds when a signal comes early, and what it would hold without one."""
        count = 5000
        self.write("a", "x\n" * count)
        set_action = lambda: signal.signal(number, action)
        with started("-c", self.dir, stderr=subprocess.PIPE, preexec_fn=set_action) as child:
            first = child.stderr.read(1)  # more than the pipe takes is left
            child.send_signal(number)
            printed = first + child.stderr.read()
            status = child.wait()
        whole = [message("bad_type_token", line, "x") for line in range(1, count + 1)]
        return status, printed.decode("latin-1"), "".join(whole)

    def test_a_second_signal_ends_what_nobody_reads(self):
        self.write("a", "x\n" * 5000)
        with started("-c", self.dir, stderr=subprocess.PIPE) as child:
            child.stderr.read(1)
            while child.poll() is None:
                child.terminate()
                time.sleep(0.01)
            self.assertEqual(child.returncode, -signal.SIGTERM)


def limited_to(limits, for_large_files=signal.SIG_DFL):
    """A function that sets limits of its process, and the action for the signal of too large a file."""
    def set_limits():
        signal.signal(signal.SIGXFSZ, for_large_files)
        for what, size in limits.items():
            resource.setrlimit(what, (size, size))
    return set_limits


class Memory(CommandCase):
    @unittest.skipIf(SANITIZED, "the sanitizers need much memory")
    def test_the_check_succeeds_or_says_that_there_is_too_little(self):
        sorted_names = [f"{number:05}" for number in range(50000)]
        names = sorted_names[:20000] + random.Random(1).sample(sorted_names[20000:], 30000)
        self.write("a", "".join(f"u m {name} r\ne m {name}\n" for name in names))
        statuses = []
        for megabytes in range(4, 64, 2):
            limits = {resource.RLIMIT_STACK: 256 << 10, resource.RLIMIT_AS: megabytes << 20}
            status, errors = run(["-cs", "-f", "a"], self.dir, child=limited_to(limits))
            self.assertEqual(os.path.exists(self.dir + "/a.cacl"), status == 0)
            if status < 0 or "error while loading" in errors:
                continue  # too little even to load the C library
            statuses.append(status)
            self.assertTrue(errors == "" if status == 0 else errors.startswith("3417-102"), errors)
        self.assertEqual(set(statuses), {Code.NO_MEMORY, Code.OK})
        self.assertEqual(statuses, sorted(statuses, reverse=True))
        cache = pathlib.Path(self.dir, "a.cacl").read_text("latin-1")
        self.assertTrue(re.findall(r"(\d{5})\0", cache) == names + sorted_names)


NO_FILE = Code.BAD_FILENAME, message("bad_acl_file_name", "{dir}/a", 0)
OTHER_MODE = Code.FILE_ERROR, message("cache_mode_differs", "{dir}/a")
NO_WRITING = Code.FILE_ERROR, message("cannot_open_for_writing", "{dir}/a.cacl")
IN_THE_WAY = [  # what the owner does first, and the result of "-s" then
    ("rm a; mkdir a", NO_FILE),
    ("rm a; mkfifo a", NO_FILE),
    ("ln -sf /dev/zero a", NO_FILE),
    ("chmod 200 a", (Code.FILE_ERROR, message("cannot_open_acl_file", "{dir}/a", errno.EACCES))),
    ("mkdir -m 644 a.cacl", OTHER_MODE),
    ("mkfifo -m 644 a.cacl", OTHER_MODE),
    ("ln -s nowhere a.cacl", NO_WRITING),
    ("chmod 444 a; cp -p a a.cacl", NO_WRITING),
]
if IS_ROOT:
    REFUSED = Code.FILE_ERROR, message("cannot_set_owner", "{dir}/a.cacl", "0", 0)
    IN_THE_WAY.append(("ln -sf of_root a", REFUSED))


def may_write(path, user, group):
    done = subprocess.run(["test", "-w", path], user=user, group=group, extra_groups=[], check=False)
    return done.returncode == 0


def entries_of(path):
    with contextlib.suppress(OSError):
        return os.getxattr(path, ENTRIES)
    return None


class Caches(CommandCase):
    def expect_compiled(self, code=Code.OK, errors="", makes=(), **how):
        self.expect(["-s", "-f", "a"], code, errors, makes, **how)

    def test_what_stands_in_the_way(self):
        for does, result in IN_THE_WAY:
            with self.subTest(does):
                self.fresh()
                os.chmod(self.dir, 0o777)
                self.write("of_root", A_TEXT)
                self.write("a", A_TEXT, owner=ORDINARY)
                subprocess.run(does, shell=True, cwd=self.dir, user=ORDINARY, group=ORDINARY, check=True)
                self.expect_compiled(*result, user=ORDINARY)

    def test_a_cache_is_protected_like_the_file(self):
        for mode in (0o640, 0o400, 0o1666, 0o2755, 0o4711):
            self.fresh()
            path = self.write("a", A_TEXT, mode, ORDINARY)
            self.expect_compiled(makes=A_NEW_CACHE, child=lambda: os.umask(0o077))
            text, cache = os.stat(path), os.stat(path + ".cacl")
            self.assertEqual(cache.st_mode, text.st_mode)
            self.assertEqual((cache.st_uid, cache.st_gid), (text.st_uid, text.st_gid))

    def test_a_cache_has_the_entries_of_the_file_and_no_others(self):
        """Only users who can write the file can write the cache, regardless of what new files in the folder inherit."""
        for entries, inherited in itertools.product((None, posix_acl(group=4)), (None, posix_acl(group=6))):
            with self.subTest(entries=entries, inherited=inherited):
                self.fresh()
                path = self.write("a", A_TEXT, owner=ORDINARY)
                if entries:
                    self.set_entries(path, entries)
                if inherited:
                    self.set_entries(self.dir, inherited, INHERITED)
                self.expect_compiled(makes=A_NEW_CACHE)
                self.assertEqual(entries_of(path + ".cacl"), entries_of(path))
                self.assertEqual(os.stat(path + ".cacl").st_mode, os.stat(path).st_mode)
                if IS_ROOT:
                    self.assertFalse(may_write(path + ".cacl", NOBODY, ORDINARY))
                    self.assertEqual(may_write(path + ".cacl", WRITER, WRITER), entries is not None)

    def test_a_cache_with_other_entries_is_not_replaced(self):
        path = self.write("a", A_TEXT, 0o664)
        self.write("a.cacl", "old", 0o664)
        self.set_entries(path, posix_acl(group=4))
        self.expect_compiled(*OTHER_MODE)
        self.set_entries(path + ".cacl", posix_acl(group=6))
        self.expect_compiled(*OTHER_MODE)
        self.set_entries(path + ".cacl", posix_acl(group=4))
        self.expect_compiled(makes=A_NEW_CACHE)

    def test_a_full_disk_leaves_the_cache_that_was_there(self):
        self.write("a", A_TEXT)
        size = len(A_CACHE)
        short = Code.FILE_ERROR, message("short_write", 7, size, 0)
        nothing = Code.FILE_ERROR, message("short_write", -1, size, errno.EFBIG)
        for _ in ("without a cache", "with one"):
            self.expect_compiled(*short, child=limited_to({resource.RLIMIT_FSIZE: 7}, signal.SIG_IGN))
            self.expect_compiled(*nothing, child=limited_to({resource.RLIMIT_FSIZE: 0}))
            self.write("a.cacl", "old")

    def test_the_longest_path_leaves_room_for_the_suffix(self):
        folder = os.path.join(self.dir, *["d" * 200] * 19)
        os.makedirs(folder)
        longest = (folder + "/").ljust(4089, "f")
        too_long = longest + "f"
        for path in longest, too_long:
            pathlib.Path(path).write_text(A_TEXT, "ascii")
        self.expect(["-s", "-f", longest], Code.OK, "")
        self.assertTrue(os.path.exists(longest + ".cacl"))
        self.expect(["-s", "-f", too_long], Code.FILE_ERROR, message("name_too_long_for_cache", too_long))
        self.assertFalse(os.path.exists(too_long + ".cacl"))

    def test_a_file_in_the_home_directory_must_be_the_users_alone(self):
        user, home = pwd.getpwuid(os.geteuid())[0:6:5]
        if not os.access(home, os.W_OK):
            self.skipTest("no home directory to write to")
        ignored = message("compile_option_ignored")
        with tempfile.NamedTemporaryFile(dir=home) as file:
            pathlib.Path(file.name).write_text("n r\n", "ascii")
            refused = message("acl_file_not_private", file.name, user)
            arguments = ["-sv", "-u", user, "-f", os.path.basename(file.name)]
            os.chmod(file.name, 0o755)
            self.expect(arguments, Code.OK, ignored + entry("n", "r"))
            os.chmod(file.name, 0o620)
            self.expect(arguments, Code.BAD_PERMISSION, ignored + refused)
            self.assertFalse(os.path.exists(file.name + ".cacl"))


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
