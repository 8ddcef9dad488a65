"""Runs qzacl on real files: the transcripts of qzacl.cases, the cases of all languages, and ACLs that are made up.

usage: qzacl_test.py BUILD-FOLDER [unittest arguments]"""
import json
import os
import random
import subprocess
import sys
import unittest

from command_case import BUILD, IS_ROOT, NOBODY, SOURCE, CommandCase, shown_by_a_shell

LETTERS = "rwcxCqledvsao"
HOSTS = ["a.dom", "b.dom", "dom", "x.y.dom", "fe80::1"]
GROUPS = ["ops", "audit", "staff"]


def random_acl(draw):
    lines = {f"u unix u{draw.randrange(3)}@{draw.choice(HOSTS)}" for _ in range(draw.randrange(5))}
    lines |= {f"e unix {draw.choice(['', '.'])}{draw.choice(HOSTS)}" for _ in range(draw.randrange(4))}
    lines |= {f"g {draw.choice(GROUPS)}" for _ in range(draw.randrange(4))}
    lines |= set(draw.sample(["o", "n"], draw.randrange(3))) | {"g always"}
    shuffled = draw.sample(sorted(lines), len(lines))
    return "".join(f"{key} {''.join(draw.sample(LETTERS, draw.randrange(4)))}\n" for key in shuffled)


class Qzacl(CommandCase):
    def shell(self, command):
        return shown_by_a_shell(command, self.dir)

    def test_transcripts(self):
        self.expect_transcripts("qzacl.cases")

    def test_cases_that_the_other_languages_run(self):
        for cases, order, count in (("examples/service.cases", "closest", 23), ("tests/service_sum.cases", "sum", 10)):
            shown = self.shell(f"qzacl test --order {order} {SOURCE}/examples/service.acl {SOURCE}/{cases}")
            self.assertEqual(shown, f"{count} passed, 0 failed")

    @unittest.skipUnless(IS_ROOT, "takes root")
    def test_cache_of_another_owner(self):
        self.shell("echo o r >a; touch -d 2001-01-01 a; qzaclfck -s -f a")
        os.chown(f"{self.dir}/a.cacl", NOBODY, -1)
        self.assertEqual(self.shell("qzacl cache a"), "a: text (owner)\n[1]")

    def test_ask_agrees_with_the_example_service(self):
        draw = random.Random(1)
        for _ in range(60):
            acl = random_acl(draw)
            self.fresh()
            self.write("a", acl)
            user = f"U{draw.randrange(3)}@{draw.choice(HOSTS)}"
            groups = draw.sample(GROUPS, draw.randrange(3))
            members = " ".join("-g " + group for group in groups)
            asked = json.loads(self.shell(f"qzacl ask --json a {user} {members}").splitlines()[0])
            by = asked["decided_by"]
            expected = "nothing is granted" if by is None else f"granted by {by}: {asked['granted'] or 'nothing'}"
            service = [BUILD / "examples/service", "a", user, *groups]
            told = subprocess.check_output(service, cwd=self.dir, text=True).splitlines()[1]
            with self.subTest(acl, user=user, groups=groups):
                self.assertEqual(told, expected)


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
