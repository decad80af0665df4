#!/usr/bin/env python3
"""Tests scripts/symbols.py, which writes the lists of symbols of the Debian packages."""
import pathlib
import re
import sys
import unittest

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
sys.dont_write_bytecode = True
sys.path.insert(0, str(ROOT / "scripts"))
import symbols  # noqa: E402


class Symbols(unittest.TestCase):
    def matches(self, name, other):
        """Whether the entry of a name on x86-64 matches what the name is on another processor."""
        kind, pattern = re.fullmatch(r' \((.*)\)"(.*)"', symbols.entry(name)).groups()
        self.assertEqual(kind, "c++|regex")
        self.assertTrue(re.search(pattern, name + "@Base"), "the name itself")
        return bool(re.search(pattern, other + "@Base"))

    def test_a_name_is_itself(self):
        for name in ("N::f(int, long long&)", "N::f(unsigned long long)", "vtable for N::Long",
                     "N::along(char const*) const", "N::~C()"):
            self.assertEqual(symbols.entry(name), f' (c++)"{name}@Base"')

    def test_sizes_differ_between_processors(self):
        for other in ("unsigned int", "unsigned long", "unsigned long long"):
            self.assertTrue(self.matches("N::f(unsigned long, int)", f"N::f({other}, int)"))
        self.assertTrue(self.matches("N::f(D<long, R<1l, 1000l> >)",
                                     "N::f(D<long long, R<1ll, 1000ll> >)"))
        self.assertTrue(self.matches("N::v[abi:cxx11](__va_list_tag*)", "N::v[abi:cxx11](char*)"))

    def test_no_other_function_matches(self):
        for other in ("N::f(int)", "N::f(unsigned char)", "M::N::f(long)", "N::f(long) const",
                      "Nxxf(long)"):
            self.assertFalse(self.matches("N::f(long)", other), other)

    def test_a_listed_symbol_keeps_its_version(self):
        text = 'lib.so.1 lib1 #MINVER#\n# comment\n (c++)"N::a()@Base" 1.0~\n (c++)"N::b()@Base" 1.0~\n'
        self.assertEqual(symbols.updated(text, ["N::a()", "N::c()"], "1.1~"),
                         'lib.so.1 lib1 #MINVER#\n# comment\n'
                         ' (c++)"N::a()@Base" 1.0~\n (c++)"N::c()@Base" 1.1~\n')


if __name__ == "__main__":
    sys.exit(unittest.main())
