"""Edits ACL files with qzacl as an administrator does, and looks at every byte of what is left, also of edits that meet
each other, lack rights or are killed. Usage: qzacl_edit_test.py BUILD_DIR [unittest arguments]."""
import contextlib
import fcntl
import itertools
import json
import os
import pathlib
import pty
import random
import re
import shutil
import signal
import subprocess
import sys
import unittest

from command_case import (BUILD, ENTRIES, IS_ROOT, NOBODY, PLACE, SANITIZED, CommandCase, posix_acl, snapshot)

os.environ["QZ_LIBRARY_DIR"] = str(BUILD / "lib")
sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent.parent / "bindings" / "python"))
if not SANITIZED:  # which Python cannot load
    import qzacl

QZACL = PLACE.name + "/bin/qzacl"
TRACER = ["strace", "-o", "/dev/null"]
CAN_TRACE = shutil.which("strace") and subprocess.run([*TRACER, "true"], check=False).returncode == 0
OLD = b"# staff\nu unix alice@h r # boss\ng ops rw\n"
EDITS = [  # a text, the words of an edit, and the text that it makes
    (OLD, "set u unix alice@h rw", OLD.replace(b" r #", b" rw #")),
    (OLD, "set u unix bob@h r", OLD + b"u unix bob@h r\n"),
    (OLD, "set g ops", OLD.replace(b"ops rw", b"ops ")),
    (OLD, "remove g ops", OLD.replace(b"g ops rw\n", b"")),
    (OLD, "remove u unix alice@h", OLD.replace(b"u unix alice@h r # boss\n", b"")),
    (OLD, "remove G OPS", OLD.replace(b"g ops rw\n", b"")),
    (OLD, "grant x g ops", OLD.replace(b"ops rw", b"ops rwx")),
    (OLD, "grant xr g new", OLD + b"g new rx\n"),
    (OLD, "revoke w g ops", OLD.replace(b"ops rw", b"ops r")),
    (OLD, "revoke rwx u unix alice@h", OLD.replace(b" r #", b"  #")),
    (b"", "set n r", b"n r\n"),
    (b"o r", "set n r", b"o r\nn r\n"),
    (b"o r", "set o w", b"o w"),
    (b"o r", "remove o", b""),
    (b"# c\r\nO\tr \t#\r\n\r\n", "grant w o", b"# c\r\nO\trw \t#\r\n\r\n"),
    (b"o r\r\nn\r\n", "remove o", b"n\r\n"),
    (b"o r\r\nn w", "set g ops r", b"o r\r\nn w\r\ng ops r\r\n"),
    (b"o r\rn w", "remove n", b"o r\r"),
    (b"o r\rn w", "set g ops r", b"o r\rn w\rg ops r\r"),
    (b"o r\fn w", "set n", b"o r\fn "),
    (b"n\t\t# none\n", "grant r n", b"n r\t\t# none\n"),
    (b"o r\n\0n w\n", "set n r", b"o r\nn r\n\0n w\n"),
    (b"\0rest", "set n r", b"n r\n\0rest"),
    (b"g caf\xe9 r\n", "grant w g caf\xe9", b"g caf\xe9 rw\n"),
    (b"u UNIX A@H r\n", "set U Unix a@h w", b"u UNIX A@H w\n"),
    (b"", "set u unix a@FE80:0::1 r", b"u unix a@fe80::1 r\n"),
    (b"", "set e HBA2 FE80:0::1 r", b"e hba2 fe80::1 r\n"),
    (b"", "set u m\xe9ch \xe9@h r", b"u m\xe9ch \xe9@h r\n"),
    (b"", "set u unix \xe9@FE80:0::1 r", b"u unix \xe9@fe80::1 r\n"),
    (b"", "set u other a@FE80:0::1 r", b"u other a@FE80:0::1 r\n"),
    (b"u unix a@fe80::1 r\n", "grant w u unix a@FE80:0::1", b"u unix a@fe80::1 rw\n"),
    (b"u unix a@FE80:0::1 r\nu unix a@fe80::1 r\n", "grant w u unix a@FE80:0::1",
     b"u unix a@FE80:0::1 rw\nu unix a@fe80::1 r\n"),
]
UNCHANGED = [(OLD, "set g OPS wr"), (OLD, "grant r u unix alice@h"), (OLD, "revoke x g ops"), (OLD, "revoke r g none"),
             (OLD, "remove o"), (b"n \n", "set n"), (b"u unix x r\n", "set u unix x r")]
