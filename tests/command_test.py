"""Runs the checker as an administrator does and compares what it prints, answers and leaves behind, to the byte.

Usage: command_test.py BUILD_DIR [unittest arguments]. The helpers serve the other script tests as well.
"""
import errno
import itertools
import os
import pathlib
import pwd
import re
import resource
import shutil
import signal
import socket
import stat
import struct
import subprocess
import sys
import tempfile
import time
import unittest

BUILD = pathlib.Path(sys.argv[1]).resolve()
SANITIZED = "QZ_SANITIZE:STRING=\n" not in (BUILD / "CMakeCache.txt").read_text()
IS_ROOT, NOBODY = os.geteuid() == 0, 65534
# A copy of the command and its libraries that any user can reach, wherever the build folder lies.
PLACE = tempfile.TemporaryDirectory()
os.chmod(PLACE.name, 0o755)
for part in ("bin", "lib"):
    shutil.copytree(BUILD / part, f"{PLACE.name}/{part}", symlinks=True)
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


def compiled(*subacls):
    """The bytes of a compiled ACL, from (type, mechanism or None, [(identity or None, mask), ...])."""
    def field(text):
        return b"" if text is None else text.encode("latin-1") + b"\0"
    out = struct.pack("<BBBH", 0x85, 1, 2, len(subacls))
    for kind, mechanism, entries in subacls:
        body = field(mechanism)
        for identity, mask in entries:
            body += struct.pack("<BIH", 1, mask, len(field(identity))) + field(identity)
        out += struct.pack("<IBIB", 10 + len(body), kind, len(entries), len(field(mechanism))) + body
    return out


def run(arguments, cwd, environment=(), ordinary=False, child=None, user=NOBODY):
    """Gives the status and what was printed; `ordinary` is without root's rights, `child` is called just before."""
    ordinary = ordinary or user != NOBODY
    rights = {"user": user, "group": user, "extra_groups": []} if ordinary and IS_ROOT else {}
    kept = {name: value for name, value in os.environ.items() if name.endswith("SAN_OPTIONS")}
    done = subprocess.run([COMMAND] + [text.encode("latin-1") for text in arguments], cwd=cwd, preexec_fn=child,
                          env={**kept, "LC_ALL": "C", **dict(environment)}, stdin=subprocess.DEVNULL,
                          capture_output=True, check=False, timeout=300, **rights)  # in case that it hangs
    if done.stdout:
        raise AssertionError(f"{arguments} printed on standard output: {done.stdout!r}")
    return done.returncode, done.stderr.decode("latin-1")


def snapshot(directory):
    """All that could be changed or left over in a directory, by name."""
    found = {}
    for item in os.scandir(directory):
        info = item.stat(follow_symlinks=False)
        content = pathlib.Path(item).read_bytes() if stat.S_ISREG(info.st_mode) and IS_ROOT else None
        found[item.name] = (info.st_mode, info.st_uid, info.st_gid, info.st_ino, info.st_mtime_ns, content)
    return found


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
        pathlib.Path(path).unlink(missing_ok=True)  # it may be one that its owner cannot write to
        pathlib.Path(path).write_bytes(text if isinstance(text, bytes) else text.encode("latin-1"))
        if owner is not None:
            os.chown(path, owner, owner)
        os.chmod(path, mode)
        return path

    def expect(self, arguments, status, errors, makes=(), **how):
        """Compares status and text, and that only the files of `makes`, (name, bytes or None for any), changed."""
        before = snapshot(self.dir)
        got = run([text.replace("{dir}", self.dir) for text in arguments], self.dir, **how)
        self.assertEqual(got, (status, errors.replace("{dir}", self.dir)))
        after = snapshot(self.dir)
        for name, content in makes:
            self.assertNotEqual(after.pop(name), before.pop(name, None))
            self.assertIn(content, (None, pathlib.Path(self.dir, name).read_bytes()))
        self.assertEqual(after, before)


