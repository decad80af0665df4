#!/usr/bin/env python3
"""Tests header_examples.py."""
import pathlib
import sys
import tempfile
import unittest

sys.dont_write_bytecode = True
import header_examples  # pylint: disable=wrong-import-position


class HeaderExamples(unittest.TestCase):
    def source(self, comment, *entries):
        text = "namespace Outer {\n" + "".join(f"/// {line}".rstrip() + "\n" for line in comment)
        used = []
        with tempfile.TemporaryDirectory() as folder:
            path = pathlib.Path(folder) / "a_part.h"
            path.write_text(text + "void f();\n} // namespace Outer\n")
            return header_examples.source_of(path, "include/a_part.h", list(entries), used)

    def test_tests_claims_as_they_stand(self):
        source = self.source(["Text.", '    f(1) == "a"   f(2) == "b  c"', "    f(3) == 4", "Text."])
        self.assertIn('assert(f(1) == "a");\nassert(f(2) == "b  c");\nassert(f(3) == 4);', source)
        self.assertIn("namespace Outer { ", source)
        self.assertIn("TEST_F(APartHeader, Line3) { run(::Outer::line3, {}); }", source)

    def test_refuses_an_example_that_nobody_reads(self):
        with self.assertRaisesRegex(SystemExit, "no test reads the example: f 1"):
            self.source(["    f  1"])

    def test_refuses_a_line_that_cannot_be_read(self):
        entry = {"at": "a_part.h: a", "line": r"(\w) is (\w)", "claim": "c({1}, {q2});"}
        self.assertIn('c(a, "b");', self.source(["    a is b"], entry))
        with self.assertRaisesRegex(SystemExit, "cannot be read: a was b"):
            self.source(["    a is b", "    a was b"], entry)
        with self.assertRaisesRegex(SystemExit, "cannot be read"):
            self.source(["    a is b or not"], entry)

    def test_tests_values_in_comments(self):
        source = self.source(["    int i = f(1);   // 2", '    f(2);    // "b", of course',
                              "    f(3);   // false: no", "    f(4);  // whatever"],
                             {"at": "a_part.h: int i"})
        self.assertIn('int i = f(1);   // 2\nassert(f(2) == "b");\nassert(f(3) == false);\n'
                      "f(4);  // whatever", source)

    def test_puts_code_in_place_of_dots(self):
        source = self.source(["    f();", "    ...and so on...", "    return g();"],
                             {"at": "a_part.h: f();", "during": ["h();"], "after": "i();"})
        self.assertIn("if (![&]() -> bool {\nf();\nh();\nreturn g();\n}()) return false;\ni();",
                      source)
        with self.assertRaisesRegex(SystemExit, "nothing stands for"):
            self.source(["    f();", "    ...and so on..."], {"at": "a_part.h: f();"})
        with self.assertRaisesRegex(SystemExit, "stands for nothing"):
            self.source(["    f();"], {"at": "a_part.h: f();", "during": ["h();"]})

    def test_refuses_words_to_replace_that_are_not_there(self):
        with self.assertRaisesRegex(SystemExit, "nothing to replace"):
            self.source(["    f();"], {"at": "a_part.h: f();", "replace": {"g": "h"}})

    def test_leaves_labels_and_their_lines_alone(self):
        source = self.source(["Returns: one", "         two", "Log: one", "     two"])
        self.assertNotIn("TEST_F", source)


if __name__ == "__main__":
    sys.exit(unittest.main())
