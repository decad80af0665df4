#!/usr/bin/env python3
"""Tests scripts/bench_run.py on programs that behave as benchmarks do, and on some that do not."""
import pathlib
import shutil
import subprocess
import sys
import tempfile
import unittest

from bench_fixture import ROOT
import bench_results
import bench_run

# Answers as a benchmark program does. ROWS maps a name to what is done for it.
PROGRAM = """#!/usr/bin/env python3
import json, os, signal, sys, time
rows = {rows}
options = dict(option.partition("=")[::2] for option in sys.argv[1:])
if "--benchmark_list_tests" in options:
    print("\\n".join(rows))
    sys.exit(0)
chosen = [name for name in rows if "^" + name + "$" == options["--benchmark_filter"]]
entries = []
for name in chosen:
    if rows[name] == "crash":
        os.kill(os.getpid(), signal.SIGSEGV)
    if rows[name] == "exit":
        sys.exit("it cannot go on")
    if rows[name] == "hang":
        time.sleep(60)
    if rows[name] == "memory":
        block = bytearray(100 << 20)
        time.sleep(0.2)
    entries.append({{"name": name, "ns:kova": 5, "ns:peer": 10,
                     "ratio:peer": 0.5, "spread:peer": 0.1}})
with open(options["--benchmark_out"], "w") as out:
    json.dump({{"context": {{}}, "benchmarks": entries}}, out)
"""


class Runs(unittest.TestCase):
    def setUp(self):
        self.folder = pathlib.Path(tempfile.mkdtemp())
        self.addCleanup(shutil.rmtree, self.folder)
        (self.folder / "bench").mkdir()
        (self.folder / "CMakeCache.txt").write_text("CMAKE_CXX_COMPILER:FILEPATH=/usr/bin/c++\n")
        self.output = self.folder / "run.json"

    def add(self, name, rows):
        program = self.folder / "bench" / name
        program.write_text(PROGRAM.format(rows=rows))
        program.chmod(0o755)
        with (self.folder / "bench" / "programs").open("a") as listed:
            listed.write(name + "\n")
        return program

    def run_script(self, *arguments):
        return subprocess.run([ROOT / "scripts/bench_run.py", "--build", self.folder, *arguments],
                              check=False, capture_output=True, text=True, cwd=self.folder)

    def rows(self):
        return {row["name"]: row for row in bench_results.read(self.output)["rows"]}

    def test_each_row_of_each_program_is_run(self):
        self.add("b_bench", {"join/2/iterations:11/manual_time": "run", "join/8": "run"})
        self.add("a_bench", {"split": "run"})
        done = self.run_script("--output", self.output)
        self.assertEqual(done.returncode, 0, done.stderr)
        run = bench_results.read(self.output)
        self.assertEqual([(row["program"], row["name"]) for row in run["rows"]],
                         [("a_bench", "split"), ("b_bench", "join/2"), ("b_bench", "join/8")])
        self.assertEqual(run["rows"][0]["ratio"], {"peer": 0.5})
        self.assertGreater(run["machine"]["memory_mib"], 100)
        self.assertGreaterEqual(run["machine"]["cores"], 1)

    def test_a_row_that_fails_loses_nothing_of_the_others(self):
        self.add("a_bench", {"first": "run", "second": "crash", "third": "exit", "last": "run"})
        self.assertEqual(self.run_script("--output", self.output).returncode, 1)
        rows = self.rows()
        self.assertEqual(rows["second"]["error"], "ended by SIGSEGV: no message")
        self.assertEqual(rows["third"]["error"], "exit status 1: it cannot go on")
        self.assertNotIn("error", rows["first"])
        self.assertNotIn("error", rows["last"])

    def test_a_program_that_cannot_run_is_a_problem(self):
        self.add("a_bench", {"first": "run"})
        self.add("gone_bench", {}).unlink()
        self.assertEqual(self.run_script("--output", self.output).returncode, 1)
        self.assertIn("gone_bench cannot be run", bench_results.read(self.output)["problems"][0])
        self.assertEqual(list(self.rows()), ["first"])

    def test_a_row_that_hangs_is_ended(self):
        program = self.add("a_bench", {"slow": "hang"})
        with self.assertRaisesRegex(bench_results.Unusable, "took longer than 0.5 s"):
            bench_run.run_row(program, "slow", self.folder, 0.5)

    def test_rows_have_their_own_peak_of_memory(self):
        self.add("a_bench", {"large": "memory", "small": "run"})
        self.run_script("--output", self.output)
        rows = self.rows()
        self.assertGreater(rows["large"]["peak_kib"], 100 << 10)
        self.assertLess(rows["small"]["peak_kib"], 90 << 10)

    def test_names_are_matched_exactly(self):
        self.assertEqual(bench_run.exact("a<B>/2.5/x+"), "^a<B>/2\\.5/x\\+$")

    def test_the_filter_and_the_list(self):
        self.add("a_bench", {"join/2/iterations:11": "run", "split/2": "run"})
        self.assertEqual(self.run_script("--list", "--filter", "^join").stdout, "a_bench join/2\n")
        self.assertEqual(self.run_script("--list", "--filter", "iterations").stdout, "")

    def test_wrong_arguments_are_one_sentence(self):
        self.add("a_bench", {"join/2": "run"})
        for words, arguments in (("there is no benchmark 'b_bench', but a_bench", ["b_bench"]),
                                 ("'(' is not a regular expression", ["--filter", "("]),
                                 ("no row matches 'none'", ["--filter", "none"])):
            with self.subTest(words=words):
                done = self.run_script("--output", self.output, *arguments)
                self.assertEqual(done.returncode, 2)
                self.assertIn(words, done.stderr)
                self.assertFalse(self.output.exists())

    def test_a_disturbed_row_runs_again_and_the_calmer_run_counts(self):
        spreads = iter([0.4, 0.3, 0.1])
        original = bench_run.run_row
        self.addCleanup(setattr, bench_run, "run_row", original)
        bench_run.run_row = lambda *_: {"spread": {"peer": next(spreads)}}
        self.assertEqual(bench_run.best_of("p", "n", "s")["spread"]["peer"], 0.3)
        self.assertEqual(bench_run.best_of("p", "n", "s")["spread"]["peer"], 0.1)


if __name__ == "__main__":
    sys.exit(unittest.main())