REFUSED = [  # a text, the words of an edit, and what is said
    (b"n r\nbad\n", "set g ops r", "3417-179"),
    (b"n r\nn w\n", "remove n", "3417-174"),
    (OLD, "set g ops Z", "3417-146"),
    (OLD, "grant Z g ops", "3417-146"),
    (OLD, "set u unix alice r", "host"),
    (OLD, "grant r e unix a@", "host"),
    (OLD, "set g a\tb r", "word"),
    (OLD, "set g #a r", "word"),
    (OLD, "set g a\nn r", "word"),
    (OLD, "set x ops r", "begins with"),
    (OLD, "set u unix", "missing"),
    (OLD, "remove g ops r", "too many"),
    (OLD, "set u 12345678901234567 a", "16 bytes"),
    (OLD, "set g " + "a" * 1096, "3417-158"),
    (b"\x85\1", "set n r", "compiled"),
    (OLD, "revoke", "words"),
    (OLD, "set -x n", "option"),
    (OLD, "set n r --wait=", "value"),
    (OLD, "set n r --wait -1", "wait"),
    (OLD, "set n r --wait ", "wait"),
]


VERBS = ["set", "remove", "grant", "revoke"]


def some_key(draw):
    kind = draw.choice("uuegno")
    identity = draw.choice(["alice@a", "Bob@B", "c@fe80::1", "d", "x\xe9"]) + ("@h" if kind == "u" else "")
    return {"n": ["n"], "o": ["o"], "g": ["g", identity]}.get(kind, [kind, draw.choice(["unix", "Krb"]), identity])


def some_letters(draw):
    return "".join(draw.sample("rwcxCqledvsao", draw.randrange(4)))


def some_text(draw):
    """A text, and the keys of its entries: with comments, blank lines, blanks and line ends of all kinds."""
    pieces, keys = [], {}
    for _ in range(draw.randrange(9)):
        end = draw.choice(["\n", "\n", "\r\n", "\r", "\f"])
        pieces.append(draw.choice(["", "", "# a comment" + end, end, " \t" + end]))
        key = some_key(draw)
        if keys.setdefault(str(key).lower(), key) is key:
            words = [*key, *([some_letters(draw)] if draw.random() < 0.8 else [])]
            blanks = [draw.choice([" ", "\t", "  ", " \v"]) for _ in words]
            line = "".join(map("".join, zip(words, blanks)))
            pieces.append(draw.choice(["", " "]) + line + draw.choice(["", "# why", "#"]) + end)
    text = "".join(pieces).encode("latin-1")
    text = text if draw.random() < 0.7 else text.rstrip()
    return text if draw.random() < 0.9 or not text.endswith(b"\n") else text + b"\0 rest", list(keys.values())


def lines_of(text):
    return re.findall(rb"[^\r\n\f]*(?:\r\n|[\r\n\f])|[^\r\n\f]+", text)


def keeps_other_bytes(before, after, verb):
    """Whether all that differs is one line, and of a line that was there before its letters alone."""
    old, new = lines_of(before), lines_of(after)
    if verb == "remove":
        return old == new or any(old[:at] + old[at + 1:] == new for at in range(len(old)))
    if len(old) != len(new):
        read, added = before.partition(b"\0 rest")[0], after.partition(b"\0 rest")[0]
        return added.startswith(read) and len(new) == len(old) + 1 and before[len(read):] == after[len(added):]
    changed = [pair for pair in zip(old, new) if pair[0] != pair[1]]
    return len(changed) <= 1 and all(differ_in_letters(*pair) for pair in changed)


