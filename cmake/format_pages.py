#!/usr/bin/python3
"""Makes the manual's pages of formats from the document that describes them.

    format_pages.py DOCUMENT FOLDER VERSION     DOCUMENT is docs/device-format.md; each page goes into FOLDER

Knows of Markdown what that document has: headings, paragraphs, lists, tables, and indented listings whose lines are a
name and, after two blanks or more, what it is.
"""

import pathlib
import re
import sys

# A heading of the first level, the page that what stands below it becomes, and what that speaks of besides.
PAGES = {
    "A device directory": ("appsync-device", ["appsync-create(1)", "appsync-backup(5)"]),
    "A backup": ("appsync-backup", ["appsync-backup(1)", "appsync-restore(1)", "appsync-device(5)"]),
}

ITEM = re.compile(r"(-|\d+\.) +(.*)")
LISTED = re.compile(r"(\S+) {2,}(\S.*)")
SPANS = re.compile(r"`([^`]*)`|\*\*(.+?)\*\*|\[([^\]]*)\]\([^)]*\)")


def escaped(text):
    return text.replace("\\", "\\e").replace("-", "\\-")


def inline(text):
    """A line of text as troff sets it; what is code or stressed is bold, of a link its words are left."""
    made, end = "", 0
    for span in SPANS.finditer(text):
        code, stressed, linked = span.groups()
        made += escaped(text[end : span.start()])
        made += inline(linked) if linked is not None else "\\fB" + escaped(code or stressed.replace("`", "")) + "\\fR"
        end = span.end()
    made += escaped(text[end:])
    return "\\&" + made if made.startswith((".", "'")) else made


def paragraph(lines):
    return inline(" ".join(line.strip() for line in lines))


def named(name, text):
    return f".TP\n{inline(name)}\n{inline(text)}\n"


def listing(lines):
    entries = []
    for line in lines:
        found = LISTED.fullmatch(line.strip())
        if found and len(line) - len(line.lstrip()) == 4:
            entries.append([found[1], found[2]])
        else:
            entries[-1][1] += " " + line.strip()
    return "".join(named(f"`{name}`", text) for name, text in entries)


def table(lines):
    """The first column is what a row is named by; each after the second is introduced by what stands above it."""
    heads, _, *rows = [[cell.strip() for cell in line.strip().strip("|").split(" | ")] for line in lines]
    made = ""
    for name, text, *others in rows:
        made += named(name, "; ".join([text, *(f"{head}: {cell}" for head, cell in zip(heads[2:], others))]))
    return made


def items(lines):
    made, kind = [], None
    for line in lines:
        found = ITEM.match(line)
        if found:
            kind = "\\(bu" if found[1] == "-" else found[1]
            made.append((kind, [found[2]]))
        else:
            made[-1][1].append(line)
    return "".join(f".IP {kind} 3\n{paragraph(text)}\n" for kind, text in made)


def block(lines):
    first = lines[0]
    if first.startswith("## "):
        return f".SH {escaped(first[3:].upper())}\n"
    if first.startswith("    "):
        return listing(lines)
    if first.startswith("|"):
        return table(lines)
    if ITEM.match(first):
        return items(lines)
    return f".PP\n{paragraph(lines)}\n"


def blocks(text):
    return [each.splitlines() for each in re.split(r"\n\n+", text.strip("\n"))]


def page(title, text, version):
    name, others = PAGES[title]
    head = f'.TH {escaped(name.upper())} 5 "" "appsync {version}" "appsync"\n'
    head += f".SH NAME\n{escaped(name)} \\- {escaped(title[0].lower() + title[1:])}\n.SH DESCRIPTION\n.nh\n.ad l\n"
    also = ",\n".join(re.sub(r"(.*)(\(\d\))", lambda it: f"\\fB{escaped(it[1])}\\fR{it[2]}", each) for each in others)
    return head + "".join(block(each) for each in blocks(text)) + f".SH SEE ALSO\n\\fBappsync\\fR(1),\n{also}\n"


def main(document, folder, version):
    folder = pathlib.Path(folder)
    folder.mkdir(parents=True, exist_ok=True)
    parts = re.split(r"^# (.*)\n", pathlib.Path(document).read_text(), flags=re.MULTILINE)
    for title, text in zip(parts[1::2], parts[2::2]):
        if title in PAGES:
            (folder / f"{PAGES[title][0]}.5").write_text(page(title, text, version))


main(*sys.argv[1:])