USAGE = message(80)
LINE_OF_A = entry("n", "r")
UNKNOWN_X = f"{COMMAND}: invalid option -- 'x'\n"
OPTIONS = [  # arguments, status, standard error; the file "a" holds the line "n r"
    ("-c -s -v -t p", 4, message(148) + USAGE),
    ("-c -s -S -v -t p -u q -f a -h", 0, message(81)),
    *[(f"-{letter}", 4, f"{COMMAND}: option requires an argument -- '{letter}'\n" + message(147) + USAGE)
      for letter in "ftu"],
    ("-x -h", 0, UNKNOWN_X + message(147)),
    ("-h -x", 4, UNKNOWN_X + message(147) + USAGE),
    ("-x -h -c -c", 4, UNKNOWN_X + message(146, "-c") + USAGE),
    *[(f"-{letter} -f a -{letter}", 4, message(146, f"-{letter}") + USAGE) for letter in "chsSv"],
    *[(f"-{letter} p -{letter} q", 4, message(146, f"-{letter}") + USAGE) for letter in "ftu"],
    ("-cvfa operand -- -x", 0, LINE_OF_A),
    ("-S -t p -f a", 0, ""),
    ("-t p -v -f a", 0, message(149) + LINE_OF_A),
    ("-t p -S -v -f a", 0, message(149) * 2 + LINE_OF_A),
    ("-s -u no.such.user -f a", 15, message(150) + message(127, "no.such.user")),
    ("-f missing%n%1$s\xff", 105, message(154, "{dir}/missing%n%1$s\xff", errno.ENOENT)),
]

CODES = {131: 42, 132: 42, 144: 43, 145: 37, 158: 42, 159: 42, 160: 43, 161: 43, 165: 42, 166: 36}
M16 = "m" * 16
LINES = [  # file text, in order what it gives (an entry's line, or a failure's message), the cache of a clean text
    ("# nobody\n\n \t\v\n  # x y z\n", [], bytes.fromhex("8501020000")),
    ("\0", [], bytes.fromhex("8501020000")),
    ("u abcd xyz wr\n", [("u", "rw", "abcd", "xyz")],
     bytes.fromhex("8501020100 1a000000 04 01000000 05 6162636400 01 03000000 0400 78797a00")),
    ("\vo\tc\r\n", [("o", "c")], bytes.fromhex("8501020100 11000000 02 01000000 00 01 04000000 0000")),
    ("N oasvdelqCxcwr #c", [("n", "rwcxCqledvsao")], compiled((1, None, [(None, 0x1fff)]))),
    ("o r\nu k Zed x\ng aB q\nn w\ne k b r\nu m c r\nu K amy\nG a_ l\ne m d\nu m A o\nE k a e\n",
     [("o", "r"), ("u", "x", "k", "Zed"), ("g", "q", "aB"), ("n", "w"), ("e", "r", "k", "b"), ("u", "r", "m", "c"),
      ("u", "", "k", "amy"), ("g", "l", "a_"), ("e", "", "m", "d"), ("u", "o", "m", "A"), ("e", "e", "k", "a")],
     compiled((8, "m", [("d", 0)]), (4, "m", [("A", 0x1000), ("c", 1)]), (8, "k", [("b", 1), ("a", 0x80)]),
              (1, None, [(None, 2)]), (16, None, [("a_", 0x40), ("aB", 0x20)]),
              (4, "k", [("amy", 0), ("Zed", 8)]), (2, None, [(None, 1)]))),
    ("n r\n%s%n r\r\n# c\n\xee\nu\ng staff r extra\no w\0\nx\n",
     [("n", "r"), (165, 2, "%s%n"), (165, 5, "\xee"), (158, 6), (159, 7), (131, 8)]),
    (f"u {M16}M b\nu {M16} b r\no r#c\n", [(132, M16 + "M", 1), ("u", "r", M16, "b"), (166, 3, "r#c")]),
    ("n rz x\no r\no r\nx\n", [(166, 1, "rz"), ("o", "r"), ("o", "r"), (160, "o"), (165, 4, "x")]),
    ("n #" + "c" * 1092 + "\no #" + "c" * 1093 + "\ng a", [("n", ""), (145, 2), ("g", "", "a")]),
    ("n r\nN w\ne unix alice\nu unix alice\nu krb5 alice\nU UNIX ALICE w\nE unix Alice\n"
     "g Staff r\ng sTAFF r\ng staffs\n",
     [("n", "r"), ("n", "w"), (160, "n"), ("e", "", "unix", "alice"), ("u", "", "unix", "alice"),
      ("u", "", "krb5", "alice"), ("u", "w", "unix", "ALICE"), (144, "u", "unix", "ALICE"), ("e", "", "unix", "Alice"),
      (144, "e", "unix", "Alice"), ("g", "r", "Staff"), ("g", "r", "sTAFF"), (161, "g", "sTAFF"), ("g", "", "staffs")]),
]
A_TEXT, _, A_CACHE = LINES[2]
MADE = [("a.cacl", A_CACHE)]


