#!/usr/bin/env python3
"""Checks that the commands named in the pages exist. Usage: commands_test.py KOVABACKUP"""
import pathlib
import re
import subprocess
import sys

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
NAMED = re.compile(r"kovabackup ([a-z]+)(?: ([a-z]+))?")


def named_commands():
    """The command groups and commands in code spans, each with its page."""
    pages = [*ROOT.glob("*.md"), *(ROOT / "docs").glob("*.md")]
    for page in pages:
        for span in re.findall(r"`([^`\n]+)`", page.read_text(encoding="utf-8")):
            found = NAMED.match(span)
            if found:
                yield page.name, [word for word in found.groups() if word]


def main():
    commands = list(named_commands())
    failed = len(commands) < 5
    for page, words in commands:
        result = subprocess.run([sys.argv[1], *words, "--help"], capture_output=True, text=True,
                                check=False)
        # The usage line names the command, so the help of another one does not count.
        if result.returncode != 0 or f"Usage: kovabackup {' '.join(words)}" not in result.stdout:
            print(f"{page}: no command '{' '.join(words)}': {result.stderr}")
            failed = True
    print(f"{len(commands)} commands named")
    return 1 if failed else 0


if __name__ == "__main__":
    sys.exit(main())
