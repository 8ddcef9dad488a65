"""Writes mdoc, the language of manual pages: words, displays and running text."""
import re
import textwrap


def escaped(text):
    return text.replace("\\", "\\e")


def argument(text):  # quoted, so that no word in it is taken for a macro
    return '"' + escaped(text).replace('"', '""') + '"'


def literal(text):
    lines = (escaped(line).replace("-", "\\-").replace("'", "\\(aq").expandtabs(8) for line in text.splitlines())
    return [".Bd -literal -offset indent", *("\\&" + line if line[:1] in (".", "'") else line for line in lines), ".Ed"]


class Prose:
    """Turns running text into lines of mdoc that mark functions, constants and headers."""
    page_of, constants = {}, set()

    def __init__(self, page):
        self.page = page

    def marked(self, word):
        if match := re.fullmatch(r"(\w+)\(([1-8])\)([.,;:]*)", word):
            return " ".join([".Xr", *match.groups()]).rstrip()
        match = re.fullmatch(r"(\(?)(<?)([\w/.]*\w)(>?)([).,;:]*)", word)
        if not match:
            return None
        before, _, core, _, after = match.groups()
        if core in self.page_of and not match[2]:
            macro = f"Fn {core}" if self.page_of[core] == self.page else f"Xr {core} 3"
        elif core in self.constants and not match[2]:
            macro = f"Dv {core}"
        elif match[2] and match[4]:
            macro = f"In {core}"
        else:
            return None
        return " ".join([f".Pf ( {macro}" if before else "." + macro, *after])

    def lines(self, text):
        line = ""
        for word in text.split():
            macro = self.marked(word)
            if macro or len(line) + len(word) > 98 or re.search(r"[\w)\"][.]$", line):
                if line:
                    yield line
                line = ""
            if macro:
                yield macro
                continue
            word = re.sub("^-", r"\\-", escaped(word))
            line = f"{line} {word}" if line else "\\&" + word if word[0] in ".'" else word
        if line:
            yield line

    def blocks(self, blocks, spaced=True):
        """The content of a comment. `spaced` says whether a paragraph at its beginning starts a new one."""
        before = ":"
        for kind, content in blocks:
            if spaced and (kind == "text" or kind == "table" and not re.match("Codes:|.*:$", before, re.S)):
                yield ".Pp"
            before, spaced = content if kind == "text" else "", True
            if kind == "text":
                yield from self.lines(content)
            elif kind == "points":
                yield ".Bl -bullet -compact"
                for point in content:
                    yield ".It"
                    yield from self.lines(point)
                yield ".El"
            else:
                wide = max((name for name, _ in content if len(name) <= 16), key=len, default="Ds")
                yield f".Bl -tag -width {argument(wide)} -compact -offset indent"
                for name, inner in content:
                    yield f".It {argument(name)}"
                    yield from self.blocks(inner, spaced=False)
                yield ".El"


def folded(text):
    """Wraps text at 79 bytes. Requests and literal displays are unchanged."""
    lines, is_literal = [], False
    for line in text.split("\n"):
        is_literal = line.startswith(".Bd") or (is_literal and not line.startswith(".Ed"))
        if is_literal or line.startswith((".", "'")) or len(line) < 80:
            lines.append(line)
            continue
        made = textwrap.wrap(line, 79, break_long_words=False, break_on_hyphens=False)
        lines += made[:1] + [("\\&" if each[0] in ".'" else "") + each for each in made[1:]]
    return "\n".join(lines)
