#!/usr/bin/env python3
"""Prints the figures of a run of the benchmarks, or what changed between two runs.

Usage: bench_report.py table FILE
       bench_report.py compare OLD NEW

compare exits with 1 if a row became slower beyond the noise, or misses a goal that it reached.
"""
import itertools
import pathlib
import shutil
import signal
import sys

sys.dont_write_bytecode = True  # no __pycache__ among the scripts
import bench_results  # pylint: disable=wrong-import-position
from bench_results import (  # pylint: disable=wrong-import-position
    OURS, goal_missed, ratio_text, time_text)

LEAST_CHANGE = 0.05  # smaller ones come from where code and data happen to lie in memory
LEAST_NAME = 12      # the narrowest column of row names


def job_of(row):
    """What rows with different arguments have in common."""
    return row["program"], row["name"].partition("/")[0]


def columns_of(head, lines, width, optional):
    """The columns to show: the optional one is left out if the names would have no room."""
    sizes = [max(len(line[i]) for line in [head, *lines]) for i in range(len(head))]
    shown = list(range(len(head)))
    if width - sum(sizes[i] + 2 for i in shown[1:]) < min(sizes[0], LEAST_NAME):
        shown.remove(optional)
    sizes[0] = max(len(head[0]), min(sizes[0], width - sum(sizes[i] + 2 for i in shown[1:])))
    return [(i, sizes[i]) for i in shown]


def text_table(head, lines, left, width, optional):
    """Lines of columns that are aligned to the right, except those in `left`.

    A name that is longer than its column has a line of its own. An empty line remains one.
    """
    columns = columns_of(head, [line for line in lines if line], width, optional)
    for line in [head, *lines]:
        if line and len(line[0]) > columns[0][1]:
            yield line[0]
            line = ("", *line[1:])
        cells = (line[i].ljust(size) if i in left else line[i].rjust(size) for i, size in columns if line)
        yield "  ".join(cells).rstrip()


def grouped(rows, lines_of):
    """The lines of all rows. Empty lines set off jobs that have several."""
    before = []
    for _, job in itertools.groupby(rows, job_of):
        lines = [line for row in job for line in lines_of(row)]
        if before and lines and max(len(before), len(lines)) > 1:
            yield ()
        yield from lines
        before = lines or before


def peer_lines(row):
    """One line for each peer of the row; a row without a peer has one line, too."""
    name, ours = row["name"], time_text(row["ns"][OURS])
    for peer, ratio in row["ratio"].items():
        goal = row["goal"].get(peer)
        yield (name, ours, peer, time_text(row["ns"][peer]), ratio_text(ratio),
               ratio_text(goal) if goal else "", "missed" if goal_missed(row, peer) else "")
        name = ours = ""
    if name:
        yield (name, ours, "", "", "", "", "")


PEER_HEAD = ("row", "ours", "peer", "theirs", "ratio", "goal", "")


def origin(results):
    machine = results["machine"]
    yield f"{results['commit']}, {results['date']}"
    yield f"{machine.get('cpu')}, {machine.get('cores')} cores, load {machine.get('load')}"


def table(results, width):
    """The figures of one run. A ratio below 1 means that the library needs less time."""
    yield from origin(results)
    rows = bench_results.measured(results)
    for program in dict.fromkeys(row["program"] for row in rows):
        own = [row for row in rows if row["program"] == program]
        peak = bench_results.memory_text(max(row.get("peak_kib", 0) for row in own))
        yield f"\n== {program}, peak memory {peak}"
        yield from text_table(PEER_HEAD, list(grouped(own, peer_lines)), (0, 2, 6), width, 3)
    goals = sum(len(row["goal"]) for row in rows)
    missed = sum(goal_missed(row, peer) for row in rows for peer in row["goal"])
    yield f"\n{len(rows)} rows in {results.get('seconds', 0)} s, {goals} goals, {missed} missed"
    yield from (f"failed: {sentence}" for sentence in bench_results.failures(results))


def key_of(row):
    return row["program"], row["name"]


