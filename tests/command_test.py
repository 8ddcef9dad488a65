"""Runs the checker as an administrator does and compares what it prints, answers and leaves behind, to the byte.

Usage: command_test.py BUILD_DIR [unittest arguments]. The helpers serve the other script tests as well.
"""
import atexit
import errno
import functools
import os
import pathlib
import pwd
import random
import re
import resource
import shutil
import signal
import stat
import struct
import subprocess
import sys
import tempfile
import time
import unittest

BUILD = pathlib.Path(sys.argv[1]).resolve()
COMMAND = str(BUILD / "bin" / "qzaclfck")
TABLE = pathlib.Path(__file__).resolve().parent.parent / "security" / "msg" / "qzseclib_msg.h"
IS_ROOT = os.geteuid() == 0
NOBODY = 65534
CLOCK_REALTIME_COARSE = 5
GUARD_SECONDS = 300  # only so that a command that hangs ends the test


def read_table():
    """The texts of the message table by id; all text here is Latin-1, so that every byte survives."""
    escapes = {"n": "\n", "t": "\t", '"': '"', "\\": "\\"}
    found = {}
    for number, literals in re.findall(r'\{(\d+),((?:\s*"(?:[^"\\]|\\.)*")+)\}', TABLE.read_text("latin-1")):
        text = "".join(re.findall(r'"((?:[^"\\]|\\.)*)"', literals))
        found[int(number)] = re.sub(r"\\(.)", lambda match: escapes[match[1]], text)
    return found


TEXTS = read_table()


def formatted(text, *values):
    shown = {"s": str, "d": str, "c": str, "x": lambda value: f"{value:x}"}
    return re.sub(r"%(\d)\$([sdcx])", lambda match: shown[match[2]](values[int(match[1]) - 1]), text)


def message(number, *values):
    """A message as the command prints it: with an empty line behind it."""
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


@functools.cache
def command_for_everyone():
    """A copy of the command and its libraries that any user can reach, wherever the build folder lies."""
    place = tempfile.mkdtemp()
    atexit.register(shutil.rmtree, place)
    os.chmod(place, 0o755)
    os.mkdir(place + "/bin", 0o755)
    shutil.copy(COMMAND, place + "/bin")
    shutil.copytree(BUILD / "lib", place + "/lib", symlinks=True,
                    ignore=lambda _, names: [name for name in names if ".so" not in name])
    return place + "/bin/qzaclfck"


def run(arguments, cwd, environment=(), ordinary=False, child=None):
    """Gives back the status and what was printed. `ordinary` runs without the rights of root, `child` is called in
    the new process before the command starts."""
    command = command_for_everyone() if ordinary and IS_ROOT else COMMAND

    def prepare():
        if ordinary and IS_ROOT:
            os.setgroups([])
            os.setgid(NOBODY)
            os.setuid(NOBODY)
        if child is not None:
            child()

    kept = {name: value for name, value in os.environ.items() if name.endswith("SAN_OPTIONS")}
    done = subprocess.run([command] + [text.encode("latin-1") for text in arguments], cwd=cwd,
                          env={**kept, "LC_ALL": "C", **dict(environment)}, preexec_fn=prepare,
                          stdin=subprocess.DEVNULL, capture_output=True, timeout=GUARD_SECONDS, check=False)
    if done.stdout:
        raise AssertionError(f"{arguments} printed on standard output: {done.stdout!r}")
    return done.returncode, done.stderr.decode("latin-1")


def snapshot(directory):
    """All that could be changed or left over in a directory, by name."""
    found = {}
    for name in os.listdir(directory):
        path = os.path.join(directory, name)
        info = os.lstat(path)
        content = pathlib.Path(path).read_bytes() if stat.S_ISREG(info.st_mode) and IS_ROOT else None
        found[name] = (info.st_mode, info.st_uid, info.st_gid, info.st_ino, info.st_mtime_ns, content)
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
        pathlib.Path(path).write_bytes(text if isinstance(text, bytes) else text.encode("latin-1"))
        if owner is not None:
            os.chown(path, owner, owner)
        os.chmod(path, mode)
        return path

    def read(self, name):
        return pathlib.Path(self.dir, name).read_bytes()

    def expect(self, arguments, status, errors, **how):
        """Compares status and text, and that only the files named by `makes` came into being or changed."""
        makes = how.pop("makes", [])
        before = snapshot(self.dir)
        got = run([text.replace("{dir}", self.dir) for text in arguments], how.pop("cwd", self.dir), **how)
        self.assertEqual(got, (status, errors.replace("{dir}", self.dir)))
        after = snapshot(self.dir)
        for name in makes:
            self.assertNotEqual(after.pop(name), before.pop(name, None))
        self.assertEqual(after, before)


