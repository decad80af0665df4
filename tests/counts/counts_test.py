#!/usr/bin/env python3
"""Tests scripts/counts.py: what it reads of callgrind, and what it lets pass."""
import json
import pathlib
import subprocess
import sys
import tempfile
import unittest
from unittest import mock

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
sys.dont_write_bytecode = True
sys.path.insert(0, str(ROOT / "scripts"))
import counts  # noqa: E402
from counts import Cost, Growth, Run  # noqa: E402

TOOLS = {"machine": "x86_64", "g++": "12.2.0", "libc": "2.36"}
CALLGRIND = """# callgrind format
version: 1
cmd: tests/counts/kova_counts
part: 1
desc: Trigger: --dump-after=kovaCounted
events: Ir sysCount sysTime
summary: {summary}
fn=(1) kovaCounted
totals: 1
part: 2
desc: Trigger: Program termination
events: Ir sysCount sysTime
summary: 99 98 97
"""
NOTICED = [Growth("self.quadratic/500", "self.quadratic/2000", 4.6)]


def written_by_callgrind(summary):
    return CALLGRIND.format(summary=summary)


def run_of(costs, growths=(), skipped=None):
    """A run with these counts. Its quadratic operation is noticed."""
    probes = {"self.quadratic/500": Cost(1000, 0), "self.quadratic/2000": Cost(16000, 0)}
    return Run({name: Cost(*cost) for name, cost in costs.items()}, probes, skipped or {},
               [*growths, *NOTICED])


def baseline_of(costs, tools=None):
    return {"tools": tools or TOOLS, "counts": {name: list(cost) for name, cost in costs.items()}}


def checked(now, before, ours=None):
    return counts.checked(run_of(now), ours or TOOLS, baseline_of(before))


class Reading(unittest.TestCase):
    def test_the_cost_is_that_of_the_counted_function_alone(self):
        self.assertEqual(counts.cost_of(written_by_callgrind("12345 6 78")), Cost(12345, 6))

    def test_zeros_at_the_end_may_be_left_out(self):
        self.assertEqual(counts.cost_of(written_by_callgrind("12345")), Cost(12345, 0))

    def test_an_operation_that_was_not_counted_exactly_once_is_refused(self):
        text = written_by_callgrind("1 0 0")
        for wrong in (text.replace("--dump-after=kovaCounted", "Program termination"), text + text):
            with self.assertRaises(ValueError):
                counts.cost_of(wrong)

    def test_what_the_program_prints(self):
        files = {"7": written_by_callgrind("70 1 0"), "8": written_by_callgrind("280 2 0")}
        run = counts.read_run(["run a/1 7", "probe a/4 8", "skip b no private /tmp: EPERM",
                               "growth a/1 a/4 4.6"], files.get)
        self.assertEqual(run, Run({"a/1": Cost(70, 1)}, {"a/4": Cost(280, 2)},
                                  {"b": "no private /tmp: EPERM"}, [Growth("a/1", "a/4", 4.6)]))

    def test_any_other_line_is_refused(self):
        with self.assertRaises(ValueError):
            counts.read_run(["walk a/1 7"], {}.get)


class Baseline(unittest.TestCase):
    def test_the_same_counts_pass_silently(self):
        self.assertEqual(checked({"a": (1000, 2)}, {"a": (1000, 2)}), ([], []))

    def test_up_to_the_bound_passes(self):
        self.assertEqual(checked({"a": (103020, 0)}, {"a": (100000, 0)}), ([], []))

    def test_more_than_the_bound_fails_with_both_counts(self):
        self.assertEqual(checked({"a": (103021, 0)}, {"a": (100000, 0)}).failures,
                         ["a: 100,000 -> 103,021 instructions (+3.0 %), allowed are 3%"])

    def test_one_more_system_call_fails(self):
        self.assertEqual(checked({"a": (1000, 6)}, {"a": (1000, 5)}).failures,
                         ["a: 5 -> 6 system calls (+20.0 %), allowed are 3%"])

    def test_the_first_system_call_fails(self):
        self.assertEqual(checked({"a": (1000, 1)}, {"a": (1000, 0)}).failures,
                         ["a: 0 -> 1 system calls, allowed are 3%"])

    def test_much_cheaper_passes_with_a_note(self):
        report = checked({"a": (8000, 0)}, {"a": (10000, 0)})
        self.assertEqual(report.failures, [])
        self.assertEqual(report.notes, ["a: 10,000 -> 8,000 instructions (-20.0 %): cheaper; "
                                        "keep that with scripts/counts update"])

    def test_a_little_cheaper_passes_silently(self):
        self.assertEqual(checked({"a": (9100, 0)}, {"a": (10000, 0)}), ([], []))

    def test_an_operation_on_one_side_alone_fails(self):
        failures = checked({"a": (1, 0), "new": (1, 0)}, {"a": (1, 0), "old": (1, 0)}).failures
        self.assertEqual([failure.split(":")[0] for failure in failures], ["new", "old"])

    def test_no_baseline_fails(self):
        failures = counts.checked(run_of({}), TOOLS, None).failures
        self.assertEqual(failures, ["baseline.json does not exist; write it with scripts/counts update"])

    def test_other_tools_are_named_and_have_a_wider_bound(self):
        ours = {**TOOLS, "libc": "2.40"}
        report = checked({"a": (11400, 0)}, {"a": (10000, 0)}, ours)
        self.assertEqual(report, ([], ["the bound is 15% instead of 3%: libc 2.36 in the baseline, 2.40 here"]))
        self.assertEqual(len(checked({"a": (11600, 0)}, {"a": (10000, 0)}, ours).failures), 1)

    def test_the_baseline_of_another_machine_is_skipped_with_a_reason(self):
        report = checked({"a": (99999, 0)}, {"a": (1, 0)}, {**TOOLS, "machine": "aarch64"})
        self.assertEqual(report, ([], ["the baseline is skipped: it is of x86_64, and this is aarch64"]))

    def test_skipped_operations_are_reported(self):
        run = run_of({}, skipped={"a/1": "no private /tmp", "a/2": "no private /tmp"})
        report = counts.checked(run, TOOLS, baseline_of({"a/1": (1, 0), "a/2": (1, 0)}))
        self.assertEqual(report, ([], ["2 operations are skipped: no private /tmp (a/1 ...)"]))


