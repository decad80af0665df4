#!/usr/bin/env python3
"""Finds words that read badly in comments, pages, messages and scripts.

Usage: scripts/words.py [--count] [PATH...]   (every tracked file by default)
  --count   print only how many hits each file has

Read are comments of C and C++, string literals of the command and the examples, and all of any
other text. The texts of log lines are contracts and are not read: they are literals of the library
and the platform, and the "text" entries of docs/messages.toml, which docs/messages.md repeats.
"""
import pathlib
import re
import subprocess
import sys

ROOT = pathlib.Path(__file__).resolve().parent.parent

# What is found, and what to write instead. Uses that are right are excluded in the pattern.
RULES = [
    (r"(?<!\bthere )\b(?:is|are|was|were|be) no (?!longer|more|less|fewer|other\b|such\b)",
     '"is not a"'),
    (r"\b(?:stands?|stood|standing)\b(?!-| for\b| in for\b)", '"is", "exists" or "applies"'),
    (r"\b(?:tells?|telling|told)\b(?! (?:[\w-]+ ){0,3}apart\b)", '"reports", "returns", "says"'),
    (r"\b(?:wants?|wanting)\b", '"requires", "needs"'),
    # In quotes, or as *whole* in a manual page, it is a state that the command prints.
    (r"(?<!\bas a )(?<!['\"*])\bwhole\b(?! numbers?\b)|\bwholes\b",
     '"complete", "unchanged", "entire", "atomically"'),
    (r"\b(?:whoever|whosoever|(?<!\buser )nobody|somebody)\b(?![\"`])", "the caller, process, user or thread by name"),
    (r"\b(?:no|without|short of|want of) memory\b(?! limit)", '"on bad_alloc", "memory runs out"'),
    (r"\b(?:lest|anew|heed(?:s|ed)?|in vain|in one piece|the road|thereof|hereby|amiss)\b",
     "a plainer word"),
    (r"\b[Jj]udg(?:e|es|ed|ing)\b", '"oracle" of a test; "checked", "compared"'),
    (r"\b(?:inner runs?|blanks)\b", '"infix", "white space"'),
    (r"\bgives? up\b(?! owner)", '"releases", "stops"'),
    (r"\bfor want\b|\bgoes with (?:it|them|the)\b|\bknows? nothing of\b", "a plainer sentence"),
]
COMPILED = [(re.compile(pattern.replace(" ", "[ \\n]"), re.I), instead)
            for pattern, instead in RULES]

# Files of other people's words, and files that are made from others.
SKIPPED = re.compile(r"^(LICENSE|abi/|bench/results/|debian/changelog|debian/copyright|"
                     r"docs/messages\.md|docs/.*\.svg|fuzz/corpus/|scripts/words\.py|"
                     r"tests/docs/words_test\.py|.*\.dict$)")
TOKEN = re.compile(r'//[^\n]*|/\*.*?\*/|R"(\w*)\(.*?\)\1"|"(?:\\.|[^"\\\n])*"|\'(?:\\.|[^\'\\\n])*\'',
                   re.S)


def c_prose(text, literals):
    """The text with all but its comments, and literals where they are prose, made blank."""
    def keep(token):
        return token.startswith("/") or (literals and token.startswith(('"', "R")))

    out, end = [], 0
    for match in TOKEN.finditer(text):
        out.append(re.sub(r"[^\n]", " ", text[end:match.start()]))
        token = match.group()
        out.append(token if keep(token) else re.sub(r"[^\n]", " ", token))
        end = match.end()
    return "".join(out) + re.sub(r"[^\n]", " ", text[end:])


def prose(name, text):
    if name.endswith((".cpp", ".h", ".c")):
        return c_prose(text, name.startswith(("tools/", "examples/")))
    if name == "docs/messages.toml":
        return re.sub(r"^text\b.*$", "", text, flags=re.M)
    return text


def hits_in(name, text):
    """Line, words and remedy of each hit in the text of a file of this name."""
    text = prose(name, text)
    # A phrase may be split by a line end and the mark of a comment: one line end remains of both.
    joined = re.sub(r"[ \t]*\n[ \t]*(?:///?<?|#|\*)?[ \t]*", "\n", text)
    joined = re.sub(r"[ \t]+", " ", joined)
    for pattern, instead in COMPILED:
        for match in pattern.finditer(joined):
            yield joined.count("\n", 0, match.start()) + 1, match.group(), instead


def files(paths):
    listed = subprocess.run(["git", "ls-files", "-z", "--", *paths], cwd=ROOT, check=True,
                            capture_output=True, text=True).stdout.split("\0")
    for name in listed:
        file = ROOT / name
        if name and not SKIPPED.search(name) and file.is_file() and not file.is_symlink():
            yield name


def main(arguments):
    counting = "--count" in arguments
    total = 0
    for name in files([argument for argument in arguments if argument != "--count"]):
        found = sorted(hits_in(name, (ROOT / name).read_text(encoding="utf-8", errors="replace")))
        total += len(found)
        if counting and found:
            print(f"{len(found):5} {name}")
        elif not counting:
            for line, words, instead in found:
                print(f"{name}:{line}: '{' '.join(words.split())}': write {instead}")
    if total:
        print(f"{total} hits of the word list")
    return 1 if total else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
