"""The copy of the sources in which scripts/mutate has compiled all mutants in, each behind a number."""
import hashlib
import json
import os
import pathlib
import re
import subprocess
from typing import NamedTuple

import mutate_source

FOLDERS = {
    "base": "library", "common": "library", "string": "library", "path": "library",
    "proc": "library", "network": "library", "temp_manager": "library", "option": "library",
    "session": "library", "service": "service", "platform": "stand-ins", "tools": "command",
    "examples": "example"}
OTHER_TESTS = ("crash", "docs", "faults", "hostile", "install", "race")  # too slow for each mutant
BLOCK = 1024  # numbers for each source, so that a change of one leaves the others as they are
ERROR = re.compile(r"^(\S+?):(\d+):(\d+): (error|fatal error|  *required from here)", re.M)


class Failed(Exception):
    pass


class Layout(NamedTuple):
    """Where everything is: the project, and the folder of the copy and the results."""
    project: pathlib.Path
    work: pathlib.Path

    @property
    def tree(self):
        return self.work / "tree"

    @property
    def build(self):
        return self.tree / "build" / "dev"

    @property
    def example(self):
        return self.work / "example"


def folder_of(path):
    return FOLDERS.get(path.split("/", 1)[0])


def is_mutated(path):
    """Sources. Headers are compiled into tests, too, which would all have to be built again."""
    return folder_of(path) is not None and path.endswith(".cpp")


def rank(seed, name):
    """An order that depends on nothing but the seed and the names."""
    return hashlib.sha256(f"{seed} {name}".encode()).hexdigest()


def choose_sources(names, count, seed):
    """Some sources of each folder, according to how many it has; at least one."""
    folders = {}
    for name in names:
        folders.setdefault(name.split("/", 1)[0], []).append(name)
    chosen = []
    for in_folder in folders.values():
        share = max(1, round(count * len(in_folder) / len(names)))
        chosen += sorted(in_folder, key=lambda name: rank(seed, name))[:share]
    return set(chosen)


def tracked(project):
    listed = subprocess.run(["git", "ls-files", "-z"], cwd=project, check=True,
                            capture_output=True, text=True).stdout
    return sorted(name for name in listed.split("\0") if name and (project / name).is_file())


def write_if_changed(path, data):
    """Keeps the time of a file that stays the same, so that nothing is compiled again."""
    if path.is_file() and not path.is_symlink() and path.read_bytes() == data:
        return
    path.parent.mkdir(parents=True, exist_ok=True)
    path.write_bytes(data)


class Tree:
    """The copy, its mutants by number, and those that do not compile.

    Only some sources have mutants, since every one of them has to be compiled."""

    def __init__(self, layout, sources, seed):
        self.layout = layout
        self.dropped_file = layout.work / "dropped.json"
        self.dropped = set()
        if self.dropped_file.exists():
            self.dropped = set(json.loads(self.dropped_file.read_text()))
        self.names = tracked(layout.project)
        self.numbered = {}  # by path: [(number, mutant)]
        candidates = list(filter(is_mutated, self.names))
        self.width = (len(candidates) + 1) * BLOCK  # above all numbers
        self._find_mutants(candidates, choose_sources(candidates, sources, seed))

    def _find_mutants(self, candidates, chosen):
        for position, path in enumerate(candidates):
            if path not in chosen:
                continue
            text = (self.layout.project / path).read_text()
            found = mutate_source.mutants_of(path, text)
            if len(found) >= BLOCK:
                raise Failed(f"{path}: more than {BLOCK} mutants")
            first = (position + 1) * BLOCK
            self.numbered[path] = [(first + i, mutant) for i, mutant in enumerate(found)]

    def mutants(self):
        """All mutants that compile, by number."""
        return {number: mutant for pairs in self.numbered.values() for number, mutant in pairs
                if mutant.ident not in self.dropped}

    def write(self):
        for name in self.names:
            source = self.layout.project / name
            target = self.layout.tree / name
            write_if_changed(target, self._contents(name, source))
            target.chmod(source.stat().st_mode & 0o777)
        self._remove_others()

    def _contents(self, name, source):
        pairs = [pair for pair in self.numbered.get(name, ())
                 if pair[1].ident not in self.dropped]
        if pairs:
            header = os.path.relpath("tests/mutate/mutants.h", os.path.dirname(name))
            return mutate_source.render(source.read_text(), header, name, pairs).encode()
        if name == "tests/support/main.cpp":
            text = source.read_text().replace("RUN_ALL_TESTS()", "kovaRunAllTests()")
            return ('#include "tests/mutate/row_of_test.h"\n' + text).encode()
        return source.read_bytes()

    def _remove_others(self):
        known = set(self.names)
        for folder in {name.split("/", 1)[0] for name in self.names if "/" in name}:
            for path in (self.layout.tree / folder).rglob("*"):
                if path.is_file() and str(path.relative_to(self.layout.tree)) not in known:
                    path.unlink()

    def drop(self, output):
        """Leaves out the mutants at which the compiler failed. Returns how many."""
        before = len(self.dropped)
        for path, line, column, _ in ERROR.findall(output):
            name = self._name_of(path)
            if name is not None:
                self.dropped.update(self._at(name, int(line), int(column)))
        self.dropped_file.write_text(json.dumps(sorted(self.dropped), indent=0))
        return len(self.dropped) - before

    def _name_of(self, path):
        for name in (path, re.sub(r"^.*/tree/", "", path), path.replace("../", "")):
            if name in self.numbered:
                return name
        return None

    def _at(self, name, line, column):
        """The mutant whose text is at a place, or all of its line."""
        text = (self.layout.tree / name).read_text().split("\n")[2:]
        if line > len(text):
            return []
        by_number = dict(self.numbered[name])
        bytes_before = text[line - 1].encode()[:column + 12].decode(errors="ignore")
        numbers = re.findall(r"kovaMutant\((\d+)\)", bytes_before)
        if not numbers:
            numbers = re.findall(r"kovaMutant\((\d+)\)", text[line - 1])
        else:
            fresh = [n for n in numbers if by_number[int(n)].ident not in self.dropped]
            numbers = (fresh or numbers)[-1:]
        return [by_number[int(number)].ident for number in numbers]


