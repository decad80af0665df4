#!/usr/bin/env python3
"""Races a run of the example service against tar | zstd of the same list and level.

It has the options of Google Benchmark that scripts/bench uses, and writes what bench/race.h reports.
The variables: KOVA_BENCH_SERVICE is the built example, which must find the libraries. KOVA_BENCH_ROOT
is the tree, by default /usr/include. Requires root, and lists nothing without. The archives are written
below the working directory. The counter peak_kib is the memory of the service itself, without the
programs that it starts.
"""
import argparse
import json
import os
import pathlib
import resource
import statistics
import subprocess
import sys
import tempfile
import time

sys.dont_write_bytecode = True
sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent.parent / "scripts"))
import bench_run  # pylint: disable=wrong-import-position

TAR = ["tar", "--create", "--directory=/", "--null", "--verbatim-files-from", "--no-recursion",
       "--format=posix", "--numeric-owner", "--acls", "--xattrs", "--ignore-failed-read"]
ROUNDS = 7
PROGRAM = os.environ.get("KOVA_BENCH_SERVICE", "")
TREE = os.environ.get("KOVA_BENCH_ROOT", "/usr/include")


def children_seconds():
    usage = resource.getrusage(resource.RUSAGE_CHILDREN)
    return usage.ru_utime + usage.ru_stime


def measure(command):
    """Returns the processor seconds of the command and its children, and its own peak of memory."""
    before = children_seconds()
    child = subprocess.Popen(command, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    peak = bench_run.wait_for(child, bench_run.LIMIT)
    if child.returncode not in (0, 3):  # 3: something could not be read, as with tar
        sys.exit(f"{command[0]} ended with {child.returncode}")
    return children_seconds() - before, peak


def commands_in(scratch):
    """The command of the service and that of its peer, for the same list of entries."""
    service = [PROGRAM, "--tasks", f"{scratch}/tasks"]
    subprocess.run([*service, "add", "--name", "bench", "--source", TREE, "--keep", "1",
                    "--destination", scratch], check=True, stdout=subprocess.DEVNULL)
    plan = subprocess.run([*service, "run", "1", "--dry-run"], check=True,
                          stdout=subprocess.PIPE, stderr=subprocess.DEVNULL).stdout
    listed = pathlib.Path(scratch) / "list"
    listed.write_bytes(b"".join(path[1:] + b"\0" for path in plan.splitlines()))
    pipe = " ".join([*TAR, f"--files-from={listed}"]) + f" | zstd -q -3 -c >{scratch}/peer"
    return [*service, "run", "1"], ["sh", "-c", pipe]


def race():
    """The counters. Both sides run once before, which fills the caches of the file system."""
    with tempfile.TemporaryDirectory(dir=os.getcwd()) as scratch:
        service, peer = commands_in(scratch)
        runs = [(measure(service), measure(peer)) for _ in range(ROUNDS + 1)][1:]
    ratios = [own[0] / other[0] for own, other in runs]
    quarters = statistics.quantiles(ratios, n=4, method="inclusive")
    return {"ns:kova": statistics.median(own[0] for own, _ in runs) * 1e9,
            "ns:tar_zstd": statistics.median(other[0] for _, other in runs) * 1e9,
            "ratio:tar_zstd": quarters[1], "spread:tar_zstd": (quarters[2] - quarters[0]) / quarters[1],
            "load": os.getloadavg()[0], "peak_kib": max(own[1] for own, _ in runs)}


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--benchmark_list_tests", action="store_true")
    parser.add_argument("--benchmark_filter")
    parser.add_argument("--benchmark_out", type=pathlib.Path)
    parser.add_argument("--benchmark_out_format")
    arguments = parser.parse_args()
    name = f"backup{TREE}"
    if arguments.benchmark_list_tests:
        if os.geteuid() == 0 and PROGRAM:
            print(name)
        return
    text = json.dumps({"context": {}, "benchmarks": [{"name": name, **race()}]})
    if arguments.benchmark_out:
        arguments.benchmark_out.write_text(text, encoding="utf-8")
    print(text)


if __name__ == "__main__":
    main()
