#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Makes the manual pages of the library, docs/man/<header>.3, from the public headers: what a header declares is the
synopsis, what its comments say is the description.

    scripts/make/make_manual.py           writes the pages again; a page whose text is the same keeps its date
    scripts/make/make_manual.py --check   compares them with what would be written
"""
import collections
import datetime
import pathlib
import re
import sys
import textwrap

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parents[1] / "checks"))
import check_exports

PAGES = check_exports.ROOT / "docs/man"
SHOWN_MACROS = re.compile(r"#define (?P<name>LDAPPW_VERSION\w*) ")
FUNCTION = re.compile(r"LDAPPW_API\s+(?P<result>.+?)\s*(?P<name>\w+)\((?P<arguments>[^()]*)\)[^;]*;", re.S)
VARIABLE = re.compile(r"LDAPPW_DATA\s[^;(]*?(?P<name>\w+)(?:\[\d+\])?;")
ENTRY = re.compile(r"LDAPPW_DATA\s+(?P<result>[^;(]*?)\s*\(\*(?P<name>\w+)\)\((?P<arguments>[^()]*)\);", re.S)
TYPE = re.compile(r"typedef\s+\w+\s+(?P<name>\w+)")

# A comment, and what it is about: declarations and macros, each with the comment behind it on its line.
Item = collections.namedtuple("Item", "comment code")
Section = collections.namedtuple("Section", "title items")


# ---- Reading a header ----

def for_c(text):
    """The lines that a program in C sees, the guard left out."""
    lines, stack = [], []
    for line in text.splitlines():
        if re.match(r"#if", line):
            stack.append(line.startswith("#ifndef"))
        elif line.startswith("#else"):
            stack[-1] = not stack[-1]
        elif line.startswith("#endif"):
            stack.pop()
        elif all(stack):
            lines.append(line)
    return "\n".join(lines)


def comment_text(comment):
    """The text of a comment: its lines without the frame."""
    lines = re.sub(r"^/\* ?|\s*\*/$", "", comment).splitlines()
    return "\n".join(re.sub(r"^ \*(?: |$)", "", line) for line in lines).strip("\n")


TOKEN = re.compile(r"/\*.*?\*/|#[^\n]*|(?:[^;{/#]|/(?!\*))*(?:\{.*?\n\}[^;]*)?;[ \t]*(?:/\*[^\n]*\*/)?", re.S)


def sections_of(text):
    """The comment at the head, and the sections in order; the first has no title."""
    head, sections = None, [Section("", [])]
    comment, code = "", []

    def close():
        nonlocal comment, code
        if code:
            sections[-1].items.append(Item(comment, code))
        comment, code = "", []

    for token in (match.strip() for match in TOKEN.findall(for_c(text))):
        title = re.match(r"/\* ---- (.*?) ----", token, re.S)
        if "SPDX" in token:
            continue
        if head is None:
            head = comment_text(token)
        elif title:
            close()
            name, _, more = re.sub(r"\n \*", "", title[1]).partition("; ")
            more = comment_text("/* " + token[title.end():]) or more
            sections.append(Section(name, [Item(more, [])] if more else []))
        elif token.startswith("/*"):
            close()
            comment = comment_text(token)
        elif token.startswith("#"):
            if SHOWN_MACROS.match(token):
                code.append(token)
            elif token.startswith("#define") and not code:
                comment = ""
        else:
            code.append(token)
    close()
    return head, [section for section in sections if section.items]


# ---- Writing mdoc ----

FUNCTIONS = {"free"}  # of all pages, and of the system


def escaped(text):
    text = text.replace("\\", "\\e")
    return re.sub(r"(?<![\w\\])-(?=\w)", r"\\-", text)


def argument(text):
    """Text behind a macro: quoted, so that no word of it is taken for a macro."""
    return '"%s"' % escaped(text).replace('"', '""')


def running(text):
    """Lines of running text, a sentence a line, with the names of operations in bold."""
    for sentence in re.split(r"(?<=[.!?;:]) (?=\S)|(?<=[.!?]\)) (?=\S)", " ".join(text.split())):
        marked = re.sub(r"\b\w+\b", lambda word: "\\fB%s\\fR" % word[0] if word[0] in FUNCTIONS else word[0],
                        escaped(sentence))
        for line in textwrap.wrap(marked, 78, break_long_words=False, break_on_hyphens=False):
            yield "\\&" + line if line[0] in ".'" else line


def rows_of(lines):
    """Rows that begin at the least indent, joined with the lines that continue them."""
    indent = min(len(line) - len(line.lstrip()) for line in lines)
    rows = []
    for line in lines:
        if line[indent] == " " and rows:
            rows[-1] += " " + line.strip()
        else:
            rows.append(line.strip())
    return rows


def table(lines):
    """Rows as a list: numbered ones, arguments, or columns."""
    rows = rows_of(lines)
    if re.match(r"\d+\. ", rows[0]):
        yield ".Bl -enum"
        for row in rows:
            yield ".It"
            yield from running(row.partition(". ")[2])
    elif re.match(r"\w+ {2,}(in|out) {2,}", rows[0]):
        yield ".Bl -tag -width Ds"
        for row in rows:
            name, way, meaning = re.split(r" {2,}", row, maxsplit=2)
            yield ".It Fa %s Pq %s" % (name, way)
            yield from running(meaning)
    else:
        heading, *cells = [re.split(r" {2,}", row) for row in rows]
        yield ".Bl -tag -width Ds"
        for row in cells:
            yield ".It %s" % argument(row[0])
            for number, cell in enumerate(row[1:], 1):
                yield from [".br"] if number > 1 else []
                yield from running("%s: %s" % (heading[number], cell))
    yield ".El"


def described(text):
    """A comment's text: paragraphs, and tables, which are indented."""
    blocks = []
    for paragraph in re.split(r"\n\s*\n", text):
        for line in paragraph.splitlines():
            kind = "table" if line.startswith(" ") else "text"
            if not blocks or blocks[-1][0] != kind:
                blocks.append((kind, []))
            blocks[-1][1].append(line)
        blocks.append(("end", []))
    written = False
    for position, (kind, lines) in enumerate(blocks):
        if kind == "text":
            if written and blocks[position - 1][0] == "end":
                yield ".Pp"
            yield from running("\n".join(lines))
        elif kind == "table":
            yield from table(lines)
        written = written or kind != "end"