def differ_in_letters(old, new):
    start = len(os.path.commonprefix([old, new]))
    end = len(os.path.commonprefix([old[start:][::-1], new[start:][::-1]]))
    pieces = [line[start:len(line) - end].strip() for line in (old, new)]
    return all(re.fullmatch(b"[a-zC]*", piece) for piece in pieces)


def changed_acl(text, verb, letters, key):
    """What the library makes of the ACL when it is edited there."""
    acl = qzacl.Acl.from_text(text)
    kind = {"n": 1, "o": 2, "u": 4, "e": 8, "g": 16}[key[0].lower()]
    mechanism = key[1].lower() if len(key) == 3 else ""
    identity = key[-1].encode("latin-1").decode("utf-8", "surrogateescape") if len(key) > 1 else ""
    wanted = qzacl.Entry(kind, qzacl.to_mask(letters), mechanism, identity)
    held = next((each for each in acl if each[0] == kind and each[2].lower() == mechanism and
                 each[3].lower() == identity.lower()), None)
    mask = {"set": wanted[1], "grant": wanted[1] | (held[1] if held else 0),
            "revoke": (held[1] if held else 0) & ~wanted[1]}.get(verb)
    if verb in ("set", "grant") or (verb == "revoke" and held):
        acl.add(wanted._replace(permissions=mask))
    elif verb == "remove" and held:
        acl.remove(held)
    return acl


class EditCase(CommandCase):
    def qzacl(self, *words, text=b"", environment=(), tracer=(), **how):
        """Gives the status and what was printed, on both streams together."""
        command = [*tracer, QZACL, *[word.encode("latin-1") for word in words]]
        kept = {name: value for name, value in os.environ.items() if name.endswith("SAN_OPTIONS")}
        done = subprocess.run(command, cwd=self.dir, input=text, stdout=subprocess.PIPE, stderr=subprocess.STDOUT,
                              env={**kept, "PATH": os.environ["PATH"], "LC_ALL": "C", **dict(environment)}, check=False,
                              timeout=300, **how)
        return done.returncode, done.stdout.decode("latin-1")

    def read(self, name="a"):
        return pathlib.Path(self.dir, name).read_bytes()

    def edit_words(self, words):
        """Of a row, with the file behind the verb."""
        verb, *others = words.split(" ")
        return [verb, "a", *others]

    def expect_refused(self, said, *words, **how):
        before = snapshot(self.dir)
        status, printed = self.qzacl(*words, **how)
        self.assertEqual((status, snapshot(self.dir)), (2, before), words)
        self.assertIn(said, printed, words)


