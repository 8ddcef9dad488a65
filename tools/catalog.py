"""The message catalog for translators: makes its source for gencat from the library's texts, and checks translations.

usage: catalog.py write        prints the source
       catalog.py check FILE   prints FILE:LINE: for everything that would leave a message untranslated or with wrong
                               conversions, and exits with 1 if there is anything
"""
import pathlib
import re
import sys

TABLE = (pathlib.Path(__file__).resolve().parents[1] / "security/msg/qzseclib_msg.h").read_text("utf-8")
HEADING = """$ Messages of the ACL library and its checker. The conversions (%1$s and the like) of a text must stay;
$ their order may change. A text whose conversions differ is not used.
"""
ESCAPES = {"n": "\n", "t": "\t", "\\": "\\", '"': '"'}  # the escapes of gencat that a text may need
CONVERSION = re.compile(r"%(?:%|([1-9])\$(0?)((?:[1-9][0-9]{0,2})?)([sduxc]))")


def unescaped(text):
    return re.sub(r"\\(.)", lambda match: ESCAPES[match[1]], text)


SET = int(re.search(r"catalog_set = (\d+);", TABLE)[1])
TEXTS = {int(number): unescaped("".join(re.findall(r'"((?:[^"\\]|\\.)*)"', literals)))
         for number, literals in re.findall(r'\{(\d+),((?:\s*"(?:[^"\\]|\\.)*")+)\}', TABLE)}


def write():
    print(f'{HEADING}$set {SET}\n$quote "')
    for number, text in TEXTS.items():
        escaped = re.sub(r'["\\]', r"\\\g<0>", text).replace("\t", "\\t")
        # A line of text also ends its source line, which a backslash continues.
        print(f'{number} "' + escaped.replace("\n", "\\n\\\n") + '"')


def conversions(text):
    """The sorted conversions of a text; None if a percent sign begins none."""
    if "%" in CONVERSION.sub("", text):
        return None
    return sorted(match.groups() for match in CONVERSION.finditer(text) if match[1])


def logical_lines(lines):
    """Lines with their starting numbers. A backslash at the end continues a line; a pair is a literal backslash."""
    first, logical = 1, ""
    for number, line in enumerate(lines, 1):
        backslashes = len(line) - len(line.rstrip("\\"))
        if backslashes % 2 != 0 and number < len(lines):
            logical += line[:-1]
            continue
        yield first, logical + line
        first, logical = number + 1, ""


class Complaint(Exception):
    """What makes a line unusable."""


class Check:
    def __init__(self, path):
        self.path, self.line, self.is_clean = path, 0, True
        self.seen, self.quote = {}, ""  # ids with their lines
        self.has_set = self.has_codeset = False

    def complain(self, what):
        print(f"{self.path}:{self.line}: {what}")
        self.is_clean = False

    def run(self, source):
        lines = source.removesuffix("\n").split("\n")
        for self.line, line in logical_lines(lines):
            try:
                self.take(line)
            except Complaint as complaint:
                self.complain(complaint)
        self.line = len(lines)
        if not self.has_set:
            self.complain(f'there is no "$set {SET}"')
        for number in TEXTS:
            if number not in self.seen:
                self.complain(f"message {number} is missing")
        return self.is_clean

    def take(self, line):
        if line.startswith("$"):
            self.take_directive(line)
        elif digits := re.match(r"[0-9]+", line):
            self.take_message(digits[0], line[digits.end():])
        elif line.strip(" \t"):
            raise Complaint("neither a directive nor a message")

    def take_directive(self, line):
        if line.startswith("$set "):
            self.has_set = True
            if not re.match(rf"{SET}(?![0-9])", line[5:]):
                raise Complaint(f"every message is in set {SET}")
        elif line.startswith("$quote"):
            self.quote = line[7:8]
        elif line.startswith("$ codeset="):
            self.has_codeset = True
        elif line[1:2] not in ("", " ", "\t"):
            raise Complaint("unknown directive")

    def take_message(self, digits, rest):
        number, name = int(digits), f"message {digits}"
        if number not in TEXTS:
            raise Complaint(f"{name} is not one of the library's")
        if number in self.seen:
            raise Complaint(f"{name} stands at line {self.seen[number]} already")
        self.seen[number] = self.line
        text, english = self.text_in(rest), TEXTS[number]
        if not text.isascii() and not self.has_codeset:
            self.complain(f'{name} is not ASCII, and no "$ codeset=" stands before it')
        if conversions(text) != conversions(english):
            self.complain(f"{name} does not have the conversions of the English text")
        if not text.endswith("\n"):
            self.complain(f"{name} does not end with a line feed (\\n)")
        # People look up a message by its number in every language.
        printed = re.match(r"(?:3417-\S* )?", english)[0]
        if not text.startswith(printed):
            self.complain(f"{name} does not begin with its number {printed}")

    def text_in(self, rest):
        """The text as gencat reads it: it begins after one blank."""
        if rest[:1] not in (" ", "\t"):
            raise Complaint("a blank and a text must follow the id")
        quote = self.quote if rest[1:2] == self.quote else ""
        text = re.match(rf'(?:\\[nt\\"]|[^\\{re.escape(quote)}])*', rest[1 + len(quote):])
        left = text.string[text.end():]
        if left.startswith("\\"):
            raise Complaint('an escape sequence other than \\n, \\t, \\\\ and \\"')
        if left != quote:
            raise Complaint("text behind the closing quotation mark" if left else "no closing quotation mark")
        return unescaped(text[0])


def main(arguments):
    if arguments == ["write"]:
        write()
    elif arguments[:1] == ["check"] and len(arguments) == 2:
        try:
            # Byte by byte, in any code set.
            source = pathlib.Path(arguments[1]).read_bytes().decode("latin-1")
        except OSError as error:
            print(f"catalog.py: cannot read the translation: {error}", file=sys.stderr)
            return 2
        return 0 if Check(arguments[1]).run(source) else 1
    else:
        print(__doc__, file=sys.stderr)
        return 2
    return 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
