#!/usr/bin/env python3
"""Tests what scripts/docs requires and replaces. The site itself is made by site_test.py."""
import os
import pathlib
import subprocess
import sys
import tempfile
import unittest

SCRIPT = pathlib.Path(__file__).resolve().parent.parent.parent / "scripts" / "docs"
PROGRAMS = ("doxygen", "sphinx-build", "scdoc", "mandoc")
MODULES = ("furo", "breathe", "myst_parser")
DOXYGEN_STATUS = 33


class Docs(unittest.TestCase):
    """With stand-ins for all tools, of which the first one that runs, doxygen, fails."""

    def setUp(self):
        holder = tempfile.TemporaryDirectory()
        self.addCleanup(holder.cleanup)
        self.root = pathlib.Path(holder.name)
        self.folder = self.root / "folder"
        for name in PROGRAMS:
            self.write(f"bin/{name}", f"#!{sys.executable}\nexit({DOXYGEN_STATUS})\n").chmod(0o755)
        for name in MODULES:
            self.write(f"modules/{name}.py", "")

    def write(self, name, text):
        path = self.root / name
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_text(text)
        return path

    def run_docs(self, *arguments):
        environment = {**os.environ, "PATH": f"{self.root}/bin:{os.environ['PATH']}",
                       "PYTHONPATH": f"{self.root}/modules", "PYTHONDONTWRITEBYTECODE": "1"}
        return subprocess.run([SCRIPT, *(arguments or [self.folder])], env=environment,
                              capture_output=True, text=True, check=False)

    def test_a_missing_module_is_named(self):
        for name in MODULES:
            with self.subTest(module=name):
                module = self.write(f"modules/{name}.py", "raise ImportError\n")
                result = self.run_docs()
                self.assertEqual(result.returncode, 1)
                self.assertIn(f"docs: needs Python's {name} (apt-get install ", result.stderr)
                self.assertFalse(self.folder.exists())
                module.write_text("")

    def test_what_is_missing_can_be_asked(self):
        self.assertEqual(self.run_docs("--missing").stdout, "\n")
        self.write("modules/furo.py", "raise ImportError\n")
        self.write("modules/breathe.py", "raise ImportError\n")
        result = self.run_docs("--missing")
        self.assertEqual(result.stdout, "Python's furo, Python's breathe\n")
        self.assertEqual(result.returncode, 0)

    def test_pages_of_others_are_left_alone(self):
        page = self.write("folder/html/index.html", "mine")
        result = self.run_docs()
        self.assertEqual(result.returncode, 1)
        self.assertIn(f"{self.folder}/html was not made by scripts/docs", result.stderr)
        self.assertEqual(page.read_text(), "mine")

    def test_other_folders_are_left_alone(self):
        names = ("doctrees", "source", "xml")
        files = [self.write(f"folder/{name}/file", "mine") for name in names]
        self.assertEqual(self.run_docs().returncode, DOXYGEN_STATUS)
        for file in files:
            self.assertEqual(file.read_text(), "mine")

    def test_pages_of_an_earlier_run_are_replaced(self):
        self.assertEqual(self.run_docs().returncode, DOXYGEN_STATUS)
        stale = self.write("folder/html/stale.html", "")
        self.assertEqual(self.run_docs().returncode, DOXYGEN_STATUS)
        self.assertFalse(stale.exists())

    def test_an_empty_folder_is_replaced(self):
        (self.folder / "html").mkdir(parents=True)
        self.assertEqual(self.run_docs().returncode, DOXYGEN_STATUS)


if __name__ == "__main__":
    unittest.main()
