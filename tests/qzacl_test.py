"""Runs qzacl on real files, and compares what it answers: plain lines, JSON and the exit status.

Usage: qzacl_test.py BUILD_DIR [unittest arguments]."""
import importlib
import json
import os
import pathlib
import random
import re
import shutil
import struct
import subprocess
import sys
import tempfile
import unittest

BUILD = pathlib.Path(sys.argv.pop(1)).resolve()
SOURCE = pathlib.Path(__file__).resolve().parent.parent
SANITIZED = "QZ_SANITIZE:STRING=\n" not in (BUILD / "CMakeCache.txt").read_text()
COMMAND = BUILD / "bin/qzacl"
CHECKER = BUILD / "bin/qzaclfck"
SERVICE = (SOURCE / "examples/service.acl").read_text()
LETTERS = "rwcxCqledvsao"

ACL = b"""# comment
n q
u unix alice@head rw

u unix Denied@head
e unix .dom rql
e unix a.other r
g ops rwx
g audit v
o r
"""

# Arguments, what is printed, and the status; the file a.acl is the one above.
ASKED = [
    ("ask a.acl", "unauthenticated: a.acl:2: n q (decides)\ngranted: q\n", 0),
    ("ask a.acl -w r", "unauthenticated: a.acl:2: n q (decides)\ngranted: q\nwanted r: no\n", 1),
    ("ask -w wr a.acl ALICE@head",
     "user: a.acl:3: u unix alice@head rw (decides)\nexpanded: no entry\nany other: a.acl:10: o r\n"
     "granted: rw\nwanted rw: yes\n", 0),
    ("ask a.acl denied@head -g ops",
     "user: a.acl:5: u unix Denied@head (decides)\nexpanded: no entry\n"
     "group: a.acl:8: g ops rwx\nany other: a.acl:10: o r\ngranted:\n", 1),
    ("ask -g ops -g none -g AUDIT a.acl bob@x",
     "user: no entry\nexpanded: no entry\ngroup: a.acl:8: g ops rwx (decides)\ngroup none: no entry\n"
     "group: a.acl:9: g audit v (decides)\nany other: a.acl:10: o r\ngranted: rwxv\n", 0),
    ("ask -m UNIX a.acl bob@host.DOM",
     "user: no entry\nexpanded: a.acl:6: e unix .dom rql (decides)\nany other: a.acl:10: o r\ngranted: rql\n", 0),
    ("ask --order sum a.acl bob@host.dom",
     "user: no entry\nexpanded: a.acl:6: e unix .dom rql (decides)\nany other: a.acl:10: o r (decides)\n"
     "granted: rql\n", 0),
    ("ask --handler Unix=none a.acl bob@host.dom",
     "user: no entry\nexpanded: no entry\nany other: a.acl:10: o r (decides)\ngranted: r\n", 0),
    ("ask --handler unix=exact a.acl A.other",
     "user: no entry\nexpanded: a.acl:7: e unix a.other r (decides)\nany other: a.acl:10: o r\ngranted: r\n", 0),
    ("who a.acl rw", "a.acl:3: u unix alice@head rw\na.acl:8: g ops rwx\n", 0),
    ("who a.acl a", "", 1),
    ("show a.acl", "n q\nu unix alice@head rw\nu unix Denied@head\ne unix .dom rql\ne unix a.other r\n"
                   "g audit v\ng ops rwx\no r\n", 0),
    ("diff a.acl a.acl", "", 0),
    ("diff a.acl b.acl", "~ u unix alice@HEAD +x -w\n- u unix Denied@head\n! e unix: other order\n+ g new\n", 1),
    ("test a.acl cases", "cases:2: expected yes, got no: unix bob@x +ops v (granted: rwx)\n1 passed, 1 failed\n", 1),
    ("lint plain.acl", "", 0),
]
B = ACL.replace(b"@head rw\n", b"@HEAD xr\n").replace(b"u unix Denied@head\n", b"").replace(
    b"e unix .dom rql\ne unix a.other r\n", b"e unix a.other r\ne unix .DOM lqr\n") + b"g new\n"
