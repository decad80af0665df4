#!/usr/bin/env python3
"""Tests scripts/mutate: what it changes, what it leaves alone, and what it counts."""
import pathlib
import subprocess
import sys
import tempfile
import textwrap
import unittest

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
SAMPLE = pathlib.Path(__file__).with_name("sample.cpp")
sys.dont_write_bytecode = True
sys.path.insert(0, str(ROOT / "scripts"))
import mutate  # noqa: E402
import mutate_run  # noqa: E402
import mutate_source  # noqa: E402
import mutate_tree  # noqa: E402
from mutate_run import Program, Reach, Test  # noqa: E402


def changes(text, kind=None):
    found = mutate_source.mutants_of("base/a.cpp", text)
    return [mutant.change for mutant in found if kind in (None, mutant.kind)]


def in_function(statement):
    return f"void f() {{\n  {statement}\n}}\n"


class Finding(unittest.TestCase):
    def test_a_comparison_moves_its_boundary(self):
        self.assertEqual(changes(in_function("x = a < b;"), "boundary"), ["a [< -> <=] b"])

    def test_the_bracket_of_a_template_is_no_comparison(self):
        self.assertEqual(changes(in_function("x = f<int>(y);"), "boundary"), [])

    def test_operands_end_at_weaker_operators(self):
        self.assertEqual(changes(in_function("x = a && f(b, c) == d + e;"), "equality"),
                         ["f(b, c) [== -> !=] d + e"])

    def test_each_side_of_a_conjunction_is_left_out(self):
        self.assertEqual(changes(in_function("return a && b;"), "operand"),
                         ["a && b: without a", "a && b: without b"])

    def test_each_flag_of_a_row_is_left_out(self):
        self.assertEqual(changes(in_function("open(p, O_RDWR | O_NOFOLLOW | O_CLOEXEC);"), "flag"),
                         [f"O_RDWR | O_NOFOLLOW | O_CLOEXEC: without {flag}"
                          for flag in ("O_RDWR", "O_NOFOLLOW", "O_CLOEXEC")])

    def test_a_flag_without_a_bit_stays(self):
        self.assertEqual(changes(in_function("open(p, O_RDONLY | O_CLOEXEC);"), "flag"),
                         ["O_RDONLY | O_CLOEXEC: without O_CLOEXEC"])

    def test_a_call_whose_result_is_not_used_is_left_out(self):
        self.assertEqual(changes(in_function("(void)::close(fd);"), "call"),
                         ["without (void)::close(fd);"])

    def test_a_declaration_is_no_call(self):
        self.assertEqual(changes(in_function("const Guard guard(fd);"), "call"), [])
        self.assertEqual(changes(in_function("bool (*take)(int);"), "call"), [])
        self.assertEqual(changes("struct A {\n  A();\n};\n", "call"), [])

    def test_the_condition_of_a_loop_is_no_statement(self):
        self.assertEqual(changes(in_function("for (int i = a; next(i); ++i) {}"), "call"), [])

    def test_calls_that_follow_each_other_are_swapped(self):
        self.assertEqual(changes(in_function("fsync(fd);\n  fchmod(fd, mode);"), "order"),
                         ["fchmod(fd, mode); before fsync(fd);"])

    def test_the_retry_is_left_out(self):
        self.assertEqual(len(changes(in_function("n = retryOnEintr([&] { return read(); });"),
                                     "retry")), 1)

    def test_the_condition_of_an_if_is_negated_unless_an_operator_is_changed(self):
        self.assertEqual(changes(in_function("if (ready(x)) go = 5;"), "condition"),
                         ["if [!](ready(x))"])
        self.assertEqual(changes(in_function("if (a == b) go = 5;"), "condition"), [])

    def test_results_are_turned(self):
        self.assertEqual(changes(in_function("return false;"), "return"), ["false -> true"])
        self.assertEqual(changes(in_function("return -1;"), "return"), ["-1 -> 0"])

    def test_constants_move_by_one_and_modes_stay_octal(self):
        self.assertEqual(changes(in_function("mode = 0600;"), "constant"),
                         ["0600 -> 0601", "0600 -> 0577"])

    def test_what_the_compiler_must_know_stays(self):
        for text in ("constexpr int k = 3;", "constexpr int f() { return 1 < 2; }",
                     "static_assert(1 == 1, \"\");", "enum class E { A = 1 };", "#if 1 == 2\n#endif",
                     "template <int n = 3> void f();", "void f() { char a[12]; }",
                     "void f(int i) { switch (i) { case 3: break; } }"):
            self.assertEqual(changes(text), [], text)

    def test_comments_and_texts_stay(self):
        self.assertEqual(changes(in_function('x = "a < b && 1"; // a < b')), [])


