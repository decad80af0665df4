"""Small results of benchmarks, for the tests of the scripts that read them."""
import pathlib
import sys

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
sys.dont_write_bytecode = True
sys.path.insert(0, str(ROOT / "scripts"))
import bench_results  # noqa: E402


def row(name, ours, program="path_bench", spread=0.02, goal=None, **peers):
    """A row in which the library takes `ours` nanoseconds, and each peer the number at its name."""
    return {"program": program, "name": name, "ns": {"kova": ours, **peers},
            "ratio": {peer: ours / time for peer, time in peers.items()},
            "spread": {peer: spread for peer in peers},
            "goal": {peer: goal for peer in peers if goal}, "load": 0.1, "peak_kib": 5120}


def results(*rows, problems=(), **others):
    return {"format": bench_results.FORMAT, "date": "2026-01-02T03:04:05Z", "commit": "abc123456",
            "compiler": "c++ 12.2.0", "packages": {"libre2-dev": "1-1"}, "problems": list(problems),
            "machine": {"cpu": "Processor", "cores": 2, "caches": "L1d 48K", "memory_mib": 2048,
                        "kernel": "Linux 6.1", "load": 0.25}, "rows": list(rows), **others}