class Edits(EditCase):
    def test_changes(self):
        for before, words, after in EDITS:
            with self.subTest(before=before, words=words):
                self.write("a", before)
                status, diff = self.qzacl(*self.edit_words(words), "--check")
                self.assertEqual((status, self.read(), os.listdir(self.dir)), (1, before, ["a"]))
                self.expect_patched(before, diff, after)
                self.assertEqual(self.qzacl(*self.edit_words(words)), (0, "changed\n"))
                self.assertEqual((self.read(), os.listdir(self.dir)), (after, ["a"]))
                self.assertEqual(self.qzacl(*self.edit_words(words), "--json")[1], '{"file":"a","changed":false}\n')

    def expect_patched(self, before, diff, after):
        path = pathlib.Path(self.root, "patched")
        path.write_bytes(before)
        if shutil.which("patch"):
            subprocess.run(["patch", "-s", "--binary", path], input=diff.encode("latin-1"), check=True)
            self.assertEqual(path.read_bytes() if path.exists() else b"", after)

    def test_nothing_to_change(self):
        for before, words in UNCHANGED:
            with self.subTest(before=before, words=words):
                self.write("a", before)
                state = snapshot(self.dir)
                self.assertEqual(self.qzacl(*self.edit_words(words), "--check"), (0, ""))
                self.assertEqual(self.qzacl(*self.edit_words(words)), (0, "unchanged\n"))
                self.assertEqual(snapshot(self.dir), state)

    def test_refusals(self):
        for before, words, said in REFUSED:
            with self.subTest(words=words):
                self.write("a", before)
                self.expect_refused(said, *self.edit_words(words))
        self.expect_refused("find", "set", "none", "n", "r")
        self.expect_refused("only a file", "set", "-", "n", "r")
        os.mkfifo(f"{self.dir}/pipe")
        self.expect_refused("regular", "set", "pipe", "n", "r")

    def test_json(self):
        self.write("a", OLD)
        for more, status in ((["--check"], 1), ([], 0)):
            got = self.qzacl("--json", "set", "a", "n", "r", *more)
            self.assertEqual((got[0], json.loads(got[1])), (status, {"file": "a", "changed": True}))

    def test_what_a_grant_hides(self):
        text = b"o rwx\ne unix .h rw\ne unix x.h rwxc\n"
        for words, said in (("grant r u unix a@x.h", "a:2: e unix .h rw granted more"), ("grant rw u unix a@x.h", ""),
                            ("grant r u unix a@other", "a:1: o rwx granted more"), ("grant r g ops", "a:1: o rwx"),
                            ("grant r n", ""), ("set u unix a@x.h r", "")):
            self.write("a", text)
            printed = self.qzacl(*self.edit_words(words))[1].replace("changed\n", "")
            self.assertIn(said, printed)
            self.assertEqual(bool(printed), bool(said), words)

    def test_letters_of_a_set(self):
        self.write("set", "a 0x1 add\nz 2 zap\n")
        self.write("a", "n z\n")
        self.assertEqual(self.qzacl("--permissions", "set", "grant", "a", "a", "n"), (0, "changed\n"))
        self.assertEqual(self.read(), b"n az\n")
        self.expect_refused("3417-146", "set", "a", "n", "r", "--permissions", "set")

    @unittest.skipIf(SANITIZED, "Python cannot load the library")
    def test_any_text_and_change(self):
        """Every byte is kept but those of one line, and the result says what the library's edit of the ACL gives."""
        draw = random.Random(15)
        for _ in range(150):
            text, entries = some_text(draw)
            verb, letters, key = draw.choice(VERBS), some_letters(draw) or "r", draw.choice(entries + [some_key(draw)])
            self.write("a", text)
            words = {"set": ["a", *key, letters], "remove": ["a", *key]}.get(verb, ["a", letters, *key])
            with self.subTest(text=text, verb=verb, words=words):
                status, printed = self.qzacl(verb, *words)
                self.assertEqual(status, 0, printed)
                after = self.read()
                self.assertEqual(printed.endswith("unchanged\n"), after == text)
                self.assertTrue(keeps_other_bytes(text, after, verb), after)
                self.assertTrue(qzacl.same(qzacl.Acl.from_text(after), changed_acl(text, verb, letters, key)), after)


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

    def test_links(self):
        self.write("a", OLD)
        os.mkdir(f"{self.dir}/below")
        os.symlink("../a", f"{self.dir}/below/link")
        self.assertEqual(self.qzacl("remove", "below/link", "g", "ops"), (0, "changed\n"))
        self.assertEqual((os.readlink(f"{self.dir}/below/link"), os.listdir(f"{self.dir}/below")), ("../a", ["link"]))
        self.assertNotIn(b"ops", self.read())
        os.link(f"{self.dir}/a", f"{self.dir}/other")
        self.expect_refused("several names", "set", "a", "n", "r")
        self.expect_refused("several names", "set", "a", "n", "r", "--check")

    @unittest.skipUnless(IS_ROOT, "takes root")
    def test_without_rights(self):
        self.write("a", OLD, 0o666)
        self.expect_refused("Permission denied", "set", "a", "n", "r", user=NOBODY, group=NOBODY, extra_groups=[])
        os.chmod(self.dir, 0o777)  # another's file would change its owner
        self.expect_refused("Operation not permitted", "set", "a", "n", "r", user=NOBODY, group=NOBODY, extra_groups=[])

    def test_output_that_cannot_be_written(self):
        self.write("a", OLD)
        with open("/dev/full", "wb") as full:
            done = subprocess.run([QZACL, "set", "a", "n", "r"], cwd=self.dir, stdout=full, stderr=subprocess.PIPE,
                                  check=False)
        self.assertEqual(done.returncode, 2)
        self.assertIn(b"standard output", done.stderr)


