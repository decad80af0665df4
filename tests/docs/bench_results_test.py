#!/usr/bin/env python3
"""Tests scripts/bench_results.py: the file of a run, and how figures are written."""
import json
import pathlib
import sys
import tempfile
import unittest

import bench_fixture
import bench_results
from bench_fixture import results, row

ENTRY = {"name": "join/2/iterations:11/manual_time", "cpu_time": 7.0, "ns:kova": 39.84662,
         "ns:append": 24.4, "ratio:append": 1.6, "spread:append": 0.1, "goal:append": 2,
         "load": 0.5}


class File(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.path = pathlib.Path(folder.name) / "run.json"

    def assert_unusable(self, text, words):
        self.path.write_text(text)
        with self.assertRaises(bench_results.Unusable) as caught:
            bench_results.read(self.path)
        self.assertIn(words, str(caught.exception))
        self.assertIn(str(self.path), str(caught.exception))

    def test_what_is_written_is_read(self):
        run = results(row("join/2", 40.5, append=20), {"program": "p", "name": "r", "error": "why"})
        bench_results.write(self.path, run)
        self.assertEqual(bench_results.read(self.path), run)
        self.assertIn('\n {"program": "path_bench", "name": "join/2"', self.path.read_text())

    def test_a_run_without_rows_is_read(self):
        bench_results.write(self.path, results(problems=["it failed"]))
        self.assertEqual(bench_results.read(self.path)["rows"], [])

    def test_other_files_are_refused_with_a_sentence(self):
        self.assert_unusable("", "is not a JSON file")
        self.assert_unusable('{"format": 1, "rows": [', "is not a JSON file")
        self.assert_unusable("[]", "was not written by this version")
        self.assert_unusable('{"format": 99}', "was not written by this version")
        self.assert_unusable('{"context": {}, "benchmarks": []}', "output of one program")
        self.assert_unusable('{"format": 1}', "is incomplete")

    def test_rows_without_what_every_reader_uses_are_refused(self):
        for key in ("program", "name", "ns", "ratio", "spread", "goal"):
            odd = row("join/2", 40, append=20)
            del odd[key]
            with self.subTest(missing=key):
                self.assert_unusable(json.dumps(results(odd)), "is incomplete")
        for key, value in (("ns", {"append": 20}), ("ns", {"kova": 40}), ("ns", {"kova": None}),
                           ("ratio", {"append": "2"}), ("ratio", []), ("name", 7)):
            with self.subTest(key=key, value=value):
                self.assert_unusable(json.dumps(results({**row("join/2", 40, append=20), key: value})),
                                     "is incomplete")

    def test_a_missing_file_is_named(self):
        with self.assertRaisesRegex(bench_results.Unusable, "No such file"):
            bench_results.read(self.path)


class Rows(unittest.TestCase):
    def test_counters_become_figures_by_name(self):
        self.assertEqual(bench_results.row_of("path_bench", ENTRY),
                         {"program": "path_bench", "name": "join/2", "load": 0.5,
                          "ns": {"kova": 39.847, "append": 24.4}, "ratio": {"append": 1.6},
                          "spread": {"append": 0.1}, "goal": {"append": 2}})

    def test_a_benchmark_without_a_race_is_an_error(self):
        found = bench_results.row_of("p", {"name": "add/100", "cpu_time": 7.0, "time_unit": "us"})
        self.assertEqual(found, {"program": "p", "name": "add/100",
                                 "error": "is not a race: it reports no ns:kova"})

    def test_a_race_without_peers_has_a_time(self):
        found = bench_results.row_of("p", {"name": "add", "ns:kova": 7})
        self.assertEqual((found["ns"], found["ratio"]), ({"kova": 7}, {}))

    def test_odd_figures_are_an_error_of_their_row(self):
        for key, value in (("ratio:append", float("nan")), ("ns:append", 0), ("ns:kova", -1.0),
                           ("spread:append", float("inf"))):
            with self.subTest(key=key):
                found = bench_results.row_of("p", {**ENTRY, key: value})
                self.assertIn("odd figures", found["error"])
        found = bench_results.row_of("p", {key: value for key, value in ENTRY.items() if key != "ns:append"})
        self.assertEqual(found["error"], "odd figures: 'append'")

    def test_an_error_is_kept(self):
        entry = {**ENTRY, "error_occurred": True, "error_message": "append: wrong result"}
        self.assertEqual(bench_results.row_of("p", entry)["error"], "append: wrong result")

    def test_only_suffixes_of_the_measurement_are_removed(self):
        for name, short in (("a/iterations:11/manual_time", "a"), ("a/threads/2", "a/threads/2"),
                            ("a<B>/size:3/iterations:1", "a<B>/size:3"), ("a/real_time", "a")):
            self.assertEqual(bench_results.short_name(name), short)


class Figures(unittest.TestCase):
    def test_times_have_three_digits_and_a_unit(self):
        for nanoseconds, text in ((0.5, "0.50 ns"), (1, "1.00 ns"), (39.84, "39.8 ns"), (999.4, "999 ns"),
                                  (999.6, "1.00 µs"), (1234, "1.23 µs"), (99960, "100 µs"),
                                  (5.6e6, "5.60 ms"), (2.5e9, "2.50 s"), (3e12, "3000 s")):
            self.assertEqual(bench_results.time_text(nanoseconds), text)

    def test_ratios_keep_digits_that_matter(self):
        for ratio, text in ((0.0118, "0.012"), (0.0996, "0.10"), (0.5, "0.50"), (1.598, "1.60"),
                            (12.34, "12.3"), (123.4, "123"), (0, "0.00")):
            self.assertEqual(bench_results.ratio_text(ratio), text)


if __name__ == "__main__":
    sys.exit(unittest.main())
