#!/usr/bin/env python3
"""Compares what gcovr counted with what each part of the product requires.

Usage: coverage.py check JSON          exits with 1 if a part has too little
       coverage.py show JSON [PART]    lists what no test runs, in paths that contain PART
"""
import collections
import json
import pathlib
import sys

# Parts, their folders, and the least percentages of lines and branches; None: no bound.
PARTS = (
    ("library", ("base", "common", "string", "path", "proc", "network", "temp_manager", "option",
                 "session"), 100, 95),
    ("service library", ("service",), 100, 95),
    ("stand-ins", ("platform",), 100, 95),
    ("command", ("tools",), 98, 84),
)


class Count:
    """How many lines and branches there are, and how many of them ran."""

    def __init__(self):
        self.lines = self.lines_run = self.branches = self.branches_run = 0

    def add(self, lines):
        """Adds the lines of a source."""
        for line in lines:
            self.lines += 1
            self.lines_run += line["count"] > 0
            for branch in line["branches"]:
                self.branches += 1
                self.branches_run += branch["count"] > 0

    def missed(self, lines, branches):
        """What is below its bound, as a text for each."""
        if self.lines == 0:
            return ["there is nothing to count"]
        checks = (("lines", self.lines_run, self.lines, lines),
                  ("branches", self.branches_run, self.branches, branches))
        return [f"{percent(run, total)} of the {name}, {bound} % are required"
                for name, run, total, bound in checks
                if bound is not None and run * 100 < bound * total]


def percent(run, total):
    """Rounded down, so that only everything is 100 %."""
    return f"{run * 1000 // total / 10:.1f} %" if total else "-"


def sources(path):
    """Path and counted lines of each source."""
    for file in json.loads(pathlib.Path(path).read_text(encoding="utf-8"))["files"]:
        yield file["file"], [line for line in file["lines"] if not line["gcovr/noncode"]]


def row(name, count):
    """A row of the table."""
    return (f"{name:24}{count.lines_run:7}{count.lines:7}{percent(count.lines_run, count.lines):>9}"
            f"{count.branches_run:9}{count.branches:7}"
            f"{percent(count.branches_run, count.branches):>9}")


def check(path):
    """Prints the table; returns whether every part has enough."""
    folders = collections.defaultdict(Count)
    parts = collections.defaultdict(Count)
    for source, lines in sources(path):
        folder = str(pathlib.PurePath(source).parent)
        folders[folder].add(lines)
        for name, tops, _, _ in PARTS:
            if folder.split("/")[0] in tops:
                parts[name].add(lines)
    print(f"{'folder':24}{'run':>7}{'lines':>7}{'':9}{'run':>9}{'branches':>10}")
    for folder in sorted(folders):
        print(row(folder, folders[folder]))
    print()
    failures = []
    for name, _, lines, branches in PARTS:
        print(row(name, parts[name]))
        failures += [f"{name}: {text}" for text in parts[name].missed(lines, branches)]
    for failure in failures:
        print(f"coverage: {failure}", file=sys.stderr)
    return not failures


def show(path, part):
    """Lists lines and branches without a count."""
    for source, lines in sources(path):
        if part not in source:
            continue
        for line in lines:
            missing = [str(number) for number, branch in enumerate(line["branches"])
                       if branch["count"] == 0]
            if line["count"] == 0:
                print(f"{source}:{line['line_number']}: line")
            elif missing:
                print(f"{source}:{line['line_number']}: "
                      f"branch {', '.join(missing)} of {len(line['branches'])}")


def main(arguments):
    """Returns the exit code."""
    if len(arguments) == 2 and arguments[0] == "check":
        return 0 if check(arguments[1]) else 1
    if len(arguments) in (2, 3) and arguments[0] == "show":
        show(arguments[1], arguments[2] if len(arguments) == 3 else "")
        return 0
    print(__doc__, file=sys.stderr)
    return 2


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
