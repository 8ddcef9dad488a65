"""Generates the manual pages of sections 3 and 7 from the sources, so that the two always agree.

Usage: from_headers.py SOURCE_DIR MAN_DIR. Section 3 comes from the C headers in include/qz, where each declaration
follows its comment. Section 7 comes from the message table and remedies.txt, which must have a block for every message.
"""
import pathlib
import re
import shutil
import sys

from mdoc import Prose, argument, folded, literal

SOURCE, MAN = map(pathlib.Path, sys.argv[1:])
DATE = "November 25, 2026"  # of the last change of contents, so that builds are reproducible
FAMILIES = {  # the sections of acl.h, with the names and subjects of their pages
    "Buffers": ("qzacl_buffers", "compiled access control lists as a whole"),
    "Entries": ("qzacl_entries", "entries of access control lists"),
    "Permissions": ("qzacl_permissions", "permission letters and masks"),
    "ACL files": ("qzacl_read", "read an ACL file"),
    "Listing": ("qzacl_list", "list the entries of an ACL"),
    "Editing": ("qzacl_edit", "add and delete entries of an ACL"),
    "Access decisions": ("qzacl_evaluate", "evaluate what an ACL grants"),
    "Dumps": ("qzacl_dump", "print ACLs for people"),
}
EVERYWHERE = ("3417-101", "3417-102")  # messages of almost every operation
DECLARATION = re.compile(r"QZ_\w+_API (extern )?([\w *]+?)(\w+)(?:\((.*)\)|(\[\d+\]))?;")


# ---- Headers -------------------------------------------------------------------------------------------------------

def uncommented(comment):
    """The lines of a comment, without its delimiters."""
    return [re.sub(r"^ ?\* ?", "", line).rstrip() for line in re.sub(r"^/\*+|\*/$", "", comment).splitlines()]


ROW = re.compile(r"( *)(\S+(?: \S+)*)  +(\S.*)")  # of a table: its tag, and the text


def indent(line):
    return len(line) - len(line.lstrip())


def starts_anew(line):
    return not line or line.startswith(("- ", "Codes:", "Threads:"))


def row_content(text, column, further):
    """The content of one row: text, and a nested table if the following rows are indented further than the text."""
    content = [("text", text)]
    for line in further:
        row = ROW.fullmatch(line)
        if row and column < indent(line):
            content += [] if content[-1][0] == "table" else [("table", [])]
            content[-1][1].append((row[2], [("text", row[3])]))
        elif content[-1][0] == "table" and indent(line) > column:
            row_text = content[-1][1][-1][1]
            row_text[0] = ("text", row_text[0][1] + " " + line.strip())
        elif content[-1][0] == "table":
            content.append(("text", line.strip()))
        else:
            content[-1] = ("text", content[-1][1] + " " + line.strip())
    return content


def parsed(lines):
    """A comment as (kind, content): "text", "points", or a "table" of (tag, content)."""
    lines, blocks, kind = list(lines), [], ""
    while lines:
        line = lines.pop(0)
        further, base = [], indent(line)
        is_point, row = line.lstrip().startswith("- "), ROW.fullmatch(line) if base > 1 else None
        while lines and lines[0] and not starts_anew(lines[0].lstrip()) and \
                (indent(lines[0]) > base or base <= 1 and indent(lines[0]) <= 1 and line):
            if base <= 1 and indent(lines[0]) > 1 and not is_point:
                break
            further.append(lines.pop(0))
        text = " ".join([line.strip(), *map(str.strip, further)])
        former, kind = kind, "points" if is_point else "table" if row else "text" if line else ""
        if not line:
            continue
        if kind != "text" and former != kind:
            blocks.append((kind, []))
        if is_point:
            blocks[-1][1].append(text[2:])
        elif row:
            blocks[-1][1].append((row[2], row_content(row[3], row.start(3), further)))
        else:
            blocks.append((kind, text))
    return blocks