def without_marks(code):
    """A declaration as a program would write it."""
    code = re.sub(r'\s*LDAPPW_(NOEXCEPT|SYMBOL\("\w+"\))', "", code)
    return re.sub(r"LDAPPW_(API|DATA)\s+", "", code)


def head_of(code):
    """What a declaration or macro names, behind the macro of the manual for its kind; nothing for bare constants."""
    for macro, pattern in (("Dv", SHOWN_MACROS), ("Fn", FUNCTION), ("Va", VARIABLE), ("Va", ENTRY), ("Vt", TYPE)):
        match = pattern.match(code)
        if match:
            return "%s %s" % (macro, match["name"])
    return "No Constants"


def synopsis(sections):
    for section in sections:
        for code in (code for item in section.items for code in item.code):
            function = FUNCTION.match(code) or ENTRY.match(code)
            if function:
                yield ".Ft %s" % argument(function["result"])
                yield ".Fo %s" % (function["name"] if FUNCTION.match(code) else "(*%s)" % function["name"])
                for parameter in re.split(r",\s*", " ".join(function["arguments"].split())):
                    yield ".Fa %s" % argument(parameter)
                yield ".Fc"
            elif VARIABLE.match(code):
                declaration = " ".join(re.sub(r"/\*.*", "", without_marks(code)).split())
                yield ".Vt %s ;" % argument("extern " + declaration.rstrip(";"))


