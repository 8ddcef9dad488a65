"""Checks what other programs compile, link, install and run against: headers, libraries, packages, and the examples.

usage: interface_test.py BUILD-FOLDER"""
import itertools
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

BUILD, SOURCE = Path(sys.argv.pop(1)).resolve(), Path(__file__).resolve().parent.parent
CACHE = dict(re.findall(r"^(\w+):\w+=(.*)$", (BUILD / "CMakeCache.txt").read_text(), re.M))
SANITIZED, COMMAND = CACHE["QZ_SANITIZE"], BUILD / "bin/qzaclfck"
HEADERS = {"libqz_cu": "cu.h", "libqz_tr": "tr.h", "libqzacl": "acl.h"}
STRICT = [*"-Wall -Wextra -Wpedantic -Wconversion -Wshadow -Werror -fsyntax-only".split(), f"-I{SOURCE}/include", "-"]
# What callers were compiled with: sizes and places in bytes, and values.
RECORDS = """sec_acle_t 32 perm_mask 0 mechanism 4 type 21 identity 24; sec_aclelist_t 16 count 0 acles 8;
    sec_perm_template_t 84 bit 0 letter 4 name 5 description 19; sec_perm_set_t 16 count 0 templates 8;
    sec_acl_buffer_t 16 length 0 data 8; sec_group_ref_t 16 id 0 name 8"""
VALUES = """S_OK 0 S_ADVISORY 1 S_BAD_PARAMETER 4 S_NO_MEMORY 6 S_UNKNOWN_USER 15 S_ACLE_NOT_FOUND 18 S_INTERNAL 23
    S_CODESET 26 S_BAD_PERMISSION 36 S_FILE_ERROR 37 S_BAD_ACL 42 S_BAD_ACLE 43 S_WARNING 99 S_BAD_FILENAME 105
    ACLE_UNAUTHENTICATED 1 ACLE_ANYOTHER 2 ACLE_USER 4 ACLE_EXPANDED 8 ACLE_GROUP 16 ACLE_USE_ID_HANDLER 128
    ID_HANDLER_EXPANDED 1 ID_HANDLER_USER 2 READ_ACL_TEXT 1 READ_ACL_CACHE 2 READ_ACL_CONVERT 4"""
FACTS = ["sizeof acl__default_perm_list == 13 * 84", "sizeof ((sec_acle_t *)0)->mechanism == 17",
         "sizeof ((sec_group_ref_t *)0)->id == 8", "offsetof(cu_error_t, message_id) == 4"]
for record, size, places in re.findall(r"(\w+) (\d+)([^;]*)", RECORDS):
    FACTS += [f"sizeof({record}) == {size}"]
    FACTS += [f"offsetof({record}, {name}) == {place}" for name, place in re.findall(r"(\w+) (\d+)", places)]
FACTS += [f"SEC_{name} == {value}" for name, value in re.findall(r"(\w+) (\d+)", VALUES)]