CASES = b"unix alice@head rw yes # hers\nunix bob@x +ops v yes\n"

# What cannot be meant, or read: the status is 2, and nothing is printed on standard output.
REFUSED = [
    "", "nothing a.acl", "who a.acl", "who a.acl r w", "who a.acl ''", "who a.acl z", "show", "show missing.acl",
    "show bad.acl", "who bad.acl r", "ask bad.acl", "lint bad.acl", "diff a.acl bad.acl", "diff - -", "cache -",
    "ask -g ops a.acl", "ask -m a.acl", "ask -m unix -m unix a.acl", "ask --handler= unix=none a.acl x@y",
    "ask --order most a.acl",
    "ask --handler unix=all a.acl", "ask --handler unix a.acl", "ask --handler =none a.acl x@y",
    "ask --handler unix=none --handler UNIX=exact a.acl", "show --json=false a.acl", "show --json=true a.acl",
    "ask -h- a.acl", "show --unknown a.acl", "show -w r a.acl", "who a.acl -- -r", "ask a.acl x -- -y",
    "show --permissions - -", "show --permissions missing a.acl", "show a.acl.cacl",
]

# Lines of a text, and the names of the warnings with their lines.
LINTED = [
    (b"u unix bob r\n", ["1 no-host"]),
    (b"u hba2 bob@ r\ne unix @ r\n", ["1 no-host", "2 no-host"]),
    (b"u krb5 bob r\n", []),
    (b"u unix a@fe80:0::1 r\nu unix b@FE80::1 r\ne hba2 0:0::1 r\n", ["1 ipv6-form", "3 ipv6-form"]),
    (b"# \xff\ng caf\xc3\xa9 r\ng \xc3( r\n", ["3 utf-8"]),
    (b"o r\nn r\r\n\r\ng x r\r\n", ["2 crlf"]),
    (b"e unix .a.b r\ne unix x.a.b r\ne unix y.A.B w\ne krb5 x.a.b r\n", ["2 hidden", "3 hidden"]),
    (b"e unix x.a.b r\ne unix .a.b r\ne unix .b r\ne unix ca.b r\n", ["4 hidden"]),
    (b"e unix a.b r\ne unix x.a.b r\n", []),
    (b"u unix a@b\ng c\n", ["1 denial"]),
    (b"".join(b"u m%d i r\n" % number for number in range(65536)), ["65536 too-many"]),
]


