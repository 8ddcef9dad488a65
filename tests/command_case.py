"""What the script tests share: the command as an administrator runs it, its messages, and files with their rights.

A script test is called with the build folder, and then with arguments of unittest."""
import doctest
import enum
import os
import pathlib
import re
import shutil
import struct
import subprocess
import sys
import tempfile
import unittest

SOURCE = pathlib.Path(__file__).resolve().parent.parent
BUILD = pathlib.Path(sys.argv[1]).resolve()
SANITIZED = "QZ_SANITIZE:STRING=\n" not in (BUILD / "CMakeCache.txt").read_text()
IS_ROOT = os.geteuid() == 0
NOBODY = 65534
ORDINARY = NOBODY - 1 if IS_ROOT else None  # the user that root becomes to lack its rights
WRITER = NOBODY - 2  # a user whom a POSIX ACL permits to write

# A copy of the command and its libraries that any user can reach, wherever the build folder lies.
PLACE = tempfile.TemporaryDirectory()
os.chmod(PLACE.name, 0o755)
for part in ("bin", "lib"):
    shutil.copytree(BUILD / part, f"{PLACE.name}/{part}", symlinks=True)
subprocess.run(["chmod", "-R", "a+rX", PLACE.name], check=True)  # the mask of the build may not allow it
COMMAND = PLACE.name + "/bin/qzaclfck"
# The C library musl has texts of its own, and knows no locales but "C" and such in UTF-8.
IS_MUSL = b"/ld-musl-" in pathlib.Path(COMMAND).read_bytes()

# ---- Codes and messages ----

DECLARED_CODES = re.findall(r"#define SEC_S_(\w+) (\d+)", (SOURCE / "include/qz/acl.h").read_text())
Code = enum.IntEnum("Code", [(name, int(number)) for name, number in DECLARED_CODES])

DECLARED_MESSAGES = re.findall(r"message<(\d+)[^>]*>\s+(\w+);", (SOURCE / "security/msg/messages.h").read_text())
IDS = {name: int(number) for number, name in DECLARED_MESSAGES}

LITERALS = r'(?:\s*"(?:[^"\\]|\\.)*")+'
TABLE = (SOURCE / "security/msg/qzseclib_msg.h").read_text("latin-1")  # so that every byte survives


def meant(literals):
    """The text of C string literals."""
    text = re.sub(r'"\s*"', "", literals.strip())[1:-1]
    return re.sub(r"\\(.)", lambda escape: {"n": "\n", "t": "\t"}.get(escape[1], escape[1]), text)


TEXTS = {int(number): meant(literals) for number, literals in re.findall(rf"{{(\d+),({LITERALS})}}", TABLE)}


def formatted(name, *values):
    """A message with values in the places of its conversions."""
    def value(conversion):
        return format(values[int(conversion[1]) - 1], conversion[2].strip("sdc"))
    return re.sub(r"%(\d)\$([sdcx])", value, TEXTS[IDS[name]])


def message(name, *values):
    """A message as the command prints it: followed by an empty line."""
    return formatted(name, *values) + "\n"


def entry(letter, permissions, *identity):
    """The line of verbose mode; `identity` is nothing, (identity) or (mechanism, identity)."""
    forms = ("dump_single_acle", "dump_group_acle", "dump_mechanism_acle")
    return formatted(forms[len(identity)], "", letter, *identity, permissions)


# ---- Cases in files ----

def unescaped(text):
    """Text of a case, with the bytes that its escapes stand for."""
    return text.encode("latin-1").decode("unicode_escape")


def rows(name):
    """The rows of a file of cases, with a bar between columns."""
    for line in (SOURCE / "tests" / name).read_text("utf-8").splitlines():
        if line and not line.startswith("#"):
            yield line.split(" | ")


def transcripts(name):
    """The cases of a file of transcripts: their titles, and commands with what they print."""
    start, *cases = re.split("(?m)^== ", (SOURCE / "tests" / name).read_text("utf-8"))
    setup = list(steps_of(start))
    for case in cases:
        title, _, steps = case.partition("\n")
        yield title, setup + list(steps_of(steps))


def steps_of(text):
    for command, printed in re.findall(r"(?m)^\$ (.*(?:\n>.*)*)\n((?:(?!\$ ).*\n)*)", text):
        yield re.sub("\n> ?", "\n", command), printed.rstrip("\n")


# ---- Programs and files ----

def environment_with(**more):
    """The environment of programs, independent of the caller's."""
    kept = {name: value for name, value in os.environ.items() if name.endswith("SAN_OPTIONS")}
    return {**kept, "PATH": f"{PLACE.name}/bin:{os.environ['PATH']}", "LC_ALL": "C", **more}


def run(arguments, cwd, environment=(), child=None, user=None):
    """Runs the command, and gives its status and what it prints; `child` is called just before."""
    rights = {"user": user, "group": user, "extra_groups": []} if user else {}
    environment = environment_with(**dict(environment))
    command = [COMMAND] + [text.encode("latin-1") for text in arguments]
    done = subprocess.run(command, cwd=cwd, env=environment, preexec_fn=child, stdin=subprocess.DEVNULL,
                          capture_output=True, check=False, timeout=300, **rights)  # in case that it hangs
    printed = b"on standard output: " + done.stdout if done.stdout else done.stderr
    return done.returncode, printed.decode("latin-1")


def shown_by_a_shell(command, cwd):
    """The output of a command as a transcript shows it."""
    done = subprocess.run(["sh", "-c", command], cwd=cwd, env=environment_with(TMPDIR=cwd), check=False,
                          stdin=subprocess.DEVNULL, capture_output=True, timeout=300)
    lines = done.stdout.decode("utf-8", "replace").splitlines()
    lines += ["! " + line for line in done.stderr.decode("utf-8", "replace").splitlines() if line]
    lines += [f"[{done.returncode}]"] if done.returncode else []
    return "\n".join(lines)


ENTRIES = "system.posix_acl_access"
INHERITED = "system.posix_acl_default"


def posix_acl(group):
    """Entries that let the owner and one user write, and the group do what is said."""
    no_id = 0xffffffff
    owner, one_user, own_group, mask, others = 1, 2, 4, 0x10, 0x20
    entries = [(owner, 6, no_id), (one_user, 6, WRITER), (own_group, group, no_id)]
    entries += [(mask, 6, no_id), (others, 4, no_id)]
    return struct.pack("<I", 2) + b"".join(struct.pack("<HHI", *entry) for entry in entries)


def snapshot(directory):
    """The state of everything in a directory, by name, to detect changes."""
    found = {}
    for item in os.scandir(directory):
        info = item.stat(follow_symlinks=False)
        owner = (info.st_uid, info.st_gid)
        found[item.name] = (info.st_mode, owner, info.st_ino, info.st_size, info.st_mtime_ns)
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

    def set_entries(self, path, entries, name=ENTRIES):
        try:
            os.setxattr(path, name, entries)
        except OSError:
            self.skipTest("the file system has no POSIX ACLs")

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

    def expect_transcripts(self, name):
        for title, steps in transcripts(name):
            self.fresh()
            for command, printed in steps:
                with self.subTest(title, command=command):
                    shown = shown_by_a_shell(command, self.dir)
                    if not doctest.OutputChecker().check_output(printed, shown, doctest.ELLIPSIS):
                        self.assertEqual(shown, printed)