class Locks(EditCase):
    def lock(self):
        return os.open(f"{self.dir}/a.lock", os.O_RDWR | os.O_CREAT, 0o600)

    def test_waiting(self):
        self.write("a", OLD)
        held = self.lock()
        fcntl.flock(held, fcntl.LOCK_EX)
        self.expect_refused("not free in time", "set", "a", "n", "r", "--wait", "0")
        self.expect_refused("not free in time", "set", "a", "n", "r", "--wait=1")
        self.assertEqual(self.qzacl("set", "a", "n", "r", "--check")[0], 1)
        waiting = subprocess.Popen([QZACL, "set", "a", "n", "r"], cwd=self.dir, stdout=subprocess.PIPE)
        self.assertRaises(subprocess.TimeoutExpired, waiting.wait, 0.2)
        os.close(held)
        self.assertEqual((waiting.communicate()[0], os.listdir(self.dir)), (b"changed\n", ["a"]))

    def test_locks_that_are_none(self):
        self.write("a", OLD)
        self.write("b", "precious")
        for make in os.symlink, os.link:
            make(f"{self.dir}/b", f"{self.dir}/a.lock")
            self.expect_refused("a.lock", "set", "a", "n", "r")
            os.unlink(f"{self.dir}/a.lock")
        os.mkfifo(f"{self.dir}/a.lock")
        self.expect_refused("a.lock", "set", "a", "n", "r")

    @unittest.skipUnless(CAN_TRACE and not SANITIZED, "takes strace")
    def test_a_lock_that_was_replaced_is_none(self):
        self.write("a", OLD)
        os.close(self.lock())
        trace = f"{self.dir}/trace"
        command = ["strace", "-o", trace, "-e", "trace=openat,flock", "-e", "inject=flock:delay_enter=1000000:when=1"]
        running = subprocess.Popen([*command, QZACL, "set", "a", "n", "r", "--wait", "2"], cwd=self.dir)
        while not re.search(rb'"a\.lock".* = \d+\n', self.read("trace") if os.path.exists(trace) else b""):
            self.assertIsNone(running.poll())
        os.unlink(f"{self.dir}/a.lock")
        held = self.lock()
        fcntl.flock(held, fcntl.LOCK_EX)
        self.assertEqual((running.wait(), self.read()), (2, OLD))
        os.close(held)

    def test_many_at_once(self):
        words = [("set", "a", "g", f"g{number}") for number in range(4)]
        words += [("grant", "a", letter, "n") for letter in "rwcx"]
        for _ in range(3):
            self.fresh()
            self.write("a", OLD)
            running = [subprocess.Popen([QZACL, *each], cwd=self.dir, stdout=subprocess.PIPE) for each in words]
            self.assertEqual([each.communicate()[0] for each in running], [b"changed\n"] * 8)
            added = set(self.read()[len(OLD):].split(b"\n"))
            self.assertEqual(added, {b"", b"g g0", b"g g1", b"g g2", b"g g3", b"n rwcx"})
            self.assertEqual(os.listdir(self.dir), ["a"])

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
        # What is left behind hinders nobody, and goes.
        self.assertEqual(self.qzacl("grant", "a", "w", "n")[0], 0)
        self.assertEqual(os.listdir(self.dir), ["a"])
        self.assertEqual(os.getxattr(f"{self.dir}/a", "user.origin"), b"x")
        return status != 0


