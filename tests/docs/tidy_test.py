#!/usr/bin/env python3
"""Tests scripts/tidy.py: what it remembers never hides a finding."""
import json
import os
import pathlib
import shutil
import subprocess
import sys
import tempfile
import unittest

SCRIPT = pathlib.Path(__file__).resolve().parent.parent.parent / "scripts" / "tidy.py"
CONFIGURATION = "Checks: '-*,modernize-use-nullptr'\nWarningsAsErrors: '*'\nHeaderFilterRegex: '.*'\n"
CLEAN = '#include "part.h"\nint *made() {\n  return nullptr;\n}\n'
DIRTY = CLEAN.replace("nullptr", "0")


class Tidy(unittest.TestCase):
    def setUp(self):
        holder = tempfile.TemporaryDirectory()
        self.addCleanup(holder.cleanup)
        self.root = pathlib.Path(holder.name).resolve()
        # In the place of clang-tidy: notes the call and passes it on.
        self.write("bin/clang-tidy",
                   f'#!/bin/sh\necho x >>{self.root}/calls\nexec {shutil.which("clang-tidy")} "$@"\n')
        (self.root / "bin/clang-tidy").chmod(0o755)
        self.write(".clang-tidy", CONFIGURATION)
        self.write("late/part.h", "int *made();\n")
        self.write("source.cpp", CLEAN)
        self.compile_with("-Iearly", "-Ilate")
        self.assertEqual(self.run_tidy(), (True, 1))
        self.assertEqual(self.run_tidy(), (True, 0), "a clean source is remembered")

    def write(self, name, text):
        path = self.root / name
        path.parent.mkdir(exist_ok=True)
        path.write_text(text)

    def compile_with(self, *options):
        command = ["ccache", "/usr/bin/c++", *options, "-o", "source.o", "-c", "source.cpp"]
        self.write("compile_commands.json", json.dumps(
            [{"directory": str(self.root), "file": "source.cpp", "command": " ".join(command)}]))

    def run_tidy(self, source="source.cpp"):
        """Whether the source passes, and how often clang-tidy ran."""
        calls = self.root / "calls"
        calls.write_text("")
        path = f"{self.root}/bin:{os.environ['PATH']}"
        run = subprocess.run([SCRIPT, self.root, self.root / source], capture_output=True, text=True,
                             env={**os.environ, "PATH": path}, check=False)
        passed = run.returncode == 0
        self.assertEqual(passed, "error:" not in run.stdout, run.stdout + run.stderr)
        return passed, len(calls.read_text().splitlines())

    def assert_found(self):
        """A finding is reported, and not only the first time."""
        self.assertEqual(self.run_tidy(), (False, 1))
        self.assertEqual(self.run_tidy(), (False, 1))

    def test_source_changes(self):
        self.write("source.cpp", DIRTY)
        self.assert_found()
        self.write("source.cpp", CLEAN)
        self.assertEqual(self.run_tidy(), (True, 0), "the same source as before")

    def test_header_changes(self):
        self.write("late/part.h", "int *made();\ninline int *part() { return 0; }\n")
        self.assert_found()

    def test_another_header_comes_first(self):
        self.write("early/part.h", "int *made();\ninline int *part() { return 0; }\n")
        self.assert_found()

    def test_a_comment_no_longer_permits_it(self):
        self.write("source.cpp", DIRTY.replace("0;", "0; // NOLINT"))
        self.assertEqual(self.run_tidy(), (True, 1))
        self.assertEqual(self.run_tidy(), (True, 0))
        self.write("source.cpp", DIRTY.replace("0;", "0; // not lint"))
        self.assert_found()

    def test_command_changes(self):
        self.write("source.cpp", CLEAN + "#ifdef MORE\nint *more() { return 0; }\n#endif\n")
        self.assertEqual(self.run_tidy(), (True, 1))
        self.compile_with("-Iearly", "-Ilate", "-DMORE")
        self.assert_found()

    def test_configuration_changes(self):
        self.write(".clang-tidy", CONFIGURATION.replace("nullptr", "nullptr,modernize-use-trailing-return-type"))
        self.assert_found()

    def test_configuration_of_a_header_appears(self):
        self.write("late/.clang-tidy", CONFIGURATION)
        self.assertEqual(self.run_tidy(), (True, 1))

    def test_tool_changes(self):
        with open(self.root / "bin/clang-tidy", "a", encoding="utf-8") as tool:
            tool.write("# another version\n")
        self.assertEqual(self.run_tidy(), (True, 1))

    def test_every_command_counts(self):
        self.write("source.cpp", CLEAN + "#ifdef MORE\nint *more() { return 0; }\n#endif\n")
        database = json.loads((self.root / "compile_commands.json").read_text())
        self.write("compile_commands.json", json.dumps(database * 2))
        self.assertEqual(self.run_tidy(), (True, 1))
        self.assertEqual(self.run_tidy(), (True, 0))
        database += json.loads(json.dumps(database).replace("-Ilate", "-Ilate -DMORE"))
        self.write("compile_commands.json", json.dumps(database))
        self.assert_found()

    def test_a_source_that_is_not_compiled_is_always_checked(self):
        self.write("other.cpp", "int *other() { return nullptr; }\n")
        self.assertEqual(self.run_tidy("other.cpp"), (True, 1))
        self.assertEqual(self.run_tidy("other.cpp"), (True, 1))

    def test_a_source_that_does_not_compile_fails(self):
        self.write("source.cpp", '#include "none.h"\n')
        self.assert_found()


if __name__ == "__main__":
    if not shutil.which("clang-tidy") or not shutil.which("clang++"):
        print("skipped: needs clang-tidy and clang++")
        sys.exit(77)
    sys.exit(unittest.main())
