#!/usr/bin/env python3
"""Runs the benchmark programs of a build folder and writes one file of figures.

Usage: bench_run.py --build FOLDER (--list | --output FILE) [--filter REGEX] [PROGRAM...]

Each row runs in a process of its own: a row that crashes or hangs loses nothing of the others, what
one row leaves on the heap does not slow the next one, and each row has its own peak of memory. The
working directory should be empty; the rows make their files there. The exit status is 1 if a row
or a program failed; the figures of all others are written nevertheless.
"""
import argparse
import datetime
import json
import os
import pathlib
import re
import signal
import subprocess
import sys
import tempfile
import time

sys.dont_write_bytecode = True  # no __pycache__ among the scripts
import bench_results  # pylint: disable=wrong-import-position
from bench_results import Unusable  # pylint: disable=wrong-import-position

ROOT = pathlib.Path(__file__).resolve().parent.parent
SERVICE = ROOT / "bench" / "backup_service_bench.py"
LIMIT = 300  # seconds for one row
DISTURBED, REPEATED_WITHIN = 0.25, 10  # a row with a larger spread runs again, if it took at most 10 s
PEERS = ("libbenchmark-dev", "libre2-dev", "libctemplate-dev", "rapidjson-dev", "libglib2.0-dev",
         "libboost-dev", "libjsoncpp-dev", "libfmt-dev", "libsodium-dev", "libc6", "coreutils",
         "findutils", "tar", "zstd")


def output_of(*command):
    done = subprocess.run(command, cwd=ROOT, check=False, capture_output=True, text=True)
    return done.stdout.strip() if done.returncode == 0 else ""


def commit():
    return output_of("git", "describe", "--always", "--abbrev=9", "--dirty", "--exclude=*") or "unknown"


def compiler(build):
    cache = (build / "CMakeCache.txt").read_text(encoding="utf-8")
    found = re.search(r"^CMAKE_CXX_COMPILER:\w+=(.*)$", cache, re.M)
    return (output_of(found.group(1), "--version") if found else "").partition("\n")[0] or "unknown"


def packages():
    """The installed versions of the peers and of what both sides are built with."""
    lines = subprocess.run(["dpkg-query", "-W", "-f=${Package} ${Version}\n", *PEERS], check=False,
                           capture_output=True, text=True).stdout.splitlines()
    return dict(line.split(" ") for line in lines if len(line.split()) == 2)


def proc_value(file, key):
    found = re.search(rf"^{key}\s*:\s*(.*)$", pathlib.Path(file).read_text(encoding="utf-8"), re.M)
    return found.group(1) if found else ""


def caches(folder=pathlib.Path("/sys/devices/system/cpu/cpu0/cache")):
    """The sizes of the caches of the first processor, such as L1d 48K."""
    named = []
    for cache in sorted(folder.glob("index*")):
        level, kind, size = ((cache / name).read_text(encoding="utf-8").strip()
                             for name in ("level", "type", "size"))
        if kind != "Instruction":
            named.append(f"L{level}{'d' if kind == 'Data' else ''} {size}")
    return ", ".join(named)


def machine():
    system = os.uname()
    return {"cpu": proc_value("/proc/cpuinfo", "model name") or system.machine,
            "cores": os.cpu_count(), "caches": caches(),
            "memory_mib": int(proc_value("/proc/meminfo", "MemTotal").split()[0]) // 1024,
            "kernel": f"{system.sysname} {system.release}",
            "load": bench_results.rounded(os.getloadavg()[0])}


def peak_of(pid):
    """The most memory in KiB that the process has held since it began; 0 when it has ended."""
    try:
        return int(proc_value(f"/proc/{pid}/status", "VmHWM").split()[0])
    except (OSError, IndexError):
        return 0


def wait_for(child, limit):
    """Waits until the child ends, and returns its peak of memory.

    The kernel's own figure for ended children would begin with the memory of this process.
    """
    peak, end = 0, time.monotonic() + limit
    while child.poll() is None:
        if time.monotonic() > end:
            raise Unusable(f"took longer than {limit} s")
        peak = max(peak, peak_of(child.pid))
        time.sleep(0.02)
    return peak


def exact(name):
    """The pattern of Google Benchmark for the row of this name alone."""
    return "^" + re.sub(r"([.^$*+?()\[\]{}|\\])", r"\\\1", name) + "$"


def run_row(program, name, scratch, limit=LIMIT):
    """Returns the row. Raises Unusable with the reason if it has no figures."""
    report, errors = scratch / "report.json", scratch / "errors"
    report.unlink(missing_ok=True)
    with errors.open("wb") as out:
        child = subprocess.Popen(  # a session of its own, so that its children end with it
            [program, f"--benchmark_filter={exact(name)}", f"--benchmark_out={report}",
             "--benchmark_out_format=json"],
            stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL, stderr=out, start_new_session=True)
    try:
        peak = wait_for(child, limit)
    except BaseException:
        os.killpg(child.pid, signal.SIGKILL)
        child.wait()
        raise
    if child.returncode != 0:
        said = errors.read_text(encoding="utf-8", errors="replace").strip().splitlines()
        raise Unusable(f"{ending(child.returncode)}: {said[-1] if said else 'no message'}")
    try:
        entries = json.loads(report.read_text(encoding="utf-8"))["benchmarks"]
        row = bench_results.row_of(program.stem, entries[0])
    except (OSError, ValueError, KeyError, IndexError, TypeError) as reason:
        raise Unusable(f"wrote no figures: {type(reason).__name__} {reason}") from reason
    return {"peak_kib": peak, **row}