CONSUMER = """cmake_minimum_required(VERSION 3.25)\nproject(consumer C)\nfind_package(qzacl 1.0 REQUIRED)
add_executable(service service.c)\ntarget_link_libraries(service qzacl::qzacl)\n"""
SERVICE, SCRIPT = (SOURCE / "examples/service.acl").read_text(), SOURCE / "examples/python/service.py"
SERVICES, PYTHON = (BUILD / "examples/service", BUILD / "examples/service_cpp"), (sys.executable, "-B")
CASES = [  # an ACL, its size when it is compiled, who asks, and the answer of the example services
    (SERVICE, 478, "alice@head.cluster.example operators", "granted by user: rwxCqle"),
    (SERVICE, 478, "MALLORY@login.cluster.example operators", "granted by user: nothing"),
    (SERVICE, 478, "carol@login.cluster.example operators", "granted by expanded: rql"),
    (SERVICE, 478, "carol@there.example operators AUDITORS staff", "granted by group: rwxCqlev"),
    (SERVICE, 478, "carol@there.example staff", "granted by any other: rql"),
    ("n r\n", 22, "carol@there", "nothing is granted"), ("# nobody\n", 0, "carol@there", "nothing is granted"),
    ("", 0, "carol@there", "nothing is granted"), ("n r\n", 22, "zoë@there", "nothing is granted"),
    # A user-expanded entry is a host, or with a dot in front a domain.
    ("e unix cluster.example r\n", 43, "carol@Cluster.EXAMPLE", "granted by expanded: r"),
    ("e unix cluster.example r\n", 43, "carol@evilcluster.example", "nothing is granted"),
    ("e unix cluster.example r\n", 43, "carol@head.cluster.example", "nothing is granted"),
    ("e unix .Cluster.example r\n", 44, "carol@head.cluster.EXAMPLE", "granted by expanded: r"),
    ("e unix .cluster.example r\n", 44, "carol@evilcluster.example", "nothing is granted"),
    ("e unix .cluster.example r\n", 44, "carol@cluster.example", "nothing is granted")]
ADDED, KEPT = "granted by user: r\ndeleted again\n", "has an entry of its own, which stays\n"
UTF8 = {**os.environ, "LC_ALL": "C.UTF-8"}
ENVIRONMENT = {**UTF8, "QZ_LIBRARY_DIR": str(BUILD / "lib"), "PYTHONPATH": str(SOURCE / "bindings/python")}
if "address" in SANITIZED:  # its runtime must come first; what Python never frees is no leak of ours
    asked = CACHE["CMAKE_CXX_COMPILER"], f"-print-file-name=libclang_rt.asan-{platform.machine()}.so"
    ENVIRONMENT |= {"LD_PRELOAD": subprocess.check_output(asked, text=True).strip(), "ASAN_OPTIONS": "detect_leaks=0"}
LOADABLE = not SANITIZED or os.path.exists(ENVIRONMENT.get("LD_PRELOAD", ""))
BASH = '. "$0"; COMP_WORDS=($1); COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); _qzaclfck; printf "%s\\n" "${COMPREPLY[@]}"'
COMPLETIONS = {"qzaclfck.bash": ("bash", "--norc", "-c", BASH),
               "qzaclfck.fish": ("fish", "--no-config", "-c", "source $argv[1]; complete -C $argv[2]")}


def run(*command, status=0, **options):  # gives what is printed
    done = subprocess.run([*map(str, command)], capture_output=True, text=True, check=False, **options)
    assert done.returncode == status, f"{command} gave {done.returncode}:\n{done.stdout}{done.stderr}"
    return done.stdout + done.stderr


def declared(header):  # the names of the functions and objects that it has for callers
    text = re.sub(r"/\*.*?\*/", "", (SOURCE / "include/qz" / header).read_text(), flags=re.S)
    return sorted(re.findall(r"\bextern const \w+ (\w+)", text)
                  + re.findall(r"^QZ_\w+_API (?!extern)[\w\s*]*?(\w+)\(", text, flags=re.M))


