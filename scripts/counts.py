#!/usr/bin/env python3
"""Counts what the operations of tests/counts cost, and compares that with the baseline.

Usage: scripts/counts.py check|update|show BUILD_FOLDER [PART]   (see scripts/counts, which builds)

Callgrind counts the instructions and the system calls of each operation. Two checks are made:

- The count of each operation is compared with tests/counts/baseline.json. Runs of the same build
  differ by less than 1 %: the alignment of the stack and the digits of a PID matter a little. 3 %
  leave room for other processors, for which libsodium selects other routines. With another compiler
  or library the code itself is another one, and the bound is 15 %.
- The growth: the cost at size 4n divided by the cost at size n has a bound for each operation. This
  needs no baseline. One operation is quadratic on purpose; the check fails unless it notices.
"""
import json
import os
import pathlib
import platform
import re
import subprocess
import sys
import tempfile
from typing import NamedTuple

ROOT = pathlib.Path(__file__).resolve().parent.parent
BASELINE = ROOT / "tests" / "counts" / "baseline.json"
COUNTED = "kovaCounted"  # the function of tests/counts/main.cpp around each operation
QUADRATIC = "self.quadratic"

DEARER = 0.03
DEARER_WITH_OTHER_TOOLS = 0.15
CHEAPER = 0.10
SAME = 0.01  # update keeps a count that changed less
SLACK = 20  # instructions, since 3 % of the smallest operations are only a few


class Cost(NamedTuple):
    instructions: int
    calls: int


class Growth(NamedTuple):
    small: str
    large: str
    bound: float


class Run(NamedTuple):
    counts: dict  # Cost by the name of an operation and its size
    probes: dict  # the same of those that have no baseline
    skipped: dict  # reasons
    growths: list

    def cost(self, name):
        return self.counts.get(name) or self.probes.get(name)


class Report(NamedTuple):
    failures: list
    notes: list


def cost_of(text):
    """The cost of the counted function in what callgrind wrote about one process."""
    parts = [part for part in re.split(r"^part: ", text, flags=re.M)
             if f"--dump-after={COUNTED}" in part]
    if len(parts) != 1:
        raise ValueError(f"{COUNTED} ran {len(parts)} times")
    events = re.search(r"^events: (.*)$", parts[0], re.M).group(1).split()
    totals = re.search(r"^summary: (.*)$", parts[0], re.M).group(1).split()
    found = dict(zip(events, map(int, totals)))  # zeros at the end of a line are left out
    return Cost(found["Ir"], found.get("sysCount", 0))


def read_run(lines, text_of):
    """What the program printed; text_of returns what callgrind wrote about a process."""
    run = Run({}, {}, {}, [])
    for line in lines:
        kind, name, rest = line.split(" ", 2)
        if kind in ("run", "probe"):
            (run.counts if kind == "run" else run.probes)[name] = cost_of(text_of(rest))
        elif kind == "skip":
            run.skipped[name] = rest
        elif kind == "growth":
            large, bound = rest.split()
            run.growths.append(Growth(name, large, float(bound)))
        else:
            raise ValueError(f"unknown line: {line}")
    return run


def callgrind(out):
    return ["valgrind", "-q", "--vgdb=no", "--tool=callgrind", "--collect-atstart=no",
            f"--toggle-collect={COUNTED}", f"--zero-before={COUNTED}",
            f"--dump-after={COUNTED}", "--combine-dumps=yes", "--collect-systime=yes",
            f"--callgrind-out-file={out}/%p"]


def environment():
    """The same on every machine. Of the string functions that the C library has for each kind of
    processor, it uses the plain ones."""
    return {"PATH": "/usr/bin:/bin", "LC_ALL": "C", "TZ": "UTC0", "LD_BIND_NOW": "1",
            "GLIBC_TUNABLES": "glibc.cpu.hwcaps=-AVX2,-AVX,-ERMS,-FSRM"}


