"""Checks the library in C++ and Python: acl.hpp compiles wherever it may be included, and the examples agree.

usage: bindings_test.py BUILD-FOLDER"""
import os
import re
import shutil
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

BUILD, SOURCE = Path(sys.argv.pop(1)).resolve(), Path(__file__).resolve().parent.parent
STRICT = "-Wall -Wextra -Wpedantic -Wconversion -Wshadow -Werror -fno-exceptions -fno-rtti -c -xc++ service.acl".split()
CACHE = dict(re.findall(r"^(\w+):\w+=(.*)$", (BUILD / "CMakeCache.txt").read_text(), re.M))
SERVICE, SCRIPT = (SOURCE / "examples/service.acl").read_text(), SOURCE / "examples/python/qzacl.py"
CASES = [(text, "service.acl", *requester.split()) for text, requester in (
    (SERVICE, "alice@head.cluster.example operators"), (SERVICE, "MALLORY@login.cluster.example operators"),
    (SERVICE, "carol@login.cluster.example operators"), (SERVICE, "carol@there operators AUDITORS staff"),
    (SERVICE, "carol@there staff"), ("n r\n", "carol@there"), ("# nobody\n", "carol@there"), ("x r\n", "carol@there"))]
ENVIRONMENT = {**os.environ, "QZ_LIBRARY_DIR": str(BUILD / "lib"), "PYTHONPATH": str(SCRIPT.parent)}
if "address" in CACHE["QZ_SANITIZE"]:  # its runtime must come first; what Python never frees is no leak of ours
    ask = CACHE["CMAKE_CXX_COMPILER"], f"-print-file-name=libclang_rt.asan-{os.uname().machine}.so"
    ENVIRONMENT |= {"LD_PRELOAD": subprocess.check_output(ask, text=True).strip(), "ASAN_OPTIONS": "detect_leaks=0"}
LOADABLE = not CACHE["QZ_SANITIZE"] or os.path.exists(ENVIRONMENT.get("LD_PRELOAD", ""))


def run_on(text, *command, **options):  # status, output and errors, in a folder with the text as service.acl
    with tempfile.TemporaryDirectory() as folder:
        Path(folder, "service.acl").write_text(text)
        os.utime(f"{folder}/service.acl", (10**9, 10**9))  # a text just written is not taken for cached
        done = subprocess.run(command, cwd=folder, capture_output=True, text=True, **options)
    return done.returncode, done.stdout.splitlines(), done.stderr.splitlines()


class Bindings(unittest.TestCase):
    def test_header_compiles_alone_and_strictly(self):
        for compiler in filter(shutil.which, ("g++", "clang++")):
            for command in (compiler, "-std=c++17", *STRICT), (compiler, "-std=c++20", *STRICT):
                self.assertEqual(run_on("#include <qz/acl.hpp>\n", *command, f"-I{SOURCE}/include"), (0, [], []))

    def test_service_in_cpp(self):
        for text, *arguments in CASES:
            in_c, in_cpp = (run_on(text, BUILD / "examples" / name, *arguments) for name in ("service", "service_cpp"))
            self.assertEqual(in_cpp, in_c, arguments)

    @unittest.skipUnless(LOADABLE, f"Python has no runtime for the sanitizers {CACHE['QZ_SANITIZE']}")
    def test_python(self):
        for text, *arguments in CASES:
            status, said, errors = run_on(text, BUILD / "examples/service", *arguments)
            shown = filter(None, run_on(text, BUILD / "bin/qzaclfck", "-vf", "service.acl")[2] if status == 0 else ())
            code, lines, failure = run_on(text, sys.executable, "-B", SCRIPT, *arguments, env=ENVIRONMENT)
            self.assertEqual((code, sorted(lines), failure), (status, sorted([*shown, *said[1:2]]), errors), arguments)
        program = """import qzacl
qzacl.register_expanded("unix", lambda requested, entry: {}["key"])
with qzacl.Acl.read("service.acl") as acl: print(acl.expanded("unix", "carol@a.example"))
try: acl.read("missing")
except qzacl.Error as error: print(error.code, error.message_id > 0, error.text[:8], list(acl))"""
        status, said, errors = run_on("e unix .example r\n", sys.executable, "-Bc", program, env=ENVIRONMENT)
        self.assertEqual((status, said, errors[-1:]), (0, ["None", "37 True 3417-135 []"], ["KeyError: 'key'"]))


if __name__ == "__main__":
    unittest.main()