class Header:
    """A header: its opening comment, and sections of (title, prose, items)."""

    def __init__(self, name):
        text = (SOURCE / "include/qz" / name).read_text(encoding="utf-8")
        self.name = name
        self.opening = uncommented(re.match(r"/\*.*?\*/", text, re.S)[0])
        body = text.split('extern "C" {\n#endif\n', 1)[1].split("#ifdef __cplusplus", 1)[0]
        self.sections = [["", [], []]]
        for block in re.split(r"\n\n+", body.strip()):
            comment, code = re.fullmatch(r"((?:/\*.*?\*/)?)\n?(.*)", block, re.S).groups()
            lines = uncommented(comment)
            title = next((match[1] for line in lines if (match := re.fullmatch(r" ?-{4} (.*) -{4}", line))), None)
            if title:
                self.sections.append([title, [line for line in lines if "----" not in line], []])
            elif code:
                self.sections[-1][2].append((lines, code))
            else:
                self.sections[-1][1] += lines
        self.constants = {match[1]: (match[2], " ".join((match[3] or "").split())) for match in re.finditer(
            r"#define (\w+)\s+(?:\\\s+)?(\w+?)u?\b *(?:/\*(.*?)\*/)?", body, re.S)}

    def declared(self, items):
        """The declarations among items: (name, result, arguments or None, comment)."""
        for lines, code in items:
            for match in DECLARATION.finditer(" ".join(code.split())):
                extern, result, name, arguments, size = match.groups()
                yield name, f"{extern or ''}{result.strip()}{size or ''}", None if extern else arguments, lines

    def all_names(self):
        return [name for _, _, items in self.sections for name, *_ in self.declared(items)]


def synopsis(header, items):
    yield from [".Sh SYNOPSIS", f".In qz/{header.name}"]
    for name, result, arguments, _ in header.declared(items):
        if arguments is None:
            kind, size = re.fullmatch(r"(.*?)((?:\[\d+\])?)", result).groups()
            yield f".Vt {argument(f'{kind} {name}{size};')}"
        else:
            yield f".Ft {argument(result)}"
            yield f".Fn {name} " + " ".join(argument(each.strip()) for each in arguments.split(","))


def type_lines(prose, lines, code):
    """A type with its fields, or its declaration."""
    fields = re.findall(r"^ +([\w ]+ )(\**\w+(?:\[\d+\])?);(?: */\* (.*?) \*/)?$", code, re.M)
    name = re.search(r"\(\*(\w+)\)|(\w+);$", code)
    yield f".Ss {name[1] or name[2]}"
    yield from prose.blocks(parsed(lines), spaced=False)
    if not fields:
        yield from literal(code)
        return
    yield ".Bl -tag -width Ds -compact -offset indent"
    for kind, field, said in fields:
        yield f".It Vt {argument(kind.strip())} Fa {argument(field)}"
        yield from prose.lines(said)
    yield ".El"


def constant_lines(prose, header, code):
    yield ".Bl -tag -width Ds -compact -offset indent"
    for name in re.findall(r"#define (\w+)", code):
        value, said = header.constants[name]
        yield f".It Dv {name} Pq {value}"
        yield from prose.lines(said)
    yield ".El"


def function_lines(prose, header, items):
    for name, _, arguments, lines in header.declared(items):
        if arguments is not None:
            yield f".Ss {name}"
            yield from prose.blocks(parsed(lines), spaced=False)


def other_lines(prose, header, items):
    """Constants and types, in the order of the header."""
    for lines, code in items:
        if code.startswith("#define"):
            yield from [".Pp", *prose.blocks(parsed(lines), spaced=False), ".Pp"]
            yield from constant_lines(prose, header, code)
        elif code.startswith("typedef"):
            yield from type_lines(prose, lines, code)


def see_also(pages):
    return [".Sh SEE ALSO", *(f".Xr {name} {section} ," for name, section in pages[:-1]),
            ".Xr {} {}".format(*pages[-1])]


def link_pages(header, page_of):
    for name in header.all_names():
        (MAN / "man3" / f"{name}.3").write_text(f".so man3/{page_of[name]}.3\n", encoding="utf-8")


# ---- The pages -----------------------------------------------------------------------------------------------------

def page(name, section, names, about, body):
    title = [f".Dd {DATE}", f".Dt {name.upper()} {section}", ".Os", ".Sh NAME"]
    title += [f".Nm {each} ," for each in names[:-1]] + [f".Nm {names[-1]}", f".Nd {about}"]
    folder = MAN / f"man{section}"
    folder.mkdir(parents=True, exist_ok=True)
    text = "\n".join([*title, *body]) + "\n"
    text = re.sub(r"(?m)^(\.S[hs] .*\n)\.Pp\n", r"\1", text)
    (folder / f"{name}.{section}").write_text(folded(text), encoding="utf-8")


