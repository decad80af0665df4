#!/usr/bin/env python3
"""Reads layers.txt, the list of the project's folders and of what each may include.

Usage: scripts/layers.py check            prints every include that the list does not allow, every
                                          source outside it and every listed folder without sources
       scripts/layers.py folders KIND...  prints the folders of these kinds, one per line
"""
import pathlib
import re
import subprocess
import sys
from typing import NamedTuple

ROOT = pathlib.Path(__file__).resolve().parent.parent
INTERFACES = {"kovabackup": "include/kovabackup", "kovaplatform": "platform/include"}
# Public headers that need no source, with the module that they count as part of.
SOURCELESS = {"kovabackup/nodiscard.h": "common"}
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
            unknown = " ".join(sorted(layer.allowed - known))
            raise ValueError(f"layers.txt: {layer.folder} may include unknown folders: {unknown}")
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
    """Maps each public header to the module that implements it: the one with a source of that stem."""
    owners = dict(SOURCELESS)
    for name in names:
        folder = folder_of(name, layers)
        if name.endswith(".cpp") and folder and layers[folder].kind == "module":
            owners[f"kovabackup/{pathlib.PurePosixPath(name).stem}.h"] = folder
    return owners


def layer_of(name, layers, owners):
    """The folder whose rules a source obeys; a public header obeys those of its module."""
    if name.startswith("include/kovabackup/service/"):
        return "service"
    if name.startswith("include/"):
        return owners.get(name.removeprefix("include/"))
    return folder_of(name, layers)


def target_of(include, name, layers, owners):
    """What an include leads to: a folder, "kovabackup" or "kovaplatform"; None outside the project."""
    if include.startswith("kovabackup/service/"):
        return "service"
    first = include.split("/")[0]
    if first == "kovabackup":
        # Between modules a public header counts as part of the module that implements it.
        inside = layers[layer_of(name, layers, owners)].kind == "module"
        return owners.get(include, first) if inside else first
    if first in INTERFACES:
        return first
    return folder_of(include, layers)


def violations(files, layers):
    """Returns a sentence for each violation. files maps the path of each source to its text."""
    owners = header_owners(files, layers)
    found = [f"layers.txt: {folder} has no sources" for folder in layers
             if not any(name.startswith(folder + "/") for name in files)]
    for name, text in sorted(files.items()):
        layer = layer_of(name, layers, owners)
        if layer is None:
            found.append(f"{name}: layers.txt names no folder that holds or implements it")
            continue
        allowed = layers[layer].allowed | {layer}
        if layer == "platform/include":  # these headers include each other by their public names
            allowed |= {"kovaplatform"}
        for match in INCLUDE.finditer(text):
            target = target_of(match.group(1), name, layers, owners)
            # Programs have only the public headers.
            leaks = name.startswith("include/") and not match.group(1).startswith("kovabackup/")
            forbidden = target not in allowed and "*" not in allowed
            if target and (leaks or forbidden):
                line = text.count("\n", 0, match.start()) + 1
                subject = "a public header" if leaks else layer
                found.append(f"{name}:{line}: {subject} may not include {match.group(1)}")
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
