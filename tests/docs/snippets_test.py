#!/usr/bin/env python3
"""Tests snippets.py."""
import pathlib
import sys
import tempfile
import unittest

sys.dont_write_bytecode = True
import snippets  # pylint: disable=wrong-import-position


class Snippets(unittest.TestCase):
    def source(self, text):
        with tempfile.TemporaryDirectory() as folder:
            path = pathlib.Path(folder) / "a-guide.md"
            path.write_text(text)
            return snippets.source_of(path, "docs/a-guide.md")

    def test_makes_a_test_of_each_block(self):
        source = self.source("# A\n```cpp\nf();\n```\n\n```cpp\ng();\n```\n")
        self.assertIn('#line 3 "docs/a-guide.md"\nf();\nreturn true;', source)
        self.assertIn("TEST_F(AGuideSnippets, Line3) { run(line3Run, {}); }", source)
        self.assertIn("TEST_F(AGuideSnippets, Line7) { run(line7Run, {}); }", source)

    def test_compiles_a_marked_block_only(self):
        source = self.source("```cpp no-run\nf();\n```\n")
        self.assertIn("TEST_F(AGuideSnippets, Line2Compiles)", source)
        self.assertNotIn("run(", source)

    def test_moves_includes_to_the_top(self):
        source = self.source("```cpp\n#include <b.h>\nf();\n```\n```cpp\n#include <a.h>\n```\n")
        self.assertIn("#include <a.h>\n#include <b.h>\n", source)
        self.assertIn('#line 2 "docs/a-guide.md"\n\nf();', source)

    def test_keeps_a_program_apart(self):
        source = self.source("```cpp\nint main() {\n  return 0;\n}\n```\n")
        self.assertIn("namespace line2 {", source)
        self.assertIn("return line2::snippetMain() == 0;", source)

    def test_reads_promised_log_lines(self):
        source = self.source('```cpp\nf();\n// log: a/b:1 bad "c" name.\n```\n')
        self.assertIn('{"a/b:1 bad \\"c\\" name."}', source)

    def test_leaves_other_languages_alone(self):
        self.assertEqual(self.source("```sh\nls\n```\n    indented\n"), "")

    def test_refuses_an_unknown_mark(self):
        with self.assertRaises(SystemExit):
            self.source("```cpp norun\n```\n")

    def test_refuses_a_block_that_does_not_end(self):
        with self.assertRaises(SystemExit):
            self.source("```cpp\nf();\n")


if __name__ == "__main__":
    sys.exit(unittest.main())
