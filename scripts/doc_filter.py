#!/usr/bin/env python3
"""Converts a header or page to input for doxygen. Usage: doc_filter.py FILE

In the comments of the headers
    @file Some sentence.           begins the description of the file
    Returns: Errors: Log: ...      begin a labelled paragraph; its text continues in the same column
    lines indented by four spaces  are examples
and everything else is prose, in which no character has a special meaning. In the C headers a comment
that begins with "/*" describes the file; if it has fewer than three lines, it is left out.
"""
import re
import sys

LABEL = re.compile(r"^((?:[A-Z][a-z]+|errno|[a-z]\w*(?:, \w+)*):)(\s+)(\S.*)$")
LABELS = {"Returns", "Errors", "errno", "Log", "Threads", "Process", "Owns", "Blocks", "Units", "Throws", "Kernel",
          "Signals", "Failure", "Ownership", "Trust", "States", "Secrets", "Lock", "Cost"}
# A label after a sentence on the same line: "Compares two texts. Returns: 1 for a match."
INNER_LABEL = re.compile(r"^(.*\.) (Returns: .*)$")
SENTENCE_ENDS = (".", ":", ";", ")")
PASSED_ON = re.compile(r"@(?:file|name|brief|\{|\})")  # doxygen commands that the headers use


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

    def __init__(self, parameters):
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
        cpp = any(re.search(r";$|==|//", line) for line in self.code)
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
            self.out += ["", "@return" if name == "Returns" else f"@par {title}"]
            text = label.group(3)
        elif self.column is not None:
            self.blank()  # back to the text
        if command:
            self.end_paragraph()
            self.out.append(command.group())
            text = text[command.end():].strip()
            if command.group() == "@file":
                text = text and "@brief " + text
            elif command.group() == "@name":
                self.out[-1], text = f"@name {text}", ""
        if text.startswith("@brief "):
            self.out.append("@brief")
            text = text[7:]
        if text:
            self.text.append(text)

    def is_parameter(self, name):
        return self.parameters and name[0].islower()

    def lines(self):
        self.end_example()
        self.end_paragraph()
        return self.out


def comment(lines, parameters):
    writer = Writer(parameters)
    for line in lines:
        writer.line(line)
    return writer.lines()


def cpp_header(text):
    out, block, margin = [], [], ""
    for line in text.splitlines() + [""]:
        found = re.match(r"^(\s*)///(?!<)( ?)(.*)$", line)
        if found:
            margin = found.group(1)
            block.append(found.group(3))
            continue
        out += [f"{margin}/// {part}".rstrip() for part in comment(block, False)]
        block = []
        found = re.match(r"^(.*///<)(.*)$", line)
        out.append(found.group(1) + escaped(found.group(2)) if found else line)
    return "\n".join(out)


def c_header(text):
    def block(found):
        opening, body = found.group(1), found.group(2)
        lines = [re.sub(r"^\s*\* ?", "", line) for line in body.strip().splitlines()]
        if opening == "/**<":
            return "/**< " + " ".join(escaped(line.strip()) for line in lines) + " */"
        if opening == "/*" and (len(lines) < 3 or found.start() == 0):
            return ""  # a comment for readers of the source
        if opening == "/*":
            lines.insert(0, "@file")
        elif lines[0] == "@file":
            lines = ["@file", "@brief " + lines[1]] + lines[2:]
        # The asterisk prevents an example from ending the comment.
        return "/**\n" + "\n".join(f" * {line}".rstrip() for line in comment(lines, True)) + "\n */"

    return re.sub(r"(/\*\*<|/\*\*|/\*)(.*?)\*/", block, text, flags=re.S)


def grouped(text, name):
    """Puts a file into the group of its library; docs/reference.dox describes the groups."""
    group = next(group for folder, group in (("kovaplatform/", "platform"),
                                             ("kovabackup/service/", "service"),
                                             ("", "util")) if name.startswith(folder))
    return re.sub(r"^([/* ]*)@file$", rf"\1@file\n\1@ingroup {group}", text, count=1, flags=re.M)


def page(text):
    """Converts a Markdown page. Doxygen accepts one word as the info string of a code block."""
    text = re.sub(r"^```(\w+) .*$", r"```\1", text, flags=re.M)
    text = re.sub(r"^```(\w+)$", r"```{.\1}", text, flags=re.M)
    # Links to what the reference does not contain become plain text.
    text = re.sub(r"\[([^\]]*)\]\((#[^)]*|LICENSE|docs/|examples/[^)]*)\)", r"\1", text)
    return re.sub(r"<!--.*?-->\n*", "", text, flags=re.S)


def main():
    with open(sys.argv[1], encoding="utf-8") as file:
        text = file.read()
    if sys.argv[1].endswith(".md"):
        sys.stdout.write(page(text))
        return
    header = c_header if "/include/kovaplatform/" in sys.argv[1] else cpp_header
    sys.stdout.write(grouped(header(text), sys.argv[1].rpartition("/include/")[2]))


if __name__ == "__main__":
    main()
