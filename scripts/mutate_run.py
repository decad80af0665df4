"""Runs the tests of the copy that scripts/mutate has built: once to see which mutants each test
reaches, and then those tests for one mutant at a time, until one of them fails.
"""
import ctypes
import os
import re
import subprocess
import time
from typing import NamedTuple

NONE = 0  # the number of no mutant
RECORDING = 500000  # as in tests/mutate/mutants.h
KEY = 0x6B6F0000
IPC_CREAT, IPC_RMID = 0o1000, 0
BATCH_SECONDS = (0.5, 4.0, 30.0)
MOST_SECONDS = 60.0  # of tests for one mutant; one that no test noticed until then has slept
RUN_LINE = re.compile(r"^\[ RUN      \] (\S+)", re.M)
DONE_LINE = re.compile(r"^\[ *(OK|FAILED|SKIPPED) *\] (\S+?)(?:,.*)? \((\d+) ms\)", re.M)
# A mutant may remove or kill anything, so it sees read-only disks and its own processes only.
SANDBOX = r"""
mount --make-rprivate / || exit 125
while read -r _ folder _; do
  case $folder in /dev | /dev/* | /proc | /proc/* | /sys | /sys/*) continue ;; esac
  mount -o remount,bind,ro "$(printf %b "$folder")" || exit 125 # %b: a space is \040 there
done </proc/self/mounts
for folder in $1; do mount -t tmpfs -o mode=1777,size=3g tmpfs "$folder" || exit 125; done
shift
prlimit "$@" # not exec: the shell remains as process 1 and collects orphans
exit $?
"""


class Test(NamedTuple):
    program: str  # relative to the build folder, or a command's name
    name: str  # "" for a program that is one test


class Outcome(NamedTuple):
    failed: str  # the test that failed, "" for none
    timed_out: bool
    output: str
    status: int


class Program(NamedTuple):
    """What runs tests. Its command may be anything if it is not GoogleTest's."""
    name: str
    command: tuple
    folder: str
    is_googletest: bool


class Reach(NamedTuple):
    seconds: dict  # by Test
    reached: dict  # numbers by Test
    broken: list  # tests that fail without a mutant


class SharedTable:
    """The memory in which a program records what its tests reach; see tests/mutate/mutants.h."""

    def __init__(self, slot, width, rows):
        self.libc = ctypes.CDLL(None, use_errno=True)
        self.libc.shmat.restype = ctypes.c_void_p
        self.libc.shmat.argtypes = [ctypes.c_int, ctypes.c_void_p, ctypes.c_int]
        self.libc.shmget.argtypes = [ctypes.c_int, ctypes.c_size_t, ctypes.c_int]
        self.width, self.rows = width, rows
        self.size = 8 + width * rows
        stale = self.libc.shmget(KEY + slot, 0, 0)
        if stale != -1:
            self.libc.shmctl(stale, IPC_RMID, None)
        self.id = self.libc.shmget(KEY + slot, self.size, IPC_CREAT | 0o666)
        if self.id == -1:
            raise OSError(ctypes.get_errno(), "shmget")
        self.address = self.libc.shmat(self.id, None, 0)
        ctypes.c_uint.from_address(self.address).value = width

    def row(self, number):
        """The numbers of the mutants that are recorded in a row."""
        data = ctypes.string_at(self.address + 8 + number * self.width, self.width)
        return [match.start() for match in re.finditer(rb"\x01", data)]

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.libc.shmctl(self.id, IPC_RMID, None)
        self.libc.shmdt(ctypes.c_void_p(self.address))


class Runner:
    """Runs programs of tests, each in namespaces of its own."""

    def __init__(self, work):
        self.fresh = " ".join(folder for folder in ("/tmp", "/var/tmp")
                              if not str(work).startswith(folder + "/"))
        self.user = [] if os.geteuid() == 0 else ["--user", "--map-root-user"]

    def run(self, program, number, timeout, arguments=()):
        """Returns status (None: timed out) and output."""
        command = ["unshare", *self.user, "--mount", "--pid", "--fork", "--kill-child",
                   "--mount-proc", "sh", "-c", SANDBOX, "sandbox", self.fresh]
        if number != NONE:
            command.append(f"--msgqueue={number}:")
        process = subprocess.Popen(
            [*command, "--", *program.command, *arguments], cwd=program.folder,
            stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, stderr=subprocess.STDOUT,
            start_new_session=True)
        try:
            output, _ = process.communicate(timeout=timeout)
            return process.returncode, output.decode(errors="replace")
        except subprocess.TimeoutExpired:
            process.kill()  # and with unshare all of its namespace
            output, _ = process.communicate()
            return None, output.decode(errors="replace")

    def test(self, program, tests, number, timeout):
        """Runs some tests of a program until one fails."""
        arguments = ()
        if program.is_googletest:
            names = ":".join(test.name for test in tests)
            arguments = ("--gtest_color=no", "--gtest_fail_fast", f"--gtest_filter={names}")
        status, output = self.run(program, number, timeout, arguments)
        if status == 125 and not program.is_googletest:
            raise OSError(f"no namespaces: {output}")
        if status == 0:
            return Outcome("", False, output, 0)
        return Outcome(failing_test(output) or tests[0].name, status is None, output, status or 0)


