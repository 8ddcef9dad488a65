"""Edits ACL files with qzacl as an administrator does, and looks at every byte of what is left, also of edits that meet
each other, lack rights or are killed.

usage: qzacl_edit_test.py BUILD-FOLDER [unittest arguments]"""
import fcntl
import itertools
import os
import pathlib
import re
import shutil
import signal
import subprocess
import sys
import unittest

from command_case import (
    ENTRIES, IS_ROOT, NOBODY, PLACE, SANITIZED, CommandCase, environment_with, posix_acl, rows, snapshot,
    unescaped)

QZACL = PLACE.name + "/bin/qzacl"
TRACER = ["strace", "-o", "/dev/null"]
CAN_TRACE = shutil.which("strace") and subprocess.run([*TRACER, "true"], check=False).returncode == 0
OLD = b"# staff\nu unix alice@h r # boss\ng ops rw\n"


def edits(outcome):
    """The texts, the words of the edits and their results in edits.cases, by outcome."""
    for text, words, result in rows("edits.cases"):
        kind, _, rest = result.partition(": ")
        if kind == outcome:
            verb, *others = words.split(" ")
            yield bytes_in(text), [verb, "a", *map(unescaped, others)], rest


def bytes_in(text):
    """The bytes of a text in quotes."""
    return unescaped(text.strip('"')).encode("latin-1")


class EditCase(CommandCase):
    def qzacl(self, *words, tracer=(), **how):
        """Returns the status and the output of both streams together."""
        command = [*tracer, QZACL, *[word.encode("latin-1") for word in words]]
        done = subprocess.run(command, cwd=self.dir, env=environment_with(), stdin=subprocess.DEVNULL, timeout=300,
                              stdout=subprocess.PIPE, stderr=subprocess.STDOUT, check=False, **how)
        return done.returncode, done.stdout.decode("latin-1")

    def read(self, name="a"):
        return pathlib.Path(self.dir, name).read_bytes()

    def expect_refused(self, said, *words, **how):
        before = snapshot(self.dir)
        status, printed = self.qzacl(*words, **how)
        self.assertEqual((status, snapshot(self.dir)), (2, before), words)
        self.assertIn(said, printed, words)


class Edits(EditCase):
    def test_transcripts(self):
        self.expect_transcripts("qzacl_edit.cases")

    def test_changes(self):
        for before, words, after in edits("makes"):
            with self.subTest(before=before, words=words):
                self.write("a", before)
                status, diff = self.qzacl(*words, "--check")
                self.assertEqual((status, self.read(), os.listdir(self.dir)), (1, before, ["a"]))
                self.expect_patched(before, diff, bytes_in(after))
                self.assertEqual(self.qzacl(*words), (0, "changed\n"))
                self.assertEqual((self.read(), os.listdir(self.dir)), (bytes_in(after), ["a"]))
                self.assertEqual(self.qzacl(*words), (0, "unchanged\n"))

    def expect_patched(self, before, diff, after):
        path = pathlib.Path(self.root, "patched")
        path.write_bytes(before)
        if shutil.which("patch"):
            subprocess.run(["patch", "-s", "--binary", path], input=diff.encode("latin-1"), check=True)
            self.assertEqual(path.read_bytes() if path.exists() else b"", after)

    def test_nothing_to_change(self):
        for before, words, _ in edits("changes nothing"):
            with self.subTest(before=before, words=words):
                self.write("a", before)
                state = snapshot(self.dir)
                self.assertEqual(self.qzacl(*words, "--check"), (0, ""))
                self.assertEqual(self.qzacl(*words), (0, "unchanged\n"))
                self.assertEqual(snapshot(self.dir), state)

    def test_refusals(self):
        for before, words, said in edits("is refused"):
            with self.subTest(words=words):
                self.write("a", before)
                self.expect_refused(said, *words)

    def test_a_signal_drops_the_copy(self):
        for number in (signal.SIGINT, signal.SIGTERM):
            self.write("a", OLD)
            environment = environment_with(EDITOR="sed -i s/^g/bad/", TMPDIR=self.dir)
            running = subprocess.Popen([QZACL, "edit", "a"], cwd=self.dir, env=environment, stdin=subprocess.PIPE,
                                       stderr=subprocess.PIPE)
            while b"What now?" not in running.stderr.peek():
                running.stderr.readline()
            running.send_signal(number)
            self.assertIn(b"was not changed", running.communicate()[1])
            self.assertEqual((running.returncode, self.read(), os.listdir(self.dir)), (2, OLD, ["a"]))


