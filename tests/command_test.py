"""Runs the checker as an administrator does and compares what it prints, answers and leaves behind, to the byte.

Usage: command_test.py BUILD_DIR [unittest arguments]. The helpers serve the other script tests as well."""
import errno
import itertools
import os
import pathlib
import pwd
import random
import re
import resource
import shutil
import signal
import socket
import struct
import subprocess
import sys
import tempfile
import time
import unittest

BUILD = pathlib.Path(sys.argv[1]).resolve()
SANITIZED = "QZ_SANITIZE:STRING=\n" not in (BUILD / "CMakeCache.txt").read_text()
IS_ROOT, NOBODY = os.geteuid() == 0, 65534
ORDINARY = NOBODY - 1 if IS_ROOT else None  # whom root takes to be without its rights
# A copy of the command and its libraries that any user can reach, wherever the build folder lies.
PLACE = tempfile.TemporaryDirectory()
os.chmod(PLACE.name, 0o755)
for part in ("bin", "lib"):
    shutil.copytree(BUILD / part, f"{PLACE.name}/{part}", symlinks=True)
subprocess.run(["chmod", "-R", "a+rX", PLACE.name], check=True)  # as the mask of who built may not allow
COMMAND = PLACE.name + "/bin/qzaclfck"
# The texts of the message table by id; all text here is Latin-1, so that every byte survives.
TABLE = pathlib.Path(__file__).resolve().parent.parent / "security" / "msg" / "qzseclib_msg.h"
TEXTS = {int(number): re.sub(r"\\(.)", lambda match: {"n": "\n", "t": "\t"}.get(match[1], match[1]),
                             "".join(re.findall(r'"((?:[^"\\]|\\.)*)"', literals)))
         for number, literals in re.findall(r'\{(\d+),((?:\s*"(?:[^"\\]|\\.)*")+)\}', TABLE.read_text("latin-1"))}


def formatted(text, *values):
    return re.sub(r"%(\d)\$([sdcx])", lambda match: format(values[int(match[1]) - 1], match[2].strip("sdc")), text)


def message(number, *values):  # as the command prints it: with an empty line behind it
    return formatted(TEXTS[number], *values) + "\n"


def entry(letter, permissions, *identity):
    """The line of verbose mode; `identity` is nothing, (identity) or (mechanism, identity)."""
    return formatted(TEXTS[87 - len(identity)], "", letter, *identity, permissions)


def run(arguments, cwd, environment=(), child=None, user=None):
    """Gives the status and what was printed; `child` is called just before."""
    rights = {"user": user, "group": user, "extra_groups": []} if user else {}
    kept = {name: value for name, value in os.environ.items() if name.endswith("SAN_OPTIONS")}
    done = subprocess.run([COMMAND] + [text.encode("latin-1") for text in arguments], cwd=cwd, preexec_fn=child,
                          env={**kept, "LC_ALL": "C", **dict(environment)}, stdin=subprocess.DEVNULL,
                          capture_output=True, check=False, timeout=300, **rights)  # in case that it hangs
    printed = b"on standard output: " + done.stdout if done.stdout else done.stderr
    return done.returncode, printed.decode("latin-1")


ENTRIES, INHERITED = "system.posix_acl_access", "system.posix_acl_default"
WRITER = NOBODY - 2  # a user whom an entry lets write


def posix_acl(group):
    """Entries that let the owner and one user write, and the group do what is said."""
    no_id = 0xffffffff
    entries = ((1, 6, no_id), (2, 6, WRITER), (4, group, no_id), (0x10, 6, no_id), (0x20, 4, no_id))
    return struct.pack("<I", 2) + b"".join(struct.pack("<HHI", *entry) for entry in entries)


def entries_of(path):
    try:
        return os.getxattr(path, ENTRIES)
    except OSError as error:
        return os.strerror(error.errno)


def may_write(path, user, group):
    done = subprocess.run(["test", "-w", path], user=user, group=group, extra_groups=[], check=False)
    return done.returncode == 0