class Growths(unittest.TestCase):
    def grown(self, small, large, bound=4.6):
        costs = {"a/100": (small, 0), "a/400": (large, 0)}
        run = run_of(costs, [Growth("a/100", "a/400", bound)])
        return counts.checked(run, TOOLS, baseline_of(costs)).failures

    def test_linear_passes(self):
        self.assertEqual(self.grown(1000, 4000), [])

    def test_quadratic_fails_with_the_ratio(self):
        self.assertEqual(self.grown(1000, 16000),
                         ["a/100 -> a/400: 16.00 times the instructions, allowed are 4.6 times"])

    def test_the_bound_is_that_of_the_operation(self):
        self.assertEqual(self.grown(1000, 5500, 5.6), [])
        self.assertEqual(len(self.grown(1000, 5700, 5.6)), 1)

    def test_a_check_that_notices_nothing_fails(self):
        run = Run({}, {"self.quadratic/500": Cost(1000, 0), "self.quadratic/2000": Cost(4000, 0)},
                  {}, NOTICED)
        blind = ["self.quadratic: the check does not notice that it is quadratic"]
        self.assertEqual(counts.checked(run, TOOLS, baseline_of({})).failures, blind)
        self.assertEqual(counts.checked(Run({}, {}, {}, []), TOOLS, baseline_of({})).failures, blind)

    def test_a_skipped_size_is_not_compared(self):
        run = run_of({}, [Growth("a/100", "a/400", 4.6)], {"a/100": "why", "a/400": "why"})
        self.assertEqual(counts.checked(run, TOOLS, baseline_of({})).failures, [])


class Update(unittest.TestCase):
    def update(self, now, baseline):
        return counts.updated(run_of(now), TOOLS, baseline)

    def test_the_first_baseline_has_every_count(self):
        baseline, lines = self.update({"b": (2, 0), "a": (1, 1)}, None)
        self.assertEqual(baseline, baseline_of({"a": (1, 1), "b": (2, 0)}))
        self.assertEqual(len(lines), 2)

    def test_twice_changes_nothing_the_second_time(self):
        before = baseline_of({"a": (10000, 1)})
        self.assertEqual(self.update({"a": (10040, 1)}, before), (before, []))

    def test_changes_are_printed(self):
        baseline, lines = self.update({"a": (900, 3), "c": (1, 0)},
                                      baseline_of({"a": (1000, 2), "b": (1, 0)}))
        self.assertEqual(baseline, baseline_of({"a": (900, 3), "c": (1, 0)}))
        self.assertEqual(lines, ["a: 1,000 -> 900 instructions (-10.0 %), 2 -> 3 system calls",
                                 "c: new, 1 instructions, 0 system calls", "b: removed"])

    def test_other_tools_replace_every_count(self):
        before = baseline_of({"a": (10000, 1)}, {**TOOLS, "libc": "2.31"})
        baseline, lines = self.update({"a": (10001, 1)}, before)
        self.assertEqual(baseline, baseline_of({"a": (10001, 1)}))
        self.assertIn("libc 2.31 in the baseline, 2.36 here", lines)

    def test_the_file_is_read_as_it_was_written(self):
        baseline = baseline_of({"a/1": (1, 2), "b": (3, 0)})
        self.assertEqual(json.loads(counts.written(baseline)), baseline)
        self.assertIn('    "a/1": [1, 2],\n', counts.written(baseline))

    def test_skipped_operations_refuse_an_update(self):
        with tempfile.TemporaryDirectory() as folder:
            file = pathlib.Path(folder) / "baseline.json"
            with mock.patch.object(counts, "BASELINE", file), self.assertRaises(SystemExit) as end:
                counts.update(run_of({"a": (1, 0)}, skipped={"b": "no private /tmp"}))
            self.assertIn("b is skipped: no private /tmp", str(end.exception.code))
            self.assertFalse(file.exists())


class CommandLine(unittest.TestCase):
    def run_script(self, *arguments):
        return subprocess.run([ROOT / "scripts" / "counts", *arguments], capture_output=True,
                              text=True, check=False)

    def test_wrong_arguments_are_refused_before_anything_is_built(self):
        for arguments in (["count"], ["check", "more"], ["update", "more"], ["show", "a", "b"], [""]):
            with self.subTest(arguments=arguments):
                run = self.run_script(*arguments)
                self.assertEqual((run.returncode, run.stdout), (1, ""))
                self.assertIn("usage: scripts/counts", run.stderr)

    def test_help(self):
        run = self.run_script("--help")
        self.assertEqual((run.returncode, run.stderr), (0, ""))
        for word in ("check", "update", "show"):
            self.assertIn(f"  {word}", run.stdout)
        self.assertNotIn("set -", run.stdout)


if __name__ == "__main__":
    sys.exit(unittest.main())
