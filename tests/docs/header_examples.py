#!/usr/bin/env python3
"""Turns the examples in the comments of the public headers into one test program's sources.

Usage: header_examples.py OUTPUT_FOLDER PROJECT_FOLDER HEADER...

An example begins with a comment line that stands four blanks in and runs as long as lines are that
far in. Each becomes a test in the namespace in which it stands:

- Lines of claims, "f(1) == 2   f(3) == 4", are tested as they stand.
- All others need an entry in header_examples.toml, which says how they are to be read. An example
  without one is an error, and so is an entry without an example.

In an example that is a piece of a program a line that begins with "..." stands for code of the
entry. A statement with a value in its comment, "f(x);  // "text"" or "// true: why", must have it.
"""
import pathlib
import re
import sys
import tomllib

KEYS = {"at", "includes", "before", "during", "after", "line", "skip", "claim", "replace",
        "paragraphs", "log", "prose"}
HEAD = """\
// Made by tests/docs/header_examples.py from {name}.
{includes}
#include "tests/docs/header_helpers.h"
#include "tests/docs/snippet_fixture.h"

// A failing assert ends its example only.
#undef assert
#define assert(...) ((__VA_ARGS__) ? void() : KovaTest::snippetFailed(#__VA_ARGS__, __LINE__))

class {suite} : public KovaTest::SnippetTest {{}};
"""


class Example:
    def __init__(self, line, scope):
        self.line = line  # of its first line, counted from 1
        self.scope = scope  # the namespaces around it
        self.lines = []

    def first(self):
        return " ".join(self.lines[0].split())


def examples_of(text):
    """The examples of a header, and with each the namespaces that are open there."""
    found, open_, scope = [], None, []
    for number, line in enumerate(text.splitlines(), 1):
        space = re.match(r"namespace (\w+) \{$", line)
        if space:
            scope.append(space.group(1))
        elif re.match(r"\} // namespace", line):
            scope.pop()
        comment = re.match(r"^(?: *///| \*)(?: (.*))?$", line)
        words = (comment.group(1) or "") if comment else None
        indent = len(words) - len(words.lstrip(" ")) if words else 0
        if open_ and words is not None and (indent >= 4 or not words.strip()):
            open_.lines.append(words[4:])
        elif indent == 4:
            open_ = Example(number, list(scope))
            open_.lines.append(words[4:])
            found.append(open_)
        else:
            open_ = None
    for example in found:
        while not example.lines[-1].strip():
            example.lines.pop()
    return found


def quoted(text):
    return '"' + text.replace("\\", "\\\\").replace('"', '\\"') + '"'


def claims_of(lines):
    """The claims of an example that is nothing but claims; else nothing."""
    claims = [part.strip() for line in lines for part in re.split(r" {3,}", line.strip()) if part]
    return claims if all(re.search(r"\) == \S", claim) for claim in claims) else []


VALUE = re.compile(r'^(\S.*\));\s*// ("[^"]*"|true|false|-?\d+)(?:[,:].*)?$')


def statements(lines, during):
    """A piece of a program: values in comments are tested, "..." lines are replaced."""
    during = list(during)
    for text in lines:
        if text.strip().startswith("..."):
            if not during:
                raise SystemExit(f"nothing stands for: {text}")
            yield during.pop(0)
            continue
        value = VALUE.match(text)
        plain = value and not re.match(r"(const|return|if)\b|[\w:<>, ]+ [&*]?\w+ =", value.group(1))
        yield f"assert({value.group(1)} == {value.group(2)});" if plain else text
    if during:
        raise SystemExit(f"stands for nothing: {during}")


def joined_values(lines):
    """A value whose comment did not fit beside its statement stands on the next line."""
    out = []
    for text in lines:
        if out and re.match(r"^\s+// \"", text) and out[-1].rstrip().endswith(";"):
            out[-1] = f"{out[-1]} {text.strip()}"
        else:
            out.append(text)
    return out