def snapshot(directory):
    """What tells of changes to anything in a directory, by name."""
    return {item.name: (info.st_mode, info.st_uid, info.st_gid, info.st_ino, info.st_size, info.st_mtime_ns)
            for item in os.scandir(directory) for info in [item.stat(follow_symlinks=False)]}


class CommandCase(unittest.TestCase):
    """A test with directories of its own; in expected texts "{dir}" stands for the one in use."""
    maxDiff = None

    def setUp(self):
        self.root = os.path.realpath(tempfile.mkdtemp())
        self.addCleanup(shutil.rmtree, self.root)
        os.chmod(self.root, 0o755)
        self.fresh()

    def fresh(self):
        self.dir = tempfile.mkdtemp(dir=self.root)
        os.chmod(self.dir, 0o755)

    def write(self, name, text, mode=0o644, owner=None):
        path = os.path.join(self.dir, name)
        pathlib.Path(path).write_bytes(text if isinstance(text, bytes) else text.encode("latin-1"))
        if owner is not None:
            os.chown(path, owner, owner)
        os.chmod(path, mode)
        return path

    def locale(self, name):
        """The environment for a locale, which is made here."""
        language, code_set = name.split(".")
        if not os.path.exists("/usr/share/i18n/locales/" + language):
            self.skipTest(f"the locale {language} is not there")
        subprocess.run(["localedef", "-i", language, "-f", code_set, f"{self.root}/{name}"], check=True)
        return {"LC_ALL": name, "LOCPATH": self.root}

    def expect(self, arguments, status, errors, makes=(), **how):
        """Compares status and text, and that only the files of `makes`, (name, bytes), changed."""
        before = snapshot(self.dir)
        got = run([text.replace("{dir}", self.dir) for text in arguments], self.dir, **how)
        self.assertEqual(got, (status, errors.replace("{dir}", self.dir)))
        after = snapshot(self.dir)
        for name, content in makes:
            self.assertNotEqual(after.pop(name), before.pop(name, None))
            self.assertEqual(pathlib.Path(self.dir, name).read_bytes(), content)
        self.assertEqual(after, before)


USAGE = message(80)
LINE_OF_A = entry("n", "r")
# The C library musl says it in other words, and knows no locales but "C" and such in UTF-8.
IS_MUSL = b"/ld-musl-" in pathlib.Path(COMMAND).read_bytes()
UNKNOWN_X = f"{COMMAND}: " + ("unrecognized option: x\n" if IS_MUSL else "invalid option -- 'x'\n")
LACKS_ARGUMENT = f"{COMMAND}: option requires an argument" + (": %s\n" if IS_MUSL else " -- '%s'\n")
OPTIONS = [  # arguments, status, standard error; the file "a" holds the line "n r"
    ("-c -s -v -t p", 4, message(148) + USAGE),
    ("-c -s -S -v -t p -u q -f a -h", 0, message(81)),
    *[(f"-{letter}", 4, LACKS_ARGUMENT % letter + message(147) + USAGE) for letter in "ftu"],
    ("-x -h", 0, UNKNOWN_X + message(147)), ("-h -x", 4, UNKNOWN_X + message(147) + USAGE),
    *[(f"-{letter} -f a -{letter}", 4, message(146, f"-{letter}") + USAGE) for letter in "chsSv"],
    *[(f"-{letter} p -{letter} q", 4, message(146, f"-{letter}") + USAGE) for letter in "ftu"],
    ("-cvfa operand -- -x", 0, LINE_OF_A),
    ("operand - -cvfa", 0, LINE_OF_A),
    ("-S -t p -f a", 0, ""), ("-t p -S -v -f a", 0, message(149) * 2 + LINE_OF_A),
    ("-u no.such.user -f a", 15, message(127, "no.such.user")),
    ("-f missing%n%1$s\xff", 105, message(154, "{dir}/missing%n%1$s\xff", errno.ENOENT)),
]

