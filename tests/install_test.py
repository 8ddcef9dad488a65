"""Installs as an administrator would, builds the example service against that, and asks the shells for completions.

usage: install_test.py BUILD-FOLDER"""
import os
import pty
import re
import select
import shutil
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

BUILD = Path(sys.argv.pop(1)).resolve()
SOURCE = Path(__file__).resolve().parent.parent
CACHE = (BUILD / "CMakeCache.txt").read_text()
PLAIN = "QZ_SANITIZE:STRING=\n" in CACHE and re.search("CMAKE_INSTALL_LIBDIR:.*=lib\n", CACHE)  # none of a packager's
CONSUMER = """cmake_minimum_required(VERSION 3.25)\nproject(consumer C)\nfind_package(qzacl 1.0 REQUIRED)
add_executable(service service.c)\ntarget_link_libraries(service qzacl::qzacl)\n"""
BASH = '. "$0"; COMP_WORDS=($1); COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); _qzaclfck; printf "%s\\n" "${COMPREPLY[@]}"'
ZSH = "fpath=('{}' $fpath); autoload -U compinit; compinit -D; unsetopt automenu; LISTMAX=999; PS1='>''>'\n"


def run(*command, **options):
    done = subprocess.run([*map(str, command)], capture_output=True, text=True, check=False, **options)
    assert done.returncode == 0, f"{command} gave {done.returncode}:\n{done.stdout}{done.stderr}"
    return done.stdout + done.stderr


def ask_zsh(script, line):  # at a terminal, as it completes nowhere else
    pid, terminal = pty.fork()
    if not pid:
        os.execvpe("zsh", ["zsh", "-f", "-i"], os.environ | {"TERM": "dumb"})
    for typed, awaited in ((ZSH.format(script.parent), r"\r>>"), (line + "\t", r"\n>>|\.acl ")):
        os.write(terminal, typed.encode())
        seen = ""
        while not re.search(awaited, seen) and select.select([terminal], [], [], 10)[0]:
            seen += os.read(terminal, 4096).decode()
    os.kill(pid, 9)
    os.waitpid(pid, 0)
    return re.findall(r"(?:^|\n)(-\w)  -- |(\w+\.acl) ", seen)


FISH = "source $argv[1]; complete -C $argv[2]"
SHELLS = {"bash": ("qzaclfck.bash", lambda script, line: run("bash", "--norc", "-c", BASH, script, line)),
          "fish": ("qzaclfck.fish", lambda script, line: run("fish", "--no-config", "-c", FISH, script, line)),
          "zsh": ("_qzaclfck", lambda script, line: "\n".join(map("".join, ask_zsh(script, line))))}


class Install(unittest.TestCase):
    def check(self, prefix, libraries, folder):
        shutil.copytree(SOURCE / "examples", folder, ignore=shutil.ignore_patterns("*.cacl"))
        (folder / "CMakeLists.txt").write_text(CONSUMER)
        flags = run("pkg-config", "--cflags", "--libs", "qzacl", "qz_cu",
                    env=os.environ | {"PKG_CONFIG_PATH": f"{libraries}/pkgconfig"}).split()
        run("cc", "service.c", *flags, "-o", "by-pkg-config", cwd=folder)
        run("cmake", "-B", "made", "-G", "Ninja", f"-Dqzacl_DIR={libraries}/cmake/qzacl", cwd=folder)
        run("cmake", "--build", folder / "made")
        for program in ("by-pkg-config", "made/service"):
            answer = run(folder / program, folder / "service.acl", "carol@there", env={"LD_LIBRARY_PATH": libraries})
            self.assertIn("any other: rql", answer)
        self.assertIn("Syntax:", run(prefix / "bin/qzaclfck", "-h", env={}))

    @unittest.skipUnless(PLAIN and shutil.which("pkg-config"), "needs pkg-config, and a plain build")
    def test_what_is_installed_serves_other_programs_wherever_it_is(self):
        with tempfile.TemporaryDirectory() as name:
            prefix, apart, made = f"{name}/p", f"{name}/libraries", f"{name}/b"
            run("cmake", "--install", BUILD, "--prefix", prefix)
            self.check(Path(prefix), f"{prefix}/lib", Path(name, "one"))
            shutil.rmtree(prefix)
            run("cmake", "-S", SOURCE, "-B", made, "-G", "Ninja", "-DCMAKE_BUILD_TYPE=Debug", "-DQZ_TESTS=OFF",
                "-DCMAKE_UNITY_BUILD=ON", f"-DCMAKE_INSTALL_LIBDIR={apart}", f"-DCMAKE_INSTALL_PREFIX={prefix}")
            run("cmake", "--build", made, "--target", "install")
            self.check(Path(prefix), apart, Path(name, "two"))

    def test_shells_complete_what_the_usage_message_lists(self):
        usage = set(re.findall(r"(?<![\w-])-\w\b", run(BUILD / "bin/qzaclfck", "-h").split("\n\n")[0]))
        os.chdir(SOURCE / "examples")
        for shell, (script, ask) in SHELLS.items():
            if not shutil.which(shell):
                print(f"{shell} is not there to be asked")
                continue
            for line, expected in (("-", usage), ("-c -v -", usage - {"-c", "-v"}), ("-f mist", {"mistakes.acl"})):
                answer = ask(SOURCE / "completions" / script, "qzaclfck " + line).split("\n")
                self.assertEqual({word.split("\t")[0] for word in answer} - {""}, expected, (shell, line))


if __name__ == "__main__":
    unittest.main()
