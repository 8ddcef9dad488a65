"""Checks what other programs compile, link, install and run against: headers, libraries, packages, and the examples.

usage: interface_test.py BUILD-FOLDER [unittest arguments]"""
import json
import os
import platform
import re
import shutil
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

from command_case import BUILD, SOURCE, rows

CACHE = dict(re.findall(r"^(\w+):\w+=(.*)$", (BUILD / "CMakeCache.txt").read_text(), re.M))
SANITIZED = CACHE["QZ_SANITIZE"]
COMMAND = BUILD / "bin/qzaclfck"
IS_X86_64 = platform.machine() == "x86_64"
HEADERS = {"libqz_cu": "cu.h", "libqz_tr": "tr.h", "libqzacl": "acl.h"}
WARNINGS = "-Wall -Wextra -Wpedantic -Wconversion -Wshadow -Werror".split()
STRICT = [*WARNINGS, "-fsyntax-only", f"-I{SOURCE}/include", "-"]

# What callers were compiled with: sizes and places in bytes, and values.
RECORDS = """sec_acle_t 32 perm_mask 0 mechanism 4 type 21 identity 24; sec_aclelist_t 16 count 0 acles 8;
    sec_perm_template_t 84 bit 0 letter 4 name 5 description 19; sec_perm_set_t 16 count 0 templates 8;
    sec_acl_buffer_t 16 length 0 data 8; sec_group_ref_t 16 id 0 name 8"""
VALUES = """S_OK 0 S_ADVISORY 1 S_BAD_PARAMETER 4 S_NO_MEMORY 6 S_UNKNOWN_USER 15 S_ACLE_NOT_FOUND 18 S_INTERNAL 23
    S_CODESET 26 S_BAD_PERMISSION 36 S_FILE_ERROR 37 S_BAD_ACL 42 S_BAD_ACLE 43 S_WARNING 99 S_BAD_FILENAME 105
    ACLE_UNAUTHENTICATED 1 ACLE_ANYOTHER 2 ACLE_USER 4 ACLE_EXPANDED 8 ACLE_GROUP 16 ACLE_USE_ID_HANDLER 128
    ID_HANDLER_EXPANDED 1 ID_HANDLER_USER 2 READ_ACL_TEXT 1 READ_ACL_CACHE 2 READ_ACL_CONVERT 4"""
NAMED_NUMBERS = re.compile(r"(\w+) (\d+)")

CONSUMER = """cmake_minimum_required(VERSION 3.25)
project(consumer C)
find_package(qzacl 1.0 REQUIRED)
add_executable(service service.c)
target_link_libraries(service qzacl::qzacl)
"""
SERVICES = (BUILD / "examples/service", BUILD / "examples/service_cpp")
PYTHON_SERVICE = (sys.executable, "-B", SOURCE / "examples/python/service.py")
UTF8 = {**os.environ, "LC_ALL": "C.UTF-8"}
FOR_PYTHON = {**UTF8, "QZ_LIBRARY_DIR": str(BUILD / "lib"), "PYTHONPATH": str(SOURCE / "bindings/python")}
if "address" in SANITIZED:  # its runtime must come first; what Python never frees is not our leak
    ASKED = CACHE["CMAKE_CXX_COMPILER"], f"-print-file-name=libclang_rt.asan-{platform.machine()}.so"
    FOR_PYTHON["LD_PRELOAD"] = subprocess.check_output(ASKED, text=True).strip()
    FOR_PYTHON["ASAN_OPTIONS"] = "detect_leaks=0"
CAN_LOAD = not SANITIZED or os.path.exists(FOR_PYTHON.get("LD_PRELOAD", ""))

# How a shell is asked: its completion script and the line so far are the arguments.
BASH = """. "$0"
COMP_WORDS=($1)
COMP_CWORD=$((${#COMP_WORDS[@]} - 1))
_PROGRAM
printf "%s\\n" "${COMPREPLY[@]}"
"""
FISH = "source $argv[1]; complete -C $argv[2]"
# It completes only at a terminal, so this prints what its script asks for.
ZSH = '_arguments() { print -l -- $@ }; . "$0"'


