#!/usr/bin/env python3
"""Measures a run of the example service beside tar | zstd of the same list and level.

Usage: backup_service_bench.py PROGRAM [TREE] [ROUNDS]     PROGRAM: the built example; TREE: /usr

Runs both alternately and prints, for each, the median CPU time with that of all children and the
wall time; then the ratio, and the peak memory of the service itself, without the programs that it
starts. Requires root. PROGRAM must find the libraries. The archives are written below the working
directory.
"""
import os
import pathlib
import resource
import statistics
import subprocess
import sys
import tempfile
import time

TAR = ["tar", "--create", "--directory=/", "--null", "--verbatim-files-from", "--no-recursion",
       "--format=posix", "--numeric-owner", "--acls", "--xattrs", "--ignore-failed-read"]


def peak_of(pid):
    """The peak resident memory in KiB that the kernel has recorded so far; 0 when it has ended."""
    try:
        for line in pathlib.Path(f"/proc/{pid}/status").read_text().splitlines():
            if line.startswith("VmHWM:"):
                return int(line.split()[1])
    except OSError:
        pass
    return 0


def measure(command):
    """Returns CPU seconds with children, wall seconds, and the peak memory of the command alone."""
    before = resource.getrusage(resource.RUSAGE_CHILDREN)
    begin = time.monotonic()
    child = subprocess.Popen(command, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    peak = 0
    while child.poll() is None:
        peak = max(peak, peak_of(child.pid))
        time.sleep(0.02)
    wall = time.monotonic() - begin
    after = resource.getrusage(resource.RUSAGE_CHILDREN)
    if child.returncode not in (0, 3):
        sys.exit(f"{command} ended with {child.returncode}")
    return after.ru_utime + after.ru_stime - before.ru_utime - before.ru_stime, wall, peak


def main():
    program = os.path.abspath(sys.argv[1])
    tree = sys.argv[2] if len(sys.argv) > 2 else "/usr"
    rounds = int(sys.argv[3]) if len(sys.argv) > 3 else 5
    with tempfile.TemporaryDirectory(dir=os.getcwd()) as scratch:
        service = [program, "--tasks", f"{scratch}/tasks"]
        subprocess.run([*service, "add", "--name", "bench", "--source", tree, "--keep", "1",
                        "--destination", scratch], check=True, stdout=subprocess.DEVNULL)
        plan = subprocess.run([*service, "run", "1", "--dry-run"], check=True,
                              stdout=subprocess.PIPE, stderr=subprocess.DEVNULL).stdout
        listed = f"{scratch}/list"
        with open(listed, "wb") as out:
            out.write(b"".join(path[1:] + b"\0" for path in plan.splitlines()))
        pipe = " ".join([*TAR, f"--files-from={listed}"]) + f" | zstd -q -3 -c >{scratch}/peer"
        peer = ["sh", "-c", pipe]
        results = {"service": [], "tar | zstd": []}
        for _ in range(rounds):
            results["service"].append(measure([*service, "run", "1"]))
            results["tar | zstd"].append(measure(peer))
        print(f"{tree}: {len(plan.splitlines())} entries, {rounds} rounds, load {os.getloadavg()[0]:.1f}")
        for name, runs in results.items():
            cpu, wall, _ = (statistics.median(values) for values in zip(*runs))
            print(f"{name:12} CPU {cpu:7.2f} s   wall {wall:7.2f} s")
        ratio = [statistics.median(run[0] for run in results[name]) for name in results]
        print(f"CPU ratio    {ratio[0] / ratio[1]:.3f}")
        print(f"own memory   {max(run[2] for run in results['service']) / 1024:.1f} MiB")


if __name__ == "__main__":
    main()
