#!/usr/bin/env python3
"""The word list finds what it must, where it must, and nothing else."""
import pathlib
import sys
import unittest

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
sys.dont_write_bytecode = True
sys.path.insert(0, str(ROOT / "scripts"))
import words  # noqa: E402


def found(name, text):
    return [(line, " ".join(match.split())) for line, match, _ in words.hits_in(name, text)]


class Words(unittest.TestCase):
    def test_each_rule_finds_its_words(self):
        for text in ("this is no file", "they are no files", "it stands here", "the table stood there",
                     "the log tells why", "as he was told", "the option wants a value", "the whole file",
                     "whoever calls", "nobody waits", "somebody else", "no memory is left",
                     "made anew", "the judge agrees", "blanks at the end", "gives up the descriptor"):
            with self.subTest(text=text):
                self.assertEqual(len(found("README.md", text)), 1, found("README.md", text))

    def test_right_uses_pass(self):
        for text in ("there is no file", "it is no longer here", "there are no such files",
                     "a stand-in", "%m stands for errno", "a whole number", "the file as a whole",
                     "the user nobody", "tell the two apart", "a blank line"):
            with self.subTest(text=text):
                self.assertEqual(found("README.md", text), [])

    def test_a_phrase_is_found_across_a_line_end_and_the_mark_of_a_comment(self):
        self.assertEqual(found("a.cpp", "int a;\n// this is\n//   no file\n"), [(2, "is no")])
        self.assertEqual(found("a.sh", "# this is\n# no file\n"), [(1, "is no")])

    def test_code_and_literals_of_the_library_are_not_read(self):
        self.assertEqual(found("path/a.cpp", 'log("is no file"); int stands = whole;\n'), [])
        self.assertEqual(found("path/a.cpp", 'char c = \'"\'; // it stands\n'), [(1, "stands")])

    def test_literals_of_the_command_and_the_examples_are_read(self):
        for name in ("tools/a.cpp", "examples/a.cpp"):
            with self.subTest(name=name):
                self.assertEqual(found(name, 'say("is no file");\n'), [(1, "is no")])

    def test_texts_of_log_lines_are_not_read(self):
        self.assertEqual(found("docs/messages.toml", 'text = "is no file"\nmeaning = "is no file"\n'),
                         [(2, "is no")])


if __name__ == "__main__":
    sys.exit(unittest.main())