class Interface(unittest.TestCase):
    def setUp(self):
        self.dir = Path(tempfile.mkdtemp())
        self.addCleanup(shutil.rmtree, self.dir)

    def write(self, text):
        (self.dir / "service.acl").write_text(text)
        (self.dir / "service.acl.cacl").unlink(missing_ok=True)
        os.utime(self.dir / "service.acl", (10**9, 10**9))  # a text just written is not taken for cached

    def test_every_header_compiles_alone_and_strictly(self):
        for compiler in filter(shutil.which, ("gcc", "clang", "g++", "clang++")):
            cxx = ["-xc++", "-fno-exceptions", "-fno-rtti"] if "++" in compiler else []
            headers = (path.name for path in (SOURCE / "include/qz").glob("*.h*" if cxx else "*.h"))
            for standard, header in itertools.product(("c++17", "c++20") if cxx else ("c99",), headers):
                if standard == "c++20" and header not in ("acl.hpp", "service.hpp"):
                    continue  # the parts of service.hpp are in it
                command = compiler, f"-std={standard}", *(cxx or ["-xc"]), *STRICT
                self.assertEqual(run(*command, input=f"#include <qz/{header}>\nint unused;\n"), "")

    def test_records_and_values_are_what_callers_were_compiled_with(self):
        lines = ["#include <stddef.h>", "#include <qz/acl.h>", "#include <qz/cu.h>"]
        lines += [f'_Static_assert({fact}, "");' for fact in FACTS]
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

    @unittest.skipIf(SANITIZED, "the sanitizers stand in the place of the hardening")
    def test_binaries_are_hardened(self):
        marks = ["GNU_RELRO", "FLAGS.*BIND_NOW|FLAGS_1.*NOW", "GNU_STACK.* RW +0x", "__stack_chk_fail",
                 r" __\w+(?<!stack)_chk@", "FLAGS_1.*PIE"]
        for name, count in ("libqz_cu.so", 4), ("libqz_tr.so", 4), ("libqzacl.so", 5), ("../bin/qzaclfck", 6):
            found = run("readelf", "-lWd", "--dyn-syms", BUILD / "lib" / name)
            for mark in marks[:count]:
                self.assertRegex(found, mark, name)
            if platform.machine() == "x86_64" and shutil.which("objdump"):
                self.assertIn("endbr64", run("objdump", "-d", "--no-show-raw-insn", BUILD / "lib" / name))
        # What leaves no mark in a binary is read off the commands that made it.
        branches = "-fcf-protection=full " if platform.machine() == "x86_64" else ""
        flags = f"-fstack-clash-protection {branches}-ftrivial-auto-var-init=.*-D_FORTIFY_SOURCE=3"
        for entry in json.loads((BUILD / "compile_commands.json").read_text()):
            if re.search("/(security/ACL|platform)/", entry["file"]):
                self.assertRegex(entry["command"], flags)

    def test_example_services(self):
        for text, size, requester, answer in CASES:
            self.write(text)
            end = KEPT if "by user" in answer else ADDED
            sources = [f"text, {size} bytes, cached", f"cache, {size} bytes"] if size else ["text, 0 bytes"] * 2
            for program, source in zip(SERVICES, sources):
                shown = run(program, "service.acl", *requester.split(), cwd=self.dir, env=UTF8)
                self.assertEqual(shown, f"read from the {source}\n{answer}\n{end}", program)
            if LOADABLE:
                shown = run(*PYTHON, SCRIPT, "service.acl", *requester.split(), cwd=self.dir, env=ENVIRONMENT)
                self.assertEqual(shown.splitlines()[-1], answer)
        self.write("o r\nx r\n")
        for program in SERVICES:
            told = run(program, "service.acl", "carol@there", status=1, cwd=self.dir)
            self.assertRegex(told, r"^service\.acl: 3417-179 (?s:.*)Orvex Guide\.\n$")

    def test_example_services_answer_the_cases(self):
        self.write(SERVICE)
        lines = (SOURCE / "examples/service.cases").read_text().splitlines()
        for mechanism, user, *groups, wanted, expected in filter(None, (line.partition("#")[0].split() for line in lines)):
            if mechanism == "unix" and "@" in user:  # whom they can ask about
                for program in SERVICES:
                    shown = run(program, "service.acl", user, *(group[1:] for group in groups), cwd=self.dir)
                    granted = re.search(r"granted by [a-z ]+: (\w+)", shown)[1].replace("nothing", "")
                    self.assertEqual("yes" if set(wanted) <= set(granted) else "no", expected, (user, groups, shown))

    def consume(self, prefix, libraries, folder):
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
        for document in prefix.rglob("*.md"):
            for target in re.findall(r"\]\(([^):]*)\)", document.read_text()):
                self.assertTrue((document.parent / target).exists(), (document, target))

    @unittest.skipIf(SANITIZED or CACHE["CMAKE_INSTALL_LIBDIR"] != "lib" or not shutil.which("pkg-config"),
                     "needs pkg-config, and a plain build that is no packager's")
    def test_what_is_installed_serves_other_programs_wherever_it_is(self):
        prefix, apart, made = self.dir / "p", f"{self.dir}/libraries", self.dir / "b"
        run("cmake", "--install", BUILD, "--prefix", prefix)
        self.consume(prefix, f"{prefix}/lib", self.dir / "one")
        shutil.rmtree(prefix)
        run("cmake", "-S", SOURCE, "-B", made, "-G", "Ninja", "-DCMAKE_BUILD_TYPE=Debug", "-DQZ_TESTS=OFF",
            "-DCMAKE_UNITY_BUILD=ON", f"-DCMAKE_INSTALL_LIBDIR={apart}", f"-DCMAKE_INSTALL_PREFIX={prefix}")
        run("cmake", "--build", made, "--target", "install")
        self.consume(prefix, apart, self.dir / "two")

    def test_shells_complete_the_verbs_of_the_companion(self):
        listed = run(BUILD / "bin/qzacl", "--help")
        usages = dict(re.findall(r"(?m)^  qzacl (\w+) (.*)", listed))
        verbs, common = set(usages), {"--help", "--json", "--permissions"}
        options = {verb: set(re.findall(r"(?<=[ [])-{1,2}\w+", usage)) | common for verb, usage in usages.items()}
        self.assertIn("ask", verbs)
        if shutil.which("bash"):
            shell = *COMPLETIONS["qzaclfck.bash"][:-1], BASH.replace("_qzaclfck", "_qzacl")
            script = SOURCE / "completions/qzacl.bash"
            self.assertEqual(set(run(*shell, script, "qzacl s").split()), {each for each in verbs if each[0] == "s"})
            for verb in verbs:
                self.assertEqual(set(run(*shell, script, f"qzacl --json {verb} -").split()), options[verb], verb)
            self.assertEqual(run(*shell, script, "qzacl ask mist", cwd=SOURCE / "examples"), "mistakes.acl\n")
        if shutil.which("fish"):
            answer = run(*COMPLETIONS["qzaclfck.fish"], SOURCE / "completions/qzacl.fish", "qzacl ")
            self.assertEqual({word.split("\t")[0] for word in answer.splitlines()}, verbs)
        if shutil.which("zsh"):
            asked = run("zsh", "-fc", '_arguments() { print -l -- $@ }; . "$0"', SOURCE / "completions/_qzacl")
            self.assertEqual(set(re.findall(r"(?m)^(?:\(- \*\)|\*)?(-[\w-]+)\[", asked)), set().union({"-h"}, *options.values()))

    def test_shells_complete_what_the_usage_message_lists(self):
        usage = set(re.findall(r"(?<![\w-])-\w\b", run(COMMAND, "-h").split("\n\n")[0]))
        told = {"-": usage, "-c -v -": usage - {"-c", "-v"}, "-f mist": {"mistakes.acl"}}
        for (script, ask), line in itertools.product(COMPLETIONS.items(), told):
            if shutil.which(ask[0]):
                answer = run(*ask, SOURCE / "completions" / script, "qzaclfck " + line, cwd=SOURCE / "examples")
                self.assertEqual({word.split("\t")[0] for word in answer.splitlines()}, told[line], (script, line))
        if shutil.which("zsh"):  # which completes at a terminal only: what the script asks of it
            asked = run("zsh", "-fc", '_arguments() { print -l -- $@ }; . "$0"', SOURCE / "completions/_qzaclfck")
            self.assertEqual(set(re.findall(r"(?m)^(?:\(- \*\))?(-\w)\[", asked)), usage)


if __name__ == "__main__":
    unittest.main()