def complaint(text):
    return f"{COMMAND}: {text}\n"


def wants(letter):
    return complaint(f"option requires an argument -- '{letter}'") + message(147) + USAGE


USAGE = message(80)
LINE_OF_A = entry("n", "r")
UNKNOWN_X = complaint("invalid option -- 'x'")

OPTIONS = [  # arguments, status, standard error; the file "a" holds the line "n r"
    ("-c -s -v -t p", 4, message(148) + USAGE),
    ("-h -f missing", 0, message(81)),
    ("-c -s -S -v -t p -u q -f a -h", 0, message(81)),
    ("-x -f a", 4, UNKNOWN_X + message(147) + USAGE),
    ("-f", 4, wants("f")),
    ("-f a -u", 4, wants("u")),
    ("-f a -t", 4, wants("t")),
    ("-x -h", 0, UNKNOWN_X + message(147)),
    ("-h -x", 4, UNKNOWN_X + message(147) + USAGE),
    ("-h -h", 4, message(146, "-h") + USAGE),
    ("-c -c -h", 0, message(146, "-c")),
    ("-x -h -c -c", 4, UNKNOWN_X + message(146, "-c") + USAGE),
    ("-c -c -x", 4, UNKNOWN_X + message(147) + USAGE),
    *[(f"-{letter} -f a -{letter}", 4, message(146, f"-{letter}") + USAGE) for letter in "csSv"],
    *[(f"-{letter} p -{letter} q", 4, message(146, f"-{letter}") + USAGE) for letter in "ftu"],
    ("-f a", 0, ""),
    ("-cvfa", 0, LINE_OF_A),
    ("-f a operand -- -x", 0, ""),
    ("-S -f a", 0, ""),
    ("-S -v -f a", 0, message(149) + LINE_OF_A),
    ("-t p -f a", 0, ""),
    ("-t p -v -f a", 0, message(149) + LINE_OF_A),
    ("-t p -S -v -f a", 0, message(149) * 2 + LINE_OF_A),
    ("-s -u no.such.user -f a", 15, message(150) + message(127, "no.such.user")),
    ("-u no.such.user -f ./a", 4, message(151, "./a", "no.such.user")),
    ("-f {dir}/a -v", 0, LINE_OF_A),
    ("-f ./../a", 105, message(154, "{dir}/./../a", errno.ENOENT)),
    ("-f missing%n%1$s\xff", 105, message(154, "{dir}/missing%n%1$s\xff", errno.ENOENT)),
    ("-f ", 105, message(154, "{dir}/", 0)),
]


class Options(CommandCase):
    def test_table(self):
        self.write("a", "n r\n")
        for arguments, status, errors in OPTIONS:
            with self.subTest(arguments):
                self.expect(arguments.split(" "), status, errors)


def entries(*shown):
    return [(0, line) for line in shown]


M16 = "m" * 16