class Command(CommandCase):
    def test_options(self):
        self.write("a", "n r\n")
        for arguments, status, errors in OPTIONS:
            with self.subTest(arguments):
                self.expect(arguments.split(" "), status, errors)

    def test_lines(self):
        """The facts of a text give what is printed with each of the eight choices of options."""
        for (text, facts, *cache), number in itertools.product([*LINES, ("", [(157, "{dir}/a")])], range(8)):
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
                            [("a.cacl", *(cache or [None]))] if "-s" in options and text and not failure else [])

    def test_identities_are_shown_in_the_code_set_of_the_locale(self):
        self.write("a", "u m \xc3\xa9 r\ng \xff\nn r\n")
        for locale, shown in (("C", TEXTS[130]), ("C.UTF-8", entry("u", "r", "m", "\xc3\xa9"))):
            self.expect(["-v", "-f", "a"], 0, shown + TEXTS[130] + LINE_OF_A, environment={"LC_ALL": locale})

    def test_many_sorted_entries_on_a_small_stack(self):
        names = [f"user{number:06}" for number in range(100000)]
        path = self.write("a", "".join(f"u m {name} r\ne m {name}\n" for name in names))
        os.utime(path, (0, 10**9))
        started = time.time_ns() - 10**8  # because the clock of the stamp ticks coarsely
        cache = compiled((8, "m", [(name, 0) for name in names]), (4, "m", [(name, 1) for name in names]))
        status = run(["-s", "-f", "a"], self.dir,
                     child=lambda: resource.setrlimit(resource.RLIMIT_STACK, (256 << 10, 256 << 10)))
        read = os.stat(path).st_atime_ns
        self.assertTrue(status == (0, "") and pathlib.Path(path + ".cacl").read_bytes() == cache, status)
        # The cache is as old as the text that it was made from, so that a later edit finds it stale.
        stamp = os.stat(path + ".cacl").st_mtime_ns
        self.assertTrue(started <= stamp and (stamp <= read or read == 0))  # 0: when a file was read is not noted

    def test_locales_and_users_that_nobody_knows(self):
        """Letters and white space mean the same under any rules; neither a locale nor a user need be known."""
        text = "u UNIX I@Host r\nu unix i@hoSt w\nu kI \u0130 r\nu k\xa0i x\xa0 r\ng \xc7 r\ng \xe7 w\n"
        cache = compiled((8, "m", [("i", 1)]))
        self.write("a", "e m i r\n", owner=NOBODY - 1 if IS_ROOT else None)
        self.write("b", text.encode("utf-8"))
        os.chmod(self.dir, 0o777)
        told = run(["-c", "-f", "b"], self.dir)
        self.assertEqual(told[1].count("3417-157"), 1)  # the user, and neither of the groups
        for name, charset in (("tr_TR", "ISO-8859-9"), ("tr_TR", "UTF-8"), ("ru_RU", "KOI8-R"), (None, None), ("xx", "x")):
            locale = f"{name}.{charset}"
            made = name is None or not os.path.exists("/usr/share/i18n/locales/" + name) or subprocess.run(
                ["localedef", "-i", name, "-f", charset, f"{self.root}/{locale}"], check=True, capture_output=True)
            environment = {"LOCPATH": self.root, "LC_ALL": locale if name else ""}
            with self.subTest(environment, made=bool(made)):
                self.assertEqual(run(["-c", "-f", "b"], self.dir, environment), told)
                self.expect(["-s", "-f", "a"], 0, "", [("a.cacl", cache)], environment=environment, user=NOBODY - 1)

    @unittest.skipIf(SANITIZED, "the sanitizers need much address space")
    def test_little_address_space(self):
        self.write("a", "".join(f"u m user{number} r\n" for number in range(100000)))
        codes = []
        for megabytes in range(4, 44, 2):
            limits = (megabytes << 20, megabytes << 20)
            code, errors = run(["-s", "-f", "a"], self.dir, child=lambda: resource.setrlimit(resource.RLIMIT_AS, limits))
            started = "error while loading" not in errors and code >= 0
            self.assertTrue(not started or (code, errors[:8]) in ((0, ""), (6, "3417-102")), (megabytes, code, errors))
            codes += [code] if started else []
            self.assertEqual(os.path.exists(self.dir + "/a.cacl"), code == 0)
        self.assertEqual((codes[0], codes[-1]), (6, 0))

    def test_hostile_names(self):
        pipe, folder = stat.S_IFIFO | 0o644, stat.S_IFDIR | 0o644
        rows = [  # what stands under a name, by its mode, where it leads, or its owner and group; what "-s" then says
            ("a", folder, 154, "{dir}/a", 0), ("a", pipe, 154, "{dir}/a", 0), ("a", "/dev/zero", 154, "{dir}/a", 0),
            ("a", "nowhere", 154, "{dir}/a", errno.ENOENT), ("a", "a", 154, "{dir}/a", errno.ELOOP),
            ("a.cacl", "nowhere", 138, "{dir}/a.cacl"), ("a.cacl", "a.cacl", 122, "{dir}/a", errno.ELOOP),
            ("a.cacl", folder, 137, "{dir}/a"), ("a.cacl", pipe, 137, "{dir}/a"), ("a.cacl", 0o600, 137, "{dir}/a"),
            *[("a.cacl", owners, 136, "{dir}/a") for owners in ((NOBODY, -1), (-1, NOBODY)) if IS_ROOT],
        ]
        for name, what, *told in rows:
            with self.subTest(f"{name}: {what}"):
                self.fresh()
                if name != "a":
                    self.write("a", A_TEXT)
                path = f"{self.dir}/{name}"
                if isinstance(what, str):
                    os.symlink(what, path)
                elif isinstance(what, tuple):
                    os.chown(self.write(name, ""), *what)
                else:
                    os.mkdir(path, 0o644) if what == folder else os.mknod(path, what)
                self.expect(["-s", "-f", "a"], 105 if name == "a" else 37, message(*told))

    def test_cache_is_protected_like_the_file(self):
        for mode in (0o640, 0o400, 0o1666, 0o2755, 0o4711):
            self.fresh()
            self.write("a", A_TEXT, mode, NOBODY if IS_ROOT else None)
            self.expect(["-s", "-f", "a"], 0, "", MADE, child=lambda: os.umask(0o077))
            self.assertEqual(*[(info.st_uid, info.st_gid, info.st_mode) for info in map(os.stat, os.scandir(self.dir))])

    def test_full_disk(self):
        for room, count, error, action in ((7, 7, 0, signal.SIG_IGN), (0, -1, errno.EFBIG, signal.SIG_DFL)):
            self.fresh()
            self.write("a", A_TEXT)
            for _ in range(2):  # without a cache, and with one, which stays
                self.expect(["-s", "-f", "a"], 37, message(139, count, len(A_CACHE), error), child=lambda: (
                    signal.signal(signal.SIGXFSZ, action), resource.setrlimit(resource.RLIMIT_FSIZE, (room, room))))
                self.write("a.cacl", "old")

    def test_closed_standard_descriptors(self):
        self.write("a", "x\n" + A_TEXT)
        self.write("b", A_TEXT)
        for closed in ((1,), (2,), (0, 2), (1, 2), (0, 1, 2)):
            for name, option, errors, makes in (("a", "-c", message(165, 1, "x") + message(162), []),
                                                ("b", "-v", entry("u", "rw", "abcd", "xyz"), [("b.cacl", A_CACHE)])):
                self.expect([option, "-s", "-f", name], 0, "" if 2 in closed else errors, makes,
                            child=lambda: list(map(os.close, closed)))

    def test_long_paths(self):
        folder = self.dir
        while len(folder) < 4050:
            folder += "/" + "d" * min(200, 4067 - len(folder))
        os.makedirs(folder)
        for length in (4089, 4090, 4095):
            path = (folder + "/").ljust(length, "f")
            pathlib.Path(path).write_text(A_TEXT, "ascii")
            self.expect(["-s", "-f", path], *((37, message(135, path)) if length > 4089 else (0, "")))
        self.assertEqual([name for name in os.listdir(folder) if "f." in name], ["f" * (4088 - len(folder)) + ".cacl"])

    def test_ordinary_user(self):
        """What rights refuse: reading, writing to a cache that is there, and making the cache's names."""
        if IS_ROOT:
            os.chown(self.dir, NOBODY, NOBODY)
        rows = [("a", 0o200, 156, "{dir}/a", errno.EACCES), ("c", 0o644, 138, "{dir}/c.cacl"), ("b", 0o444),
                ("b", 0o444, 138, "{dir}/b.cacl"), ("r", 0o644, 141, "{dir}/r.cacl", "0", 0)]  # r is the file of root
        for name, mode, *told in rows if IS_ROOT else rows[:-1]:
            os.chmod(self.dir, 0o755)
            self.write(name, A_TEXT, mode, NOBODY if IS_ROOT and name != "r" else None)
            os.chmod(self.dir, 0o555 if name == "c" else 0o755)
            self.expect(["-s", "-f", name], 37 if told else 0, message(*told) if told else "",
                        [] if told else [("b.cacl", A_CACHE)], ordinary=True)

    def test_home_directory(self):
        user, home = pwd.getpwuid(os.geteuid())[0:6:5]
        if not os.access(home, os.W_OK):
            self.skipTest("no home directory to write to")
        with tempfile.NamedTemporaryFile(dir=home) as file:
            pathlib.Path(file.name).write_text("n r\n", "ascii")
            refused = (36, message(155, file.name, user))
            for mode, owner, status, errors in [(0o755, -1, 0, LINE_OF_A), (0o620, -1, *refused), (0o602, -1, *refused),
                                                (0o600, NOBODY, *refused)][:None if IS_ROOT else 3]:
                os.chmod(file.name, mode)
                os.chown(file.name, owner, -1)
                self.expect(["-sv", "-u", user, "-f", os.path.basename(file.name)], status, message(150) + errors)
            self.assertFalse(os.path.exists(file.name + ".cacl"))

    def test_entries_are_gathered_into_large_writes(self):
        names = [f"user{number}" for number in range(5000)]
        self.write("a", "".join(f"u m {name} r\n" for name in names))
        reader, writer = socket.socketpair(socket.AF_UNIX, socket.SOCK_SEQPACKET)  # which keeps writes apart
        with reader, subprocess.Popen([COMMAND, "-v", "-f", "a"], cwd=self.dir, stderr=writer) as command:
            writer.close()
            sizes = [len(text) for text in iter(lambda: reader.recv(1 << 20), b"")]
        self.assertEqual((command.returncode, sum(sizes)), (0, sum(len(entry("u", "r", "m", name)) for name in names)))
        self.assertLess(len(sizes), 10)


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
