#!/usr/bin/env python3
"""The check of the include direction notices what it must notice."""
import pathlib
import sys
import unittest

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
sys.dont_write_bytecode = True
sys.path.insert(0, str(ROOT / "scripts"))
import layers  # noqa: E402

LIST = """
# a comment
base     | base             |                       | floor
platform | platform/include |                       | interface
platform | platform/core    | base kovaplatform     | stand-in
module   | path/filter      |                       | filter
module   | path             | base kovaplatform     | paths
module   | session          | path base             | sessions
service  | service          | base kovabackup       | second library
user     | tools            | service base kovabackup | command
user     | tests            | *                     | tests
"""
# A tree that follows the rules; each test adds a file to it.
TREE = {
    "base/trim.h": "",
    "platform/include/kovaplatform/kovacore.h": "",
    "platform/core/fail.h": '#include "base/trim.h"\n#include "kovaplatform/kovacore.h"\n',
    "path/filter/path_filter.cpp": '#include "kovabackup/path_filter.h"\n#include <string>\n',
    "path/path_util.cpp": '#include "base/trim.h"\n#include "path/tree.h"\n',
    "session/session.cpp": '#include "kovabackup/path_util.h"\n#include "kovabackup/session.h"\n',
    "include/kovabackup/path_filter.h": "",
    "include/kovabackup/path_util.h": "",
    "include/kovabackup/session.h": '#include "kovabackup/path_util.h"\n',
    "include/kovabackup/service/walk.h": '#include "kovabackup/path_filter.h"\n',
    "service/walk.cpp": '#include "kovabackup/service/walk.h"\n#include "base/trim.h"\n',
    "tools/kovabackup/walk.cpp": '#include "kovabackup/service/walk.h"\n',
    "tools/kovabackup/main.cpp": '#include "kovabackup/session.h"\n#include "tools/kovabackup/x.h"\n',
    "tests/path/path_test.cpp": '#include "session/session_private.h"\n',
}


class Layers(unittest.TestCase):
    def setUp(self):
        self.layers = layers.parse(LIST)

    def check(self, name=None, text=""):
        return layers.violations({**TREE, **({name: text} if name else {})}, self.layers)

    def assert_refused(self, name, text, *words):
        found = self.check(name, text)
        self.assertEqual(len(found), 1, found)
        for word in (name, *words):
            self.assertIn(word, found[0])

    def test_a_tree_that_keeps_the_rules_passes(self):
        self.assertEqual(self.check(), [])

    def test_a_module_may_not_include_one_above_it(self):
        self.assert_refused("path/up.cpp", '\n#include "session/session_private.h"\n',
                            ":2: path may not include session/session_private.h")

    def test_a_module_may_not_include_the_public_header_of_one_above_it(self):
        self.assert_refused("path/up.cpp", '#include "kovabackup/session.h"\n', "kovabackup/session.h")

    def test_a_public_header_obeys_the_rules_of_its_module(self):
        self.assert_refused("include/kovabackup/path_util.h", '#include "kovabackup/session.h"\n',
                            "path may not include")

    def test_a_public_header_may_not_include_what_its_module_may(self):
        self.assert_refused("include/kovabackup/path_util.h", '#include "base/trim.h"\n')

    def test_a_folder_within_a_module_has_rules_of_its_own(self):
        self.assert_refused("path/filter/up.cpp", '#include "path/tree.h"\n', "path/filter may not")

    def test_a_stand_in_may_not_include_a_module(self):
        self.assert_refused("platform/core/up.cpp", '#include "path/tree.h"\n')

    def test_a_stand_in_may_not_include_a_public_header(self):
        self.assert_refused("platform/core/up.cpp", '#include "kovabackup/session.h"\n')

    def test_the_platforms_interface_may_not_include_the_floor(self):
        self.assert_refused("platform/include/kovaplatform/k.h", '#include "base/trim.h"\n')

    def test_the_floor_may_not_include_the_platforms_interface(self):
        self.assert_refused("base/up.h", "#  include <kovaplatform/kovacore.h>\n")

    def test_a_user_may_not_include_the_inside_of_a_module(self):
        self.assert_refused("tools/kovabackup/in.cpp", '#include "path/tree.h"\n')

    def test_a_module_may_not_include_the_second_library(self):
        self.assert_refused("path/up.cpp", '#include "kovabackup/service/walk.h"\n',
                            "path may not include")

    def test_the_second_library_may_not_include_the_inside_of_a_module(self):
        self.assert_refused("service/in.cpp", '#include "path/tree.h"\n', "service may not")

    def test_a_folder_that_the_list_does_not_name_is_refused(self):
        self.assert_refused("attic/walk.cpp", "", "names no folder")

    def test_a_public_header_without_a_module_is_refused(self):
        self.assert_refused("include/kovabackup/lost.h", "", "names no folder")

    def test_a_public_header_that_needs_no_source_obeys_the_rules_of_its_module(self):
        self.layers = layers.parse(LIST + "module | common | base | log lines\n")
        name = "include/kovabackup/nodiscard.h"
        shared = {"common/log.cpp": "", name: ""}
        self.assertEqual(layers.violations({**TREE, **shared}, self.layers), [])
        up = {**TREE, **shared, name: '#include "kovabackup/session.h"\n'}
        self.assertEqual(layers.violations(up, self.layers),
                         [f"{name}:1: common may not include kovabackup/session.h"])

    def test_a_listed_folder_without_sources_is_refused(self):
        self.layers = layers.parse(LIST + "module | gone | base | nothing\n")
        self.assertEqual(self.check(), ["layers.txt: gone has no sources"])

    def test_the_list_may_not_name_a_folder_twice_or_one_that_it_does_not_know(self):
        for row in ("module | path | base | again\n", "module | new | basement | misspelled\n"):
            with self.subTest(row=row), self.assertRaises(ValueError):
                layers.parse(LIST + row)


if __name__ == "__main__":
    sys.exit(unittest.main())