LINES = [  # file text, and in order what it gives: (0, line of verbose mode) or (code, failure)
    ("n", entries(entry("n", ""))),
    ("o wrwr # anyone\n", entries(entry("o", "rw"))),
    ("# n\n\n \t\v\n  # x y z\n#\n", []),
    ("n#x\n", [(42, message(165, 1, "n#x"))]),
    ("N r\nO w\nU UNIX A#b c\nE Krb5 Bob\nG Staff #q\n",
     entries(LINE_OF_A, entry("o", "w"), entry("u", "c", "unix", "A#b"), entry("e", "", "krb5", "Bob"),
             entry("g", "", "Staff"))),
    ("n oasvdelqCxcwr\n", entries(entry("n", "rwcxCqledvsao"))),
    (" \t\vn\v\t r\t\n", entries(LINE_OF_A)),
    ("n r\r\n# c\r\nx\r\n", entries(LINE_OF_A) + [(42, message(165, 5, "x"))]),
    ("n\fx r\f", entries(entry("n", "")) + [(42, message(165, 2, "x"))]),
    ("x r\no r\n", [(42, message(165, 1, "x")), *entries(entry("o", "r"))]),
    ("nn r\n%s%n r\n\xee\n", [(42, message(165, n, token)) for n, token in ((1, "nn"), (2, "%s%n"), (3, "\xee"))]),
    ("u\nu unix\ne # unix alice\ne unix\t\ng\ng #\nu", [(42, message(158, number)) for number in range(1, 8)]),
    ("n r x\ng staff rw extra\nu a b r r # c\n", [(42, message(159, number)) for number in range(1, 4)]),
    (f"u {M16} b r\nu {M16}M b r\ne {M16}M\n", entries(entry("u", "r", M16, "b"))
     + [(42, message(132, M16 + "M", 2)), (42, message(132, M16 + "M", 3))]),
    ("n rz x\nn R\ng a r#c\n", [(36, message(166, n, token)) for n, token in ((1, "rz"), (2, "R"), (3, "r#c"))]),
    ("n r #" + "c" * 1090 + "\no #" + "c" * 1092, entries(LINE_OF_A, entry("o", ""))),
    ("n r #" + "c" * 1091 + "\no r\n" + " " * 1096,
     [(37, message(145, 1)), *entries(entry("o", "r")), (37, message(145, 3))]),
    ("n r\no w\0\nx\n", entries(LINE_OF_A) + [(42, message(131, 2))]),
    ("x w\0\nx\n", [(42, message(165, 1, "x"))]),
    ("# n\0\nx\n", [(42, message(131, 1))]),
    ("n r\n\0x\n", entries(LINE_OF_A)),
    ("n r\nN w\n", entries(LINE_OF_A, entry("n", "w")) + [(43, message(160, "n"))]),
    ("o r\no r\n", entries(entry("o", "r"), entry("o", "r")) + [(43, message(160, "o"))]),
    ("u unix alice\nu krb5 alice\nU UNIX ALICE w\n",
     entries(entry("u", "", "unix", "alice"), entry("u", "", "krb5", "alice"), entry("u", "w", "unix", "ALICE"))
     + [(43, message(144, "u", "unix", "ALICE"))]),
    ("e unix a\nu unix a\ne unix A\n",
     entries(entry("e", "", "unix", "a"), entry("u", "", "unix", "a"), entry("e", "", "unix", "A"))
     + [(43, message(144, "e", "unix", "A"))]),
    ("g Staff r\ng sTAFF r\ng staffs\n", entries(entry("g", "r", "Staff"), entry("g", "r", "sTAFF"))
     + [(43, message(161, "g", "sTAFF")), *entries(entry("g", "", "staffs"))]),
    ("x\nu\nn rz\no r r\nn r\nn r\n",
     [(42, message(165, 1, "x")), (42, message(158, 2)), (36, message(166, 3, "rz")), (42, message(159, 4)),
      *entries(LINE_OF_A, LINE_OF_A), (43, message(160, "n"))]),
]

CACHES = [  # file text, the cache that "-s" leaves
    ("# nobody\n\n", bytes.fromhex("8501020000")),
    ("\0", bytes.fromhex("8501020000")),
    ("u abcd xyz wr\n", bytes.fromhex("8501020100 1a000000 04 01000000 05 6162636400 01 03000000 0400 78797a00")),
    ("o c\n", bytes.fromhex("8501020100 11000000 02 01000000 00 01 04000000 0000")),
    ("e m c\ne m A\ne M b\n", compiled((8, "m", [("c", 0), ("A", 0), ("b", 0)]))),
    ("g aB\ng a_\ng \xff\ng \x7f\n", compiled((16, None, [("a_", 0), ("aB", 0), ("\x7f", 0), ("\xff", 0)]))),
    ("o r\nu k Zed x\ng Staff q\nn w\ne k b r\nu m c r\nu k amy\ng admins l\ne m d\nu m A o\ne k a e\n",
     compiled((8, "m", [("d", 0)]), (4, "m", [("A", 0x1000), ("c", 1)]), (8, "k", [("b", 1), ("a", 0x80)]),
              (1, None, [(None, 2)]), (16, None, [("admins", 0x40), ("Staff", 0x20)]),
              (4, "k", [("amy", 0), ("Zed", 8)]), (2, None, [(None, 1)]))),
]
A_TEXT, A_CACHE = CACHES[2]


