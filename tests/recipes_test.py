"""Tries what README.md, docs/recipes.md and docs/tracing.md tell: their code blocks are taken out and run.

Usage: recipes_test.py BUILD_DIR [unittest arguments]; with --write the outputs in the documents are written anew."""
import json
import os
import pathlib
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

SOURCE, BUILD = pathlib.Path(__file__).resolve().parent.parent, pathlib.Path(sys.argv[1]).resolve()
DOCS = {path: path.read_text() for path in (SOURCE / "docs/recipes.md", SOURCE / "docs/tracing.md")}
RECIPES = dict(re.findall(r"<!-- recipe: (.*?) -->\n```\w*\n(.*?)```\n", "".join(DOCS.values()), re.DOTALL))
OUTPUT = re.compile(r"(<!-- output: (.*?) -->\n```\n)(.*?)(?=```\n)", re.DOTALL)
WRITE = "--write" in sys.argv
PLACES = ["examples/mistakes.acl:" + place for place in  # line 1 for duplicates
          "5:158 8:179 11:172 14:145 17:180 20:173 1:157 1:157 1:175 1:174 1:174 43:144".split()]
RUNS = [  # what is done to the ACL and its cache, and who then asks the service
    ("touch -d '2 hours ago' service.acl", "guest@login.cluster.example"),
    ("touch -d '1 hour ago' service.acl.cacl", "mallory@login.cluster.example"), ("true", "eve@example.org strangers"),
    ("chmod 600 service.acl.cacl", "root@head.cluster.example"), ("touch service.acl", "root@head.cluster.example"),
    ("chmod 644 *.cacl; echo >service.acl.cacl; touch -d '1 hour ago' service.acl", "root@head.cluster.example")]


class Readme(unittest.TestCase):
    def test_outputs(self):
        def real(found):  # what the command prints on either stream, run as built instead of through ./dev
            command = found[2].replace("build/release/", f"{BUILD}/").replace("./dev run", f"{BUILD}/bin/qzaclfck")
            with tempfile.TemporaryDirectory() as folder:
                shutil.copytree(SOURCE / "examples", folder + "/examples", ignore=shutil.ignore_patterns("*.cacl"))
                return found[1] + subprocess.run(command, shell=True, cwd=folder, check=False, stdout=subprocess.PIPE,
                                                 stderr=subprocess.STDOUT).stdout.decode()
        readme = SOURCE / "README.md"
        shown, count = OUTPUT.subn(real, readme.read_text())
        if WRITE:
            readme.write_text(shown)
        self.assertEqual((shown, count > 2), (readme.read_text(), True))


@unittest.skipUnless(os.path.exists("/usr/share/i18n/locales/de_DE") and shutil.which("git") and shutil.which("jq")
                     and shutil.which("gencat"), "what the recipes need is not there")
class Recipes(unittest.TestCase):
    def setUp(self):
        self.dir = pathlib.Path(tempfile.mkdtemp()).resolve()
        self.addCleanup(shutil.rmtree, self.dir)
        shutil.copytree(SOURCE / "examples", self.dir / "examples", ignore=shutil.ignore_patterns("*.cacl"))
        for name, text in RECIPES.items():
            (self.dir / name).write_text(text)
            (self.dir / name).chmod(0o755)
        self.environment = {"PATH": f"{BUILD}/bin:{BUILD}/examples:{self.dir}:{os.environ['PATH']}", "LC_ALL": "C",
                            "HOME": str(self.dir), "LOCPATH": str(self.dir)}

    def run_in_shell(self, command, **more):
        done = subprocess.run(command, shell=True, env={**self.environment, **more}, cwd=self.dir, check=False,
                              stdout=subprocess.PIPE, stderr=subprocess.DEVNULL)
        return done.returncode, done.stdout.decode()

    def test_commands(self):
        for command in re.findall("(?:validate: |=/usr/bin/)(qzaclfck .*)(?:%s|/etc/)", "".join(RECIPES.values())):
            self.assertEqual(self.run_in_shell(command + "examples/service.acl"), (0, ""))
            self.assertEqual(self.run_in_shell(command + "examples/mistakes.acl"), (37, ""))
        self.assertTrue((self.dir / "examples/service.acl.cacl").exists())

    def test_commits(self):
        self.run_in_shell("git init repo; mv pre-commit repo/.git/hooks")
        for staged, present, expected in ("service", "mistakes", 0), ("mistakes", "service", 1):
            change = f"cd repo && cp ../examples/{staged}.acl 'a b.acl' && git add . && cp ../examples/{present}.acl *"
            commit = "git -c user.name=x -c user.email=x commit -m x"
            self.assertEqual(self.run_in_shell(f"{change} && {commit}")[0], expected, staged)

    def test_places_of_mistakes(self):
        subprocess.run(["localedef", "-i", "de_DE", "-f", "UTF-8", self.dir / "de_DE.UTF-8"], check=True)
        catalogs = re.search("NLSPATH=(.*)", RECIPES["language"])[1].replace("/usr/local", str(BUILD))
        matcher = json.loads(RECIPES["matcher"])["problemMatcher"][0]["pattern"][0]
        editor = re.search("errorformat=(.*)", RECIPES["vim"])[1].replace("\\ ", " ")
        editor = re.sub("%(.)", lambda part: rf"(?P<{part[1]}>{'.+?' if part[1] in 'fm' else '[0-9]+'})", editor)
        for locale, text in ("C", "The ACL entry at line 5"), ("de_DE.UTF-8", "Der ACL-Eintrag in Zeile 5"):
            _, shown = self.run_in_shell("aclcheck examples/*.acl", LC_ALL=locale, NLSPATH=catalogs)
            for expression, *keys in (matcher["regexp"], *range(1, 4)), (editor, "f", "l", "n"):
                found = [re.match(expression, line).group(*keys) for line in shown.splitlines()]
                self.assertEqual([f"{file}:{line}:{code[-3:]}" for file, line, code in found], PLACES)
            self.assertIn(text, re.match(matcher["regexp"], shown.split("\n")[0])[4])
        self.assertEqual([matcher[name] for name in ("file", "line", "code", "message")], [1, 2, 3, 4])

    def test_outputs(self):
        traced = {"QZ_TRACE_LEVELS": "_SEL:Errors=1,Info=1,API=8,Perf=1", "QZ_TRACE_FILE": "service.trace"}
        shutil.copy(SOURCE / "examples/service.acl", self.dir)
        for step, user in RUNS:
            self.assertEqual(self.run_in_shell(f"({step}) && service service.acl {user} >&2", **traced), (0, ""))
        for path, text in DOCS.items():
            shown = OUTPUT.sub(lambda found: found[1] + self.run_in_shell(found[2])[1].replace(str(self.dir), "/etc"), text)
            if WRITE:
                path.write_text(shown)
            self.assertEqual(*[re.sub(r"\d+:\d+:\d+|\d+(?= us)", "", each) for each in (shown, path.read_text())])

    def test_table_of_trace_points(self):
        calls = re.findall(r"trace_(exit|entry|release_exit|id|data|elapsed|arguments)\((\d+)", "".join(
            path.read_text() for path in (SOURCE / "security").rglob("*.cpp")))
        recorded = {int(number) + more for how, number in calls for more in range(1 + (how == "exit"))}
        self.assertEqual(recorded, set(map(int, re.findall(r"\*\*(\d+)\*\*", "".join(DOCS.values())))))


if __name__ == "__main__":
    unittest.main(argv=[argument for argument in sys.argv if argument not in (sys.argv[1], "--write")])