def run(*command, status=0, **options):
    """Returns the output."""
    done = subprocess.run([*map(str, command)], capture_output=True, text=True, check=False, **options)
    assert done.returncode == status, f"{command} gave {done.returncode}:\n{done.stdout}{done.stderr}"
    return done.stdout + done.stderr


def declared(header):
    """The names of the functions and objects that a header has for callers."""
    text = re.sub(r"/\*.*?\*/", "", (SOURCE / "include/qz" / header).read_text(), flags=re.S)
    objects = re.findall(r"\bextern const \w+ (\w+)", text)
    functions = re.findall(r"^QZ_\w+_API (?!extern)[\w\s*]*?(\w+)\(", text, flags=re.M)
    return sorted(objects + functions)


def facts():
    """The facts about records and values, as conditions in C."""
    yield "sizeof acl__default_perm_list == 13 * 84"
    yield "sizeof ((sec_acle_t *)0)->mechanism == 17"
    yield "sizeof ((sec_group_ref_t *)0)->id == 8"
    yield "offsetof(cu_error_t, message_id) == 4"
    for record in RECORDS.split(";"):
        (name, size), *places = NAMED_NUMBERS.findall(record)
        yield f"sizeof({name}) == {size}"
        for field, place in places:
            yield f"offsetof({name}, {field}) == {place}"
    for name, value in NAMED_NUMBERS.findall(VALUES):
        yield f"SEC_{name} == {value}"


def service_cases():
    """The rows of example_services.cases: an ACL, the size of its cache, who asks, and the answer."""
    for text, size, requester, answer in rows("example_services.cases"):
        if text.startswith("examples/"):
            text = (SOURCE / text).read_text()
        text = text.replace("(nothing)", "").replace(" /", "\n")
        yield text, int(size.split()[0]), requester.split(), answer


def options_in(text):
    return set(re.findall(r"(?<![\w-])-{1,2}\w+", text))