class Bulk(CommandCase):
    def test_lines(self):
        """The facts of a text give what is printed with each of the eight choices of options."""
        for text, events in LINES:
            for number in range(8):
                options = [option for bit, option in enumerate(("-c", "-v", "-s")) if number >> bit & 1]
                with self.subTest(text[:60], options=options):
                    self.fresh()
                    self.write("a", text)
                    first_failure = next((index for index, (code, _) in enumerate(events) if code != 0), None)
                    goes_on = first_failure is None or "-c" in options
                    status = 0 if goes_on else events[first_failure][0]
                    told = events if goes_on else events[:first_failure + 1]
                    errors = "".join(shown for code, shown in told if code != 0 or "-v" in options)
                    is_cached = "-s" in options and first_failure is None
                    if "-s" in options and not is_cached:
                        errors += message(162)
                    self.expect([*options, "-f", "a"], status, errors, makes=["a.cacl"] if is_cached else [])

        self.fresh()
        self.write("a", "")
        self.expect(["-f", "a", "-s", "-c"], 0, "")
        self.expect(["-f", "a", "-s", "-v"], 0, message(157, "{dir}/a"))

    def test_caches(self):
        for text, cache in CACHES:
            with self.subTest(text):
                self.fresh()
                self.write("a", text)
                self.expect(["-s", "-f", "a"], 0, "", makes=["a.cacl"])
                self.assertEqual(self.read("a.cacl"), cache)

    def test_identities_are_shown_in_the_code_set_of_the_locale(self):
        self.write("a", "u m \xc3\xa9 r\ng \xff\nn r\n")
        self.expect(["-v", "-f", "a"], 0, TEXTS[130] * 2 + LINE_OF_A)
        self.expect(["-v", "-f", "a"], 0, entry("u", "r", "m", "\xc3\xa9") + TEXTS[130] + LINE_OF_A,
                    environment={"LC_ALL": "C.UTF-8"})

    def test_every_bad_line_is_reported(self):
        self.write("a", "".join(f"bad{number}\n" for number in range(10000)))
        self.expect(["-c", "-s", "-f", "a"], 0,
                    "".join(message(165, number + 1, f"bad{number}") for number in range(10000)) + message(162))

    def test_random_bytes(self):
        numbers = random.Random(20261124)
        pieces = "n|o r|u unix |e K |g |\n|\r|\f|\0| |\t|#|rwx|\xff\xfe|\xc3\xa9|%s%n".split("|") + ["x" * 1090]
        for number in range(300):
            with self.subTest(number):
                text = "".join(numbers.choices(pieces, k=numbers.randrange(1, 200)))
                self.write("a", text if number % 2 else numbers.randbytes(numbers.randrange(1, 4000)))
                options = [["-c", "-v"], ["-c", "-v", "-s"], ["-s"], []][number % 4]
                status, _ = run([*options, "-f", "a"], self.dir)
                self.assertIn(status, (0,) if "-c" in options else (0, 36, 37, 42, 43))
        self.assertLessEqual(set(os.listdir(self.dir)), {"a", "a.cacl"})

    def test_many_sorted_entries_on_a_small_stack(self):
        names = [f"user{number:06}" for number in range(100000)]
        path = self.write("a", "".join(f"u m {name} r\ne m {name}\n" for name in names))
        os.utime(path, (0, 10**9))
        started = time.clock_gettime_ns(CLOCK_REALTIME_COARSE)
        done = run(["-s", "-f", "a"], self.dir,
                   child=lambda: resource.setrlimit(resource.RLIMIT_STACK, (256 << 10, 256 << 10)))
        read = os.stat(path).st_atime_ns
        self.assertEqual(done, (0, ""))
        self.assertTrue(self.read("a.cacl") == compiled((8, "m", [(name, 0) for name in names]),
                                                        (4, "m", [(name, 1) for name in names])))
        # The cache is as old as the text that it was made from, so that a later edit finds it stale.
        stamp = os.stat(path + ".cacl").st_mtime_ns
        self.assertGreaterEqual(stamp, started)
        if read != 0:  # the file system notes when a file was read
            self.assertLessEqual(stamp, read)


def link(to, name):
    return lambda place: os.symlink(to, f"{place}/{name}")


def node(kind, name):
    return lambda place: os.mknod(f"{place}/{name}", kind | 0o644)


def file(place):
    pathlib.Path(place, "a").write_text(A_TEXT, "ascii")


