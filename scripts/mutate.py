#!/usr/bin/env python3
"""Changes the sources one small way at a time, and counts what no test notices.

Usage: scripts/mutate [--count N] [--sources N] [--seed S] [--folder F]... [--only ID]... [--list]
                      [--fresh] [--survivors] [--jobs N] [--ci]
  --count N    how many mutants are tried, 600 by default: evenly over folders and kinds
  --sources N  of how many sources, 60 by default: each has to be compiled
  --seed S     chooses other sources and mutants
  --folder F   only of this folder; may be repeated
  --only ID    only this mutant; may be repeated. It prints what every test says
  --list       prints the mutants that are chosen, and tries none
  --fresh      forgets the results of earlier runs
  --survivors  tries those again that no test noticed
  --jobs N     as many at a time, 2 by default
  --ci         60 mutants of 12 sources

A copy of the project in build/mutate has all mutants of these sources compiled in, each behind a
number that is chosen at run time. Every test runs once to record which mutants it reaches; a mutant then costs only the
tests that reach it. Results are kept in build/mutate and continued by the next run. Exit status 1:
fewer than 97 % were noticed, or fewer than 90 % in one folder, or a survivor that nothing explains.
tests/mutate/survivors.toml explains the mutants that change nothing that a test could notice.
"""
import argparse
import concurrent.futures
import json
import pathlib
import re
import sys
import tomllib

import mutate_run
import mutate_source
import mutate_tree

ROOT = pathlib.Path(__file__).resolve().parent.parent
SURVIVORS = "tests/mutate/survivors.toml"
LEAST, LEAST_IN_FOLDER = 0.97, 0.90
FEWEST = 30  # of each folder, if it has as many
# Calls whose order may matter. Most others that follow each other are independent.
ORDERED = re.compile(r"\w*(sync|chmod|chown|zero|lock|close|flush|free|kill|rename|unlink|sig)\w*\(")
REASONS = ("equivalent", "contract")
PLAIN = {"tests/path/path_util_libgen_test"}  # has a main function of its own


def say(text):
    print(text, flush=True)


def in_turns(seed, pairs):
    """Some (number, mutant) of each kind in turn, so that rare kinds are not drowned."""
    kinds = {}
    for pair in sorted(pairs, key=lambda pair: mutate_tree.rank(seed, pair[1].ident)):
        kinds.setdefault(pair[1].kind, []).append(pair)
    order = []
    while any(kinds.values()):
        order += [kinds[kind].pop(0) for kind in sorted(kinds) if kinds[kind]]
    return order