CODES = {131: 42, 145: 37, 158: 42, 159: 42, 160: 43, 165: 42, 166: 36}
LINES = [  # file text, in order what it gives (an entry's line, or a failure's message), the cache of a clean text
    ("", [(157, "{dir}/a")]),
    ("# nobody\n\n \t\v\n  # x y z\n", [], bytes.fromhex("8501020000")),
    ("u abcd xyz wr\n", [("u", "rw", "abcd", "xyz")],
     bytes.fromhex("8501020100 1a000000 04 01000000 05 6162636400 01 03000000 0400 78797a00")),
    ("o\nN oasvdelqCxcwr #c\r\nu k Zed x\ng aB q\nE k b r\nu K amy\nG a_ l",
     [("o", ""), ("n", "rwcxCqledvsao"), ("u", "x", "k", "Zed"), ("g", "q", "aB"), ("e", "r", "k", "b"),
      ("u", "", "k", "amy"), ("g", "l", "a_")],
     bytes.fromhex("8501020500 15000000 08 01000000 02 6b00 01 01000000 0200 6200"
                   "1e000000 10 02000000 00 01 40000000 0300 615f00 01 20000000 0300 614200"
                   "22000000 04 02000000 02 6b00 01 00000000 0400 616d7900 01 08000000 0400 5a656400"
                   "11000000 01 01000000 00 01 ff1f0000 0000 11000000 02 01000000 00 01 00000000 0000")),
    ("n r\n%s%n r\r\n# c\n\xee\nu\ng staff r extra\no w\0\nx\n",
     [("n", "r"), (165, 2, "%s%n"), (165, 5, "\xee"), (158, 6), (159, 7), (131, 8)]),
    ("o r\no r\nn rz x\nx\n", [("o", "r"), ("o", "r"), (160, "o"), (166, 3, "rz"), (165, 4, "x")]),
    ("n #" + "c" * 1092 + "\no #" + "c" * 1093 + "\ng a", [("n", ""), (145, 2), ("g", "", "a")]),
]
A_TEXT, _, A_CACHE = LINES[2]


