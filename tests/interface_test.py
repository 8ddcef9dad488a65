#!/usr/bin/env python3
"""Checks what other programs compile, link and run against: headers, records, libraries, and the example service.

usage: interface_test.py BUILD-FOLDER
"""
import os
import re
import shutil
import subprocess
import sys
import tempfile
import time
import unittest
from pathlib import Path

BUILD = Path(sys.argv.pop(1)).resolve()
SOURCE = Path(__file__).resolve().parent.parent
HEADERS = {"libqz_cu": "cu", "libqz_tr": "tr", "libqzacl": "acl"}
STRICT = ["-Wall", "-Wextra", "-Wpedantic", "-Werror", f"-I{SOURCE / 'include'}"]
C, CXX = ["-std=c99", "-xc"], ["-std=c++20", "-xc++"]
SANITIZED = "QZ_SANITIZE:STRING=\n" not in (BUILD / "CMakeCache.txt").read_text()

# What callers were compiled with: sizes and places in bytes, and values.
LAYOUT = {
    "sizeof(sec_acle_t)": 32, "offsetof(sec_acle_t, perm_mask)": 0, "offsetof(sec_acle_t, mechanism)": 4,
    "sizeof(((sec_acle_t *)0)->mechanism)": 17, "offsetof(sec_acle_t, type)": 21, "offsetof(sec_acle_t, identity)": 24,
    "sizeof(sec_aclelist_t)": 16, "offsetof(sec_aclelist_t, count)": 0, "offsetof(sec_aclelist_t, acles)": 8,
    "sizeof(sec_perm_template_t)": 84, "offsetof(sec_perm_template_t, bit)": 0, "offsetof(sec_perm_template_t, letter)": 4,
    "offsetof(sec_perm_template_t, name)": 5, "offsetof(sec_perm_template_t, description)": 19,
    "sizeof(sec_perm_set_t)": 16, "offsetof(sec_perm_set_t, count)": 0, "offsetof(sec_perm_set_t, templates)": 8,
    "sizeof(sec_acl_buffer_t)": 16, "offsetof(sec_acl_buffer_t, length)": 0, "offsetof(sec_acl_buffer_t, data)": 8,
    "sizeof(sec_group_ref_t)": 16, "offsetof(sec_group_ref_t, id)": 0, "offsetof(sec_group_ref_t, name)": 8,
    "offsetof(cu_error_t, code)": 0, "offsetof(cu_error_t, message_id)": 4,
    "sizeof acl__default_perm_list": 13 * 84,
    "SEC_S_OK": 0, "SEC_S_ADVISORY": 1, "SEC_S_BAD_PARAMETER": 4, "SEC_S_NO_MEMORY": 6, "SEC_S_UNKNOWN_USER": 15,
    "SEC_S_ACLE_NOT_FOUND": 18, "SEC_S_INTERNAL": 23, "SEC_S_CODESET": 26, "SEC_S_BAD_PERMISSION": 36,
    "SEC_S_FILE_ERROR": 37, "SEC_S_BAD_ACL": 42, "SEC_S_BAD_ACLE": 43, "SEC_S_WARNING": 99, "SEC_S_BAD_FILENAME": 105,
    "SEC_ACLE_UNAUTHENTICATED": 1, "SEC_ACLE_ANYOTHER": 2, "SEC_ACLE_USER": 4, "SEC_ACLE_EXPANDED": 8,
    "SEC_ACLE_GROUP": 16, "SEC_ACLE_USE_ID_HANDLER": 128, "SEC_ID_HANDLER_EXPANDED": 1, "SEC_ID_HANDLER_USER": 2,
    "SEC_READ_ACL_TEXT": 1, "SEC_READ_ACL_CACHE": 2, "SEC_READ_ACL_CONVERT": 4,
}


def run(*command, **options):
    """A finished command that had to succeed."""
    done = subprocess.run(command, capture_output=True, text=True, **options)
    if done.returncode != 0:
        raise AssertionError(f"{command} returned {done.returncode}\n{done.stdout}{done.stderr}")
    return done.stdout


def declared(header):
    """The names of the functions and objects that a header declares for callers."""
    text = re.sub(r"/\*.*?\*/", "", (SOURCE / f"include/qz/{header}.h").read_text(), flags=re.S)
    objects = re.findall(r"\bextern const \w+ (\w+)", text)
    return sorted(objects + re.findall(r"^QZ_\w+_API (?!extern)[\w\s*]*?(\w+)\(", text, flags=re.M))