def choose(mutants, count, seed):
    """A sample: of each folder according to its size, but at least FEWEST."""
    folders = {}
    for pair in mutants.items():
        if pair[1].kind == "order" and not ORDERED.search(pair[1].change):
            continue
        folders.setdefault(pair[1].path.split("/", 1)[0], []).append(pair)
    fewest = min(FEWEST, count // max(1, len(folders)))
    chosen = []
    for folder in sorted(folders):
        share = max(fewest, round(count * len(folders[folder]) / len(mutants)))
        chosen += in_turns(seed, folders[folder])[:share]
    return dict(chosen)


class State:
    """What earlier runs found: by ident, the test that noticed it, or "" for none."""

    def __init__(self, path, fresh):
        self.path = path
        self.found = {}
        if path.exists() and not fresh:
            self.found = json.loads(path.read_text())

    def add(self, ident, noticed):
        self.found[ident] = noticed
        self.path.write_text(json.dumps(self.found, indent=0))


def read_survivors(path):
    if not path.exists():
        return {}
    return {entry["id"]: entry for entry in tomllib.loads(path.read_text()).get("survivor", [])}


def idents_in(paths):
    """Those of all mutants of some sources, also of those that are not tried."""
    return {mutant.ident for path in paths if (ROOT / path).is_file()
            for mutant in mutate_source.mutants_of(path, (ROOT / path).read_text())}


def survivor_errors(explained, known):
    """What is wrong with the list of survivors: it must not outlive the lines that it explains."""
    for ident, entry in explained.items():
        if ident not in known:
            yield f"{ident}: no such mutant any more: {entry.get('path')}: {entry.get('change')}"
        elif entry.get("reason") not in REASONS or not entry.get("why"):
            yield f"{ident}: needs a reason ({' or '.join(REASONS)}) and why"


class Recordings:
    """What each program reached, kept until something is built again."""

    def __init__(self, path, stamp):
        self.path, self.stamp = path, stamp
        self.known = {}
        if path.exists():
            self.known = json.loads(path.read_text())

    def get(self, program):
        """The Reach of a program, or None."""
        entry = self.known.get(program.name)
        if entry is None or entry["stamp"] != self.stamp(program):
            return None
        tests = {mutate_run.Test(program.name, name): of for name, of in entry["tests"].items()}
        return mutate_run.Reach({test: of[0] for test, of in tests.items()},
                                {test: of[1] for test, of in tests.items()},
                                [mutate_run.Test(program.name, name) for name in entry["broken"]])

    def add(self, program, reach):
        self.known[program.name] = {
            "stamp": self.stamp(program), "broken": [test.name for test in reach.broken],
            "tests": {test.name: [reach.seconds[test], reach.reached[test]]
                      for test in reach.seconds}}
        self.path.write_text(json.dumps(self.known))


def newest(paths):
    return max((path.stat().st_mtime for path in paths), default=0.0)


def stamp_in(layout):
    """A function that returns when the last of the files was built that a program uses."""
    shared = [*layout.build.rglob("*.so*"), layout.build / "tools" / "kovabackup",
              *layout.build.glob("examples/*_relay"), *layout.example.glob("build/backup_service")]
    return lambda program: newest(path for path in [*shared, pathlib.Path(program.command[0])]
                                  if path.exists())


def record_all(runner, programs, width, jobs, recordings):
    """Which mutants each test reaches."""
    complete = mutate_run.Reach({}, {}, [])

    def add(reach):
        complete.seconds.update(reach.seconds)
        complete.reached.update(reach.reached)
        complete.broken.extend(reach.broken)

    with concurrent.futures.ThreadPoolExecutor(jobs) as pool:
        futures = {}
        for slot, program in enumerate(programs.values()):
            known = recordings.get(program)
            if known is not None:
                add(known)
            else:
                futures[pool.submit(mutate_run.record, runner, program, slot, width)] = program
        for future in concurrent.futures.as_completed(futures):
            recordings.add(futures[future], future.result())
            add(future.result())
    return complete


def built_programs(layout, names):
    return {name: mutate_run.Program(name, (str(layout.build / name),),
                                     str((layout.build / name).parent), name not in PLAIN)
            for name in names}


def other_programs(layout, with_example):
    """The tests of the examples."""
    relay = layout.build / "examples" / "option_relay"
    found = {"option_relay": mutate_run.Program("option_relay", (str(relay),), str(relay.parent),
                                                False)}
    if with_example:
        script = layout.tree / "tests" / "mutate" / "example_case"
        folder = layout.tree / "tests" / "install" / "backup_service_cases"
        for case in sorted(path.name for path in folder.iterdir() if path.name != "lib.sh"):
            found[f"example {case}"] = mutate_run.Program(
                f"example {case}", (str(script), str(layout.example), case), "/", False)
    return found


def tests_of(reach):
    """The tests that reach each mutant."""
    found = {}
    for test, numbers in reach.reached.items():
        for number in numbers:
            found.setdefault(number, []).append(test)
    return found


class Trial:
    """Tries mutants, and keeps what came of each."""

    def __init__(self, runner, programs, reach, state):
        self.runner, self.programs, self.reach, self.state = runner, programs, reach, state
        self.tests = tests_of(reach)

    def one(self, number, mutant):
        tests = self.tests.get(number, [])
        return mutate_run.notice(self.runner, self.programs, self.reach, number, tests,
                                 mutant.path.split("/", 1)[0])

    def all(self, chosen, jobs):
        with concurrent.futures.ThreadPoolExecutor(jobs) as pool:
            futures = {pool.submit(self.one, number, mutant): number
                       for number, mutant in chosen.items()}
            for done, future in enumerate(concurrent.futures.as_completed(futures), 1):
                number = futures[future]
                self._tell(done, len(chosen), chosen[number], number, future.result())

    def _tell(self, done, count, mutant, number, noticed):
        self.state.add(mutant.ident, "" if noticed is None else
                       f"{noticed[1]}: {noticed[0].program} {noticed[0].name}")
        if noticed is None:
            reached = len(self.tests.get(number, []))
            say(f"[{done}/{count}] slept ({reached} tests reach it): {describe(mutant)}")
        elif done % 25 == 0:
            say(f"[{done}/{count}]")


def describe(mutant):
    return f"{mutant.ident} {mutant.path}:{mutant.line} {mutant.kind}: {mutant.change}"


class Row:
    def __init__(self):
        self.tried = self.noticed = self.equivalent = self.explained = 0
        self.slept = []

    def add(self, mutant, noticed, entry):
        self.tried += 1
        if noticed:
            self.noticed += 1
        elif entry is None:
            self.slept.append(mutant)
        elif entry["reason"] == "equivalent":
            self.equivalent += 1
        else:
            self.explained += 1

    @property
    def share(self):
        counted = self.tried - self.equivalent
        return self.noticed / counted if counted else 1.0


def table_of(chosen, state, explained):
    """Rows by folder, and one of all."""
    rows, total = {}, Row()
    for mutant in chosen.values():
        if mutant.ident in state.found:
            args = (mutant, state.found[mutant.ident], explained.get(mutant.ident))
            rows.setdefault(mutant.path.split("/", 1)[0], Row()).add(*args)
            total.add(*args)
    return rows, total


def print_table(rows, total):
    say(f"{'folder':14} {'part':10} tried noticed equivalent contract slept  share")
    for name, row in [*sorted(rows.items()), ("all", total)]:
        part = mutate_tree.FOLDERS.get(name, "")
        say(f"{name:14} {part:10} {row.tried:5} {row.noticed:7} {row.equivalent:10} "
            f"{row.explained:8} {len(row.slept):5} {100 * row.share:5.1f} %")


def failures_of(rows, total):
    if total.share < LEAST:
        yield f"noticed {100 * total.share:.1f} %, which is less than {100 * LEAST:.0f} %"
    for name, row in sorted(rows.items()):
        if row.share < LEAST_IN_FOLDER:
            yield f"{name}: noticed {100 * row.share:.1f} %, less than {100 * LEAST_IN_FOLDER:.0f} %"
    for mutant in total.slept:
        yield f"nothing notices or explains {describe(mutant)}"


def reads_arguments(arguments):
    parser = argparse.ArgumentParser(usage=__doc__.split("\n\n")[1])
    parser.add_argument("--count", type=int, default=600)
    parser.add_argument("--sources", type=int, default=60)
    parser.add_argument("--seed", default="1")
    parser.add_argument("--folder", action="append", default=[])
    parser.add_argument("--only", action="append", default=[])
    parser.add_argument("--jobs", type=int, default=2)
    for flag in ("--list", "--fresh", "--survivors", "--ci"):
        parser.add_argument(flag, action="store_true")
    options = parser.parse_args(arguments)
    if options.ci:
        options.count, options.sources = 60, 12
    return options


def chosen_by(options, mutants, state):
    if options.only:
        return {n: m for n, m in mutants.items() if m.ident in options.only}
    if options.folder:
        mutants = {n: m for n, m in mutants.items()
                   if any(m.path.startswith(folder.rstrip("/") + "/") for folder in options.folder)}
    chosen = choose(mutants, options.count, options.seed)
    if options.survivors:
        chosen = {n: m for n, m in chosen.items() if state.found.get(m.ident) == ""}
    return chosen


def reach_of(layout, tree, programs, runner, jobs):
    say(f"recording which mutants {len(programs)} programs reach")
    recordings = Recordings(layout.work / "reach.json", stamp_in(layout))
    reach = record_all(runner, programs, tree.width, jobs, recordings)
    for test in reach.broken:
        say(f"not used, since it fails without a mutant: {test.program} {test.name}")
    say(f"{len(reach.seconds)} tests, {sum(reach.seconds.values()):.0f} s")
    return reach


def main(arguments):
    options = reads_arguments(arguments)
    layout = mutate_tree.Layout(ROOT, ROOT / "build" / "mutate")
    layout.work.mkdir(parents=True, exist_ok=True)
    tree = mutate_tree.Tree(layout, options.sources, options.seed)
    state = State(layout.work / "results.json", options.fresh)
    explained = read_survivors(ROOT / SURVIVORS)
    if options.list:
        for mutant in chosen_by(options, tree.mutants(), state).values():
            say(describe(mutant))
        return 0
    names = mutate_tree.build(tree, options.jobs, say)
    mutate_tree.build_example(tree, options.jobs, say)
    programs = {**built_programs(layout, names), **other_programs(layout, True)}
    chosen = chosen_by(options, tree.mutants(), state)
    again = options.only or options.survivors
    todo = {n: m for n, m in chosen.items() if again or m.ident not in state.found}
    if todo:
        runner = mutate_run.Runner(layout.work)
        reach = reach_of(layout, tree, programs, runner, options.jobs)
        say(f"{len(tree.mutants())} mutants, {len(chosen)} chosen, {len(todo)} to try")
        Trial(runner, programs, reach, state).all(todo, options.jobs)
    rows, total = table_of(chosen, state, explained)
    print_table(rows, total)
    known = idents_in({entry["path"] for entry in explained.values()})
    failures = [*survivor_errors(explained, known), *failures_of(rows, total)]
    for failure in failures:
        say(failure)
    return 1 if failures else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