class Command(CommandCase):
    def test_options(self):
        self.write("a", "n r\n")
        for arguments, status, errors in OPTIONS:
            for strict in ({}, {"POSIXLY_CORRECT": "1"}):  # when the C library looks for no options behind operands
                with self.subTest(arguments, **strict):
                    self.expect(arguments.split(" "), status, errors, environment=strict)

    def test_lines(self):
        """The facts of a text give what is printed with each of the eight choices of options."""
        for (text, facts, *cache), number in itertools.product(LINES, range(8)):
            options = [option for bit, option in enumerate(("-c", "-v", "-s")) if number >> bit & 1]
            codes = [CODES.get(fact[0], 0) for fact in facts]
            failure = next(filter(None, codes), 0)
            told = facts if "-c" in options or not failure else facts[:codes.index(failure) + 1]
            errors = [message(*fact) if fact[0] in TEXTS else entry(*fact) for fact in told
                      if fact[0] in CODES or "-v" in options]
            if "-s" in options and failure:
                errors.append(message(162))
            with self.subTest(text[:60], options=options):
                self.fresh()
                self.write("a", text)
                self.expect([*options, "-f", "a"], 0 if "-c" in options else failure, "".join(errors),
                            [("a.cacl", content) for content in cache if "-s" in options])

    def test_locales(self):
        """They say in which code set identities are shown and what ends a word, and nothing about letters."""
        self.write("a", "u m \xc3\xa9 r\ng \xff\nn r\n")
        for locale, shown in (("C", TEXTS[130]), ("C.UTF-8", entry("u", "r", "m", "\xc3\xa9"))):
            self.expect(["-v", "-f", "a"], 0, shown + TEXTS[130] + LINE_OF_A, environment={"LC_ALL": locale})
        text = "u UNIX I@Host r\nu unix i@hoSt w\nu kI \u0130 r\nu k\xa0i x\xa0 r\ng \xc7 r\ng \xe7 w\n"
        self.write("a", text.encode("utf-8"))
        told = run(["-c", "-f", "a"], self.dir)
        self.assertEqual(told[1].count("3417-157"), 1)  # the user, and neither of the groups
        for environment in self.locale("tr_TR.ISO-8859-9"), self.locale("tr_TR.UTF-8"), {"LC_ALL": "not.known"}:
            self.assertEqual(run(["-c", "-f", "a"], self.dir, environment), told)
        if IS_MUSL:
            return
        # More bytes than usual are white space: they end a token, but do not stand between two.
        rules = pathlib.Path("/usr/share/i18n/locales/i18n_ctype").read_text("utf-8")
        rules = rules.replace("\nspace /", "\nspace /\n<U00A0>;/")
        pathlib.Path(self.root, "blanks").write_text(rules, "utf-8")
        subprocess.run(["localedef", "-ci", "blanks", "-f", "ISO-8859-1", "./x"], cwd=self.root, capture_output=True)
        self.write("a", "g a\xa0r\no \xa0r\n")
        self.expect(["-cv", "-f", "a"], 0, entry("g", "r", "a") + message(159, 2),
                    environment={"LC_ALL": "", "LC_CTYPE": "x", "LOCPATH": self.root})

    def test_entries_are_gathered_into_one_write(self):
        self.write("a", "n\no\ng a\n")
        reader, writer = socket.socketpair(type=socket.SOCK_SEQPACKET)  # which keeps writes apart
        with reader, writer:
            self.expect(["-v", "-f", "a"], 0, "", child=lambda: os.dup2(writer.fileno(), 2))
            self.assertEqual(reader.recv(1 << 20).decode(), entry("n", "") + entry("o", "") + entry("g", "", "a"))

    @unittest.skipUnless(os.path.exists("/proc/self/io"), "the system does not count writes")
    def test_failures_are_flushed_one_by_one_on_a_terminal_only(self):
        self.write("a", "x\nn r\ny\no w\n")
        terminal, writer = os.openpty()
        self.addCleanup(os.close, terminal)
        with open(writer, "wb") as shown, open(os.path.join(self.root, "log"), "wb") as log:
            for stream, options, writes in ((shown, "-c", 2), (shown, "-cv", 3), (log, "-cvs", 2)):
                with self.subTest(stream=stream.name, options=options):
                    command = [COMMAND, options, "-f", "a"]
                    with subprocess.Popen(command, cwd=self.dir, stderr=stream, env={"LC_ALL": "C"}) as child:
                        os.waitid(os.P_PID, child.pid, os.WEXITED | os.WNOWAIT)
                        counts = pathlib.Path(f"/proc/{child.pid}/io").read_text("ascii")
                    self.assertIn(f"\nsyscw: {writes}\n", counts)
        told = [message(165, 1, "x"), entry("n", "r"), message(165, 3, "y"), entry("o", "w"), message(162)]
        self.assertEqual(pathlib.Path(log.name).read_text("latin-1"), "".join(told))

    def test_a_signal_loses_nothing_that_was_gathered(self):
        """It ends the command behind a line, with everything up to there in the pipe; ignored, it ends nothing."""
        count = 5000
        self.write("a", "x\n" * count)
        told = "".join(message(165, number, "x") for number in range(1, count + 1))
        for number in (signal.SIGHUP, signal.SIGINT, signal.SIGQUIT, signal.SIGTERM):
            for action, status in ((signal.SIG_DFL, -number), (signal.SIG_IGN, 0)):
                command, child = [COMMAND, "-c", "-f", "a"], lambda: signal.signal(number, action)
                with self.subTest(number, action=action), subprocess.Popen(
                        command, cwd=self.dir, stderr=subprocess.PIPE, env={"LC_ALL": "C"}, preexec_fn=child) as done:
                    first = done.stderr.read(1)  # more than the pipe takes is left
                    done.send_signal(number)
                    printed = (first + done.stderr.read()).decode("latin-1")
                    self.assertEqual(done.wait(), status)
                    self.assertTrue(told.startswith(printed) and printed.endswith("\n\n"))
                    self.assertEqual(len(printed) == len(told), action == signal.SIG_IGN)

    def test_a_second_signal_ends_what_nobody_reads(self):
        self.write("a", "x\n" * 5000)
        with subprocess.Popen([COMMAND, "-c", "-f", "a"], cwd=self.dir, stderr=subprocess.PIPE) as child:
            child.stderr.read(1)
            while child.poll() is None:
                child.terminate()
                time.sleep(0.01)
            self.assertEqual(child.returncode, -signal.SIGTERM)

    @unittest.skipIf(SANITIZED, "the sanitizers need much memory")
    def test_little_memory(self):
        """However little there is, the check succeeds or says that it was too little."""
        names = [f"{number:05}" for number in range(50000)]
        shuffled = names[:20000] + random.Random(1).sample(names[20000:], 30000)
        self.write("a", "".join(f"u m {name} r\ne m {name}\n" for name in shuffled))
        mark = b"\2" if sys.byteorder == "little" else b"\1"
        cache = b"\x85\1" + mark + struct.pack("=H", 2) + b"".join(
            struct.pack("=IBIB", 12 + 50000 * 13, kind, 50000, 2) + b"m\0" + b"".join(
                struct.pack("=BIH", 1, mask, 6) + name.encode() + b"\0" for name in order)
            for kind, mask, order in ((8, 0, shuffled), (4, 1, names)))
        found = []
        for megabytes in range(4, 64, 2):
            limits = ((resource.RLIMIT_STACK, 256 << 10), (resource.RLIMIT_AS, megabytes << 20))
            code, errors = run(["-cs", "-f", "a"], self.dir, child=lambda: [
                resource.setrlimit(kind, (limit, limit)) for kind, limit in limits])
            if code >= 0 and "error while loading" not in errors:
                found.append((code, errors[:8]))
            self.assertEqual(os.path.exists(self.dir + "/a.cacl"), code == 0)
        self.assertEqual((found[0], found[-1], len(set(found))), ((6, "3417-102"), (0, ""), 2))
        self.assertTrue(pathlib.Path(self.dir, "a.cacl").read_bytes() == cache)

    def test_what_stands_in_the_way(self):
        for does, *told in [  # what its owner does before, and what "-s" then says to the owner
                ("rm a; mkdir a", 154, "{dir}/a", 0), ("rm a; mkfifo a", 154, "{dir}/a", 0),
                ("ln -sf /dev/zero a", 154, "{dir}/a", 0), ("chmod 200 a", 156, "{dir}/a", errno.EACCES),
                ("mkdir -m 644 a.cacl", 137, "{dir}/a"), ("mkfifo -m 644 a.cacl", 137, "{dir}/a"),
                ("ln -s nowhere a.cacl", 138, "{dir}/a.cacl"), ("chmod 444 a; cp -p a a.cacl", 138, "{dir}/a.cacl"),
                *[("ln -sf of_root a", 141, "{dir}/a.cacl", "0", 0)] * IS_ROOT]:
            with self.subTest(does):
                self.fresh()
                os.chmod(self.dir, 0o777)
                self.write("of_root", A_TEXT)
                self.write("a", A_TEXT, owner=ORDINARY)
                subprocess.run(does, shell=True, cwd=self.dir, user=ORDINARY, group=ORDINARY, check=True)
                self.expect(["-s", "-f", "a"], 105 if told[0] == 154 else 37, message(*told), user=ORDINARY)

    def test_cache_is_protected_like_the_file(self):
        for mode in (0o640, 0o400, 0o1666, 0o2755, 0o4711):
            self.fresh()
            self.write("a", A_TEXT, mode, ORDINARY)
            self.expect(["-s", "-f", "a"], 0, "", [("a.cacl", A_CACHE)], child=lambda: os.umask(0o077))
            self.assertEqual(*[(info.st_uid, info.st_gid, info.st_mode) for info in map(os.stat, os.scandir(self.dir))])

    def test_cache_has_the_entries_of_the_file_and_no_others(self):
        """Nobody can write the cache who cannot write the file, whatever new files in the folder inherit."""
        for entries, inherited in itertools.product((None, posix_acl(group=4)), (None, posix_acl(group=6))):
            with self.subTest(entries=entries, inherited=inherited):
                self.fresh()
                path = self.write("a", A_TEXT, owner=ORDINARY)
                try:
                    if entries:
                        os.setxattr(path, ENTRIES, entries)
                    if inherited:
                        os.setxattr(self.dir, INHERITED, inherited)
                except OSError:
                    self.skipTest("the file system has no POSIX ACLs")
                self.expect(["-s", "-f", "a"], 0, "", [("a.cacl", A_CACHE)])
                self.assertEqual(entries_of(path + ".cacl"), entries_of(path))
                self.assertEqual(os.stat(path + ".cacl").st_mode, os.stat(path).st_mode)
                if IS_ROOT:
                    self.assertFalse(may_write(path + ".cacl", NOBODY, ORDINARY))
                    self.assertEqual(may_write(path + ".cacl", WRITER, WRITER), entries is not None)

    def test_cache_with_other_entries_is_not_replaced(self):
        path = self.write("a", A_TEXT, 0o664)
        self.write("a.cacl", "old", 0o664)
        try:
            os.setxattr(path, ENTRIES, posix_acl(group=4))
        except OSError:
            self.skipTest("the file system has no POSIX ACLs")
        self.expect(["-s", "-f", "a"], 37, message(137, "{dir}/a"))
        os.setxattr(path + ".cacl", ENTRIES, posix_acl(group=6))
        self.expect(["-s", "-f", "a"], 37, message(137, "{dir}/a"))
        os.setxattr(path + ".cacl", ENTRIES, posix_acl(group=4))
        self.expect(["-s", "-f", "a"], 0, "", [("a.cacl", A_CACHE)])

    def test_full_disk(self):
        self.write("a", A_TEXT)
        for _ in range(2):  # without a cache, and with one, which stays
            for room, count, error, action in ((7, 7, 0, signal.SIG_IGN), (0, -1, errno.EFBIG, signal.SIG_DFL)):
                self.expect(["-s", "-f", "a"], 37, message(139, count, len(A_CACHE), error), child=lambda: (
                    signal.signal(signal.SIGXFSZ, action), resource.setrlimit(resource.RLIMIT_FSIZE, (room, room))))
            self.write("a.cacl", "old")

    def test_closed_standard_descriptors(self):
        self.write("a", "x\n" + A_TEXT)
        self.write("b", A_TEXT)
        for closed in ((0,), (1,), (2,), (0, 1), (0, 2), (1, 2), (0, 1, 2)):
            for name, option, errors, makes in (("a", "-c", message(165, 1, "x") + message(162), []),
                                                ("b", "-v", entry("u", "rw", "abcd", "xyz"), [("b.cacl", A_CACHE)])):
                self.expect([option, "-s", "-f", name], 0, "" if 2 in closed else errors, makes,
                            child=lambda: list(map(os.close, closed)))

    def test_long_paths(self):
        folder = os.path.join(self.dir, *["d" * 200] * 19)
        os.makedirs(folder)
        for length in (4089, 4090):
            path = (folder + "/").ljust(length, "f")
            pathlib.Path(path).write_text(A_TEXT, "ascii")
            self.expect(["-s", "-f", path], *((37, message(135, path)) if length > 4089 else (0, "")))
            self.assertEqual(os.path.exists(path + ".cacl"), length == 4089)

    def test_home_directory(self):
        user, home = pwd.getpwuid(os.geteuid())[0:6:5]
        if not os.access(home, os.W_OK):
            self.skipTest("no home directory to write to")
        with tempfile.NamedTemporaryFile(dir=home) as file:
            pathlib.Path(file.name).write_text("n r\n", "ascii")
            refused = (36, message(155, file.name, user))
            for mode, owner, *told in [(0o755, -1, 0, LINE_OF_A), (0o620, -1, *refused), (0o602, -1, *refused),
                                       *[(0o600, NOBODY, *refused)] * IS_ROOT]:
                os.chmod(file.name, mode)
                os.chown(file.name, owner, -1)
                self.expect(["-sv", "-u", user, "-f", os.path.basename(file.name)], told[0], message(150) + told[1])
            self.assertFalse(os.path.exists(file.name + ".cacl"))


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
