#!/usr/bin/env python3
"""Tests on small projects that scripts/messages finds every log line and every difference."""
import pathlib
import shutil
import subprocess
import sys
import tempfile
import unittest

PROJECT = pathlib.Path(__file__).resolve().parent.parent.parent

SOURCES = r"""
constexpr char kModule[] = "path/thing";  // "path/not_this"
struct Report { int number; const char *word; };
constexpr Report kOne = {3, ""};
constexpr Report kTwo = {4, " again"};
bool warn(int number, const char *what) { // Log::error(kModule, 99, "commented out")
  Log::error(kModule, number, "%s failed: %m", what);
  return false;
}
bool both(const char *path, int number) {
  Log::bare(LOG_DEBUG, kModule, 1, "plain \"%s\", %m", path);
  return warn(number, "second");
}
void f(const Report &report, const char *path) {
  if (!warn(2, "first") || !both(path, 5)) {
    Log::debug(kModule, report.number, "tried%s %d "
                                       "times", report.word, 7);
  }
}
"""

ENTRIES = {
    1: ('plain \\"%s\\", %m', 'priority = "LOG_DEBUG"\nplain = true\n'),
    2: ("first failed: %m", ""),
    3: ("tried %d times", 'priority = "LOG_DEBUG"\n'),
    4: ("tried again %d times", 'priority = "LOG_DEBUG"\n'),
    5: ("second failed: %m", ""),
}


STAND_IN = r"""
ConfigError systemError(const char *what) {
  return {KOVA_CONF_ERR_OPEN, 0, std::string(what) + ": " + std::strerror(errno)};
}
bool read(Error &error) {
  error = systemError("cannot be read");
  return fail(KOVA_CONF_ERR_KEY, line_, "unknown key '" + std::string(key) + "'");
}
void report() {
  KLIBCErrSetEx(KOVA_CONF_ERR_NO_MEMORY, "config.cpp", __LINE__);
  ::syslog(LOG_ERR, "kovaplatform: %s:%d: %s", path, error.line, error.what.c_str());
  ::syslog(LOG_ERR, "kovaplatform: %s: %s", path, error.what.c_str());
  ::syslog(LOG_WARNING, "kovaplatform: odd");
}
"""

STAND_IN_ENTRIES = {
    "read": ("kovaplatform: %s: cannot be read: %m", ""),
    "unknown-key": ("kovaplatform: %s:%d: unknown key '%s'", ""),
    "odd": ("kovaplatform: odd", 'priority = "LOG_WARNING"\n'),
}


