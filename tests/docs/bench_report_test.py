#!/usr/bin/env python3
"""Tests scripts/bench_report.py: the table of a run, and what changed between two."""
import pathlib
import subprocess
import sys
import tempfile
import unittest

from bench_fixture import ROOT, results, row
import bench_report
import bench_results


def table(run, width=80):
    return "\n".join(bench_report.table(run, width))


def compared(old, new, width=80):
    return "\n".join(bench_report.compare(results(old), results(new), width))


class Table(unittest.TestCase):
    def test_each_row_shows_both_times_ratio_and_goal(self):
        shown = table(results(row("join/2", 40, goal=0.5, append=100)))
        self.assertIn("== path_bench, peak memory 5.00 MiB", shown)
        self.assertRegex(shown, r"\njoin/2 +40\.0 ns +append +100 ns +0\.40 +0\.50\n")
        self.assertIn("1 rows in 0 s, 1 goals, 0 missed", shown)

    def test_a_missed_goal_is_marked(self):
        shown = table(results(row("join/2", 60, goal=0.5, append=100)))
        self.assertRegex(shown, r"0\.60 +0\.50 +missed\n")
        self.assertIn("1 goals, 1 missed", shown)

    def test_further_peers_follow_without_repeating_the_row(self):
        lines = table(results(row("join/2", 40, append=100, other=10))).splitlines()
        self.assertRegex(lines[-3], r"^ +other +10\.0 ns +4\.00$")

    def test_jobs_are_separated(self):
        shown = table(results(row("join/2", 40), row("join/8", 40), row("split/2", 40)))
        self.assertRegex(shown, r"join/2 +40\.0 ns\njoin/8 +40\.0 ns\n\nsplit/2")
        shown = table(results(row("join", 40), row("split", 40), row("token/1", 40), row("token/2", 40)))
        self.assertRegex(shown, r"\njoin +40\.0 ns\nsplit +40\.0 ns\n\ntoken/1")

    def test_no_line_is_wider_than_the_terminal(self):
        run = results(row("a_job_with_a_rather_long_name/100000/walk", 123, goal=0.5,
                          boost_property_tree=456), row("join/2", 123, goal=2, append=456))
        for width in (60, 80, 120):
            with self.subTest(width=width):
                shown = table(run, width)
                self.assertLessEqual(max(map(len, shown.splitlines())), width)
                self.assertIn("a_job_with_a_rather_long_name/100000/walk", shown)

    def test_a_narrow_terminal_keeps_the_ratio(self):
        shown = table(results(row("a_job_with_a_long_name/1", 40, goal=0.3, boost_property_tree=100)), 56)
        self.assertNotIn("theirs", shown)
        self.assertRegex(shown, r"0\.40 +0\.30 +missed")

    def test_failures_are_named_beside_the_other_rows(self):
        failed = {"program": "path_bench", "name": "split/2", "error": "wrong result"}
        shown = table(results(failed, row("join/2", 40, append=100), problems=["text_bench is gone"]))
        self.assertIn("failed: path_bench split/2: wrong result\nfailed: text_bench is gone", shown)
        self.assertIn("join/2", shown)

    def test_a_row_without_spread_and_memory_is_shown(self):
        plain = row("join/2", 40, append=100)
        plain["spread"] = {}
        del plain["peak_kib"]
        self.assertIn("0.40", table(results(plain)))


