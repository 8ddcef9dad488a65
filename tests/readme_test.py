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
block = re.compile(r"(<!-- output: (\./dev run|build/release/examples/service) (.*?) -->\n```\n)(.*?)(```\n)", re.S)
programs = {"./dev run": "bin/qzaclfck", "build/release/examples/service": "examples/service"}


def real_output(program, arguments):
    with tempfile.TemporaryDirectory() as folder:
        shutil.copytree(source / "examples", pathlib.Path(folder) / "examples")
        run = subprocess.run([pathlib.Path(sys.argv[1]).resolve() / programs[program], *shlex.split(arguments)],
                             cwd=folder, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, check=False)
    return run.stdout.decode()


text = readme.read_text()
shown = re.sub(block, lambda match: match[1] + real_output(match[2], match[3]) + match[5], text)
if "--write" in sys.argv:
    readme.write_text(shown)
elif not block.search(text) or shown != text:
    sys.exit("README.md does not show what the command prints")