def verdict(old, new, peer):
    """What a peer's ratio says about the library: slower, faster, a missed goal, or nothing.

    A change counts if it is larger than the spreads of both runs together, and than LEAST_CHANGE.
    """
    change = new["ratio"][peer] / old["ratio"][peer] - 1
    noise = max(LEAST_CHANGE, old["spread"].get(peer, 0) + new["spread"].get(peer, 0))
    reached = old["ratio"][peer] <= new["goal"].get(peer, 0)
    words = ["SLOWER"] if change > noise else ["faster"] if change < -noise else []
    if goal_missed(new, peer) and reached:
        words.append("GOAL MISSED")
    return change, noise, ", ".join(words)


def change_lines(old, new):
    name = new["name"]
    for peer, ratio in new["ratio"].items():
        if peer in old["ratio"]:
            change, noise, words = verdict(old, new, peer)
            yield (name, peer, ratio_text(old["ratio"][peer]), ratio_text(ratio), f"{change:+.0%}",
                   f"{noise:.0%}", words)
            name = ""


CHANGE_HEAD = ("row", "peer", "old", "new", "change", "noise", "")


def differences(old, new):
    """What else differs: machine, versions, and rows that are only in one of the two."""
    for key in ("cpu", "cores"):
        if old["machine"].get(key) != new["machine"].get(key):
            yield f"another machine: {old['machine'].get(key)}, {new['machine'].get(key)}"
    for name, version in new["packages"].items():
        if old["packages"].get(name, version) != version:
            yield f"another version of {name}: {old['packages'][name]}, {version}"
    olds, news = ({key_of(row): row for row in bench_results.measured(run)} for run in (old, new))
    for word, these, others in (("new", news, olds), ("gone", olds, news)):
        yield from (f"{word}: {' '.join(key)}" for key in these if key not in others)
        for key in these.keys() & others.keys():
            yield from (f"{word}: {' '.join(key)} against {peer}"
                        for peer in these[key]["ratio"] if peer not in others[key]["ratio"])


def compare(old, new, width):
    """What changed from one run to another, and whether something became worse."""
    yield from (f"{word}: {line}" for word, run in (("old", old), ("new", new)) for line in origin(run))
    before = {key_of(row): row for row in bench_results.measured(old)}
    rows = [row for row in bench_results.measured(new) if key_of(row) in before]
    for program in dict.fromkeys(row["program"] for row in rows):
        own = [row for row in rows if row["program"] == program]
        lines = list(grouped(own, lambda row: change_lines(before[key_of(row)], row)))
        if any(lines):
            yield f"\n== {program}: ratios"
            yield from text_table(CHANGE_HEAD, lines, (0, 1, 6), width, 5)
    yield f"\n{len(rows)} rows in both runs, {len(worse(old, new))} worse"
    yield from differences(old, new)
    yield from (f"failed: {sentence}" for sentence in bench_results.failures(new))


def worse(old, new):
    """Program, row and peer of everything that became slower or lost its goal."""
    before = {key_of(row): row for row in bench_results.measured(old)}
    return [(*key_of(row), peer) for row in bench_results.measured(new) if key_of(row) in before
            for peer in row["ratio"] if peer in before[key_of(row)]["ratio"]
            and verdict(before[key_of(row)], row, peer)[2] not in ("", "faster")]


def main(arguments):
    width = shutil.get_terminal_size((80, 24)).columns
    try:
        runs = [bench_results.read(pathlib.Path(name)) for name in arguments[1:]]
    except bench_results.Unusable as reason:
        print(f"bench: {reason}", file=sys.stderr)
        return 2
    match arguments[0], runs:
        case "table", [results]:
            print("\n".join(table(results, width)))
            return 1 if bench_results.failures(results) else 0
        case "compare", [old, new]:
            print("\n".join(compare(old, new, width)))
            return 1 if worse(old, new) or bench_results.failures(new) else 0
    print(__doc__, file=sys.stderr)
    return 2


if __name__ == "__main__":
    signal.signal(signal.SIGPIPE, signal.SIG_DFL)  # a reader such as head may end first
    sys.exit(main(sys.argv[1:]))
