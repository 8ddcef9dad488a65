"""Runs what README.md, docs/ and the manual show: commands, examples and recipes; and checks that nothing is missing.

usage: documents_test.py BUILD-FOLDER [unittest arguments]; --write renews the outputs in the documents"""
import json
import os
import re
import shlex
import shutil
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

from command_case import BUILD, SANITIZED, SOURCE

WRITE = "--write" in sys.argv
README = "README.md"
RECIPES_PAGE = "docs/recipes.md"
TRACING = "docs/tracing.md"
MANUAL = "docs/man/qzaclfck.1"
PAGES = (README, RECIPES_PAGE, TRACING, MANUAL, "docs/man/qzacl.1", "docs/man/qzacl.5", "docs/man/qzcacl.5")
DOCS = {name: (SOURCE / name).read_text() for name in PAGES}
RECIPES = dict(re.findall(r"<!-- recipe: (.*?) -->\n```\w*\n(.*?)```\n", "".join(DOCS.values()), re.S))
# A command and what it prints, in Markdown and in a manual page; and how the command is written there.
OUTPUT = re.compile(r"(<!-- output: (.*?) -->\n```\n)((?s:.*?))(?=```\n)")
EXAMPLE = re.compile(r"(?m)^(\$ ((?:.*\\e\n)*.*\n))((?:.*\n)*?)(?=\$ |\.Ed)")
WRITTEN = {"./dev run": "qzaclfck", "build/release/examples/": "", "\\-": "-", "\\(aq": "'", "\\e": "\\"}
TIMES = re.compile(r"\d+:\d+:\d+|\d+(?= us)")  # which differ each time
MARKUP = str.maketrans({"\\": "\\e", "-": "\\-", "'": "\\(aq"})
# What docs/tracing.md takes as its example.
SERVED = """set -e; export QZ_TRACE_LEVELS=_SEL:Errors=1,Info=1,API=8,Perf=1 QZ_TRACE_FILE=service.trace
    cp -p examples/service.acl .; touch -d '2 hours ago' service.acl; service service.acl guest@login.cluster.example
    touch -d '1 hour ago' service.acl.cacl; service service.acl mallory@login.cluster.example
    service service.acl eve@example.org strangers
    chmod 600 service.acl.cacl; service service.acl root@head.cluster.example
    touch service.acl; service service.acl root@head.cluster.example
    chmod 644 service.acl*; echo >service.acl.cacl; touch -d '1 hour ago' service.acl
    service service.acl root@head.cluster.example"""
# A text that grants, its later cache, and a new text between their times that does not.
REVOKED = """set -e; rm -f service.acl*; echo u unix carol@a.example r >service.acl; touch -d '3 hours ago' service.acl
    qzaclfck -s -f service.acl; touch -d '1 hour ago' service.acl.cacl
    echo n r >new.acl; touch -d '2 hours ago' new.acl"""
# The program that the library's snippet in README.md belongs to.
PROGRAM = """#include <qz/acl.h>
#include <stdio.h>
static void show_error(void) { puts("shown"); }
int main(void) {
%s
    return 0;
}
"""