def measure(build):
    with tempfile.TemporaryDirectory(dir=build) as out:
        run = subprocess.run([*callgrind(out), "tests/counts/kova_counts"], cwd=build,
                             env=environment(), capture_output=True, text=True, check=False)
        if run.returncode != 0:
            sys.exit(f"counts: the program failed\n{run.stdout[-500:]}{run.stderr}")
        return read_run(run.stdout.splitlines(), lambda pid: (pathlib.Path(out) / pid).read_text())


def output_of(*command):
    run = subprocess.run(command, capture_output=True, text=True, check=False)
    return run.stdout.strip() if run.returncode == 0 else "unknown"


def tools():
    """What the counts depend on besides the sources, by upstream versions: the revisions of a
    distribution's packages rarely change a count."""
    return {"machine": platform.machine(), "g++": output_of("g++", "-dumpfullversion"),
            "libc": platform.libc_ver()[1], "jsoncpp": output_of("pkg-config", "--modversion", "jsoncpp"),
            "libsodium": output_of("pkg-config", "--modversion", "libsodium"),
            "valgrind": output_of("valgrind", "--version").removeprefix("valgrind-")}


def differing(ours, theirs):
    """The tools that differ from those of the baseline, in words."""
    return [f"{name} {theirs.get(name, 'unknown')} in the baseline, {ours[name]} here"
            for name in ours if ours[name] != theirs.get(name)]


def percent(old, new):
    return "" if old == 0 else f" ({(new - old) / old:+.1%})".replace("%", " %")


def change(name, what, old, new):
    return f"{name}: {old:,} -> {new:,} {what}{percent(old, new)}"


def compare(name, old, new, bound, report):
    for what, before, after, slack in (("instructions", old.instructions, new.instructions, SLACK),
                                       ("system calls", old.calls, new.calls, 0)):
        if after > before * (1 + bound) + slack:
            report.failures.append(f"{change(name, what, before, after)}, allowed are {bound:.0%}")
        elif after + slack < before * (1 - CHEAPER):
            report.notes.append(f"{change(name, what, before, after)}: cheaper; "
                                "keep that with scripts/counts update")


def check_baseline(run, ours, baseline, report):
    theirs, counts = baseline["tools"], baseline["counts"]
    if ours["machine"] != theirs["machine"]:
        report.notes.append(f"the baseline is skipped: it is of {theirs['machine']}, "
                            f"and this is {ours['machine']}")
        return
    different = differing(ours, theirs)
    bound = DEARER_WITH_OTHER_TOOLS if different else DEARER
    if different:
        report.notes.append(f"the bound is {bound:.0%} instead of {DEARER:.0%}: {'; '.join(different)}")
    for name, cost in run.counts.items():
        if name in counts:
            compare(name, Cost(*counts[name]), cost, bound, report)
        else:
            report.failures.append(f"{name}: not in the baseline; add it with scripts/counts update")
    for name in counts:
        if name not in run.counts and name not in run.skipped:
            report.failures.append(f"{name}: only in the baseline; remove it with scripts/counts update")


def ratio(run, growth):
    """None when one of the sizes was skipped."""
    small, large = run.cost(growth.small), run.cost(growth.large)
    return large.instructions / small.instructions if small and large else None


def check_growths(run, report):
    noticed = False
    for growth in run.growths:
        grown = ratio(run, growth)
        exceeds = grown is not None and grown > growth.bound
        if growth.small.startswith(QUADRATIC + "/"):
            noticed = exceeds
        elif exceeds:
            report.failures.append(f"{growth.small} -> {growth.large}: {grown:.2f} times the "
                                   f"instructions, allowed are {growth.bound:g} times")
    if not noticed:
        report.failures.append(f"{QUADRATIC}: the check does not notice that it is quadratic")