class Comparison(unittest.TestCase):
    def assert_change(self, old, new, words):
        line = [line for line in compared(old, new).splitlines() if line.startswith("join/2")][0]
        self.assertRegex(line, words)

    def test_changes_beyond_the_noise_are_marked(self):
        self.assert_change(row("join/2", 40, append=100), row("join/2", 50, append=100),
                           r"0\.40 +0\.50 +\+25% +5% +SLOWER$")
        self.assert_change(row("join/2", 50, append=100), row("join/2", 40, append=100),
                           r"0\.50 +0\.40 +-20% +5% +faster$")

    def test_the_spreads_of_both_runs_are_noise(self):
        calm, disturbed = row("join/2", 40, append=100), row("join/2", 50, append=100, spread=0.25)
        self.assert_change(calm, disturbed, r"\+25% +27%$")
        self.assert_change(disturbed, calm, r"-20% +27%$")

    def test_small_changes_are_noise_even_without_spread(self):
        self.assert_change(row("join/2", 100, append=100, spread=0), row("join/2", 104, append=100, spread=0),
                           r"\+4% +5%$")

    def test_a_goal_that_was_reached_may_not_be_missed(self):
        old, new = row("join/2", 49, append=100), row("join/2", 51, goal=0.5, append=100)
        self.assert_change(old, new, r"GOAL MISSED$")
        self.assertEqual(bench_report.worse(results(old), results(new)), [("path_bench", "join/2", "append")])
        old, new = row("join/2", 52, append=100), row("join/2", 51, goal=0.5, append=100)
        self.assertEqual(bench_report.worse(results(old), results(new)), [])

    def test_a_faster_row_is_not_worse(self):
        self.assertEqual(bench_report.worse(results(row("join/2", 50, append=100)),
                                            results(row("join/2", 20, append=100))), [])

    def test_new_and_missing_rows_and_peers_are_listed(self):
        old = results(row("join/2", 40, append=100), row("split/2", 1, append=2))
        new = results(row("join/2", 40, other=100), row("token/2", 1, append=2))
        shown = "\n".join(bench_report.compare(old, new, 80))
        for line in ("new: path_bench token/2", "gone: path_bench split/2",
                     "new: path_bench join/2 against other", "gone: path_bench join/2 against append"):
            self.assertIn(line, shown)

    def test_other_machines_and_versions_are_named(self):
        old, new = results(row("join/2", 40)), results(row("join/2", 40), packages={"libre2-dev": "2-1"})
        new["machine"]["cpu"] = "Other"
        shown = "\n".join(bench_report.compare(old, new, 80))
        self.assertIn("another machine: Processor, Other", shown)
        self.assertIn("another version of libre2-dev: 1-1, 2-1", shown)

    def test_a_row_that_failed_has_not_become_slower(self):
        failed = {"program": "path_bench", "name": "join/2", "error": "why"}
        shown = "\n".join(bench_report.compare(results(row("join/2", 4, append=1)), results(failed), 80))
        self.assertIn("gone: path_bench join/2", shown)
        self.assertIn("failed: path_bench join/2: why", shown)


class Program(unittest.TestCase):
    def run_on(self, verb, *runs):
        with tempfile.TemporaryDirectory() as folder:
            files = []
            for number, run in enumerate(runs):
                files.append(pathlib.Path(folder) / f"{number}.json")
                bench_results.write(files[-1], run)
            return subprocess.run([ROOT / "scripts/bench_report.py", verb, *files], check=False,
                                  capture_output=True, text=True)

    def test_exit_statuses(self):
        good, slow = results(row("join/2", 40, append=100)), results(row("join/2", 90, append=100))
        failed = results({"program": "path_bench", "name": "join/2", "error": "why"})
        for status, verb, runs in ((0, "table", [good]), (1, "table", [failed]), (0, "compare", [good, good]),
                                   (1, "compare", [good, slow]), (0, "compare", [slow, good]),
                                   (1, "compare", [good, failed]), (2, "table", [good, good]), (2, "x", [])):
            with self.subTest(verb=verb, status=status):
                self.assertEqual(self.run_on(verb, *runs).returncode, status)

    def test_an_unusable_file_is_one_sentence(self):
        done = subprocess.run([ROOT / "scripts/bench_report.py", "table", "/nonexistent.json"], check=False,
                              capture_output=True, text=True)
        self.assertEqual((done.returncode, done.stderr),
                         (2, "bench: /nonexistent.json: No such file or directory\n"))


if __name__ == "__main__":
    sys.exit(unittest.main())