class Documents(unittest.TestCase):
    def setUp(self):
        self.dir = Path(tempfile.mkdtemp()).resolve()
        self.addCleanup(shutil.rmtree, self.dir)
        shutil.copytree(SOURCE / "examples", self.dir / "examples", ignore=shutil.ignore_patterns("*.cacl"))
        subprocess.run(["chmod", "-R", "u=rwX,go=rX", self.dir / "examples"], check=True)
        for name, text in RECIPES.items():
            (self.dir / name).write_text(text)
            (self.dir / name).chmod(0o755)

    def run_in_shell(self, command, folder=".", **more):
        """Returns the status, and the output of both streams."""
        here = str(self.dir)
        path = f"{BUILD}/bin:{BUILD}/examples:{here}:{os.environ['PATH']}"
        environment = {"PATH": path, "LC_ALL": "C", "HOME": here, "LOCPATH": here, **more}
        done = subprocess.run(command, shell=True, env=environment, cwd=self.dir / folder, check=False, text=True,
                              stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
        return done.returncode, done.stdout.replace(str(self.dir), "/etc")

    def real_output(self, found, page):
        """A command and its real output, which is compared with the page."""
        command = found[2]
        for written, meant in WRITTEN.items():
            command = command.replace(written, meant)
        is_manual = not page.endswith(".md")
        _, printed = self.run_in_shell(command, Path(page).stem if is_manual else ".")
        if is_manual:
            printed = printed.translate(MARKUP)
        if not WRITE:
            self.assertEqual(TIMES.sub("", printed), TIMES.sub("", found[3]), command)
        return found[1] + printed

    def test_outputs(self):
        self.assertEqual(self.run_in_shell(SERVED)[0], 0)
        for page, text in DOCS.items():
            if page == TRACING and not shutil.which("jq"):
                continue
            (self.dir / Path(page).stem).mkdir(exist_ok=True)
            pattern = OUTPUT if page.endswith(".md") else EXAMPLE
            shown, count = pattern.subn(lambda found, page=page: self.real_output(found, page), text)
            self.assertTrue(count, page)
            if WRITE:
                (SOURCE / page).write_text(shown)

    def test_recipes_tell_right_from_wrong(self):
        commands = re.findall("(?:validate|command): (qzaclfck .*)(?:%s|/etc/)", RECIPES["ansible"])
        self.assertEqual(len(commands), 2)
        for command in commands:
            self.assertEqual(self.run_in_shell(command + "examples/service.acl"), (0, ""))
            self.assertEqual(self.run_in_shell(command + "examples/mistakes.acl")[0], 37)

    def starts(self):
        """Whether systemd would go on: a command with "-" may fail."""
        recipe = RECIPES["unit"].replace("/etc/", "examples/")
        commands = re.findall(r"ExecStartPre=(-?)/usr/bin/(.*)", recipe)
        return all(may_fail or self.run_in_shell(command)[0] == 0 for may_fail, command in commands)

    def test_unit_needs_a_valid_file_but_no_cache(self):
        cache = self.dir / "examples/service.acl.cacl"
        cache.mkdir()  # so that none can be written
        self.assertTrue(self.starts())
        shutil.copy(self.dir / "examples/mistakes.acl", self.dir / "examples/service.acl")
        self.assertFalse(self.starts())

    def test_replacing_a_file_by_an_older_one_takes_effect(self):
        manual = re.search(r"\$ (.*mv new\.acl site\.acl.*)", DOCS[MANUAL])[1]
        manual = manual.replace("\\-", "-").replace("site.acl", "service.acl")
        recipe = re.search(r"(?m)^(.*mv new\.acl /etc/.*)$", DOCS[RECIPES_PAGE])[1]
        task = re.search("command: (.*)", RECIPES["ansible"])[1]
        (self.dir / "postinst").write_text(RECIPES["postinst"].replace("/etc/", ""))
        move = "mv new.acl service.acl"
        for way in manual, recipe, f"{move}; {task}", f"{move}; postinst configure":
            replace = way.replace("/etc/", "")
            shown = self.run_in_shell(f"{REVOKED}; {replace}; service service.acl carol@a.example")
            self.assertRegex(shown[1], "^read from the cache, 22 bytes\nnothing is granted\n", way)

    def with_checker(self, script):
        """An environment in which the script is qzaclfck."""
        checker = self.dir / "checker/qzaclfck"
        checker.parent.mkdir(exist_ok=True)
        checker.write_text("#!/bin/sh\n" + script)
        checker.chmod(0o755)
        return {"PATH": f"{checker.parent}:{self.dir}:{os.environ['PATH']}"}

    def test_aclcheck_fails_when_the_checker_does(self):
        for script in "kill -KILL $$", "exit 1":
            status, shown = self.run_in_shell("aclcheck examples/service.acl", **self.with_checker(script))
            self.assertEqual(status, 1, script)
            self.assertIn("examples/service.acl", shown)

    @unittest.skipUnless(shutil.which("vim"), "there is no Vim")
    def test_vim_finds_the_mistakes(self):
        for folder in "ftdetect", "after/ftplugin":
            (self.dir / ".vim" / folder).mkdir(parents=True)
            shutil.copy(self.dir / f"{Path(folder).name}.vim", self.dir / ".vim" / folder / "acl.vim")
        places = "map(filter(getqflist(), 'v:val.valid'), 'v:val.lnum')"
        ask = f"silent make | call writefile({places}, 'places') | qall!"
        self.run_in_shell(f'vim -es -u DEFAULTS -c "{ask}" examples/mistakes.acl </dev/null')
        expected = re.findall(r"(?m)^examples/mistakes\.acl:(\d+):", DOCS[RECIPES_PAGE])
        self.assertEqual((self.dir / "places").read_text().split(), expected)

    @unittest.skipIf(SANITIZED or not shutil.which("cc"), "needs a compiler and a plain build")
    def test_snippet_shows_a_broken_file(self):
        snippet = re.search(r"```c\n(.*?)```", DOCS[README], re.S)[1].replace("/etc/", "")
        (self.dir / "snippet.c").write_text(PROGRAM % snippet)
        include, lib = shlex.quote(f"{SOURCE}/include"), shlex.quote(f"{BUILD}/lib")
        flags = f"-Wall -Wextra -Werror -I{include} -L{lib} -Wl,-rpath,{lib}"
        self.assertEqual(self.run_in_shell(f"cc {flags} snippet.c -o snippet -lqzacl"), (0, ""))
        for text, shown in (r"u unix a@b r\nu unix a@b r\n", "shown\n"), (r"o r\n", ""), ("", ""):
            self.assertEqual(self.run_in_shell(f"printf '{text}' >service.acl; ./snippet"), (0, shown), text)

    def test_an_edit_reaches_every_host(self):
        (self.dir / "ssh").write_text('#!/bin/sh\ncd "$1" && shift && exec "$@"\n')  # a host is a folder
        (self.dir / "ssh").chmod(0o755)
        script = self.dir / "edit-by-hand"
        script.write_text(script.read_text().replace("/etc/", ""))
        texts = {"a": "g ops rw\ng interns r\n", "b": "g ops rw\n"}
        for host, text in texts.items():
            (self.dir / host).mkdir()
            (self.dir / host / "service.acl").write_text(text)
        shown = self.run_in_shell("edit-by-hand a b")
        self.assertEqual(shown, (0, "a: changed\nb: unchanged\n"))
        for host in texts:
            self.assertEqual((self.dir / host / "service.acl").read_text(), "g ops rw\n")

    def test_edits_of_ansible_change_once(self):
        task = re.search("cmd: (.*)", RECIPES["edit"])[1].replace("/etc/", "examples/")
        for mode, status, expected in (
                ("--check", 1, "+g operators  rw\n"),
                ("-s", 0, "changed\n"),
                ("--check", 0, ""),
                ("-s", 0, "unchanged\n")):
            got, shown = self.run_in_shell(re.sub("{{.*?}}", mode, task))
            self.assertEqual(got, status)
            self.assertIn(expected, shown)

    def test_cases_that_must_hold(self):
        self.assertEqual(self.run_in_shell("gate examples/service.acl"), (0, "23 passed, 0 failed\n"))
        self.assertEqual(self.run_in_shell("sed -i /^o/d examples/service.acl; gate examples/service.acl")[0], 1)

    def test_one_file_on_many_hosts(self):
        (self.dir / "ssh").write_text("#!/bin/sh\ntest $1 = same || echo g new r\ntac examples/service.acl\n")
        (self.dir / "ssh").chmod(0o755)
        (self.dir / "compare").write_text(RECIPES["compare"].replace("/etc/", "examples/"))
        self.run_in_shell("sed -i '/^e hba2 node02/d' examples/service.acl")
        self.assertEqual(self.run_in_shell("compare same other"), (0, "other: + g new r\n"))

    def commit(self, staged, present, environment):
        """The status of committing a staged file while the working tree has another in its place."""
        stage = f"cd repo && cp ../examples/{staged}.acl 'a b.acl' && git add ."
        change = f"cp ../examples/{present}.acl *"
        commit = "git -c user.name=x -c user.email=x commit -m x"
        return self.run_in_shell(f"{stage} && {change} && {commit}", **environment)[0]

    @unittest.skipUnless(shutil.which("git"), "there is no git")
    def test_commits_of_mistakes_are_refused(self):
        self.run_in_shell("git init repo; mv pre-commit repo/.git/hooks")
        (self.dir / "examples/other.acl").write_text("o r\n")
        self.assertEqual(self.commit("service", "mistakes", {}), 0)
        self.assertEqual(self.commit("mistakes", "service", {}), 1)
        self.assertEqual(self.commit("other", "service", self.with_checker("kill -KILL $$")), 1)

    @unittest.skipUnless(shutil.which("gencat"), "there is no gencat")
    @unittest.skipUnless(os.path.exists("/usr/share/i18n/locales/de_DE"), "there is no German locale")
    def test_places_of_mistakes_in_another_language(self):
        subprocess.run(["localedef", "-i", "de_DE", "-f", "UTF-8", self.dir / "de_DE.UTF-8"], check=True)
        build = str(BUILD).replace("%", "%%")
        catalogs = re.search("NLSPATH=(.*)", RECIPES["language"])[1].replace("/usr/local", build)
        matcher = json.loads(RECIPES["matcher"])["problemMatcher"][0]["pattern"][0]
        places = re.findall(r"(?m)^examples/\S+: 3417-\d+", DOCS[RECIPES_PAGE])
        _, shown = self.run_in_shell("aclcheck examples/*.acl", LC_ALL="de_DE.UTF-8", NLSPATH=catalogs)
        found = [re.match(matcher["regexp"], line) for line in shown.splitlines()]
        keys = [matcher[key] for key in ("file", "line", "code")]
        self.assertEqual(["{}:{}: {}".format(*each.group(*keys)) for each in found], places)
        self.assertIn("Der ACL-Eintrag in Zeile 5", found[0][matcher["message"]])

    def test_tracing_as_the_readme_shows_it(self):
        command = re.search(r"(?m)^QZ_TRACE_LEVELS=.*\\\n.*$", DOCS[README])[0]
        shown = self.run_in_shell(f"mkdir build; {command.replace('build/release/examples/', '')}")
        self.assertEqual(shown[0], 0, shown)
        self.assertIn('"id":84', (self.dir / "build/trace.jsonl").read_text())  # an answer of sec__single_acle_perm

    def test_table_of_trace_points(self):
        declared = (SOURCE / "security/ACL/lib/trace_points.h").read_text()
        recorded = set(map(int, re.findall(r"(?:trace|timed)_point<(\d+)", declared)))
        operations = re.findall(r"traced_operation<\s*(\d+),\s+\w+,\s+with_(\w+)<.*?leaves_(\w+)", declared, re.S)
        for entry, arguments, leaving in operations:
            entered = int(entry)
            left = entered + {"arguments": 3, "acl_and": 5}[arguments]
            recorded.update(range(entered, left, 2))
            recorded.update(range(left, left + {"bare": 1, "result": 2, "outputs": 3}[leaving]))
        self.assertEqual(recorded, set(map(int, re.findall(r"\*\*(\d+)\*\*", DOCS[TRACING]))))

    def test_manual_has_every_function(self):
        pages = BUILD / "share/man"
        for library in "security/ACL/lib/libqzacl", "platform/libqz_cu/libqz_cu", "platform/libqz_tr/libqz_tr":
            for function in re.findall(r"(\w+);\n", (SOURCE / f"{library}.map").read_text()):
                _, page = (pages / f"man3/{function}.3").read_text().split(maxsplit=2)[:2]
                self.assertRegex((pages / page).read_text(), rf"(?m)^\.Nm {function}\b")

    def test_manual_has_every_option(self):
        described = re.findall(r"(?m)^\.It Fl (\w)", DOCS[MANUAL])
        _, usage = self.run_in_shell("qzaclfck")
        self.assertEqual(set(described), set(re.findall(r"\s\[?-(\w)\b", usage)))

    @unittest.skipUnless(shutil.which("mandoc"), "there is no mandoc")
    def test_manual_is_sound(self):
        # Without matters of style, such as trailing blanks in output.
        checked = self.run_in_shell("mandoc -T lint -W warning $(grep -L '^[.]so ' man*/*)", BUILD / "share/man")
        self.assertEqual(checked, (0, ""))


if __name__ == "__main__":
    unittest.main(argv=[sys.argv[0]] + [argument for argument in sys.argv[2:] if argument != "--write"])