APPEND = "sh -c 'printf \"%s\\n\" \"$0\" >>\"$1\"' "  # what an administrator does in an editor: a line at the end
MEANWHILE = "sh -c 'echo n x >>a; echo g staff r >>\"$0\"'"
SESSIONS = [  # a text, the editor, the answers, the status, the text behind it, and what is said
    (OLD, APPEND + "'n r'", "", 0, OLD + b"n r\n", "changed\n"),
    (OLD, "true", "", 0, OLD, "unchanged\n"),
    (OLD, "false", "", 2, OLD, "the editor failed"),
    (OLD, "no-such-editor", "", 2, OLD, "the editor failed"),
    (OLD, APPEND + "bad", "", 2, OLD, "3417-179"),
    (OLD, APPEND + "bad", "d\n", 2, OLD, "What now?"),
    (OLD, APPEND + "bad", "s\nd\n", 2, OLD, "+bad\n"),
    (OLD, APPEND + "'n r'", "", 0, OLD + b"n r\n", "changed\n"),
    (OLD, "sh -c 'grep bad \"$0\" && sed -i /bad/d \"$0\" || echo bad >>\"$0\"'", "e\n", 0, OLD, "unchanged\n"),
    (b"bad\n", "sed -i 's/bad/n r/'", "", 0, b"n r\n", "changed\n"),
    (b"bad\n", "true", "", 2, b"bad\n", "3417-179"),
    (OLD, "sed -i s/^/\\\\x85/", "d\n", 2, OLD, "compiled"),
    (b"\x85\1", "sh -c 'echo o >\"$0\"'", "", 2, b"\x85\1", "a: only texts"),
    (OLD, "sh -c 'rm \"$0\"; mkfifo \"$0\"'", "", 2, OLD, "no regular file"),
    (OLD, MEANWHILE, "d\n", 2, OLD + b"n x\n", "changed while it was edited"),
    (OLD, "sh -c 'grep -q new \"$0\" || { echo n x >>a; echo g new r >>\"$0\"; }'", "s\ne\n", 0,
     OLD + b"g new r\n", "-n x\n"),
]


class Sessions(EditCase):
    def test_sessions(self):
        for before, editor, answers, status, after, said in SESSIONS:
            with self.subTest(editor=editor, answers=answers):
                self.write("a", before)
                temporary = os.path.join(self.root, "temporary")
                os.makedirs(temporary, exist_ok=True)
                environment = {"EDITOR": editor, "TMPDIR": temporary}
                got, printed = self.qzacl("edit", "a", text=answers.encode(), environment=environment)
                self.assertEqual((got, self.read(), os.listdir(self.dir)), (status, after, ["a"]), printed)
                self.assertIn(said, printed)
                self.assertEqual(os.listdir(temporary), [])

    def test_control_bytes_on_a_terminal(self):
        self.write("a", OLD)
        terminal, inner = pty.openpty()
        environment = {**os.environ, "EDITOR": "sh -c 'printf \"bad\\033[2J\\n\" >>\"$0\"'"}
        running = subprocess.Popen([QZACL, "edit", "a"], cwd=self.dir, env=environment, stdin=inner, stdout=inner,
                                   stderr=inner)
        os.close(inner)
        os.write(terminal, b"s\nd\n")
        shown = b""
        with contextlib.suppress(OSError):  # which is how a terminal ends
            while piece := os.read(terminal, 4096):
                shown += piece
        os.close(terminal)
        self.assertEqual(running.wait(), 2)
        self.assertIn(b"+bad\\x1b[2J", shown)

    def test_a_signal_drops_the_copy(self):
        for number in (signal.SIGINT, signal.SIGTERM):
            self.write("a", OLD)
            environment = {**os.environ, "EDITOR": APPEND + "bad", "TMPDIR": self.dir}
            running = subprocess.Popen([QZACL, "edit", "a"], cwd=self.dir, env=environment, stdin=subprocess.PIPE,
                                       stderr=subprocess.PIPE)
            while b"What now?" not in running.stderr.peek():
                running.stderr.readline()
            running.send_signal(number)
            self.assertIn(b"was not changed", running.communicate()[1])
            self.assertEqual((running.returncode, self.read(), os.listdir(self.dir)), (2, OLD, ["a"]))

    def test_visual_comes_first_and_nobody_else_looks_on(self):
        self.write("a", OLD)
        look = "sh -c 'stat -c %a:%n \"$0\" \"${0%/*}\"; ls *.lock'"
        printed = self.qzacl("edit", "a", environment={"VISUAL": look, "EDITOR": "false", "TMPDIR": self.root})[1]
        self.assertRegex(printed, "^600:.*/a\n700:")
        self.assertRegex(printed, "cannot access")