def claimed(lines, entry):
    """What the entry's expressions make of the lines: one claim for each match."""
    for text in lines:
        if re.search(entry.get("skip", r"^$"), text):
            continue
        rest, matches = text, list(re.finditer(entry["line"], text))
        for match in matches:
            rest = rest.replace(match.group(), "", 1)
            yield re.sub(r"\{(q?)(\d)\}", lambda place, found=match: (
                quoted(found.group(int(place.group(2)))) if place.group(1)
                else found.group(int(place.group(2)))), entry["claim"])
        if not matches or rest.strip():
            raise SystemExit(f"cannot be read: {text}")


def body_of(example, entry):
    lines = example.lines
    for old, new in entry.get("replace", {}).items():
        if not any(old in text for text in lines):
            raise SystemExit(f"{example.first()}: nothing to replace: {old}")
        lines = [text.replace(old, new) for text in lines]
    if "line" in entry:
        code = list(claimed(lines, entry))
    else:
        code = list(statements(joined_values(lines), entry.get("during", [])))
    if entry.get("paragraphs"):
        parts = "\n".join(code).split("\n\n")
        code = [f"if (![&]() -> bool {{\n{part}\nreturn true;\n}}()) return false;"
                for part in parts]
    elif code[-1].startswith("return "):
        code = ["if (![&]() -> bool {", *code, "}()) return false;"]
    return "\n".join([entry.get("before", ""), *code, entry.get("after", "")])


def test_of(example, entry, suite, where):
    name = f"line{example.line}"
    opened = "".join(f"namespace {space} {{ " for space in example.scope)
    log = ", ".join(map(quoted, entry.get("log", [])))
    call = "::".join(["", *example.scope, name])
    return (f"{opened}\nstatic bool {name}() {{\n#line {example.line} {quoted(where)}\n"
            f"{body_of(example, entry)}\nreturn true;\n}}\n{'}' * len(example.scope)}\n"
            f"TEST_F({suite}, Line{example.line}) {{ run({call}, {{{log}}}); }}\n")


def entry_of(example, header, entries, used):
    for entry in entries:
        name, _, first = entry["at"].partition(": ")
        if name == header and example.first().startswith(first):
            used.append(entry["at"])
            return entry
    if claims_of(example.lines):
        return {"line": r"\S.*?\) == .*?(?=\s{3}|$)", "claim": "assert({0});"}
    raise SystemExit(f"{header}:{example.line}: no test reads the example: {example.first()}")


def source_of(path, where, entries, used):
    suite = "".join(part.capitalize() for part in path.stem.split("_")) + "Header"
    tests, includes = [], {f"#include <{path.parent.name}/{path.name}>"}
    for example in examples_of(path.read_text(encoding="utf-8")):
        entry = entry_of(example, path.name, entries, used)
        unknown = set(entry) - KEYS
        if unknown:
            raise SystemExit(f"{entry['at']}: unknown {unknown}")
        includes.update(f"#include <{name}>" for name in entry.get("includes", []))
        if "prose" not in entry:
            tests.append(test_of(example, entry, suite, where))
    head = HEAD.format(name=where, suite=suite, includes="\n".join(sorted(includes)))
    used_names = "namespace KOVA { namespace Backup {}}\nusing namespace KOVA::Backup;\n"
    return "\n".join([head, used_names, *tests])


def main():
    output, project = pathlib.Path(sys.argv[1]), pathlib.Path(sys.argv[2])
    data = pathlib.Path(__file__).with_name("header_examples.toml")
    entries, used = tomllib.loads(data.read_text(encoding="utf-8"))["example"], []
    for name in sys.argv[3:]:
        path = project / name
        text = source_of(path, name, entries, used)
        target = output / f"{path.stem}_header.cpp"
        if not target.exists() or target.read_text(encoding="utf-8") != text:
            target.write_text(text, encoding="utf-8")
    idle = [entry["at"] for entry in entries if used.count(entry["at"]) != 1]
    if idle:
        raise SystemExit(f"{data.name}: not the words of one example: {idle}")


if __name__ == "__main__":
    main()
