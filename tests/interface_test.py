"""Checks what other programs compile, link and run against: headers, records, libraries, and the example service.

usage: interface_test.py BUILD-FOLDER"""
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

BUILD = Path(sys.argv.pop(1)).resolve()
SOURCE = Path(__file__).resolve().parent.parent
HEADERS = {"libqz_cu": "cu", "libqz_tr": "tr", "libqzacl": "acl"}
STRICT = ["-Wall", "-Wextra", "-Wpedantic", "-Werror", f"-I{SOURCE / 'include'}"]
C, CXX = ["-std=c99", "-xc"], ["-std=c++20", "-xc++"]
SANITIZED = "QZ_SANITIZE:STRING=\n" not in (BUILD / "CMakeCache.txt").read_text()
# What callers were compiled with: sizes and places in bytes, and values.
RECORDS = """sec_acle_t 32 perm_mask 0 mechanism 4 type 21 identity 24; sec_aclelist_t 16 count 0 acles 8;
    sec_perm_template_t 84 bit 0 letter 4 name 5 description 19; sec_perm_set_t 16 count 0 templates 8;
    sec_acl_buffer_t 16 length 0 data 8; sec_group_ref_t 16 id 0 name 8; cu_error_t 0 code 0 message_id 4"""
VALUES = """S_OK 0 S_ADVISORY 1 S_BAD_PARAMETER 4 S_NO_MEMORY 6 S_UNKNOWN_USER 15 S_ACLE_NOT_FOUND 18 S_INTERNAL 23
    S_CODESET 26 S_BAD_PERMISSION 36 S_FILE_ERROR 37 S_BAD_ACL 42 S_BAD_ACLE 43 S_WARNING 99 S_BAD_FILENAME 105
    ACLE_UNAUTHENTICATED 1 ACLE_ANYOTHER 2 ACLE_USER 4 ACLE_EXPANDED 8 ACLE_GROUP 16 ACLE_USE_ID_HANDLER 128
    ID_HANDLER_EXPANDED 1 ID_HANDLER_USER 2 READ_ACL_TEXT 1 READ_ACL_CACHE 2 READ_ACL_CONVERT 4"""
LAYOUT = {"sizeof acl__default_perm_list": 13 * 84, "sizeof(((sec_acle_t *)0)->mechanism)": 17}
for record, size, places in re.findall(r"(\w+) (\d+)([^;]*)", RECORDS):
    LAYOUT |= {f"sizeof({record})": int(size)} if record != "cu_error_t" else {}  # its size is not callers' to know
    LAYOUT |= {f"offsetof({record}, {name})": int(place) for name, place in re.findall(r"(\w+) (\d+)", places)}
LAYOUT |= {f"SEC_{name}": int(value) for name, value in re.findall(r"(\w+) (\d+)", VALUES)}


def run(*command, **options):
    return subprocess.run(command, stdout=subprocess.PIPE, text=True, check=True, **options).stdout


def declared(header):  # the names of the functions and objects that it has for callers
    text = re.sub(r"/\*.*?\*/", "", (SOURCE / f"include/qz/{header}.h").read_text(), flags=re.S)
    return sorted(re.findall(r"\bextern const \w+ (\w+)", text)
                  + re.findall(r"^QZ_\w+_API (?!extern)[\w\s*]*?(\w+)\(", text, flags=re.M))


