"""The README shows what the command really prints: every block behind an output marker is run and compared.

Called with the build folder; with --write behind it, the blocks are written anew instead.
"""
import pathlib
import re
import shlex
import shutil
import subprocess
import sys
import tempfile

source = pathlib.Path(__file__).resolve().parent.parent
readme = source / "README.md"
block = re.compile(r"(<!-- output: \./dev run (.*?) -->\n```\n)(.*?)(```\n)", re.S)


def real_output(arguments):
    with tempfile.TemporaryDirectory() as folder:
        shutil.copytree(source / "examples", pathlib.Path(folder) / "examples")
        run = subprocess.run([pathlib.Path(sys.argv[1]).resolve() / "bin/qzaclfck", *shlex.split(arguments)],
                             cwd=folder, capture_output=True, check=False)
    assert run.stdout == b"", run.stdout
    return run.stderr.decode()


text = readme.read_text()
shown = re.sub(block, lambda match: match[1] + real_output(match[2]) + match[4], text)
if "--write" in sys.argv:
    readme.write_text(shown)
elif not block.search(text) or shown != text:
    sys.exit("README.md does not show what the command prints")