def checked(run, ours, baseline):
    report = Report([], [])
    if baseline is None:
        report.failures.append(f"{BASELINE.name} does not exist; write it with scripts/counts update")
    else:
        check_baseline(run, ours, baseline, report)
    check_growths(run, report)
    for why in sorted(set(run.skipped.values())):
        names = [name for name, reason in run.skipped.items() if reason == why]
        report.notes.append(f"{len(names)} operations are skipped: {why} ({names[0]} ...)")
    return report


def updated(run, ours, baseline):
    """The new baseline, and a line for each change."""
    same_tools = baseline is not None and baseline["tools"] == ours
    old = baseline["counts"] if baseline else {}
    counts, lines = {}, []
    for name, cost in sorted(run.counts.items()):
        before = Cost(*old[name]) if name in old else None
        counts[name] = list(cost)
        if before is None:
            lines.append(f"{name}: new, {cost.instructions:,} instructions, {cost.calls:,} system calls")
        elif (same_tools and cost.calls == before.calls and
              abs(cost.instructions - before.instructions) <= before.instructions * SAME):
            counts[name] = list(before)
        else:
            lines.append(f"{change(name, 'instructions', before.instructions, cost.instructions)}, "
                         f"{before.calls:,} -> {cost.calls:,} system calls")
    lines += [f"{name}: removed" for name in old if name not in counts]
    if baseline and not same_tools:
        lines += differing(ours, baseline["tools"])
    return {"tools": ours, "counts": counts}, lines


def written(baseline):
    """The text of the baseline: one line for each operation, so that differences are readable."""
    rows = ",\n".join(f"    {json.dumps(name)}: {json.dumps(cost)}"
                      for name, cost in baseline["counts"].items())
    return (f'{{\n  "tools": {json.dumps(baseline["tools"])},\n'
            f'  "counts": {{\n{rows}\n  }}\n}}\n')


def read_baseline():
    return json.loads(BASELINE.read_text(encoding="utf-8")) if BASELINE.exists() else None


def show(run, baseline, part):
    counts = baseline["counts"] if baseline else {}
    print(f"{'operation':44}{'instructions':>14}{'calls':>8}  baseline")
    for name, cost in {**run.counts, **run.probes}.items():
        if part in name:
            compared = percent(counts[name][0], cost.instructions)[2:-1] if name in counts else "none"
            print(f"{name:44}{cost.instructions:14,}{cost.calls:8,}  {compared}")
    print(f"\n{'growth to four times the size':58}{'times':>8}  allowed")
    for growth in run.growths:
        if part in growth.small and ratio(run, growth) is not None:
            print(f"{growth.small:58}{ratio(run, growth):8.2f}  {growth.bound:g}")
    return 0


def check(run):
    report = checked(run, tools(), read_baseline())
    for note in report.notes:
        print(f"note: {note}")
    for failure in report.failures:
        print(f"FAILED: {failure}")
    print(f"{len(run.counts)} operations, {len(run.growths)} growths: "
          + (f"{len(report.failures)} failures" if report.failures else "all within their bounds"))
    return 1 if report.failures else 0


def update(run):
    if run.skipped:
        name, why = next(iter(run.skipped.items()))
        sys.exit(f"counts: a baseline needs every operation, but {name} is skipped: {why}")
    baseline, lines = updated(run, tools(), read_baseline())
    for line in lines:
        print(line)
    if lines:
        BASELINE.write_text(written(baseline), encoding="utf-8")
    print(f"{BASELINE.relative_to(ROOT)}: {len(baseline['counts'])} operations, "
          + (f"{len(lines)} changes" if lines else "unchanged"))
    return 0


def main(arguments):
    if len(arguments) < 2 or arguments[0] not in ("check", "update", "show"):
        sys.exit(__doc__)
    run = measure(os.path.abspath(arguments[1]))
    if arguments[0] == "show":
        return show(run, read_baseline(), arguments[2] if len(arguments) > 2 else "")
    return check(run) if arguments[0] == "check" else update(run)


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