def best_of(program, name, scratch):
    """Runs the row, and once more if something disturbed it; the calmer of both runs counts."""
    begin = time.monotonic()
    row = run_row(program, name, scratch)
    if spread_of(row) > DISTURBED and time.monotonic() - begin <= REPEATED_WITHIN:
        row = min(row, run_row(program, name, scratch), key=spread_of)
    return row


def spread_of(row):
    if "error" in row:
        return float("inf")
    return max(row["spread"].values(), default=0)


def ending(code):
    return f"exit status {code}" if code > 0 else f"ended by {signal.Signals(-code).name}"


def names_of(program, pattern):
    """The names of the program's rows that the pattern matches anywhere."""
    try:
        done = subprocess.run([program, "--benchmark_list_tests"], check=False, capture_output=True,
                              text=True, timeout=LIMIT)
    except (OSError, subprocess.TimeoutExpired) as reason:
        raise Unusable(f"{program.stem} cannot be run: {reason}") from reason
    if done.returncode != 0:
        raise Unusable(f"{program.stem} cannot list its rows: {ending(done.returncode)}")
    return [name for name in done.stdout.splitlines()
            if re.search(pattern, bench_results.short_name(name))]


def programs_of(build, chosen):
    """The paths of the chosen programs, by default of all that the build folder lists."""
    try:
        listed = (build / "bench" / "programs").read_text(encoding="utf-8").split()
    except OSError as reason:
        raise Unusable(f"{build} has no benchmarks: {reason.strerror}") from reason
    known = {name: build / "bench" / name for name in listed}
    known[SERVICE.stem] = SERVICE
    unknown = [name for name in chosen if name not in known]
    if unknown:
        raise Unusable(f"there is no benchmark '{unknown[0]}', but {', '.join(sorted(known))}")
    return [known[name] for name in chosen or sorted(known)]


def rows_of(programs, pattern, problems):
    """Pairs of a program and the name of a row. A program without a list is added to the problems."""
    for program in programs:
        try:
            yield from ((program, name) for name in names_of(program, pattern))
        except Unusable as reason:
            problems.append(str(reason))


def show(done, total, text):
    """One line of progress: on a terminal over the previous one, elsewhere now and then."""
    if sys.stderr.isatty():
        print(f"\r\033[K{done}/{total} {text}", end="", file=sys.stderr, flush=True)
    elif done % 10 == 0 or done == total:
        print(f"{done}/{total} {text}", file=sys.stderr, flush=True)


def run_all(programs, pattern, results):
    """Adds the rows and problems to the results as they come."""
    todo = list(rows_of(programs, pattern, results["problems"]))
    with tempfile.TemporaryDirectory() as scratch:
        for done, (program, name) in enumerate(todo):
            short = bench_results.short_name(name)
            show(done, len(todo), f"{program.stem} {short}")
            try:
                row = best_of(program, name, pathlib.Path(scratch))
            except Unusable as reason:
                row = {"program": program.stem, "name": short, "error": str(reason)}
            results["rows"].append(row)
    show(len(todo), len(todo), "rows\n" if sys.stderr.isatty() else "rows")


def run(build, programs, pattern, output):
    now = datetime.datetime.now(datetime.timezone.utc)
    results = {"format": bench_results.FORMAT, "date": now.strftime("%Y-%m-%dT%H:%M:%SZ"),
               "commit": commit(), "compiler": compiler(build), "machine": machine(),
               "packages": packages(), "problems": [], "rows": []}
    try:
        run_all(programs, pattern, results)
    except KeyboardInterrupt:
        results["problems"].append("the run was interrupted")
    results["seconds"] = round((datetime.datetime.now(datetime.timezone.utc) - now).total_seconds())
    if not results["rows"] and not results["problems"]:
        raise Unusable(f"no row matches '{pattern}'")
    bench_results.write(output, results)
    return 1 if bench_results.failures(results) else 0


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--build", type=pathlib.Path, required=True)
    parser.add_argument("--filter", default="")
    parser.add_argument("--output", type=pathlib.Path)
    parser.add_argument("--list", action="store_true")
    parser.add_argument("programs", nargs="*")
    arguments = parser.parse_args()
    try:
        re.compile(arguments.filter)
        programs = programs_of(arguments.build, arguments.programs)
        if not arguments.list:
            return run(arguments.build, programs, arguments.filter, arguments.output)
        for program in programs:
            for name in names_of(program, arguments.filter):
                print(program.stem, bench_results.short_name(name))
        return 0
    except re.error as reason:
        print(f"bench: '{arguments.filter}' is not a regular expression: {reason}", file=sys.stderr)
    except Unusable as reason:
        print(f"bench: {reason}", file=sys.stderr)
    return 2


if __name__ == "__main__":
    sys.exit(main())
