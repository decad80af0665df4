#!/usr/bin/env python3
"""Runs clang-tidy on sources, one file a run, and remembers which of them were clean.

Usage: scripts/tidy.py BUILD_FOLDER SOURCE...

A source is not checked again while everything that its result depends on is unchanged: the contents
of every file that its compilation reads, comments included, since NOLINT is one; its compile
command; every .clang-tidy above those files; clang-tidy itself, and this script. A hash of all this
names an empty file in BUILD_FOLDER/tidy. Only clean results are kept, so a finding is reported each
time.
"""
import concurrent.futures
import functools
import hashlib
import json
import os
import pathlib
import shlex
import shutil
import subprocess
import sys

TIDY = shutil.which("clang-tidy")
CLANG = shutil.which("clang++")


@functools.lru_cache(None)
def digest(path):
    return hashlib.sha256(path.read_bytes()).hexdigest()


@functools.lru_cache(None)
def configurations(folder):
    """The .clang-tidy files of a folder and of those above it."""
    files = (place / ".clang-tidy" for place in (folder, *folder.parents))
    return frozenset(file for file in files if file.is_file())


def commands(build):
    """The compile command of each source, as arguments, with the folder where it runs."""
    found = {}
    for entry in json.loads((build / "compile_commands.json").read_text(encoding="utf-8")):
        folder = pathlib.Path(entry["directory"])
        words = entry.get("arguments") or shlex.split(entry["command"])
        found.setdefault((folder / entry["file"]).resolve(), []).append((folder, words))
    return found


def files_read(folder, words):
    """Every file that a compilation reads, or None if clang cannot list them."""
    # What precedes the first option is the compiler, and perhaps its launcher.
    first = next(index for index, word in enumerate(words) if word.startswith("-"))
    options, skip = [], False
    for word in words[first:]:
        if skip or word in ("-o", "-MF", "-MT", "-MQ"):
            skip = not skip
        elif word not in ("-c", "-MD", "-MMD"):
            options.append(word)
    # clang-tidy defines this, too.
    run = subprocess.run([CLANG, *options, "-D__clang_analyzer__", "-w", "-M"], cwd=folder, capture_output=True, text=True,
                         check=False)
    if run.returncode != 0:
        return None
    _, _, rule = run.stdout.replace("\\\n", " ").partition(":")
    return {(folder / name).resolve() for name in shlex.split(rule)}


def key_of(compilations):
    """The hash of what the result depends on, or None if it cannot be found out."""
    if not CLANG or not compilations:  # without a command, clang-tidy makes one up
        return None
    files = {pathlib.Path(TIDY).resolve(), pathlib.Path(__file__).resolve()}
    parts = []
    for folder, words in compilations:
        read = files_read(folder, words)
        if read is None:
            return None
        files.update(read, *(configurations(file.parent) for file in read))
        parts += [str(folder), *words]
    parts += [f"{file} {digest(file)}" for file in sorted(files)]
    return hashlib.sha256("\0".join(parts).encode()).hexdigest()


def check(source, build, compilations):
    """Returns the findings in a source; None when it is clean."""
    kept, key = build / "tidy", key_of(compilations)
    if key and (kept / key).exists():
        return None
    run = subprocess.run([TIDY, "--quiet", "-p", str(build), str(source)], capture_output=True,
                         text=True, check=False)
    if run.returncode != 0 or run.stdout.strip():
        return run.stdout + run.stderr
    digest.cache_clear()
    configurations.cache_clear()
    if key and key == key_of(compilations):  # nothing was edited meanwhile
        kept.mkdir(exist_ok=True)
        (kept / key).touch()
    return None


def main():
    if len(sys.argv) < 2 or not TIDY:
        sys.exit(__doc__ if TIDY else "needs clang-tidy")
    build = pathlib.Path(sys.argv[1])
    known, failed = commands(build), False
    with concurrent.futures.ThreadPoolExecutor(os.cpu_count()) as pool:
        runs = {pool.submit(check, source, build, known.get(pathlib.Path(source).resolve(), [])): source
                for source in sys.argv[2:]}
        for run in concurrent.futures.as_completed(runs):
            if run.result() is not None:
                print(run.result().rstrip() or f"{runs[run]}: clang-tidy failed", flush=True)
                failed = True
    return 1 if failed else 0


if __name__ == "__main__":
    sys.exit(main())
