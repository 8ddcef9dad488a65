"""The manual: form, a page for every function, the command's options, examples as they run (--write: writes these)."""
import os
import pathlib
import re
import shutil
import sys
import tempfile
from subprocess import DEVNULL, PIPE, STDOUT, run

BUILD, SOURCE = pathlib.Path(sys.argv[1]).resolve(), pathlib.Path(__file__).resolve().parent.parent
MAN, FAULTS, MARKUP = BUILD / "share/man", [], str.maketrans({"\\": "\\e", "-": "\\-", "'": "\\(aq"})
os.environ.update({"LC_ALL": "C", "PATH": f"{BUILD}/bin:{os.environ['PATH']}"})


def printed(*command, folder=None):
    return run(command, stdout=PIPE, stderr=STDOUT, cwd=folder, check=False).stdout.decode()


def ran(example):  # its commands, each behind "$ ", with what they print
    text = example[0].replace("\\-", "-").replace("\\(aq", "'").replace("\\e", "\\")
    return "".join(each + printed("sh", "-c", each[2:], folder=place)
                   for each in re.findall(r"(?m)^\$ (?:.*\\\n)*.*\n", text)).translate(MARKUP)


for page in sorted((SOURCE / "docs/man").glob("*.[15]")):
    with tempfile.TemporaryDirectory() as place:
        shown = re.sub(r"(?ms)^\$ .*?(?=^\.Ed)", ran, page.read_text())
    if "--write" in sys.argv:
        page.write_text(shown)
    elif shown != page.read_text():
        FAULTS.append(f"{page.name}: the examples print something else")
maps = (SOURCE / "security/ACL/lib/libqzacl.map").read_text() + (SOURCE / "platform/libqz_cu/libqz_cu.map").read_text()
for name in re.findall(r"(\w+);\n", maps):
    link = MAN / f"man3/{name}.3"
    if not link.exists() or not re.search(rf"(?m)^\.Nm {name}\b", (MAN / link.read_text().split()[1]).read_text()):
        FAULTS.append(f"{name} has no page")
options = re.findall(r"(?m)^\.It Fl (\w)", (SOURCE / "docs/man/qzaclfck.1").read_text())
if set(options) != set(re.findall(r"\s\[?-(\w)\b", printed("qzaclfck"))):
    FAULTS.append(f"qzaclfck.1 has other options than the usage: {options}")
if shutil.which("mandoc"):
    pages = (page for page in MAN.glob("man*/*") if not page.read_text().startswith(".so "))
    # Whether other manuals are installed is the machine's affair; what is shown as it was printed may end in blanks.
    harmless = re.compile("referenced manual not found|outdated mandoc.db|whitespace at end of input line")
    FAULTS += [line for line in run(["mandoc", "-T", "lint", *pages], stdout=PIPE,
                                  stderr=DEVNULL, check=False).stdout.decode().splitlines() if not harmless.search(line)]
else:
    print("mandoc is not there: the form of the pages is not checked")
sys.exit("\n".join(FAULTS) or None)