class Interface(unittest.TestCase):
    def test_every_header_compiles_alone_and_strictly(self):
        for name, options in (("gcc", C), ("clang", C), ("g++", CXX), ("clang++", CXX)):
            for header in HEADERS.values() if shutil.which(name) else ():
                run(name, *options, *STRICT, "-fsyntax-only", "-", input=f"#include <qz/{header}.h>\nint unused;\n")

    def test_records_and_values_are_what_callers_were_compiled_with(self):
        lines = "".join(f'printf("%lu\\n", (unsigned long)({expression}));\n' for expression in LAYOUT)
        program = ("#include <stddef.h>\n#include <stdio.h>\n#include <qz/acl.h>\n#include <qz/cu.h>\n"
                   f"int main(void) {{\n{lines}return 0; }}\n")
        with tempfile.TemporaryDirectory() as folder:
            run(shutil.which("gcc") or "cc", *C, *STRICT, "-", "-o", f"{folder}/layout", input=program)
            self.assertEqual(dict(zip(LAYOUT, map(int, run(f"{folder}/layout").split()))), LAYOUT)

    def test_libraries_need_each_other_alone_and_export_what_is_declared(self):
        for library, header in HEADERS.items():
            dynamic = run("readelf", "-dW", str(BUILD / f"lib/{library}.so"))
            self.assertEqual(re.findall(r"\(SONAME\).*\[(.*)\]", dynamic), [f"{library}.so.1"])
            foreign = [name for name in re.findall(r"\(NEEDED\).*\[(.*)\]", dynamic)
                       if not name.startswith(("libqz", "libc.so.", "ld-linux"))]
            self.assertTrue(SANITIZED or not foreign, f"{library} needs {foreign}")
            symbols = run("nm", "-D", "--defined-only", str(BUILD / f"lib/{library}.so"))
            self.assertEqual(sorted(re.findall(r" [^A ] (\w+)", symbols)), declared(header), library)

    @unittest.skipIf(SANITIZED, "the sanitizers stand in the place of the hardening")
    def test_binaries_are_hardened(self):
        headers = {"full RELRO": r"GNU_RELRO", "immediate binding": r"FLAGS.*BIND_NOW|FLAGS_1.*NOW",
                   "no executable stack": r"GNU_STACK.* RW +0x", "stack protector": r"__stack_chk_fail"}
        for path in [BUILD / f"lib/{library}.so" for library in HEADERS] + [BUILD / "bin/qzaclfck"]:
            found = run("readelf", "-lWd", "--dyn-syms", str(path))
            for what, pattern in headers.items():
                self.assertRegex(found, pattern, f"{path}: {what}")
            if path.suffix != ".so":
                self.assertRegex(found, r"FLAGS_1.*PIE")
        # What leaves no mark in a binary is read off the commands that made it.
        branches = "-fcf-protection=full " if platform.machine() == "x86_64" else ""
        for entry in json.loads((BUILD / "compile_commands.json").read_text()):
            if "/security/ACL/" in entry["file"] or "/platform/" in entry["file"]:
                self.assertRegex(entry["command"], f"-fstack-clash-protection {branches}-ftrivial-auto-var-init=.*"
                                                  "-D_FORTIFY_SOURCE=3")
        for path in BUILD / "lib/libqzacl.so", BUILD / "bin/qzaclfck":
            self.assertRegex(run("nm", "-D", str(path)), r"U __\w+(?<!stack)_chk@")
            if branches and shutil.which("objdump"):
                self.assertIn("endbr64", run("objdump", "-d", "--no-show-raw-insn", str(path)))

    def test_example_service(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        acl = Path(shutil.copyfile(SOURCE / "examples/service.acl", f"{folder.name}/service.acl"))
        os.utime(acl, (10**9, 10**9))  # a text just written is not taken for cached
        added, kept = "granted by user: r\ndeleted again\n", "has an entry of its own, which stays\n"
        text, cache = "text, 478 bytes, cached", "cache, 478 bytes"

        def serve(requester):
            done = subprocess.run([BUILD / "examples/service", acl, *requester.split()], capture_output=True, text=True)
            return done.returncode, done.stdout, done.stderr.split("Failure")[0]
        for requester, source, answer in (
                ("alice@head.cluster.example operators", text, "granted by user: rwxCqle"),
                ("MALLORY@login.cluster.example operators", cache, "granted by user: nothing"),
                ("carol@login.cluster.example operators", cache, "granted by domain: rql"),
                ("carol@there.example operators AUDITORS", cache, "granted by groups: rwxCqlev"),
                ("carol@there.example staff", cache, "granted by any other: rql")):
            end = kept if "by user" in answer else added
            self.assertEqual(serve(requester), (0, f"read from the {source}\n{answer}\n{end}", ""))
        acl.write_text("# nobody\n")
        self.assertEqual(serve("carol@there"), (0, "read from the text, 0 bytes\nnothing is granted\n" + added, ""))
        acl.write_text("o r\nx r\n")
        self.assertEqual(serve("carol@there"), (1, "", f"{acl}: 3417-179 "))
        self.assertEqual(serve(""), (2, "", "usage: service ACL-FILE USER@HOST [GROUP...]\n"))


if __name__ == "__main__":
    unittest.main()
