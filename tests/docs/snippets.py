#!/usr/bin/env python3
"""Turns the ```cpp blocks of Markdown files into one test program's sources.

Usage: snippets.py OUTPUT_FOLDER PROJECT_FOLDER FILE...

Of FILE.md in the project comes OUTPUT_FOLDER/<file>_snippets.cpp, with a test for each block:
    ```cpp           compiled and run, in the fixture of snippet_fixture.h
    ```cpp no-run    compiled only
The #include lines of a block are moved to the top of the source. The rest is the body of a
function that returns bool: a block may end early with "return false", which fails its test. A
block with a main is a program of its own and fails unless main returns 0. assert(x) fails the test
and ends the block. A line "// log: MODULE:NUMBER TEXT" promises a line in the system log.
"""
import pathlib
import re
import sys

FENCE = re.compile(r"^```(\w*)\s*(.*)$")
LOG = re.compile(r"^\s*// log: (.*)$")
HEAD = """\
// Made by tests/docs/snippets.py from {name}.
{includes}
#include "tests/docs/snippet_fixture.h"

// A failing assert ends its block only.
#undef assert
#define assert(claim) ((claim) ? void() : KovaTest::snippetFailed(#claim, __LINE__))

using namespace KOVA::Backup; // as the text of the documents says
"""


class Block:
    def __init__(self, line, info):
        self.line = line  # of its first line, counted from 1
        self.runs = info != "no-run"
        self.lines = []

    def includes(self):
        return [text for text in self.lines if text.startswith("#include")]

    def logs(self):
        return [found.group(1) for found in map(LOG.match, self.lines) if found]

    def body(self):
        return "\n".join("" if text.startswith("#include") else text for text in self.lines)


def blocks_of(path):
    blocks, block, fence = [], None, False
    for number, text in enumerate(path.read_text(encoding="utf-8").splitlines(), 1):
        found = FENCE.match(text)
        if fence and text == "```":
            fence, block = False, None
        elif fence:
            if block:
                block.lines.append(text)
        elif found:
            fence = True
            if found.group(1) == "cpp":
                if found.group(2) not in ("", "no-run"):
                    raise SystemExit(f"{path}:{number}: unknown mark '{found.group(2)}'")
                block = Block(number + 1, found.group(2))
                blocks.append(block)
    if fence:
        raise SystemExit(f"{path}: a block is not closed")
    return blocks


def quoted(text):
    return '"' + text.replace("\\", "\\\\").replace('"', '\\"') + '"'


def function_of(block, name, where):
    body = f"#line {block.line} {quoted(where)}\n{block.body()}\n"
    if re.search(r"^int main\(", block.body(), re.M):
        body = body.replace("int main(", "int snippetMain(")
        return (f"namespace {name} {{\n{body}}}\n"
                f"static bool {name}Run() {{ return {name}::snippetMain() == 0; }}\n")
    return f"static bool {name}Run() {{\n{body}return true;\n}}\n"


def source_of(path, where):
    """The source, or "" when the file has no block."""
    blocks = blocks_of(path)
    includes = sorted({line for block in blocks for line in block.includes()})
    suite = "".join(part.capitalize() for part in re.split(r"\W+", path.stem)) + "Snippets"
    parts = [HEAD.format(name=where, includes="\n".join(includes))]
    for block in blocks:
        name = f"line{block.line}"
        parts.append(function_of(block, name, where))
        if block.runs:
            logs = ", ".join(map(quoted, block.logs()))
            parts.append(f"TEST_F({suite}, Line{block.line}) {{ run({name}Run, {{{logs}}}); }}\n")
        else:
            parts.append(f"TEST_F({suite}, Line{block.line}Compiles) {{ (void)&{name}Run; }}\n")
    parts.insert(1, f"class {suite} : public KovaTest::SnippetTest {{}};\n")
    return "\n".join(parts) if blocks else ""


def main():
    output, project = pathlib.Path(sys.argv[1]), pathlib.Path(sys.argv[2])
    for name in sys.argv[3:]:
        path = project / name
        target = output / (re.sub(r"\W+", "_", path.stem).lower() + "_snippets.cpp")
        text = source_of(path, name) or f"// {name} has no block to run.\n"
        if not target.exists() or target.read_text(encoding="utf-8") != text:
            target.write_text(text, encoding="utf-8")


if __name__ == "__main__":
    main()