class Caches(EditCase):
    def cache_of(self, *permissions):
        """What the checker says of the file's cache."""
        return self.qzacl("cache", "a", *permissions)

    def test_cache_counts(self):
        self.write("a", OLD)
        self.assertEqual(self.qzacl("set", "a", "n", "r", "-s"), (0, "changed\n"))
        self.assertEqual(self.cache_of()[0], 0)
        os.unlink(f"{self.dir}/a.cacl")
        self.assertEqual(self.qzacl("set", "a", "n", "r", "-s"), (0, "unchanged\n"))
        self.assertEqual(self.cache_of()[0], 0)
        self.assertEqual(self.qzacl("set", "a", "n", "w", "-s", "--check")[0], 1)
        self.assertEqual(self.qzacl("edit", "a", "-s", environment={"EDITOR": APPEND + "'o r'"}), (0, "changed\n"))
        self.assertEqual(self.cache_of()[0], 0)

    def test_letters_of_a_set(self):
        self.write("set", "a 1\nz 0x80000000\n")
        self.write("a", "n a\n")
        self.assertEqual(self.qzacl("set", "a", "n", "z", "-s", "--permissions", "set"), (0, "changed\n"))
        self.assertEqual(self.cache_of("--permissions", "set")[0], 0)

    def test_no_entries(self):
        self.write("a", "n r\n#\n")
        self.assertEqual(self.qzacl("set", "a", "n", "w", "-s"), (0, "changed\n"))
        self.assertEqual(self.qzacl("remove", "a", "n", "-s"), (0, "changed\n"))
        os.utime(f"{self.dir}/a.cacl", (4e9, 4e9))  # later than any text
        self.assertEqual(self.qzacl("remove", "a", "n", "-s")[0], 2)
        self.write("a", "")
        self.assertEqual(self.qzacl("remove", "a", "n", "-s"), (0, "unchanged\n"))

    def test_cache_that_does_not_count(self):
        self.write("a", OLD)
        self.write("a.cacl", "x", 0o600)
        status, printed = self.qzacl("set", "a", "n", "r", "-s")
        self.assertEqual((status, self.read()), (2, OLD + b"n r\n"))
        self.assertRegex(printed, "(?s)^changed\n3417-.*services do not read the cache")
        os.unlink(f"{self.dir}/a.cacl")
        os.utime(f"{self.dir}/a", (4e9, 4e9))
        self.assertEqual(self.qzacl("set", "a", "n", "r", "-s")[0], 2)

    def test_many_at_once(self):
        self.write("a", OLD)
        running = [subprocess.Popen([QZACL, "grant", "a", letter, "n", "-s"], cwd=self.dir, stdout=subprocess.PIPE)
                   for letter in "rwcx"]
        self.assertEqual([(each.communicate()[0], each.returncode) for each in running], [(b"changed\n", 0)] * 4)
        self.assertEqual((self.cache_of()[0], self.read()), (0, OLD + b"n rwcx\n"))


if __name__ == "__main__":
    unittest.main(argv=sys.argv[1:])
