#!/usr/bin/env python3
"""Converts a header to input for doxygen. Usage: doc_filter.py FILE

In the comments of the headers
    @file Some sentence.           begins the description of the file
    Returns: Errors: Log: ...      begin a labelled paragraph; its text continues in the same column
    lines indented by four spaces  are examples, or a list if the last one ends with a full stop
and everything else is prose, in which no character has a special meaning. In the C headers a comment
that begins with "/*" describes the file; if it has fewer than three lines, it is left out.

The declarations of a header form a group of its name, which its page of the site shows.
"""
import pathlib
import re
import sys

LABEL = re.compile(r"^((?:[A-Z][a-z]+|errno|[a-z]\w*(?:, \w+)*):)(\s+)(\S.*)$")
LABELS = {"Returns", "Errors", "errno", "Log", "Threads", "Process", "Owns", "Blocks", "Units", "Throws", "Kernel",
          "Signals", "Failure", "Ownership", "Trust", "States", "Secrets", "Lock", "Cost"}
# A label after a sentence on the same line: "Compares two texts. Returns: 1 for a match."
INNER_LABEL = re.compile(r"^(.*\.) (Returns: .*)$")
SENTENCE_ENDS = (".", ":", ";", ")")
PASSED_ON = re.compile(r"@(?:file|name|\{|\})")  # doxygen commands that the headers use


SPECIAL = re.compile(r"[@\\#<>&%*`]|__")


def escaped(text):
    """Escapes prose. Quoted texts and words that contain special characters become code."""

    def put(found):
        word = found.group()
        if not SPECIAL.search(word):
            return word
        if "\\" not in word and (word.startswith('"') or re.search(r"[*`]|__", word)):
            body, marks = re.fullmatch(r"(.*?[^),.;:])?([),.;:]*)", word).groups("")
            return (f"`` {body} ``" if "`" in body else f"`{body}`") + marks
        plain = re.sub(r"([@\\#<>&%])", r"\\\1", word)
        return plain.replace('"', "&quot;") if "\\" in word else plain

    return re.sub(r'"[^"]*"[^\s"]*|[^\s"]+|"', put, text)


class Writer:
    """Converts the lines of one comment to doxygen's syntax."""

    def __init__(self, group, parameters):
        self.group = group
        self.parameters = parameters
        self.out = []
        self.code = None  # lines of the example that is being written
        self.column = None  # column in which the text of the current label begins
        self.text = []  # lines of the paragraph that is being written

    def line(self, text):
        indent = len(text) - len(text.lstrip(" "))
        if self.column is not None and text.strip() and indent == self.column:
            self.text.append(text.strip())
        elif not text.strip():
            self.blank()
        elif indent >= 4:
            self.example(text)
        else:
            self.prose(text)

    def end_paragraph(self):
        if self.text:
            self.out.append(escaped(" ".join(self.text)))
            self.text = []

    def blank(self):
        if self.code is None:
            self.end_paragraph()
            self.out.append("")
            self.column = None
        else:
            self.code.append("")

    def example(self, text):
        self.end_paragraph()
        self.column = None
        if self.code is None:
            self.code = []
        self.code.append(text[4:])

    def end_example(self):
        if self.code is None:
            return
        while self.code and not self.code[-1]:
            self.code.pop()
        if re.search(r"[^.]\.$", self.code[-1]):
            self.out += ["", *list_items(self.code), ""]
        elif table_columns(self.code):
            self.out += ["", *table(self.code), ""]
        else:
            cpp = any(re.search(r"\);$|\{$|==|(^|\s)//", line) for line in self.code)
            marks = "@code{.cpp}" if cpp else "@code{.unparsed}"
            # A zero-width character splits every sequence that would begin or end a comment.
            lines = [re.sub(r"/(?=\*)|\*(?=/)", "\\g<0>\N{WORD JOINER}", line) for line in self.code]
            self.out += ["", marks, *lines, "@endcode", ""]
        self.code = None

    def prose(self, text):
        self.end_example()
        text = text.strip()
        if self.column is not None and self.text and not self.text[-1].endswith(SENTENCE_ENDS):
            self.text.append(text)  # a continuation line with a wrong indentation
            return
        inner = INNER_LABEL.match(text)
        if inner:
            self.prose(inner.group(1))
            text = inner.group(2)
        label = LABEL.match(text)
        name = label.group(1)[:-1] if label else ""
        command = PASSED_ON.match(text)
        if name in LABELS or (label and self.is_parameter(name)):
            self.end_paragraph()
            self.column = len(label.group(1)) + len(label.group(2))
            title = name if name in LABELS else f"Argument {name}"
            self.out += ["", f"@par {title}"]
            text = label.group(3)
        elif self.column is not None:
            self.blank()  # back to the text
        if command:
            self.end_paragraph()
            text = text[command.end():].strip()
            self.command(command.group(), text)
            if command.group() == "@name":
                text = ""
        if text:
            self.text.append(text)

    def command(self, name, text):
        lines = {"@file": f"@addtogroup {self.group} {self.group}.h", "@name": f"@name {text}"}
        self.out.append(lines.get(name, name))

    def is_parameter(self, name):
        return self.parameters and name[0].islower()

    def lines(self):
        self.end_example()
        self.end_paragraph()
        return self.out