class Interface(unittest.TestCase):
    def test_every_header_compiles_alone_and_strictly(self):
        compilers = [(name, options) for name, options in
                     (("gcc", C), ("clang", C), ("g++", CXX), ("clang++", CXX)) if shutil.which(name)]
        self.assertTrue(compilers)
        for name, options in compilers:
            for header in HEADERS.values():
                run(name, *options, *STRICT, "-fsyntax-only", "-", input=f"#include <qz/{header}.h>\nint unused;\n")

    def test_records_and_values_are_what_callers_were_compiled_with(self):
        lines = "".join(f'    printf("%lu\\n", (unsigned long)({expression}));\n' for expression in LAYOUT)
        program = ("#include <stddef.h>\n#include <stdio.h>\n#include <qz/acl.h>\n#include <qz/cu.h>\n"
                   f"int main(void)\n{{\n{lines}    return 0;\n}}\n")
        with tempfile.TemporaryDirectory() as folder:
            run(shutil.which("gcc") or "cc", *C, *STRICT, "-", "-o", f"{folder}/layout", input=program)
            found = dict(zip(LAYOUT, map(int, run(f"{folder}/layout").split())))
        self.assertEqual(found, LAYOUT)

    def test_libraries_need_libc_and_each_other_alone(self):
        own = {f"{library}.so.1" for library in HEADERS}
        for library in HEADERS:
            dynamic = run("readelf", "-dW", str(BUILD / f"lib/{library}.so"))
            self.assertEqual(re.findall(r"\(SONAME\).*\[(.*)\]", dynamic), [f"{library}.so.1"])
            needed = re.findall(r"\(NEEDED\).*\[(.*)\]", dynamic)
            foreign = [name for name in needed if name not in own and not name.startswith(("libc.so.", "ld-linux"))]
            self.assertTrue(SANITIZED or not foreign, f"{library} needs {foreign}")

    def test_libraries_export_what_their_headers_declare(self):
        for library, header in HEADERS.items():
            symbols = run("nm", "-D", "--defined-only", str(BUILD / f"lib/{library}.so")).splitlines()
            exported = sorted(line.split()[2].split("@")[0] for line in symbols if line.split()[1] != "A")
            self.assertEqual(exported, declared(header), library)
            self.assertGreater(len(exported), 3)


class ExampleService(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.acl = Path(folder.name) / "service.acl"
        shutil.copyfile(SOURCE / "examples/service.acl", self.acl)
        hour_ago = time.time() - 3600
        os.utime(self.acl, (hour_ago, hour_ago))

    def service(self, *arguments):
        """What the service prints for these arguments, and its status."""
        done = subprocess.run([BUILD / "examples/service", *arguments], capture_output=True, text=True)
        return done.stdout.splitlines(), done.stderr, done.returncode

    def test_decides_by_the_closest_entry(self):
        source = "the text, 478 bytes, cached"
        for requester, answer in {
                "alice@head.cluster.example operators": "granted by user: rwxCqle",
                "ALICE@HEAD.cluster.example": "granted by user: rwxCqle",
                "mallory@login.cluster.example operators": "granted by user: nothing",
                "carol@login.cluster.example operators": "granted by domain: rql",
                "carol@elsewhere.example operators AUDITORS": "granted by groups: rwxCqlev",
                "carol@elsewhere.example staff": "granted by any other: rql"}.items():
            lines, errors, status = self.service(self.acl, *requester.split())
            self.assertEqual((lines, errors, status), (
                [f"read from {source}", answer] + (
                    ["has an entry of its own, which stays"] if "by user" in answer else
                    ["granted by user: r", "deleted again"]), "", 0), requester)
            source = "the cache, 478 bytes"
        self.assertTrue(Path(f"{self.acl}.cacl").exists())

    def test_a_file_without_entries_grants_nothing(self):
        self.acl.write_text("# nobody\n")
        lines, errors, status = self.service(self.acl, "carol@elsewhere.example")
        self.assertEqual((lines, errors, status), (["read from the text, 0 bytes", "nothing is granted",
                                                    "granted by user: r", "deleted again"], "", 0))

    def test_shows_failures_as_messages(self):
        self.acl.write_text("o r\nx r\n")
        for arguments, shown, expected in (
                ([self.acl, "carol@host"], f"{self.acl}: 3417-179 Failure: ", 1),
                ([f"{self.acl}.none", "carol@host"], f"{self.acl}.none: 3417-135 Failure: ", 1),
                ([self.acl], "usage: service ACL-FILE USER@HOST [GROUP...]\n", 2)):
            lines, errors, status = self.service(*arguments)
            self.assertEqual((lines, status), ([], expected))
            self.assertTrue(errors.startswith(shown), errors)


if __name__ == "__main__":
    unittest.main()