class Idents(unittest.TestCase):
    def idents(self, text):
        return [mutant.ident for mutant in mutate_source.mutants_of("base/a.cpp", text)]

    def test_they_stay_when_lines_move(self):
        text = in_function("return a < b;")
        self.assertEqual(self.idents(text), self.idents("// more\n\n" + text))

    def test_they_change_with_the_line(self):
        self.assertFalse(set(self.idents(in_function("return a < b;"))) &
                         set(self.idents(in_function("return a < c;"))))

    def test_equal_lines_have_different_ones(self):
        found = self.idents(in_function("x = a < b;") * 2)
        self.assertEqual(len(found), len(set(found)))


def rendered(text):
    pairs = list(enumerate(mutate_source.mutants_of("base/a.cpp", text), 1))
    return mutate_source.render(text, "mutate.h", "base/a.cpp", pairs)


class Rendering(unittest.TestCase):
    def test_lines_stay_where_they_are(self):
        text = SAMPLE.read_text()
        lines = rendered(text).split("\n")[2:]
        self.assertEqual(len(lines), len(text.split("\n")))
        self.assertIn("isSmall(9)", lines[text.split("\n").index("  const bool right = "
                                                                 "isSmall(9) && !isSmall(10);")])

    def test_without_a_mutant_the_text_is_the_same(self):
        body = in_function("if (a && b < 3) f(c);")
        self.assertEqual(mutate_source.render(body, "mutate.h", "base/a.cpp", []).split("\n", 2)[2],
                         body)


class Built:
    """The sample with its mutants, in a folder of its own."""

    def __init__(self, folder):
        self.pairs = list(enumerate(mutate_source.mutants_of("sample.cpp", SAMPLE.read_text()), 1))
        source = folder / "sample.cpp"
        source.write_text(mutate_source.render(SAMPLE.read_text(), ROOT / "tests" / "mutate" / "mutants.h",
                                               "sample.cpp", self.pairs))
        program = folder / "sample"
        subprocess.run(["g++", "-std=c++17", "-D_GNU_SOURCE", "-o", program, source], check=True)
        self.program = Program("sample", (str(program),), str(folder), False)
        self.child = Program("child", (str(program), "child"), str(folder), False)

    def number(self, change):
        return next(number for number, mutant in self.pairs if mutant.change == change)


def can_make_namespaces():
    command = ["unshare", *mutate_run.Runner(ROOT).user, "--mount", "--pid", "--fork", "true"]
    return subprocess.run(command, check=False, capture_output=True).returncode == 0


