#!/usr/bin/env python3
"""Tests scripts/coverage.py, which compares the coverage with what is required."""
import contextlib
import io
import json
import pathlib
import sys
import tempfile
import unittest

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
sys.dont_write_bytecode = True
sys.path.insert(0, str(ROOT / "scripts"))
import coverage  # noqa: E402


def line(number, count, branches=(), noncode=False):
    """A line as gcovr describes it."""
    return {"line_number": number, "count": count, "gcovr/noncode": noncode,
            "branches": [{"count": branch} for branch in branches]}


# Bounds of the test's own, and a source for each part, which runs.
coverage.PARTS = (("library", ("base", "path"), 100, 95), ("command", ("tools",), 98, None))
ENOUGH = {f"{folder}/enough.cpp": [line(1, 1)] for folder in ("base", "tools")}


def files(lines_by_path):
    """What gcovr writes of some sources."""
    return json.dumps({"files": [{"file": path, "lines": lines}
                                 for path, lines in lines_by_path.items()]})


class Coverage(unittest.TestCase):
    def run_main(self, lines_by_path, *arguments):
        """Exit code, output and complaints of a command over these sources and the others."""
        return self.run_alone({**ENOUGH, **lines_by_path}, *arguments)

    def run_alone(self, lines_by_path, *arguments):
        """The same over these sources alone."""
        out, err = io.StringIO(), io.StringIO()
        with tempfile.TemporaryDirectory() as folder:
            path = pathlib.Path(folder) / "coverage.json"
            path.write_text(files(lines_by_path), encoding="utf-8")
            with contextlib.redirect_stdout(out), contextlib.redirect_stderr(err):
                code = coverage.main([arguments[0], str(path), *arguments[1:]])
        return code, out.getvalue(), err.getvalue()

    def test_everything_is_enough(self):
        code, out, err = self.run_main({"path/a.cpp": [line(1, 2, (1, 1))]}, "check")
        self.assertEqual((code, err), (0, ""))
        self.assertRegex(out, r"(?m)^library +2 +2 +100\.0 % +2 +2 +100\.0 %$")

    def test_one_line_too_few_in_a_part_fails(self):
        lines = [line(number, 1) for number in range(1, 5000)] + [line(5000, 0)]
        code, out, err = self.run_main({"path/a.cpp": lines}, "check")
        self.assertEqual(code, 1)
        self.assertEqual(err, "coverage: library: 99.9 % of the lines, 100 % are required\n")
        self.assertRegex(out, r"(?m)^library +5000 +5001 +99\.9 %")

    def test_too_few_branches_fail(self):
        source = {"path/filter/a.cpp": [line(1, 1, [1] * 94 + [0] * 6)]}
        code, _, err = self.run_main(source, "check")
        self.assertEqual(code, 1)
        self.assertIn("library: 94.0 % of the branches, 95 % are required", err)

    def test_the_bound_itself_is_enough(self):
        source = {"path/filter/a.cpp": [line(1, 1, [1] * 95 + [0] * 5)]}
        self.assertEqual(self.run_main(source, "check")[0], 0)

    def test_a_part_without_a_bound_needs_none(self):
        source = {"tools/a.cpp": [line(1, 1, [0] * 99)]}
        self.assertEqual(self.run_main(source, "check")[0], 0)

    def test_excluded_lines_do_not_count(self):
        source = {"base/a.cpp": [line(1, 1), line(2, 0, noncode=True)]}
        self.assertEqual(self.run_main(source, "check")[0], 0)

    def test_a_build_that_counted_nothing_fails(self):
        code, _, err = self.run_alone({"tests/a.cpp": [line(1, 1)]}, "check")
        self.assertEqual(code, 1)
        self.assertIn("library: there is nothing to count", err)

    def test_lists_what_does_not_run(self):
        source = {"base/a.cpp": [line(1, 1, (1, 0, 1)), line(2, 0, (0, 0)), line(3, 1, (1, 1))],
                  "path/b.cpp": [line(1, 0)]}
        self.assertEqual(self.run_main(source, "show", "base/a"),
                         (0, "base/a.cpp:1: branch 1 of 3\nbase/a.cpp:2: line\n", ""))


if __name__ == "__main__":
    unittest.main()
