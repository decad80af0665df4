#!/usr/bin/env python3
"""Brings the list of symbols of a library's Debian package up to date.

Usage: scripts/symbols.py LIBRARY LIST PACKAGE VERSION

LIST then has one line for each function that LIBRARY exports. A line that is already there keeps its
version; a new one gets VERSION. A name that contains a type whose size depends on the processor
becomes an expression that matches the name on each of them.
"""
import pathlib
import re
import subprocess
import sys

HEAD = """\
{library}.so.{major} {package} #MINVER#
* Build-Depends-Package: {library}-dev
# What programs may call, each with the version that brought it; one line a function, as c++filt
# writes it (constructors and destructors are several symbols under one such name). The version ends
# in "~" because a symbol that is lost in the very version that brought it would not be noticed.
# The package does not build when the library exports another list.
"""
# Types that have another name on another processor, as c++filt writes them on x86-64: size_t and
# uint64_t, int64_t, numbers of the latter in a template, va_list. "long long" is the same everywhere.
VARYING = [
    (r"unsigned long(?! long)", "unsigned (int|long|long long)"),
    (r"(?<!long )(?<!unsigned )\blong\b(?! long)", "long( long)?"),
    (r"\b(\d+)l\b", r"\1ll?"),
    (r"__va_list_tag\*", ".*"),
]


def entry(name):
    """The line of a symbol without its version."""
    varying = re.compile("|".join(pattern for pattern, _ in VARYING))
    expression, end = "", 0
    for found in varying.finditer(name):
        for pattern, other in VARYING:
            if re.fullmatch(pattern, found.group()):
                expression += escaped(name[end:found.start()]) + re.sub(pattern, other, found.group())
                end = found.end()
                break
    if not expression:
        return f' (c++)"{name}@Base"'
    return f' (c++|regex)"^{expression}{escaped(name[end:])}@Base$"'


def escaped(text):
    return re.sub(r"[][\\^$.|?*+(){}]", r"\\\g<0>", text)


def exported(library):
    """The names of the functions that a library exports."""
    table = subprocess.run(["nm", "-D", "--defined-only", library], check=True, capture_output=True,
                           text=True).stdout
    mangled = "\n".join(line.split()[2] for line in table.splitlines())
    names = subprocess.run(["c++filt"], input=mangled, check=True, capture_output=True,
                           text=True).stdout
    return sorted(set(names.splitlines()))


def updated(text, names, version):
    """The text of a list with a line for each name."""
    lines = text.splitlines()
    since = dict(line.rsplit(" ", 1) for line in lines if line.startswith(" "))
    head = [line for line in lines if not line.startswith(" ")]
    return "\n".join(head + [f"{line} {since.get(line, version)}" for line in map(entry, names)]) + "\n"


def main():
    library, path, package, version = sys.argv[1], pathlib.Path(sys.argv[2]), *sys.argv[3:]
    stem, major = re.fullmatch(r"(.*?)(\d+)", package).groups()
    old = path.read_text() if path.exists() else HEAD.format(library=stem, package=package,
                                                             major=major)
    new = updated(old, exported(library), version)
    for line in sorted(set(old.splitlines()) ^ set(new.splitlines())):
        print("+" if line in new.splitlines() else "-", line.strip())
    path.write_text(new)


if __name__ == "__main__":
    main()