def list_items(lines):
    """A list in prose. An item ends with a semicolon, the last one with a full stop."""
    items = [item.strip() for item in re.split(r"(?<=;)\n", "\n".join(lines))]
    return ["- " + escaped(" ".join(item.split())) for item in items]


def table_columns(lines):
    """Where the columns of a table begin; nothing if the lines are not one.

    Only columns are separated by two spaces or more, and every row has the first two of them.
    """
    if any(re.search(r"==|//|\);$| gives |^\s*$", line) for line in lines):
        return []
    width = max(map(len, lines))
    starts = [0] + [at for at in range(2, width)
                    if all(line[at - 2:at].strip() == "" for line in lines)
                    and any(line[at:at + 1].strip() for line in lines)]
    rows = table_rows(lines, starts)
    complete = len(starts) > 1 and all(row[1] for row in rows)
    return starts if complete and len(rows) > 2 and "  " not in "\n".join(sum(rows, [])) else []


def table_rows(lines, starts):
    """The rows of a table; a line that begins with a space continues the row above it."""
    rows = []
    for line in lines:
        cells = [line[start:end].strip() for start, end in zip(starts, starts[1:] + [None])]
        if line[0] != " ":
            rows.append(cells)
        else:
            rows[-1] = [f"{old} {new}".strip() for old, new in zip(rows[-1], cells)]
    return rows


def table(lines):
    rows = table_rows(lines, table_columns(lines))
    return ["<table>", *("<tr>" + "".join(f"<td>{escaped(cell)}</td>" for cell in row) + "</tr>"
                         for row in rows), "</table>"]


def comment(lines, group, parameters):
    writer = Writer(group, parameters)
    for line in lines:
        writer.line(line)
    return writer.lines()


def membership(line, group, documented):
    """What puts a declaration outside of classes into the group of its header."""
    space = re.match(r"namespace (\w+)", line)
    if documented and space:  # its comment becomes a paragraph of the header's description
        return [f"/// @addtogroup {group} {group}.h", f"/// @par {space.group(1)}"]
    if documented or re.match(r"(?:class|struct|enum class) \w+ .*\{$", line):
        return [f"/// @ingroup {group}"]
    return []


def cpp_header(text, group):
    out, block, margin = [], [], ""
    for line in text.splitlines() + [""]:
        found = re.match(r"^(\s*)///(?!<)( ?)(.*)$", line)
        if found:
            margin = found.group(1)
            block.append(found.group(3))
            continue
        out += membership(line, group, bool(block) and not margin and block[0][:1] != "@")
        out += [f"{margin}/// {part}".rstrip() for part in comment(block, group, False)]
        block = []
        found = re.match(r"^(.*///<)(.*)$", line)
        out.append(found.group(1) + escaped(found.group(2)) if found else line)
    return "\n".join(out)


def c_header(text, group):
    def block(found):
        opening, body = found.group(1), found.group(2)
        lines = [re.sub(r"^\s*\* ?", "", line) for line in body.strip().splitlines()]
        if opening == "/**<":
            return "/**< " + " ".join(escaped(line.strip()) for line in lines) + " */"
        if opening == "/*" and (len(lines) < 3 or found.start() == 0):
            return ""  # a comment for readers of the source
        if opening == "/*":
            lines.insert(0, "@file")
        if lines[0] == "@file":
            lines.append("@{")
        # The asterisk prevents an example from ending the comment.
        converted = comment(lines, group, True)
        return "/**\n" + "\n".join(f" * {line}".rstrip() for line in converted) + "\n */"

    text = re.sub(r"(/\*\*<|/\*\*|/\*)(.*?)\*/", block, text, flags=re.S)
    # Each description of the file opens the group, so what follows the first one closes it before.
    first, *others = re.split(rf"(?=/\*\*\n \* @addtogroup {group} )", text)
    return first + "/** @} */\n".join(others) + "/** @} */\n"


def main():
    name = sys.argv[1]
    with open(name, encoding="utf-8") as file:
        text = file.read()
    header = c_header if "/include/kovaplatform/" in name else cpp_header
    sys.stdout.write(header(text, pathlib.Path(name).stem))


if __name__ == "__main__":
    main()