def run_logged(command, log, **more):
    with open(log, "w", encoding="utf-8") as out:
        status = subprocess.run(command, stdout=out, stderr=subprocess.STDOUT,
                                stdin=subprocess.DEVNULL, check=False, **more).returncode
    return status, pathlib.Path(log).read_text(errors="replace")


def programs_of(listed):
    """The test programs of units, from what `ninja -t targets all` says."""
    found = []
    for line in listed.splitlines():
        path, _, rule = line.partition(": ")
        parts = path.split("/")
        if (rule.startswith("CXX_EXECUTABLE_LINKER") and parts[0] == "tests" and
                parts[-1].endswith("_test") and parts[1] not in OTHER_TESTS):
            found.append(path)
    return sorted(found)


def build(tree, jobs, say):
    """Builds the copy; returns the test programs, relative to the build folder."""
    layout = tree.layout
    for attempt in range(12):
        tree.write()
        configure(layout)
        listed = subprocess.run(["ninja", "-C", layout.build, "-t", "targets", "all"], check=True,
                                capture_output=True, text=True).stdout
        programs = programs_of(listed)
        status, output = run_logged(
            ["ninja", "-C", layout.build, f"-j{jobs}", "-k", "0", *programs, "kovabackup",
             "option_relay"], layout.work / "build.log")
        if status == 0:
            return programs
        dropped = tree.drop(output)
        say(f"attempt {attempt + 1}: {dropped} mutants do not compile")
        if dropped == 0:
            break
    raise Failed(f"the copy does not build; see {layout.work / 'build.log'}")


def configure(layout):
    command = ["cmake", "--preset", "dev",
               "-DCMAKE_GTEST_DISCOVER_TESTS_DISCOVERY_MODE=PRE_TEST"]  # CTest is not used
    if (layout.build / "build.ninja").exists():
        command = ["ninja", "-C", layout.build, "build.ninja"]  # tests may have been added
    status, _ = run_logged(command, layout.work / "configure.log", cwd=layout.tree)
    if status != 0:
        raise Failed(f"cmake failed; see {layout.work / 'configure.log'}")


def build_example(tree, jobs, say):
    """Installs the copy and builds the example service against it, as its users do."""
    layout = tree.layout
    log = layout.work / "example.log"
    prefix = layout.example / "prefix"
    steps = [
        ["ninja", "-C", layout.build, f"-j{jobs}", "kovabackup", "kovabackup_man",
         "kovaplatform_man"],
        ["cmake", "--install", layout.build, "--prefix", prefix],
        ["cmake", "-S", layout.tree / "examples" / "backup_service", "-B", layout.example / "build",
         "-G", "Ninja", f"-DCMAKE_PREFIX_PATH={prefix}"]]
    for step in steps:
        status, _ = run_logged(step, log)
        if status != 0:
            raise Failed(f"{' '.join(map(str, step))} failed; see {log}")
    for attempt in range(12):
        tree.write()
        status, output = run_logged(["ninja", "-C", layout.example / "build", f"-j{jobs}", "-k",
                                     "0"], log)
        if status == 0:
            return
        dropped = tree.drop(output)
        say(f"example, attempt {attempt + 1}: {dropped} mutants do not compile")
        if dropped == 0:
            break
    raise Failed(f"the example does not build; see {log}")
