#!/usr/bin/env python3
"""Reads layers.txt, the list of the project's folders and of what each may include.

Usage: scripts/layers.py check            names every include that the list does not allow
       scripts/layers.py folders KIND...  prints the folders of these kinds, one a line
"""
import pathlib
import re
import subprocess
import sys
from typing import NamedTuple

ROOT = pathlib.Path(__file__).resolve().parent.parent
INTERFACES = {"kovabackup": "include/kovabackup", "kovaplatform": "platform/include"}
INCLUDE = re.compile(r'^[ \t]*#[ \t]*include[ \t]*["<]([^">\n]+)[">]', re.M)
SOURCE = (".cpp", ".h", ".c")


class Layer(NamedTuple):
    kind: str
    folder: str
    allowed: frozenset
    holds: str


def parse(text):
    """The layers by folder, in the order of the list."""
    layers = {}
    for row in text.splitlines():
        if row.strip() and not row.startswith("#"):
            kind, folder, allowed, holds = (cell.strip() for cell in row.split("|"))
            if folder in layers:
                raise ValueError(f"layers.txt names {folder} twice")
            layers[folder] = Layer(kind, folder, frozenset(allowed.split()), holds)
    known = set(layers) | set(INTERFACES) | {"*"}
    for layer in layers.values():
        if not layer.allowed <= known:
            raise ValueError(f"layers.txt: {layer.folder} may include {layer.allowed - known}")
    return layers


def read():
    return parse((ROOT / "layers.txt").read_text(encoding="utf-8"))


def folder_of(path, layers):
    """The innermost listed folder that holds a path; None when none does."""
    parts = path.split("/")[:-1]
    while parts and "/".join(parts) not in layers:
        parts.pop()
    return "/".join(parts) or None


def header_owners(names, layers):
    """Which module implements each public header: the one with a source of the same stem."""
    owners = {}
    for name in names:
        folder = folder_of(name, layers)
        if name.endswith(".cpp") and folder and layers[folder].kind == "module":
            owners[f"kovabackup/{pathlib.PurePosixPath(name).stem}.h"] = folder
    return owners


def layer_of(name, layers, owners):
    """The folder whose rules a source obeys; a public header obeys those of its module."""
    if name.startswith("include/"):
        return owners.get(name.removeprefix("include/"))
    return folder_of(name, layers)


def target_of(include, name, layers, owners):
    """The folder, or "kovabackup" or "kovaplatform", that an include leads to; None outside."""
    first = include.split("/")[0]
    if first == "kovabackup":
        inside = layers[layer_of(name, layers, owners)].kind == "module"
        return owners.get(include, first) if inside else first
    if first in INTERFACES:
        return first
    return folder_of(include, layers)


def violations(files, layers):
    """files: the text of each source by its path. Returns a sentence for each violation."""
    owners = header_owners(files, layers)
    found = [f"layers.txt: {folder} has no sources" for folder in layers
             if not any(name.startswith(folder + "/") for name in files)]
    for name, text in sorted(files.items()):
        layer = layer_of(name, layers, owners)
        if layer is None:
            found.append(f"{name}: layers.txt names no folder that holds or implements it")
            continue
        allowed = layers[layer].allowed | {layer}
        if layer == "platform/include":
            allowed |= {"kovaplatform"}
        for match in INCLUDE.finditer(text):
            target = target_of(match.group(1), name, layers, owners)
            private = name.startswith("include/") and not match.group(1).startswith("kovabackup/")
            if target and (private or target not in allowed and "*" not in allowed):
                line = text.count("\n", 0, match.start()) + 1
                found.append(f"{name}:{line}: {layer} may not include {match.group(1)}")
    return found


def tracked_sources():
    names = subprocess.run(["git", "ls-files", "-z"], cwd=ROOT, check=True, capture_output=True,
                           text=True).stdout.split("\0")
    return {name: (ROOT / name).read_text(encoding="utf-8")
            for name in names if name.endswith(SOURCE) and (ROOT / name).is_file()}


def main(arguments):
    layers = read()
    if arguments[:1] == ["folders"]:
        print("\n".join(folder for folder, layer in layers.items() if layer.kind in arguments[1:]))
        return 0
    if arguments == ["check"]:
        found = violations(tracked_sources(), layers)
        print("\n".join(found), end="\n" if found else "")
        return 1 if found else 0
    sys.exit(__doc__)


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