@unittest.skipUnless(can_make_namespaces(), "skipped: no namespaces")
class Running(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        (ROOT / "build").mkdir(exist_ok=True)
        cls.folder = tempfile.TemporaryDirectory(dir=ROOT / "build")
        cls.addClassCleanup(cls.folder.cleanup)
        cls.built = Built(pathlib.Path(cls.folder.name))
        cls.runner = mutate_run.Runner(cls.folder.name)
        cls.reach = mutate_run.record(cls.runner, cls.built.program, 99990, 100)

    def noticed(self, change, program=None):
        program = program or self.built.program
        test = Test(program.name, "")
        reach = Reach({test: 0.1}, {}, [])
        return mutate_run.notice(self.runner, {program.name: program}, reach,
                                 self.built.number(change), [test])

    def test_without_a_mutant_the_sample_is_content(self):
        self.assertEqual(self.reach.broken, [])

    def test_a_wrong_limit_is_noticed(self):
        self.assertEqual(self.noticed("number [< -> <=] 10"), (Test("sample", ""), "failure"))

    def test_a_wipe_that_is_left_out_sleeps(self):
        self.assertIsNone(self.noticed("without wipe(secret);"))

    def test_a_child_without_an_environment_has_the_mutant(self):
        self.assertIsNotNone(self.noticed("number [< -> <=] 10", self.built.child))

    def test_what_a_run_reaches_is_recorded_and_nothing_else(self):
        reached = self.reach.reached[Test("sample", "")]
        self.assertIn(self.built.number("without wipe(secret);"), reached)
        self.assertNotIn(self.built.number("without ::execve(argv[0], arguments, environment);"),
                         reached)

    def test_a_mutant_cannot_write_to_the_disk(self):
        program = Program("touch", ("touch", str(pathlib.Path(self.folder.name) / "x")), "/", False)
        self.assertNotIn(self.runner.run(program, 0, 10)[0], (0, 125))

    def test_a_mutant_cannot_write_to_another_disk(self):
        disk = pathlib.Path(self.folder.name) / "another disk"
        disk.mkdir()
        code = """if True:
            import pathlib, sys
            from mutate_run import Program, Runner
            touch = Program("touch", ("touch", sys.argv[1] + "/x"), "/", False)
            status = Runner(sys.argv[1]).run(touch, 0, 10)[0]
            sys.exit(status in (0, 125) or pathlib.Path(sys.argv[1], "x").exists())
            """
        command = ["unshare", *self.runner.user, "--mount", "sh", "-c",
                   'mount -t tmpfs tmpfs "$0" && exec "$@"', str(disk),
                   sys.executable, "-B", "-c", code, str(disk)]
        subprocess.run(command, check=True, cwd=ROOT / "scripts")

    def test_a_program_that_does_not_end_is_ended(self):
        self.assertIsNone(self.runner.run(Program("sleep", ("sleep", "60"), "/", False), 0, 0.5)[0])


class Once:
    """A runner whose test fails the first time only."""

    def __init__(self):
        self.runs = 0

    def test(self, _program, tests, _number, _timeout):
        self.runs += 1
        return mutate_run.Outcome(tests[0].name, False, "", 1 if self.runs == 1 else 0)


class Deciding(unittest.TestCase):
    def test_a_failure_that_does_not_repeat_is_not_counted(self):
        test = Test("p", "A.b")
        program = Program("p", ("p",), "/", True)
        self.assertIsNone(mutate_run.notice(Once(), {"p": program}, Reach({test: 0.1}, {}, []), 7,
                                            [test]))

    def test_quick_programs_are_tried_first(self):
        seconds = {Test("slow", "A.a"): 3.0, Test("quick", "A.a"): 0.1, Test("slow", "A.b"): 9.0}
        self.assertEqual(mutate_run.plan(list(seconds), seconds),
                         [[Test("quick", "A.a")], [Test("slow", "A.a")], [Test("slow", "A.b")]])

    def test_the_tests_of_the_changed_folder_come_first(self):
        seconds = {Test("tests/proc/p", "A.a"): 0.1, Test("tests/path/q", "A.a"): 0.2}
        self.assertEqual(mutate_run.plan(list(seconds), seconds, "path")[0],
                         [Test("tests/path/q", "A.a")])

    def test_what_takes_too_long_is_not_tried(self):
        seconds = {Test("p", "A.a"): 1.0, Test("q", "A.a"): 70.0}
        batches = mutate_run.plan(list(seconds), seconds)
        self.assertEqual(list(mutate_run.affordable(batches, seconds)), [[Test("p", "A.a")]])

    def test_the_test_that_ran_last_failed_when_a_program_ends_early(self):
        self.assertEqual(mutate_run.failing_test(textwrap.dedent("""\
            [ RUN      ] A.first
            [       OK ] A.first (1 ms)
            [ RUN      ] A.second
            """)), "A.second")

    def test_a_broken_test_is_not_used(self):
        class NoTable:
            def row(self, _number):
                return []
        output = "[ RUN      ] A.a\n[  FAILED  ] A.a (1 ms)\n"
        program = Program("p", ("p",), "/", True)
        reach = mutate_run.read_reach(program, output, NoTable())
        self.assertEqual((reach.broken, reach.seconds), ([Test("p", "A.a")], {}))


def some_mutants(count, folder="base"):
    text = "".join(in_function(f"x{i} = a < b;") for i in range(count))
    return mutate_source.mutants_of(f"{folder}/a.cpp", text)


class Choosing(unittest.TestCase):
    def setUp(self):
        several = some_mutants(300) + some_mutants(40, "network")
        self.mutants = dict(enumerate(several, 1))

    def test_the_same_seed_chooses_the_same(self):
        self.assertEqual(mutate.choose(self.mutants, 100, "1"), mutate.choose(self.mutants, 100, "1"))
        self.assertNotEqual(mutate.choose(self.mutants, 100, "1"),
                            mutate.choose(self.mutants, 100, "2"))

    def test_a_small_folder_has_its_share(self):
        chosen = mutate.choose(self.mutants, 100, "1").values()
        self.assertEqual(sum(m.path.startswith("network/") for m in chosen), 30)


class Counting(unittest.TestCase):
    def setUp(self):
        self.chosen = dict(enumerate(some_mutants(40), 1))
        self.state = mutate.State(pathlib.Path("/nonexistent"), True)
        self.state.found = {mutant.ident: "failure: p A.a" for mutant in self.chosen.values()}

    def failures(self, sleeping, reason=None):
        explained = {}
        for mutant in list(self.chosen.values())[:sleeping]:
            self.state.found[mutant.ident] = ""
            if reason:
                explained[mutant.ident] = {"reason": reason, "why": "w"}
        return list(mutate.failures_of(*mutate.table_of(self.chosen, self.state, explained)))

    def test_nothing_is_wrong_when_all_are_noticed(self):
        self.assertEqual(self.failures(0), [])

    def test_one_that_sleeps_unexplained_fails(self):
        self.assertEqual(len(self.failures(1)), 1)

    def test_equivalent_ones_do_not_count(self):
        self.assertEqual(self.failures(5, "equivalent"), [])

    def test_explained_ones_count_as_not_noticed(self):
        self.assertIn("noticed 87.5 %", self.failures(5, "contract")[0])

    def test_the_list_must_not_outlive_its_mutants(self):
        self.assertEqual(len(list(mutate.survivor_errors(
            {"0123456789": {"reason": "equivalent", "why": "w"}}, set()))), 1)

    def test_the_list_must_say_why(self):
        ident = self.chosen[1].ident
        self.assertEqual(len(list(mutate.survivor_errors({ident: {"reason": "equivalent"}},
                                                         {ident}))), 1)

    def test_the_list_may_explain_mutants_that_are_not_tried(self):
        path = "tests/mutate/sample.cpp"
        known = mutate.idents_in({path, "tests/mutate/removed.cpp"})
        found = mutate_source.mutants_of(path, SAMPLE.read_text())
        self.assertEqual(known, {mutant.ident for mutant in found})


class Recording(unittest.TestCase):
    def setUp(self):
        self.folder = tempfile.TemporaryDirectory()
        self.addCleanup(self.folder.cleanup)
        self.path = pathlib.Path(self.folder.name) / "reach.json"
        self.program = Program("p", ("p",), "/", True)
        self.reach = Reach({Test("p", "A.a"): 0.5}, {Test("p", "A.a"): [7]}, [Test("p", "A.b")])

    def test_it_is_kept_for_the_next_run(self):
        mutate.Recordings(self.path, lambda _: 1).add(self.program, self.reach)
        self.assertEqual(mutate.Recordings(self.path, lambda _: 1).get(self.program), self.reach)

    def test_it_ends_with_the_build(self):
        mutate.Recordings(self.path, lambda _: 1).add(self.program, self.reach)
        self.assertIsNone(mutate.Recordings(self.path, lambda _: 2).get(self.program))


class Building(unittest.TestCase):
    def test_headers_and_tests_are_left_alone(self):
        self.assertFalse(mutate_tree.is_mutated("include/kovabackup/session.h"))
        self.assertFalse(mutate_tree.is_mutated("tests/base/log_test.cpp"))
        self.assertTrue(mutate_tree.is_mutated("base/log_line.cpp"))

    def test_every_folder_has_a_source(self):
        names = [f"base/{i}.cpp" for i in range(30)] + ["network/a.cpp"]
        chosen = mutate_tree.choose_sources(names, 10, "1")
        self.assertEqual(len(chosen), 11)
        self.assertIn("network/a.cpp", chosen)

    def test_programs_of_units_are_built(self):
        listed = ("tests/base/log_test: CXX_EXECUTABLE_LINKER__log_test_Debug\n"
                  "tests/docs/docs_headers_test: CXX_EXECUTABLE_LINKER__docs_headers_test_Debug\n"
                  "tests/proc/kova_process_helper: CXX_EXECUTABLE_LINKER__x_Debug\n")
        self.assertEqual(mutate_tree.programs_of(listed), ["tests/base/log_test"])


if __name__ == "__main__":
    unittest.main()