def failing_test(output):
    """The test that failed, or the one that ran when the program ended."""
    for result, name, _ in DONE_LINE.findall(output):
        if result == "FAILED":
            return name
    started = RUN_LINE.findall(output)
    return started[-1] if started else ""


def record(runner, program, slot, width):
    """Runs a program without a mutant. Returns its Reach."""
    rows = 1
    if program.is_googletest:
        _, listed = runner.run(program, NONE, 120, ("--gtest_list_tests",))
        rows += len(re.findall(r"^  \S", listed, re.M))
    with SharedTable(slot, width, rows) as table:
        start = time.monotonic()
        arguments = ("--gtest_color=no",) if program.is_googletest else ()
        status, output = runner.run(program, RECORDING + slot, 1200, arguments)
        if not program.is_googletest:
            test = Test(program.name, "")
            return Reach({test: time.monotonic() - start}, {test: table.row(0)},
                         [] if status == 0 else [test])
        return read_reach(program, output, table)


def read_reach(program, output, table):
    seconds, reached, broken = {}, {}, []
    results = {name: (result, int(ms)) for result, name, ms in DONE_LINE.findall(output)}
    everywhere = table.row(0)
    for position, name in enumerate(RUN_LINE.findall(output)):
        test = Test(program.name, name)
        result, milliseconds = results.get(name, ("FAILED", 0))
        if result == "OK":
            seconds[test] = milliseconds / 1000
            reached[test] = sorted({*table.row(position + 1), *everywhere})
        elif result == "FAILED":
            broken.append(test)
    return Reach(seconds, reached, broken)


def batches_of(tests, seconds):
    """Tests of one program, the quickest first, in batches that take longer and longer."""
    batches, batch, total = [], [], 0.0
    limits = list(BATCH_SECONDS)
    for test in sorted(tests, key=lambda test: seconds[test]):
        if batch and total + seconds[test] > limits[0]:
            batches.append(batch)
            batch, total = [], 0.0
            limits = limits[1:] or limits
        batch.append(test)
        total += seconds[test]
    return batches + [batch]


def plan(tests, seconds, folder=""):
    """The order in which tests are tried, in batches of one program each: every program's quick
    tests first, and before the others those of the folder that was changed."""
    by_program = {}
    for test in tests:
        by_program.setdefault(test.program, []).append(test)
    rounds = []
    for of_program in by_program.values():
        for turn, batch in enumerate(batches_of(of_program, seconds)):
            far = folder not in batch[0].program.split("/")
            cost = sum(seconds[test] for test in batch)
            rounds.append((turn, far, cost, batch[0].program, batch))
    return [entry[-1] for entry in sorted(rounds)]


def time_limit(tests, seconds):
    return 20 + 6 * sum(seconds[test] for test in tests)


def affordable(batches, seconds):
    """The batches that fit into MOST_SECONDS, and always the first."""
    total = 0.0
    for batch in batches:
        total += sum(seconds[test] for test in batch)
        if total <= MOST_SECONDS or batch is batches[0]:
            yield batch


def notice(runner, programs, reach, number, tests, folder=""):
    """Returns the test that notices a mutant, and how; or None.

    A failure counts only if the same test fails a second time, since some tests depend on time and
    the machine may be busy."""
    for group in affordable(plan(tests, reach.seconds, folder), reach.seconds):
        program = programs[group[0].program]
        left = list(group)
        while left:
            outcome = runner.test(program, left, number, time_limit(left, reach.seconds))
            if outcome.status == 0 and not outcome.timed_out:
                break
            failed = Test(program.name, outcome.failed)
            if failed not in reach.seconds:
                failed = left[0]
            again = runner.test(program, [failed], number, time_limit([failed], reach.seconds))
            if again.status != 0 or again.timed_out:
                return failed, "timeout" if again.timed_out else "failure"
            left = [test for test in left if test != failed]
    return None