def opening_lines(prose, header):
    """The opening comment: the purpose of the header, and the rules for every call under their names."""
    rules_at = next(i for i, line in enumerate(header.opening) if "----" in line)
    rules = []
    for kind, content in parsed(header.opening[rules_at + 1:]):
        match = re.fullmatch(r"([A-Z][\w -]{3,40})\. (.*)", content, re.S) if kind == "text" else None
        rules += [f".Ss {match[1]}", *prose.lines(match[2])] if match else prose.blocks([(kind, content)])
    return list(prose.blocks(parsed(header.opening[1:rules_at]), spaced=False)), [".Sh RULES FOR EVERY CALL", *rules]


def write_acl_pages(acl):
    first = acl.sections[0]
    if [title for title, *_ in acl.sections[1:]] != list(FAMILIES):
        sys.exit("the sections of acl.h are not those that this script knows")
    prose = Prose("qzacl")
    names = [name for name, *_ in acl.declared(first[2])]
    purpose, rules = opening_lines(prose, acl)
    families = [".Sh OPERATIONS"]
    for (name, about), (_, _, items) in zip(FAMILIES.values(), acl.sections[1:]):
        families += [".Pp", f".Xr {name} 3 :", f"{about}", ".Bd -ragged -offset indent -compact"]
        declared = [each for each, *_ in acl.declared(items)]
        families += [*(f".Xr {each} 3 ," for each in declared[:-1]), f".Xr {declared[-1]} 3", ".Ed"]
    page("qzacl", 3, ["qzacl", *names], "access control lists: the library and the rules for every call", [
        ".Sh LIBRARY", "libqzacl (link with", ".Fl lqzacl ,", "or by", ".Nm pkg-config", "or CMake as",
        ".Qq qzacl )", *synopsis(acl, first[2]), ".Sh DESCRIPTION",
        *purpose, ".Pp",
        *prose.blocks([block for lines, code in first[2] if code.startswith("QZ_") for block in parsed(lines)],
                      spaced=False),
        *families, *rules, ".Sh CONSTANTS AND TYPES",
        *other_lines(prose, acl, first[2]),
        *see_also([("qzaclfck", 1), ("qz_cu", 3), ("qz_tr", 3), ("qzacl", 5), ("qzcacl", 5), ("qzacl_messages", 7)])])
    for (name, about), (title, text, items) in zip(FAMILIES.values(), acl.sections[1:]):
        prose = Prose(name)
        described = function_lines(prose, acl, items)
        page(name, 3, [name, *(each for each, *_ in acl.declared(items))], about, [
            *synopsis(acl, items), ".Sh DESCRIPTION", *prose.blocks(parsed(text), spaced=False), *([".Pp"] * any(text)),
            "The rules for every call are described in", ".Xr qzacl 3 ;",
            "a number such as 3417-101 refers to a message in", ".Xr qzacl_messages 7 .", *described,
            *see_also([("qz_cu", 3), ("qzacl", 3), ("qzacl", 5), ("qzacl_messages", 7)])])


def write_platform_page(header, name, about, related):
    """A platform library: one page for all its functions."""
    prose = Prose(name)
    purpose, rules = opening_lines(prose, header)
    body = [".Sh LIBRARY", f"lib{name} (link with", f".Fl l{name} )",
            *synopsis(header, [item for _, _, items in header.sections for item in items]), ".Sh DESCRIPTION",
            *purpose, *rules, ".Sh CONSTANTS AND TYPES", *other_lines(prose, header, header.sections[0][2])]
    for title, text, items in header.sections[1:]:
        body += [f".Sh {title.upper()}", *prose.blocks(parsed(text), spaced=False)]
        body += [*other_lines(prose, header, items), *function_lines(prose, header, items)]
    page(name, 3, [name, *header.all_names()], about, [*body, *see_also(related)])


def message_texts():
    """The texts of the message table by their printed numbers."""
    table = (SOURCE / "security/msg/qzseclib_msg.h").read_text(encoding="utf-8")
    texts = {}
    for literals in re.findall(r'\{\d+,((?:\s*"(?:[^"\\]|\\.)*")+)\}', table):
        text = "".join(re.findall(r'"((?:[^"\\]|\\.)*)"', literals))
        text = re.sub(r"\\(.)", lambda match: {"n": "\n", "t": "\t"}.get(match[1], match[1]), text)
        if number := re.match(r"3417-\d{3}", text):
            texts[number[0]] = text
    return texts