HOSTILE = [  # what stands under the names of the ACL file and its cache, and what "-s" then says
    (None, None, 105, message(154, "{dir}/a", errno.ENOENT)),
    (lambda place: os.mkdir(place + "/a"), None, 105, message(154, "{dir}/a", 0)),
    (node(stat.S_IFIFO, "a"), None, 105, message(154, "{dir}/a", 0)),
    (node(stat.S_IFSOCK, "a"), None, 105, message(154, "{dir}/a", 0)),
    (link("/dev/zero", "a"), None, 105, message(154, "{dir}/a", 0)),
    (link("nowhere", "a"), None, 105, message(154, "{dir}/a", errno.ENOENT)),
    (link("a", "a"), None, 105, message(154, "{dir}/a", errno.ELOOP)),
    (file, link("nowhere", "a.cacl"), 37, message(138, "{dir}/a.cacl")),
    (file, link("a.cacl", "a.cacl"), 37, message(122, "{dir}/a", errno.ELOOP)),
    (file, lambda place: os.mkdir(place + "/a.cacl", 0o644), 37, message(137, "{dir}/a")),
    (file, node(stat.S_IFIFO, "a.cacl"), 37, message(137, "{dir}/a")),
    (file, lambda place: os.mknod(place + "/a.cacl", 0o600), 37, message(137, "{dir}/a")),
]