class Files(EditCase):
    def test_protection_is_kept(self):
        path = self.write("a", OLD, 0o640)
        if IS_ROOT:
            os.chown(path, 1234, 2345)
        os.chmod(path, 0o2640)
        attributes = {"user.origin": b"\0anything", ENTRIES: posix_acl(6)}
        for name, value in attributes.items():
            os.setxattr(path, name, value)
        os.setxattr(self.dir, "system.posix_acl_default", posix_acl(7))
        before = os.stat(path)
        self.assertEqual(self.qzacl("remove", "a", "g", "ops"), (0, "changed\n"))
        after = os.stat(path)
        self.assertNotEqual(after.st_ino, before.st_ino)
        kept = ("st_mode", "st_uid", "st_gid")
        self.assertEqual([getattr(after, name) for name in kept], [getattr(before, name) for name in kept])
        self.assertEqual({name: os.getxattr(path, name) for name in os.listxattr(path)}, attributes)

    def test_entries_of_the_folder_are_not_inherited(self):
        path = self.write("a", OLD, 0o600)
        os.setxattr(self.dir, "system.posix_acl_default", posix_acl(7))
        self.assertEqual(self.qzacl("remove", "a", "g", "ops"), (0, "changed\n"))
        self.assertEqual((os.listxattr(path), os.stat(path).st_mode & 0o7777), ([], 0o600))

    @unittest.skipUnless(IS_ROOT, "takes root")
    def test_without_rights(self):
        self.write("a", OLD, 0o666)
        self.expect_refused("Permission denied", "set", "a", "n", "r", user=NOBODY, group=NOBODY, extra_groups=[])
        os.chmod(self.dir, 0o777)  # another's file would change its owner
        self.expect_refused("Operation not permitted", "set", "a", "n", "r", user=NOBODY, group=NOBODY, extra_groups=[])


class Locks(EditCase):
    @unittest.skipUnless(CAN_TRACE and not SANITIZED, "takes strace")
    def test_a_lock_that_was_replaced_is_none(self):
        self.write("a", OLD)
        self.write("a.lock", "", 0o600)
        trace = f"{self.dir}/trace"
        command = ["strace", "-o", trace, "-e", "trace=openat,flock", "-e", "inject=flock:delay_enter=1000000:when=1"]
        running = subprocess.Popen([*command, QZACL, "set", "a", "n", "r", "--wait", "2"], cwd=self.dir)
        while not re.search(rb'"a\.lock".* = \d+\n', self.read("trace") if os.path.exists(trace) else b""):
            self.assertIsNone(running.poll())
        os.unlink(f"{self.dir}/a.lock")
        held = os.open(f"{self.dir}/a.lock", os.O_RDWR | os.O_CREAT, 0o600)
        fcntl.flock(held, fcntl.LOCK_EX)
        self.assertEqual((running.wait(), self.read()), (2, OLD))
        os.close(held)

    def test_many_at_once(self):
        words = [("set", "a", "g", f"g{number}") for number in range(4)]
        words += [("grant", "a", letter, "n") for letter in "rwcx"]
        for options, left in ([], {"a"}), (["-s"], {"a", "a.cacl"}):
            self.fresh()
            self.write("a", OLD)
            running = [subprocess.Popen([QZACL, *each, *options], cwd=self.dir, stdout=subprocess.PIPE)
                       for each in words]
            told = [(each.communicate()[0], each.returncode) for each in running]
            self.assertEqual(told, [(b"changed\n", 0)] * 8)
            added = set(self.read()[len(OLD):].split(b"\n"))
            self.assertEqual(added, {b"", b"g g0", b"g g1", b"g g2", b"g g3", b"n rwcx"})
            self.assertEqual(set(os.listdir(self.dir)), left)
            self.assertEqual(self.qzacl("cache", "a")[0], 0 if options else 1)  # whether the cache counts

    @unittest.skipUnless(CAN_TRACE and not SANITIZED, "takes strace")
    def test_changes_without_the_lock_are_not_lost(self):
        self.write("a", OLD)
        command = [*TRACER, "-e", "inject=fsync:delay_enter=1000000", QZACL, "set", "a", "n", "r"]
        running = subprocess.Popen(command, cwd=self.dir, stderr=subprocess.PIPE)
        while ".a.qzacl" not in os.listdir(self.dir):
            self.assertIsNone(running.poll())
        self.write("a", b"n w\n")
        self.assertIn(b"changed meanwhile", running.communicate()[1])
        self.assertEqual((running.returncode, self.read(), os.listdir(self.dir)), (2, b"n w\n", ["a"]))

    @unittest.skipUnless(CAN_TRACE and not SANITIZED, "takes strace")
    def test_kill_at_each_step(self):
        for step in "openat flock read write fchown fchmod fsetxattr fsync renameat unlinkat close".split():
            times = next(time for time in itertools.count(1) if not self.killed_at(step, time))
            self.assertGreater(times, 1, step)

    def killed_at(self, step, time):
        """Whether an edit that is killed as it calls the system for the so many-th time got there."""
        self.fresh()
        os.setxattr(self.write("a", OLD), "user.origin", b"x")
        tracer = [*TRACER, "-e", f"trace={step}", "-e", f"inject={step}:signal=KILL:when={time}"]
        status, _ = self.qzacl("set", "a", "n", "r", tracer=tracer)
        self.assertIn(status, (0, -signal.SIGKILL))
        self.assertIn(self.read(), (OLD, OLD + b"n r\n"), (step, time))
        self.assertLessEqual(set(os.listdir(self.dir)), {"a", "a.lock", ".a.qzacl"})
        # The next edit is not hindered by what is left, and removes it.
        self.assertEqual(self.qzacl("grant", "a", "w", "n")[0], 0)
        self.assertEqual(os.listdir(self.dir), ["a"])
        self.assertEqual(os.getxattr(f"{self.dir}/a", "user.origin"), b"x")
        return status != 0


if __name__ == "__main__":
    unittest.main(argv=sys.argv[1:])