def narrow(line):
    """A line of a display; one that is too wide with its comment above it."""
    member = re.match(r"( *)(.*?) */\* (.*) \*/$", line)
    if len(line) <= 72 or not member:
        return [line]
    comment = textwrap.wrap("/* %s */" % member[3], 76, initial_indent=member[1], subsequent_indent=member[1] + "   ")
    return comment + [member[1] + member[2]]


def described_item(item):
    yield ".It %s" % " , ".join(map(head_of, item.code))
    yield from described(item.comment)
    shown = [without_marks(code) for code in item.code if not code.startswith("LDAPPW_") or "/*" in code]
    if shown:
        yield ".Bd -literal"
        yield from (escaped(line) for code in shown for each in code.splitlines() for line in narrow(each))
        yield ".Ed"


def described_section(section):
    if section.title:
        yield ".Ss %s" % escaped(section.title)
    items = list(section.items)
    if items and not items[0].code:
        yield from described(items.pop(0).comment)
    if items:
        yield ".Bl -tag -width Ds"
        for item in items:
            yield from described_item(item)
        yield ".El"


def functions_of(sections):
    matches = [FUNCTION.match(code) for section in sections for item in section.items for code in item.code]
    return [match["name"] for match in matches if match]


def page_of(header, head, sections):
    name = header.removesuffix(".h")
    functions = functions_of(sections)
    others = sorted([other.removesuffix(".h"), 3] for other in check_exports.HEADERS if other != header)
    yield ".Dt %s 3" % name.upper()
    yield ".Os"
    yield ".Sh NAME"
    yield from (".Nm %s ," % each for each in [name] + functions[:-1])
    yield ".Nm %s" % functions[-1]
    yield ".Nd %s" % head.partition(":")[0]
    yield ".Sh LIBRARY"
    yield "ldappw (libldappw, \\-lldappw)"
    yield ".Sh SYNOPSIS"
    yield ".In %s" % header
    yield from synopsis(sections)
    yield ".Sh DESCRIPTION"
    yield from described(head)
    for section in sections:
        yield from described_section(section)
    yield ".Sh SEE ALSO"
    yield from (".Xr %s %d ," % (each, number) for each, number in others)
    yield ".Xr ldappw 7"


def see_that_all_is_shown(header, sections):
    """What a page shows is all that the header declares."""
    codes = [code for section in sections for item in section.items for code in item.code]
    symbols = [re.search(r'LDAPPW_SYMBOL\("(\w+)"\)', code) or head_of(code).split() for code in codes
               if code.startswith("LDAPPW_")]
    shown = {symbol[1] for symbol in symbols}
    if shown != check_exports.declared_in(header):
        sys.exit("make_manual: %s: not understood: %s" % (header, shown ^ check_exports.declared_in(header)))


def main():
    check = sys.argv[1:] == ["--check"]
    headers = {header: sections_of((check_exports.SOURCES / header).read_text()) for header in check_exports.HEADERS}
    for header, (_, sections) in headers.items():
        see_that_all_is_shown(header, sections)
        FUNCTIONS.update(functions_of(sections))
    stale = []
    for header, (head, sections) in headers.items():
        path = PAGES / header.replace(".h", ".3")
        start = '.\\" SPDX-License-Identifier: Apache-2.0\n.\\" Made from %s by scripts/make/make_manual.py.\n' % header
        body = "\n".join(page_of(header, head, sections)) + "\n"
        now = path.read_text() if path.exists() else ""
        if re.sub(r"^\.Dd .*\n", "", now, flags=re.M) == start + body:
            continue
        stale.append(path.name)
        if not check:
            today = datetime.date.today()
            path.write_text("%s.Dd %s %d, %d\n%s" % (start, today.strftime("%B"), today.day, today.year, body))
    if check and stale:
        sys.exit("make_manual: not as the headers are: %s; run scripts/make/make_manual.py" % ", ".join(stale))


if __name__ == "__main__":
    main()