class Files(CommandCase):
    def owned_file(self, name, text=A_TEXT, mode=0o644):
        """A file of whoever runs the command with `ordinary`, in a directory that is his."""
        if IS_ROOT:
            os.chown(self.dir, NOBODY, NOBODY)
        return self.write(name, text, mode, NOBODY if IS_ROOT else None)

    def test_hostile_names(self):
        for number, (acl, cache, status, errors) in enumerate(HOSTILE):
            with self.subTest(number):
                self.fresh()
                for make in filter(None, (acl, cache)):
                    make(self.dir)
                self.expect(["-s", "-f", "a"], status, errors)

    def test_cache_mode_is_that_of_the_file(self):
        for mode in (0o644, 0o600, 0o400, 0o777, 0o1666, 0o2755, 0o4711):
            with self.subTest(mode=oct(mode)):
                self.fresh()
                self.write("a", A_TEXT, mode)
                self.expect(["-s", "-f", "a"], 0, "", makes=["a.cacl"], child=lambda: os.umask(0o077))
                self.assertEqual(stat.S_IMODE(os.stat(self.dir + "/a.cacl").st_mode), mode)

    def test_cache_is_replaced_in_one_step(self):
        self.write("file", A_TEXT)
        held = self.write("old", "what readers hold open stays as it is")
        os.symlink("file", self.dir + "/a")
        for put in (os.symlink, os.link):
            with self.subTest(put.__name__):
                put(held, self.dir + "/a.cacl")
                self.expect(["-s", "-f", "a"], 0, "", makes=["a.cacl"])
                self.assertFalse(os.path.islink(self.dir + "/a.cacl"))
                self.assertEqual(self.read("a.cacl"), A_CACHE)
                os.unlink(self.dir + "/a.cacl")

    def test_full_disk(self):
        for room, count, error, action in ((0, -1, errno.EFBIG, signal.SIG_IGN), (7, 7, 0, signal.SIG_IGN),
                                           (0, -1, errno.EFBIG, signal.SIG_DFL)):
            def limit(room=room, action=action):
                signal.signal(signal.SIGXFSZ, action)
                resource.setrlimit(resource.RLIMIT_FSIZE, (room, room))

            self.fresh()
            self.write("a", A_TEXT)
            refused = message(139, count, len(A_CACHE), error)
            self.expect(["-s", "-f", "a"], 37, refused, child=limit)
            self.write("a.cacl", "old")
            self.expect(["-s", "-f", "a"], 37, refused, child=limit)

    def test_closed_standard_descriptors(self):
        self.write("a", "x\n" + A_TEXT)
        self.write("b", A_TEXT)
        for closed in ((0,), (1,), (2,), (0, 1), (0, 2), (1, 2), (0, 1, 2)):
            with self.subTest(closed=closed):
                def close(closed=closed):
                    for number in closed:
                        os.close(number)

                errors = (message(165, 1, "x") + message(162), entry("u", "rw", "abcd", "xyz"))
                failed, shown = ("", "") if 2 in closed else errors
                self.expect(["-c", "-s", "-f", "a"], 0, failed, child=close)
                self.expect(["-v", "-s", "-f", "b"], 0, shown, child=close, makes=["b.cacl"])
                self.assertEqual(self.read("b.cacl"), A_CACHE)

    def path_of_length(self, length, last):
        """Makes the directories for a path of a length in bytes, whose last name has `last` of them."""
        path = self.dir
        while length - len(path) > last + 1:
            path += "/" + "d" * min(200, max(1, length - len(path) - last - 2))
        os.makedirs(path, exist_ok=True)
        return (path + "/").ljust(length, "f")

    def test_long_paths(self):
        for length, status in ((4089, 0), (4090, 37), (4095, 37)):
            with self.subTest(length=length):
                path = self.path_of_length(length, 20)
                file_name = os.path.basename(path)
                pathlib.Path(path).write_text(A_TEXT, "ascii")
                self.expect(["-s", "-f", path], status, message(135, path) if status else "")
                self.assertEqual(sorted(os.listdir(os.path.dirname(path))),
                                 [file_name] if status else [file_name, file_name + ".cacl"])
        for length in (4096, 4097, 9000):
            path = "/".ljust(length, "f")
            self.expect(["-f", path], 105, message(154, path, errno.ENAMETOOLONG))
        name = "n" * 251  # a name that has no room for the cache's extension
        self.write(name, A_TEXT)
        self.expect(["-s", "-f", name], 37, message(122, "{dir}/" + name, errno.ENAMETOOLONG))
        cwd = self.path_of_length(4090, 21)
        os.mkdir(cwd)
        self.expect(["-f", "123456"], 105, message(153, cwd, "123456"), cwd=cwd)
        self.expect(["-f", "12345"], 105, message(154, cwd + "/12345", errno.ENAMETOOLONG), cwd=cwd)

    def test_working_directory_that_is_gone(self):
        def leave():
            os.mkdir("gone")
            os.chdir("gone")
            os.rmdir("../gone")

        self.expect(["-f", "a"], 105, message(152, "getcwd()", errno.ENOENT), child=leave)

    def test_ordinary_user(self):
        """What rights refuse: reading, writing to a cache that is there, and making the cache's names."""
        self.owned_file("a", mode=0o200)
        self.expect(["-s", "-f", "a"], 37, message(156, "{dir}/a", errno.EACCES), ordinary=True)
        self.owned_file("b", mode=0o444)
        self.expect(["-s", "-f", "b"], 0, "", makes=["b.cacl"], ordinary=True)
        self.expect(["-s", "-f", "b"], 37, message(138, "{dir}/b.cacl"), ordinary=True)
        self.owned_file("c")
        os.chmod(self.dir, 0o555)
        self.addCleanup(os.chmod, self.dir, 0o755)
        self.expect(["-s", "-f", "c"], 37, message(138, "{dir}/c.cacl"), ordinary=True)

    @unittest.skipUnless(IS_ROOT, "only root gives files away")
    def test_owners(self):
        path = self.write("a", A_TEXT, 0o640, NOBODY)
        self.expect(["-s", "-f", "a"], 0, "", makes=["a.cacl"])
        made = os.stat(path + ".cacl")
        self.assertEqual((made.st_uid, made.st_gid, stat.S_IMODE(made.st_mode)), (NOBODY, NOBODY, 0o640))
        for owner, group in ((NOBODY, 0), (0, NOBODY)):
            os.chown(path + ".cacl", owner, group)
            self.expect(["-s", "-f", "a"], 37, message(136, "{dir}/a"))
        os.chown(self.dir, NOBODY, NOBODY)
        self.write("b", A_TEXT)
        self.expect(["-s", "-f", "b"], 37, message(141, "{dir}/b.cacl", "0", 0), ordinary=True)

    def test_home_directory(self):
        user = pwd.getpwuid(os.geteuid())
        if not os.access(user.pw_dir, os.W_OK):
            self.skipTest("no home directory to write to")
        handle, path = tempfile.mkstemp(dir=user.pw_dir)
        self.addCleanup(os.unlink, path)
        os.write(handle, b"n r\n")
        os.close(handle)
        options = ["-v", "-u", user.pw_name, "-f", os.path.basename(path)]
        refused = message(155, path, user.pw_name)
        for mode, status, errors in ((0o600, 0, LINE_OF_A), (0o755, 0, LINE_OF_A), (0o620, 36, refused),
                                     (0o602, 36, refused)):
            with self.subTest(mode=oct(mode)):
                os.chmod(path, mode)
                self.expect(["-s", *options], status, message(150) + errors)
                self.expect(["-v", "-f", path], 0, LINE_OF_A)
        self.assertFalse(os.path.exists(path + ".cacl"))
        if IS_ROOT:
            os.chmod(path, 0o600)
            os.chown(path, NOBODY, NOBODY)
            self.expect(options, 36, refused)


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