class Messages(unittest.TestCase):
    def setUp(self):
        self.root = pathlib.Path(tempfile.mkdtemp())
        self.addCleanup(shutil.rmtree, self.root)
        for folder in ("docs", "path", "platform/include/kovaplatform"):
            (self.root / folder).mkdir(parents=True)
        for header in ("kovacore.h", "kovasdk.h", "kovanetsdk.h"):
            shutil.copy(PROJECT / "platform/include/kovaplatform" / header,
                        self.root / "platform/include/kovaplatform")
        self.write(SOURCES, ENTRIES)

    def write(self, sources, entries, head=""):
        (self.root / "path/thing.cpp").write_text(sources)
        text = head + '[modules]\n"path/thing" = "things"\n'
        for number, (line, more) in entries.items():
            text += f'["path/thing".{number}]\ntext = "{line}"\n{more}'
            text += 'from = "f"\nmeaning = "m"\naction = "a"\n'
        (self.root / "docs/messages.toml").write_text(text)

    def run_script(self, *arguments):
        return subprocess.run([PROJECT / "scripts/messages", "--root", self.root, *arguments],
                              capture_output=True, text=True, check=False)

    def assert_refused(self, words):
        result = self.run_script()
        self.assertNotEqual(result.returncode, 0, result.stdout)
        self.assertIn(words, result.stderr)

    def test_follows_parameters_and_records(self):
        result = self.run_script()
        self.assertEqual(result.returncode, 0, result.stderr)
        self.assertEqual(result.stdout, "5 log lines in the sources, 5 explained\n")
        page = (self.root / "docs/messages.md").read_text()
        self.assertIn('### path/thing:1\n\n    plain "%s", %m\n\nLOG_DEBUG, plain.', page)
        self.assertIn("### path/thing:4\n\n    tried again %d times\n\nLOG_DEBUG.", page)
        self.assertIn("| 0xF309 | it is in place, but may not outlast a power cut |", page)

    def test_check_passes_on_what_was_written_only(self):
        self.run_script()
        self.assertEqual(self.run_script("--check").returncode, 0)
        with (self.root / "docs/messages.md").open("a") as page:
            page.write("more\n")
        result = self.run_script("--check")
        self.assertNotEqual(result.returncode, 0)
        self.assertIn("out of date", result.stderr)

    def test_refuses_a_line_that_is_not_explained(self):
        self.write(SOURCES, {n: e for n, e in ENTRIES.items() if n != 5})
        self.assert_refused("path/thing:5")

    def test_refuses_an_explained_line_that_is_not_in_the_sources(self):
        self.write(SOURCES, {**ENTRIES, 6: ("gone", "")})
        self.assert_refused("path/thing:6: in docs/messages.toml, but not in the sources")

    def test_lets_an_announced_module_be_absent(self):
        self.write("", {6: ("to come", "")}, 'announced = ["path/thing"]\n')
        self.assertEqual(self.run_script().returncode, 0)

    def test_refuses_a_text_that_differs(self):
        self.write(SOURCES, {**ENTRIES, 2: ("first failed", "")})
        self.assert_refused("path/thing:2: docs/messages.toml has")

    def test_refuses_a_priority_that_differs(self):
        self.write(SOURCES, {**ENTRIES, 3: (ENTRIES[3][0], "")})
        self.assert_refused("path/thing:3: docs/messages.toml has")

    def test_refuses_one_number_for_two_texts(self):
        self.write(SOURCES.replace('warn(2, "first")', 'warn(5, "first")'), ENTRIES)
        self.assert_refused("path/thing:5: docs/messages.toml has")

    def test_refuses_a_number_that_it_cannot_follow(self):
        self.write(SOURCES.replace("warn(number, ", "warn(number + 1, "), ENTRIES)
        self.assert_refused("cannot be followed")

    def test_refuses_a_line_that_is_written_in_another_way(self):
        self.write(SOURCES + 'void g() { ::syslog(3, "past all rules"); }', ENTRIES)
        self.assert_refused("writes past base/log_line.h")

    def write_stand_in(self, entries):
        (self.root / "platform/config").mkdir(exist_ok=True)
        (self.root / "platform/config/config.cpp").write_text(STAND_IN)
        self.write(SOURCES, ENTRIES)
        path = self.root / "docs/messages.toml"
        text = path.read_text().replace("[modules]\n", '[modules]\nkovaplatform = "settings"\n')
        for name, (line, more) in entries.items():
            text += f'[kovaplatform.{name}]\nplain = true\ntext = "{line}"\n{more}'
            text += 'from = "f"\nmeaning = "m"\naction = "a"\n'
        path.write_text(text)

    def test_explains_the_lines_of_stand_ins(self):
        self.write_stand_in(STAND_IN_ENTRIES)
        result = self.run_script()
        self.assertEqual(result.returncode, 0, result.stderr)
        self.assertEqual(result.stdout, "8 log lines in the sources, 8 explained\n")
        page = (self.root / "docs/messages.md").read_text()
        self.assertIn("### kovaplatform:read\n\n    kovaplatform: %s: cannot be read: %m\n", page)

    def test_refuses_a_line_of_a_stand_in_that_is_not_explained(self):
        self.write_stand_in({n: e for n, e in STAND_IN_ENTRIES.items() if n != "read"})
        self.assert_refused("cannot be read: %m'): in the sources, but not in docs/messages.toml")

    def test_refuses_an_explained_line_that_no_stand_in_writes(self):
        self.write_stand_in({**STAND_IN_ENTRIES, "gone": ("kovaplatform: gone", "")})
        self.assert_refused("kovaplatform:gone: in docs/messages.toml, but not in the sources")

    def test_refuses_a_priority_of_a_stand_in_that_differs(self):
        self.write_stand_in({**STAND_IN_ENTRIES, "odd": ("kovaplatform: odd", "")})
        self.assert_refused("kovaplatform:odd: in docs/messages.toml, but not in the sources")

    def test_refuses_an_entry_without_advice(self):
        path = self.root / "docs/messages.toml"
        path.write_text(path.read_text().replace('action = "a"\n', "", 1))
        self.assert_refused("missing ['action']")


if __name__ == "__main__":
    sys.exit(unittest.main())