class Interface(unittest.TestCase):
    def setUp(self):
        self.dir = Path(tempfile.mkdtemp())
        self.addCleanup(shutil.rmtree, self.dir)

    def write(self, text):
        (self.dir / "service.acl").write_text(text)
        (self.dir / "service.acl.cacl").unlink(missing_ok=True)
        os.utime(self.dir / "service.acl", (10**9, 10**9))  # a text just written is not taken for cached

    def ask(self, program, *requester, **options):
        return run(program, "service.acl", *requester, cwd=self.dir, env=UTF8, **options)

    def compile(self, compiler, *options):
        for path in (SOURCE / "include/qz").glob("*.h*" if "++" in compiler else "*.h"):
            # service.hpp includes the others.
            if "-std=c++20" in options and path.name not in ("acl.hpp", "service.hpp"):
                continue
            includes = f"#include <qz/{path.name}>\nint unused;\n"
            self.assertEqual(run(compiler, *options, *STRICT, input=includes), "")

    def test_every_header_compiles_alone_and_strictly(self):
        for compiler in filter(shutil.which, ("gcc", "clang")):
            self.compile(compiler, "-std=c99", "-xc")
        for compiler in filter(shutil.which, ("g++", "clang++")):
            for standard in ("c++17", "c++20"):
                self.compile(compiler, f"-std={standard}", "-xc++", "-fno-exceptions", "-fno-rtti")

    def test_records_and_values_are_what_callers_were_compiled_with(self):
        lines = ["#include <stddef.h>", "#include <qz/acl.h>", "#include <qz/cu.h>"]
        lines += [f'_Static_assert({fact}, "");' for fact in facts()]
        run("cc", "-std=c11", "-xc", *STRICT, input="\n".join(lines) + "\n")

    def test_libraries_need_each_other_alone_and_export_what_is_declared(self):
        for library, header in HEADERS.items():
            dynamic = run("readelf", "-dW", BUILD / f"lib/{library}.so")
            self.assertEqual(re.findall(r"\(SONAME\).*\[(.*)\]", dynamic), [f"{library}.so.1"])
            self.assertRegex(dynamic, "FLAGS_1.*NODELETE")  # ends of threads, and forks, call into it
            foreign = re.findall(r"\(NEEDED\).*\[((?!libqz|libc\.so\.|ld-linux).*)\]", dynamic)
            self.assertTrue(SANITIZED or not foreign, f"{library} needs {foreign}")
            symbols = run("nm", "-D", "--defined-only", BUILD / f"lib/{library}.so")
            self.assertEqual(sorted(re.findall(r" [^A ] (\w+)", symbols)), declared(header), library)

    @unittest.skipIf(SANITIZED, "the sanitizers replace the hardening")
    def test_binaries_are_hardened(self):
        of_libraries = ["GNU_RELRO", "FLAGS.*BIND_NOW|FLAGS_1.*NOW", "GNU_STACK.* RW +0x", "__stack_chk_fail"]
        with_checked_calls = [*of_libraries, r" __\w+(?<!stack)_chk@"]
        self.expect_marks("lib/libqz_cu.so", of_libraries)
        self.expect_marks("lib/libqz_tr.so", of_libraries)
        self.expect_marks("lib/libqzacl.so", with_checked_calls)
        self.expect_marks("bin/qzaclfck", [*with_checked_calls, "FLAGS_1.*PIE"])

    def expect_marks(self, name, marks):
        found = run("readelf", "-lWd", "--dyn-syms", BUILD / name)
        for mark in marks:
            self.assertRegex(found, mark, name)
        if IS_X86_64 and shutil.which("objdump"):
            self.assertIn("endbr64", run("objdump", "-d", "--no-show-raw-insn", BUILD / name))

    @unittest.skipIf(SANITIZED, "the sanitizers replace the hardening")
    def test_hardening_that_leaves_no_mark_was_asked_for(self):
        branches = "-fcf-protection=full " if IS_X86_64 else ""
        flags = f"-fstack-clash-protection {branches}-ftrivial-auto-var-init=.*-D_FORTIFY_SOURCE=3"
        for entry in json.loads((BUILD / "compile_commands.json").read_text()):
            if re.search("/(security/ACL|platform)/", entry["file"]):
                self.assertRegex(entry["command"], flags)

    def test_example_services(self):
        for text, size, requester, answer in service_cases():
            self.write(text)
            end = "has an entry of its own, which stays" if "by user" in answer else "granted by user: r\ndeleted again"
            at_first = f"text, {size} bytes, cached" if size else "text, 0 bytes"
            then = f"cache, {size} bytes" if size else "text, 0 bytes"
            for program, source in zip(SERVICES, (at_first, then)):
                shown = self.ask(program, *requester)
                self.assertEqual(shown, f"read from the {source}\n{answer}\n{end}\n", program)
            if CAN_LOAD:
                shown = run(*PYTHON_SERVICE, "service.acl", *requester, cwd=self.dir, env=FOR_PYTHON)
                self.assertEqual(shown.splitlines()[-1], answer)

    def test_example_services_tell_of_mistakes(self):
        self.write("o r\nx r\n")
        for program in SERVICES:
            told = self.ask(program, "carol@there", status=1)
            self.assertRegex(told, r"^service\.acl: 3417-179 (?s:.*)Orvex Guide\.\n$")

    def consume(self, prefix, libraries, folder):
        """Builds and runs the example with the installed files."""
        shutil.copytree(SOURCE / "examples", folder, ignore=shutil.ignore_patterns("*.cacl"))
        (folder / "CMakeLists.txt").write_text(CONSUMER)
        packages = os.environ | {"PKG_CONFIG_PATH": f"{libraries}/pkgconfig"}
        flags = run("pkg-config", "--cflags", "--libs", "qzacl", "qz_cu", env=packages).split()
        run("cc", "service.c", *flags, "-o", "by-pkg-config", cwd=folder)
        run("cmake", "-B", "made", "-G", "Ninja", f"-Dqzacl_DIR={libraries}/cmake/qzacl", cwd=folder)
        run("cmake", "--build", folder / "made")
        for program in ("by-pkg-config", "made/service"):
            answer = run(folder / program, folder / "service.acl", "carol@there", env={"LD_LIBRARY_PATH": libraries})
            self.assertIn("any other: rql", answer)
        self.assertIn("Syntax:", run(prefix / "bin/qzaclfck", "-h", env={}))
        for document in prefix.rglob("*.md"):
            for target in re.findall(r"\]\(([^):]*)\)", document.read_text()):
                self.assertTrue((document.parent / target).exists(), (document, target))

    @unittest.skipIf(SANITIZED or CACHE["CMAKE_INSTALL_LIBDIR"] != "lib" or not shutil.which("pkg-config"),
                     "needs pkg-config, and a plain build that is no packager's")
    def test_what_is_installed_serves_other_programs_wherever_it_is(self):
        prefix = self.dir / "p"
        run("cmake", "--install", BUILD, "--prefix", prefix)
        self.consume(prefix, f"{prefix}/lib", self.dir / "one")
        shutil.rmtree(prefix)
        apart = f"{self.dir}/libraries"
        places = f"-DCMAKE_INSTALL_LIBDIR={apart}", f"-DCMAKE_INSTALL_PREFIX={prefix}"
        options = "-DCMAKE_BUILD_TYPE=Debug", "-DCMAKE_UNITY_BUILD=ON", "-DQZ_TESTS=OFF"
        run("cmake", "-S", SOURCE, "-B", self.dir / "b", "-G", "Ninja", *places, *options)
        run("cmake", "--build", self.dir / "b", "--target", "install")
        self.consume(prefix, apart, self.dir / "two")