class Qzacl(unittest.TestCase):
    def setUp(self):
        self.dir = pathlib.Path(tempfile.mkdtemp())
        self.addCleanup(shutil.rmtree, self.dir)
        self.write("a.acl", ACL)
        self.write("b.acl", B)
        self.write("cases", CASES)
        self.write("plain.acl", b"o r\n")
        self.write("bad.acl", b"o r\nx\no w\n")
        self.write("a.acl.cacl", b"\x85\x01\x02\x01\x00")

    def write(self, name, content):
        (self.dir / name).write_bytes(content)

    def run_it(self, *words, given=b"", **more):
        """Gives standard output, the status and standard error."""
        command = [COMMAND, *words]
        done = subprocess.run(command, input=given, capture_output=True, cwd=self.dir, check=False, timeout=300, **more)
        return done.stdout, done.returncode, done.stderr

    def run_words(self, line):
        words = [word.replace("''", "") for word in line.split()]
        return self.run_it(*words)

    def compile(self, name):
        text = self.dir / name
        os.utime(text, (1, 1))
        subprocess.run([CHECKER, "-s", "-f", text], check=True)
        return name + ".cacl"

    def test_answers(self):
        for line, printed, status in ASKED:
            with self.subTest(line):
                self.assertEqual(self.run_words(line), (printed.encode(), status, b""))

    def test_refusals(self):
        for line in REFUSED:
            with self.subTest(line):
                printed, status, messages = self.run_words(line)
                self.assertEqual((printed, status), (b"", 2))
                self.assertTrue(messages)

    def test_all_messages_of_a_check_are_told(self):
        messages = self.run_words("show bad.acl")[2].decode()
        self.assertEqual(re.findall(r"3417-\d+", messages), ["3417-179", "3417-174"])

    def test_messages_say_which_of_several_files(self):
        self.write("bad.cacl", b"\x85\x01")
        for words, first in [
                ("diff a.acl bad.acl", "bad.acl: does not parse"),
                ("diff bad.cacl bad.acl", "bad.cacl: does not read"),
                ("test bad.acl cases", "bad.acl: does not parse"),
                ("lint a.acl bad.acl", "bad.acl: does not parse"),
                ("lint none.acl", "none.acl: does not read")]:
            messages = self.run_words(words)[2].decode()
            self.assertTrue(messages.startswith(f"qzacl: {first}\n3417-"), messages)

    def test_json_agrees_with_plain(self):
        for line, printed, status in ASKED:
            with self.subTest(line):
                answer, json_status, messages = self.run_words("--json " + line)
                self.assertEqual((json_status, messages), (status, b""))
                objects = [json.loads(each) for each in answer.splitlines()]
                verb = line.split()[0]
                self.assertEqual(getattr(self, "plain_of_" + verb)(objects), printed)

    def entry_of(self, each):
        words = (each[key] for key in ("type", "mechanism", "identity", "permissions"))
        return " ".join(filter(None, words))

    def plain_of_who(self, objects):
        return "".join(f"{each['file']}:{each['line']}: {self.entry_of(each)}\n" for each in objects)

    def plain_of_show(self, objects):
        numbered = ACL.decode().splitlines()
        for each in objects:
            self.assertEqual(numbered[each["line"] - 1], self.entry_of(each))
        return "".join(self.entry_of(each) + "\n" for each in objects)

    def plain_of_lint(self, objects):
        return "".join(f"{each['file']}:{each['line']}: warning: {each['text']} [{each['warning']}]\n"
                       for each in objects)

    def plain_of_test(self, objects):
        failed = "".join(f"cases:{each['line']}: expected {each['expected']}, got {each['got']}: {each['mechanism']} "
                         f"{each['identity']} +{each['groups'][0]} {each['permissions']} (granted: rwx)\n"
                         for each in objects)
        return failed + "1 passed, 1 failed\n"

    def plain_of_diff(self, objects):
        signs = {"add": "+", "remove": "-"}
        lines = []
        for each in objects:
            key = self.entry_of({**each, "permissions": None})
            if each["change"] == "order":
                lines.append(f"! {key}: other order")
            elif each["change"] == "alter":
                more = "".join(letter for letter in each["after"] if letter not in each["before"])
                less = "".join(letter for letter in each["before"] if letter not in each["after"])
                lines.append(f"~ {key} +{more} -{less}")
            else:
                lines.append(f"{signs[each['change']]} {self.entry_of(each)}")
        return "".join(line + "\n" for line in lines)

    def plain_of_ask(self, objects):
        (asked,) = objects
        lines = []
        for each in asked["answers"]:
            name = each["identity"] if each["type"] is None else None
            place = "no entry" if each["type"] is None else f"{each['file']}:{each['line']}: {self.entry_of(each)}"
            decides = " (decides)" if each["decides"] else ""
            lines.append(" ".join(filter(None, (each["party"], name))) + f": {place}{decides}")
        lines.append(f"granted: {asked['granted']}".rstrip())
        if asked["wanted"] is not None:
            lines.append(f"wanted {asked['wanted']}: {'yes' if asked['allowed'] else 'no'}")
        return "".join(line + "\n" for line in lines)

    def test_words_arrive_as_they_are(self):
        for name in ("[a,b]", "++", "show", "-x", "a b", "%%", "{x}", "--json"):
            with self.subTest(name):
                self.write(name, b"g %s r\n" % name.replace(" ", "_").encode())
                group = name.replace(" ", "_")
                printed = self.run_it("show", "--", name)[0].decode()
                self.assertEqual(printed, f"g {group} r\n")
                asked = self.run_it("ask", "-g", group, "--", name, "x@y")[0].decode()
                self.assertIn(f"group: {name}:1: g {group} r (decides)\n", asked)

    def test_an_option_takes_one_value(self):
        for value in ("none", "--order=", "-s-", "--"):
            printed = self.run_it("ask", "-g", value, "a.acl", "bob@x")[0].decode()
            self.assertIn(f"group {value}: no entry\nany other", printed)

    def test_standard_input_and_compiled_files(self):
        compiled = self.compile("a.acl")
        shown = self.run_words("show a.acl")
        self.assertEqual(self.run_it("show", "-", given=ACL), shown)
        self.assertEqual(self.run_it("show", compiled), shown)
        held = b"a.acl.cacl: u unix alice@head rw\na.acl.cacl: g ops rwx\n"
        self.assertEqual(self.run_it("who", compiled, "w"), (held, 0, b""))
        self.assertEqual(self.run_it("diff", compiled, "a.acl"), (b"", 0, b""))
        self.write("again.acl", shown[0])
        again = self.compile("again.acl")
        self.assertEqual((self.dir / again).read_bytes(), (self.dir / compiled).read_bytes())

    def test_entries_that_no_line_can_hold(self):
        for name in (b"a b", b"#a", b"", b"x" * 1095, b"a\n"):
            with self.subTest(name):
                entry = struct.pack("=BIH", 1, 1, len(name) + 1) + name + b"\0"
                subacl = struct.pack("=IBIB", 10 + len(entry), 16, 1, 0) + entry
                order = 2 if sys.byteorder == "little" else 1
                self.write("odd.acl", struct.pack("=BBBH", 0x85, 1, order, 1) + subacl)
                self.assertEqual(self.run_words("show odd.acl")[:2], (b"", 2))

    def test_identities_are_asked_in_their_stored_form(self):
        text = b"u hba2 a@fe80::1 w\no r\n"
        for host in ("fe80::1", "FE80:0:0::1", "fe80:0000::0001"):
            self.assertIn(b"granted: w\n", self.run_it("ask", "-m", "HBA2", "-", f"A@{host}", given=text)[0], host)

    def test_lines_are_counted_by_line_feeds(self):
        printed = self.run_it("who", "-", "r", given=b"\r\n#\f\rg a r\r\n\x0bg b r\ng c r")[0]
        self.assertEqual(printed, b"-:2: g a r\n-:3: g b r\n-:4: g c r\n")

    def test_lint(self):
        for text, expected in LINTED:
            with self.subTest(text[:60]):
                printed, status, _ = self.run_it("lint", "-", given=text)
                found = re.findall(r"^-:(\d+): warning: .* \[(.*)\]$", printed.decode("latin-1"), re.M)
                self.assertEqual([" ".join(each) for each in found], expected)
                self.assertEqual(status, 1 if expected else 0)

    def test_bytes_that_are_no_text(self):
        text = b"g a\xe2\x82\x01\x1b[2J r\n"
        self.assertEqual(self.run_it("who", "-", "r", given=text)[0], b"-:1: " + text)
        answer = self.run_it("who", "-", "r", "--json", given=text)[0]
        self.assertEqual(json.loads(answer)["identity"], "a\ufffd\ufffd\x01\x1b[2J")
        self.write("odd.acl", text)
        command = f"{COMMAND} who odd.acl r"
        done = subprocess.run(["script", "-qec", command, "/dev/null"], cwd=self.dir, capture_output=True, check=False)
        self.assertIn(b"g a\xe2\x82\\x01\\x1b[2J r", done.stdout)
        self.write("odd.acl", b"\x1b[2J\n")
        done = subprocess.run(["script", "-qec", command, "/dev/null"], cwd=self.dir, capture_output=True, check=False)
        self.assertIn(b"(\\x1b[2J).", done.stdout)
        self.assertIn(b"\t'n'/'N'", done.stdout)

    def test_output_that_cannot_be_written(self):
        for redirection in (">/dev/full", ">&-"):
            done = subprocess.run(f"{COMMAND} show a.acl {redirection}", shell=True, cwd=self.dir, check=False,
                                  capture_output=True)
            self.assertEqual((done.returncode, b"standard output" in done.stderr), (2, True), redirection)
        reader, writer = os.pipe()
        os.close(reader)
        # Also where the signal is ignored, as it is here.
        done = subprocess.run([COMMAND, "show", "a.acl"], cwd=self.dir, check=False, stdout=writer,
                              stderr=subprocess.PIPE, restore_signals=False)
        os.close(writer)
        self.assertEqual(done.stderr, b"")

    def test_permissions_of_a_service(self):
        self.write("set", b"# of jobs\nS 0x1 submit to submit jobs\nK 02 kill\nA 2147483648\n")
        self.write("jobs.acl", b"g ops KS\no A\n")
        expected = b"g ops SK\no A\n"
        self.assertEqual(self.run_words("--permissions set show jobs.acl"), (expected, 0, b""))
        self.assertEqual(self.run_words("show --permissions set jobs.acl"), (expected, 0, b""))
        self.assertEqual(self.run_words("show jobs.acl")[1], 2)
        compiled = self.compile("a.acl")
        self.assertEqual(self.run_words(f"show {compiled} --permissions set")[:2], (b"", 2))
        self.write("set", b"".join(b"%c %d\n" % (ord("a") + bit, 1 << bit) for bit in range(13)))
        self.assertEqual(self.run_words(f"who {compiled} c --permissions set")[1], 1)
        self.write("set", b"".join(b"%c %d\n" % (ord("a") + bit // 2, 1 << bit) for bit in range(13)))
        self.assertEqual(self.run_words(f"show {compiled} --permissions set")[:2], (b"", 2))
        for line in (b"SK 1", b"S 3", b"S x", b"S", b"S 0", b"S 4294967296", b"S 1 fourteen_bytes"):
            self.write("set", line + b"\n")
            self.assertEqual(self.run_words("show a.acl --permissions set")[:2], (b"", 2), line)

    def test_cache(self):
        text = self.dir / "c.acl"

        def told():
            printed, status, _ = self.run_words("cache c.acl --json")
            answer = json.loads(printed)
            return answer["reads"], answer["reason"], answer["same"], status

        self.write("c.acl", b"")
        self.assertEqual(told(), ("text", "empty", None, 0))
        self.write("c.acl", b"# no entries\n")
        self.assertEqual(told(), ("text", "empty", None, 0))
        self.write("c.acl", b"o r\n")
        self.assertEqual(told(), ("text", "missing", None, 1))
        cache = self.dir / self.compile("c.acl")
        self.assertEqual(told(), ("cache", None, True, 0))
        self.write("c.acl", b"o w\n")
        os.utime(text, (1, 1))
        self.assertEqual(told(), ("cache", None, False, 1))
        self.write("c.acl", b"x\n")
        os.utime(text, (1, 1))
        self.assertEqual(told(), ("cache", None, None, 2))
        self.write("c.acl", b"o r\n")
        os.utime(text, (5, 5))
        for seconds, reason in ((4, "not later"), (5, "same second")):
            os.utime(cache, (seconds, seconds))
            self.assertEqual(told(), ("text", reason, None, 1))
        os.utime(cache, (6, 6))
        cache.chmod(0o600)
        text.chmod(0o644)
        self.assertEqual(told(), ("text", "mode", None, 1))
        cache.chmod(0o644)
        cache.write_bytes(b"\x85")
        self.assertEqual(told(), ("text", "damaged", None, 1))
        if os.geteuid() == 0:
            os.chown(cache, 65534, -1)
            self.assertEqual(told(), ("text", "owner", None, 1))
        plain = self.run_words("cache c.acl missing.acl")
        self.assertEqual(plain[1], 2)
        self.assertRegex(plain[0], rb"^c.acl: text \((owner|damaged)\)\n$")

    def test_cases_that_the_other_languages_run(self):
        for cases, order, count in (("examples/service.cases", "closest", 23), ("tests/service_sum.cases", "sum", 10)):
            printed = self.run_it("test", "--order", order, SOURCE / "examples/service.acl", SOURCE / cases)
            self.assertEqual(printed, (f"{count} passed, 0 failed\n".encode(), 0, b""))

    def test_cases_that_cannot_be_read_or_asked(self):
        for case in (b"unix a@b r", b"unix a@b r maybe", b"unix a@b ops r yes", b"- a@b r yes", b"- - +g r yes",
                     b"unix a@b z yes", b"unix a\0@b r yes"):
            with self.subTest(case):
                printed, status, messages = self.run_it("test", "a.acl", "-", given=case + b"\nunix alice@head r yes\n")
                self.assertEqual((printed, status), (b"1 passed, 0 failed\n", 2))
                self.assertIn(b"-:1: ", messages)

    def asked_at_random(self):
        """Gives a user, groups, and what is answered of a text that was made up."""
        made = random.Random(1)
        hosts = ["a.dom", "b.dom", "dom", "x.y.dom", "fe80::1"]
        groups = ["ops", "audit", "staff"]
        for _ in range(60):
            self.write("r.acl", self.random_acl(made, hosts, groups).encode())
            user = f"U{made.randrange(3)}@{made.choice(hosts)}"
            member = made.sample(groups, made.randrange(3))
            options = [word for group in member for word in ("-g", group)]
            answer = self.run_it("ask", "--json", *options, "r.acl", user)[0]
            yield user, member, json.loads(answer)

    def test_ask_agrees_with_the_example_service(self):
        service = BUILD / "examples/service"
        for user, groups, asked in self.asked_at_random():
            told = subprocess.check_output([service, "r.acl", user, *groups], cwd=self.dir, text=True).splitlines()[1]
            (self.dir / "r.acl.cacl").unlink(missing_ok=True)
            by = asked["decided_by"]
            expected = "nothing is granted" if by is None else f"granted by {by}: {asked['granted'] or 'nothing'}"
            self.assertEqual(told, expected)

    @unittest.skipIf(SANITIZED, "Python cannot load the library")
    def test_ask_agrees_with_calls_of_the_library(self):
        os.environ["QZ_LIBRARY_DIR"] = str(BUILD / "lib")
        sys.path.insert(0, str(SOURCE / "bindings/python"))
        qzacl = importlib.import_module("qzacl")
        qzacl.register_expanded("unix", qzacl.domain)
        for user, groups, asked in self.asked_at_random():
            acl = qzacl.Acl.read(str(self.dir / "r.acl"))
            granted = [acl.user("unix", user), acl.expanded("unix", user)]
            granted += [acl.groups([group]) for group in groups] + [acl.any_other()]
            expected = [None if mask is None else qzacl.to_letters(mask) for mask in granted]
            self.assertEqual([each["permissions"] for each in asked["answers"]], expected)

    def random_acl(self, made, hosts, groups):
        def entry(key):
            return f"{key} {''.join(made.sample(LETTERS, made.randrange(4)))}\n"
        lines = {f"u unix u{made.randrange(3)}@{made.choice(hosts)}" for _ in range(made.randrange(5))}
        lines |= {f"e unix {made.choice(['', '.'])}{made.choice(hosts)}" for _ in range(made.randrange(4))}
        lines |= {f"g {made.choice(groups)}" for _ in range(made.randrange(4))}
        lines |= set(made.sample(["o", "n"], made.randrange(3))) | {"g always"}
        return "".join(entry(key) for key in sorted(lines, key=lambda _: made.random()))


if __name__ == "__main__":
    unittest.main()
