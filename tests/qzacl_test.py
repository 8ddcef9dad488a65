"""Runs qzacl on real files: the transcripts of qzacl.cases and the cases of all languages.

usage: qzacl_test.py BUILD-FOLDER [unittest arguments]"""
import os
import sys
import unittest

from command_case import IS_ROOT, NOBODY, SOURCE, CommandCase, shown_by_a_shell


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


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