class Completions(unittest.TestCase):
    """What a shell offers, where it is installed."""

    @classmethod
    def setUpClass(cls):
        cls.usage = options_in(run(COMMAND, "-h").split("\n\n")[0])
        companion = BUILD / "bin/qzacl"
        usages = re.findall(r"(?m)^  qzacl (\w+) (.*)", run(companion, "--help")) if companion.exists() else []
        common = {"--help", "--json", "--permissions"}
        cls.options_of_verbs = {verb: options_in(usage) | common for verb, usage in usages}
        cls.verbs = set(cls.options_of_verbs)

    def offered(self, shell, script, line):
        if not shutil.which(shell):
            self.skipTest(f"there is no {shell}")
        program = script.split(".")[0]
        in_bash = ("bash", "--norc", "-c", BASH.replace("PROGRAM", program))
        in_fish = ("fish", "--no-config", "-c", FISH)
        ask = in_bash if shell == "bash" else in_fish
        answer = run(*ask, SOURCE / "completions" / script, line, cwd=SOURCE / "examples")
        return {each.split("\t")[0] for each in answer.splitlines()}

    def offered_by_zsh(self, script):
        if not shutil.which("zsh"):
            self.skipTest("there is no zsh")
        asked = run("zsh", "-fc", ZSH, SOURCE / "completions" / script)
        return set(re.findall(r"(?m)^(?:\(- \*\)|\*)?(-[\w-]+)\[", asked))

    def test_bash_and_fish_complete_the_checker(self):
        for shell in "bash", "fish":
            with self.subTest(shell):
                script = "qzaclfck." + shell
                self.assertEqual(self.offered(shell, script, "qzaclfck -"), self.usage)
                self.assertEqual(self.offered(shell, script, "qzaclfck -c -v -"), self.usage - {"-c", "-v"})
                self.assertEqual(self.offered(shell, script, "qzaclfck -f mist"), {"mistakes.acl"})

    def test_bash_completes_the_companion(self):
        begins_with_s = {verb for verb in self.verbs if verb.startswith("s")}
        self.assertEqual(self.offered("bash", "qzacl.bash", "qzacl s"), begins_with_s)
        self.assertEqual(self.offered("bash", "qzacl.bash", "qzacl -g ops s"), begins_with_s)
        self.assertEqual(self.offered("bash", "qzacl.bash", "qzacl ask mist"), {"mistakes.acl"})
        for verb, options in self.options_of_verbs.items():
            self.assertEqual(self.offered("bash", "qzacl.bash", f"qzacl --json {verb} -"), options, verb)

    def test_fish_completes_the_companion(self):
        self.assertIn("ask", self.verbs)
        self.assertEqual(self.offered("fish", "qzacl.fish", "qzacl "), self.verbs)

    def test_zsh_completes_both(self):
        self.assertEqual(self.offered_by_zsh("_qzaclfck"), self.usage)
        self.assertEqual(self.offered_by_zsh("_qzacl"), {"-h"}.union(*self.options_of_verbs.values()))


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1] + sys.argv[2:])