def remedies():
    """The blocks of remedies.txt by number: who reports it, its cause and its remedy."""
    blocks = {}
    file = (SOURCE / "docs/man/remedies.txt").read_text(encoding="utf-8")
    for block in re.split(r"\n\n+", re.sub(r"^#.*\n", "", file, flags=re.M).strip()):
        match = re.fullmatch(r"(\S+) (command|library|both)\ncause: (.+?)\nremedy: (.+)", block, re.S)
        if not match or match[1] in blocks:
            sys.exit(f"remedies.txt: malformed or duplicate block: {block}")
        blocks[match[1]] = match.groups()[1:]
    return blocks


def reporting_functions(acl):
    """The functions whose comments list a message, by its number."""
    functions = {}
    for _, _, items in acl.sections:
        for name, _, _, lines in acl.declared(items):
            codes = " ".join(lines).partition("Codes:")[2]
            for number in re.findall(r"3417-\d{3}", codes):
                functions.setdefault(number, {})[name] = True
    return functions


def write_messages(acl):
    """Section 7."""
    texts, blocks, named_at = message_texts(), remedies(), reporting_functions(acl)
    if blocks.keys() != texts.keys():
        sys.exit("remedies.txt: without block or without message: " + " ".join(sorted(blocks.keys() ^ texts.keys())))
    prose = Prose("qzacl_messages")
    body = []
    for number, text in sorted(texts.items()):
        who, cause, remedy = blocks[number]
        functions = list(named_at.get(number, {})) if number not in EVERYWHERE else []
        if who == "command" and functions:
            sys.exit(f"remedies.txt: {number} is of the library, too: {functions}")
        body += [f".Ss {number}", *literal(text), ".Bl -tag -width Remedy -compact", ".It From"]
        body += {"command": [".Xr qzaclfck 1"], "both": [".Xr qzaclfck 1", "and the library"],
                 "library": ["the library"]}[who]
        if functions:
            body[-1:] = [body[-1] + ":"]
            body += [*(f".Xr {each} 3 ," for each in functions[:-1]), f".Xr {functions[-1]} 3"]
        body += [".It Cause", *prose.lines(cause), ".It Remedy", *prose.lines(remedy), ".El"]
    page("qzacl_messages", 7, ["qzacl_messages"], "messages of the ACL library and of qzaclfck by number", [
        ".Sh DESCRIPTION", *prose.lines(
            "Each failure records one message. The command prints it on standard error; a program fetches it with "
            "cu_get_error_1 and cu_get_errmsg_1. The texts are shown as in the message catalog, with placeholders "
            "such as %1$s for the values. The functions listed after \"the library\" are those whose pages list the "
            "message; functions that refer to these may report it, too."),
        ".Pp", *prose.lines("The usage and help of the command and the lines of a dump are in the same catalog, but "
                            "have no number and are not listed."),
        ".Sh MESSAGES", *body, *see_also([("gencat", 1), ("qzaclfck", 1), ("qz_cu", 3), ("qzacl", 3)])])


def main():
    for section in ("man3", "man7"):
        shutil.rmtree(MAN / section, ignore_errors=True)
    acl, cu, tr = Header("acl.h"), Header("cu.h"), Header("tr.h")
    pages = ["qzacl", *(name for name, _ in FAMILIES.values())]
    for name, (_, _, items) in zip(pages, acl.sections):
        Prose.page_of.update({each: name for each, *_ in acl.declared(items)})
    Prose.page_of.update({name: "qz_cu" for name in cu.all_names()})
    Prose.page_of.update({name: "qz_tr" for name in tr.all_names()})
    Prose.constants = acl.constants.keys() | cu.constants.keys() | tr.constants.keys()
    write_acl_pages(acl)
    write_platform_page(cu, "qz_cu", "errors, code sets, strings, clock and addresses",
                        [("qz_tr", 3), ("qzacl", 3), ("qzacl_messages", 7)])
    write_platform_page(tr, "qz_tr", "trace categories and records", [("qzaclfck", 1), ("qz_cu", 3), ("qzacl", 3)])
    write_messages(acl)
    for header in (acl, cu, tr):
        link_pages(header, Prose.page_of)


main()
