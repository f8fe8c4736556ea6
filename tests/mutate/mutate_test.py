"""What the script that changes the rooms promises of itself: that it changes what it means to and nothing else, and that it tells a killed
mutant from one that survives."""

import pathlib
import sys
import tempfile
import unittest

HERE = pathlib.Path(__file__).resolve().parent
sys.path += [str(HERE), str(HERE.parent / "check")]

import copy_tree  # noqa: E402
import coverage  # noqa: E402
import mutate  # noqa: E402
import mutations  # noqa: E402
import suites  # noqa: E402
from cpp_source import Source  # noqa: E402

NAMES = mutations.Names(["enum class Kind { one, two };\ninline constexpr int kFirst = 1;\ninline constexpr int kSecond = 2;\n"])


def changes(text, kind=None):
    """The texts that the mutants of a text come to."""
    found = mutations.mutants_of("room/file.cpp", text, NAMES)
    return [mutant.applied_to(text) for mutant in found if kind in (None, mutant.kind)]


def body(statements):
    return f"void f() {{ {statements} }}"


class TheSource(unittest.TestCase):
    def kinds(self, text):
        return [(token.kind, token.text) for token in Source(text).tokens]

    def test_comments_are_no_tokens_and_texts_are_one_each(self):
        self.assertEqual(self.kinds('a /* "b" */ "c // d" // e "f"\n\'"\' R"x(g")x"'),
                         [("word", "a"), ("string", '"c // d"'), ("character", "'\"'"), ("string", 'R"x(g")x"')])

    def test_numbers_are_one_token_with_their_separators_and_suffixes(self):
        self.assertEqual(self.kinds("1'000U+0x1F"), [("number", "1'000U"), ("sign", "+"), ("number", "0x1F")])

    def test_braces_of_functions_hold_statements_and_others_do_not(self):
        text = "namespace n { class C { int f() const { return g({1}); } }; auto h = [] { k(); }; C::C() : a{1} { m(); } enum E { e }; }"
        source = Source(text)
        inside = sorted(source.slice(index, source.match[index]) for index in source.bodies)
        self.assertEqual(inside, ["{ k(); }", "{ m(); }", "{ return g({1}); }"])

    def test_a_bracket_without_partner_is_refused(self):
        for text in ("f(", "f)", "(]"):
            with self.assertRaises(ValueError):
                Source(text)


class TheMutants(unittest.TestCase):
    def test_comments_directives_and_what_only_the_compiler_reads_stay(self):
        for text in ("// if (a && b) return 1;\n", "/* 1 == 2 */", '#include "a/b.h"\n', '#if 1 && 2\n#endif\n',
                     'static_assert(1 + 1 == 2, "text");', 'using a = b<1, 2>;', 'namespace a {}', 'template <int N = 1> class C;'):
            self.assertEqual(changes(text), [], text)

    def test_only_the_text_kind_touches_what_is_inside_quotes(self):
        text = body('f("a && b == 1", \'c\');')
        quoted = [range(text.index('"') + 1, text.rindex('"')), range(text.index("'") + 1, text.rindex("'"))]
        for mutant in mutations.mutants_of("room/file.cpp", text, NAMES):
            inside = any(mutant.start in positions and mutant.end - 1 in positions for positions in quoted)
            self.assertTrue(not inside or mutant.kind == "text", str(mutant))

    def test_conditions_are_negated_each_in_its_way(self):
        self.assertEqual(changes(body("if (a == b) c();"), "condition"), [body("if (!(a == b)) c();")])
        self.assertEqual(changes(body("if (const auto* a = b()) c();"), "condition"), [body("if (const auto* a = b(); !a) c();")])
        self.assertEqual(changes(body("if (a(); b) c();"), "condition"), [body("if (a(); !(b)) c();")])
        self.assertEqual(changes(body("if (!a) c();"), "condition"), [])
        self.assertEqual(changes(body("if (!a) c();"), "negation"), [body("if (a) c();")])

    def test_signs_between_operands_are_changed_and_those_of_types_are_not(self):
        self.assertEqual(changes(body("x = a && b;"), "connective"), [body("x = a || b;")])
        self.assertEqual(changes(body("for (auto&& a : b) c();"), "connective"), [])
        self.assertEqual(changes(body("x = a < b;"), "comparison"), [body("x = a <= b;"), body("x = a >= b;")])
        self.assertEqual(changes(body("vector<int> a;"), "comparison"), [])
        self.assertEqual(changes(body("x = a + b;"), "arithmetic"), [body("x = a - b;")])
        self.assertEqual(changes(body("T* a = &b;"), "arithmetic"), [])

    def test_constants_become_others_of_their_kind(self):
        self.assertEqual(changes("a(41, 1'000U)", "number"), ["a(42, 1'000U)", "a(41, 1001U)"])
        self.assertEqual(changes("a(true, Kind::one, kSecond)", "constant"),
                         ["a(false, Kind::one, kSecond)", "a(true, Kind::two, kSecond)", "a(true, Kind::one, kFirst)"])
        self.assertEqual(changes("virtual void a() const = 0;", "number"), [])

    def test_a_text_changes_in_its_level_or_in_a_letter_that_is_no_placeholder(self):
        self.assertEqual(changes('a("[INFO] %s")', "text"), ['a("[DEBUG] %s")', 'a("[INFO] %sx")'])
        self.assertEqual(changes('a("bcd\\n")', "text"), ['a("bxd\\n")'])
        self.assertEqual(changes('a("")', "text"), ['a("x")'])
        self.assertEqual(changes("a('/')", "text"), ["a('x')"])

    def test_statements_are_removed_and_declarations_are_not(self):
        self.assertEqual(changes(body("a(); b = c; return;"), "statement"),
                         [body("; b = c; return;"), body("a(); ; return;"), body("a(); b = c; ;")])
        self.assertEqual(changes(body("int a = b; const T& c = d; std::vector<T> e; auto f = g;"), "statement"), [])
        self.assertEqual(changes(body("if (a) b(); else c();"), "statement"), [body("if (a) ; else c();"), body("if (a) b(); else ;")])
        self.assertEqual(changes("class C { void a() const; T b; };", "statement"), [])

    def test_neighbouring_statements_are_exchanged_when_each_is_whole_and_calls_something(self):
        self.assertEqual(changes(body("a(); b = c();  return;"), "order"), [body("b = c(); a();  return;")])
        self.assertEqual(changes(body("a(); if (b) c(); d();"), "order"),
                         [body("if (b) c(); a(); d();"), body("a(); d(); if (b) c();")])
        self.assertEqual(changes(body("a([] { b(); }); c();"), "order"), [body("c(); a([] { b(); });")])
        for statements in ("a(); int b = c(); d();", "a(); if (b) c(); else d();", "if (a) b(); else c(); d();", "a(); for (;;) b();",
                           "a(); if (b) { c(); } d();", "a(); { b(); } c();", "a(); a();", "assert(a); b();", "a(); b = std::move(c);",
                           "a(); if (b) return; c();", "switch (a) { case 1: b(); break; case 2: c(); }"):
            self.assertEqual(changes(body(statements), "order"), [], statements)

    def test_a_queue_becomes_one_of_the_other_kind(self):
        self.assertEqual(changes("a(b.serialQueue(c), d->concurrentQueue(e))", "concurrency"),
                         ["a(b.concurrentQueue(c), d->concurrentQueue(e))", "a(b.serialQueue(c), d->serialQueue(e))"])
        self.assertEqual(changes("class C { T serialQueue(int a); };", "concurrency"), [])
        self.assertEqual(changes("a(b.concurrentQueue(), b.serialQueue)", "concurrency"), [])

    def test_locks_barriers_and_queues_are_removed(self):
        self.assertEqual(changes(body("const std::lock_guard lock(mutex_);"), "statement"), [body(";")])
        self.assertEqual(changes(body("q->barrierAsync([a] { b(); });"), "queue"),
                         [body("q->async([a] { b(); });"), body("([a] { b(); })();")])
        self.assertEqual(changes("x = qxSync(q, [a] { return b; });", "queue"), ["x = ([a] { return b; })();"])

    def test_neighbouring_arguments_are_swapped_and_parameters_are_not(self):
        self.assertEqual(changes(body("a(b, c(d), e);"), "arguments"), [body("a(c(d), b, e);"), body("a(b, e, c(d));")])
        self.assertEqual(changes("void a(int b, const T& c);", "arguments"), [])
        self.assertEqual(changes(body("a(b, b);"), "arguments"), [])
        self.assertEqual(changes("enum class K { a, b };", "arguments"), [])

    def test_the_other_value_is_given(self):
        self.assertEqual(changes("auto a = b ? c : d;", "value"), ["auto a = b ? d : c;"])
        for head in ("bool f() ", "[[nodiscard]] bool C::f(int a) const ", "auto f = [] ", "auto f = [](int a) "):
            self.assertEqual(changes(head + "{ if (a) { return b; } }", "value"),
                             [head + "{ if (a) { return !(b); } }", head + "{ if (a) { return {}; } }"])
        self.assertEqual(changes("T f(bool a) { return a(b); }", "value"), ["T f(bool a) { return {}; }"])
        self.assertEqual(changes("bool f() { return true; }", "value"), [])
        self.assertEqual(changes(body("return true;"), "constant"), [body("return false;")])

    def test_a_mutant_differs_from_its_file_and_says_where(self):
        text = "int a() {\n  return b ==\n         1;\n}\n"
        for mutant in mutations.mutants_of("room/file.cpp", text, NAMES):
            self.assertNotEqual(mutant.applied_to(text), text)
            self.assertEqual(mutant.line, 3 if mutant.kind == "number" else 2)
            self.assertNotIn("\n", str(mutant.before) + str(mutant.after))

    def test_the_order_depends_on_the_seed_and_on_nothing_else(self):
        mutants = list(mutations.mutants_of("room/file.cpp", body("a(b, c); if (d && e) f(1, 2);"), NAMES))
        order = [str(mutant) for mutant in mutations.shuffled(mutants)]
        self.assertEqual(order, [str(mutant) for mutant in mutations.shuffled(list(reversed(mutants)))])
        self.assertNotEqual(order, [str(mutant) for mutant in mutations.shuffled(mutants, "another")])
        self.assertEqual(sorted(order), sorted(str(mutant) for mutant in mutants))


# Stands for a room and its test program: the "program" is a script that fails unless the room's file says what it should.
class OneRoom(mutate.Workshop):
    def __init__(self, directory, script):
        super().__init__(directory, directory)
        (directory / "common").mkdir()
        self.file = directory / "common" / "a.cpp"
        self.file.write_text(body("a();"))
        (directory / "bin").mkdir()
        for room in mutate.ROOMS:
            program = pathlib.Path(self.program(room))
            program.write_text(f"#!/bin/sh\n{script}\n")
            program.chmod(0o755)
            self.seconds[room, "Suite.Test"] = 0.0
        self.made = []

    def make(self, rooms):
        self.made += rooms
        return ("broken", "") if "notCompiling" in self.file.read_text() else (None, "")


class TheTrial(unittest.TestCase):
    def tried(self, script, replacement=";", path="common/a.cpp"):
        with tempfile.TemporaryDirectory() as directory:
            workshop = OneRoom(pathlib.Path(directory), script.replace("FILE", f"{directory}/common/a.cpp"))
            original = workshop.file.read_text()
            start = original.index("a();")
            result = workshop.try_mutant(mutations.Mutant(path, original, "statement", start, start + 4, replacement))
            self.assertEqual(workshop.file.read_text(), original)
            return result, workshop.made

    def test_a_mutant_that_a_test_notices_is_killed_and_no_further_room_is_built(self):
        (result, killer), made = self.tried("grep -q 'a();' FILE")
        self.assertEqual((result, killer, made), (mutate.KILLED, "common_tests Suite.Test: status 1", ["common"]))

    def test_a_mutant_that_no_test_of_any_room_above_notices_survives(self):
        (result, killer), made = self.tried("true")
        self.assertEqual((result, killer, made), (mutate.SURVIVED, None, list(mutate.ROOMS)))

    def test_a_crash_kills_and_what_does_not_compile_does_not_count(self):
        self.assertEqual(self.tried("kill -SEGV $$")[0], (mutate.KILLED, "common_tests Suite.Test: signal 11"))
        self.assertEqual(self.tried("true", "notCompiling")[0], (mutate.INVALID, None))

    def test_what_does_not_end_is_ended(self):
        self.assertEqual(suites.run_limited(["sh", "-c", "sleep 1000 & wait"], 0.2)[0], "still running after 0.2 s")

    def test_what_takes_all_memory_is_ended(self):
        failure, output = suites.run_limited([sys.executable, "-c", f"bytearray({2 * suites.MEMORY_BYTES})"], 60)
        self.assertEqual(failure, "status 1")
        self.assertIn("MemoryError", output)


class TheResults(unittest.TestCase):
    def test_what_is_known_stays_known_until_the_tests_change_and_a_survivor_no_longer(self):
        with tempfile.TemporaryDirectory() as directory:
            path = pathlib.Path(directory) / "results.json"
            results = mutate.Results(path, "tests")
            results.record("one", mutate.KILLED, "a test")
            results.record("two", mutate.SURVIVED, None)
            again, changed = mutate.Results(path, "tests"), mutate.Results(path, "other tests")
            self.assertEqual([again.of("one"), again.of("two"), again.of("three")], [mutate.KILLED, mutate.SURVIVED, None])
            self.assertEqual([changed.of("one"), changed.of("two")], [mutate.KILLED, None])

    def test_a_key_is_of_the_place_the_change_and_the_whole_file(self):
        texts = [body("a(); b();"), body("a(); b(); c();")]
        keys = {mutant.key(text) for text in texts for mutant in mutations.mutants_of("room/file.cpp", text, NAMES)}
        self.assertEqual(len(keys), 8)

    def test_an_equivalent_mutant_is_written_as_it_is_printed_with_its_reason(self):
        entries = mutate.read_equivalent("# why\n\nroom/a.cpp: statement\n- a();\n+ ;\n  a does nothing\n")
        self.assertEqual(entries, {("room/a.cpp", "statement", "a();", ";"): "a does nothing"})
        for text in ("room/a.cpp: statement\n- a();\n+ ;\n", "- a();\n", "room/a.cpp: statement\n+ ;\n"):
            with self.assertRaises(ValueError):
                mutate.read_equivalent(text)

    def test_survivors_are_settled_by_an_entry_and_entries_must_be_true(self):
        one, other = list(mutations.mutants_of("room/a.cpp", body("a(); b();"), NAMES))[:2]
        for results, settled, well in (([mutate.KILLED], [], True), ([mutate.SURVIVED], [], False), ([mutate.SURVIVED], [one], True),
                                       ([mutate.KILLED], [one], False), ([mutate.KILLED], [other], True)):
            report = mutate.Report({mutant.identity: "reason" for mutant in settled})
            for result in results:
                report.add(one, result)
            self.assertEqual(report.finish([one, other]), well)
        self.assertFalse(mutate.Report({other.identity: "reason"}).finish([one]))


class TheCopy(unittest.TestCase):
    def test_it_becomes_like_its_source_and_leaves_alone_what_is(self):
        with tempfile.TemporaryDirectory() as directory:
            source, target = pathlib.Path(directory) / "source", pathlib.Path(directory) / "target"
            for name, text in (("a/same", "1"), ("a/other", "2"), ("gone", "3"), ("build/left", "4"), (".git/left", "5")):
                (source / name).parent.mkdir(parents=True, exist_ok=True)
                (source / name).write_text(text)
            copy_tree.copy(source, target)
            time = (target / "a/same").stat().st_mtime_ns
            (target / "a/other").write_text("mutated")
            (source / "gone").unlink()
            copy_tree.copy(source, target)
            self.assertEqual(sorted(str(path) for path in copy_tree.files_of(target)), ["a/other", "a/same"])
            self.assertEqual([(target / "a/other").read_text(), (target / "a/same").stat().st_mtime_ns], ["2", time])
            self.assertFalse((target / "build").exists() or (target / ".git").exists())


# What gcov prints of a file of two lines: a call that may throw, a decision, and what cleans up after an exception.
REPORT = """\
        -:    0:Source:a
        -:    0:Runs:1
function _Z1fv called 3 returned 100% blocks executed 60%
        3:    1:one
        3:    1-block  0
call    0 returned 3
branch  1 taken 3 (fallthrough)
branch  2 taken 0 (throw)
        3:    1-block  1
branch  3 taken {} (fallthrough)
branch  4 taken {}
    $$$$$:    1-block  2
branch  5 never executed
branch  6 never executed
       3*:    2:two
    =====:    3:}}
    $$$$$:    3-block  0
call    0 never executed
"""


class TheCoverage(unittest.TestCase):
    def coverage(self, *reports):
        sums = coverage.Coverage()
        for report in reports:
            for line in coverage.read_report(report):
                sums.add(line)
        return sums

    def test_only_decisions_of_the_source_are_branches_and_only_lines_that_can_be_reached_are_lines(self):
        sums = self.coverage(REPORT.format(2, 0))
        self.assertEqual(dict(sums.branches()), {("a", 1): [2, 0]})
        self.assertEqual(dict(sums.lines), {("a", 1): 3, ("a", 2): 3})

    def test_copies_are_summed_up(self):
        self.assertEqual(dict(self.coverage(REPORT.format(2, 0), REPORT.format(0, 1)).branches()), {("a", 1): [2, 1]})

    def test_a_call_that_was_not_reached_is_known_by_a_copy_in_which_it_was(self):
        unreached = REPORT.replace("branch  1 taken 3 (fallthrough)\nbranch  2 taken 0 (throw)",
                                   "branch  1 never executed\nbranch  2 never executed")
        self.assertEqual(dict(self.coverage(unreached.format(1, 1), REPORT.format(1, 1)).branches()), {("a", 1): [2, 2]})

    def problems(self, sums, reasons=""):
        with tempfile.TemporaryDirectory() as directory:
            (pathlib.Path(directory) / "a").write_text("one\ntwo\n}\n")
            return coverage.report(pathlib.Path(directory), sums, coverage.read_reasons(reasons))

    def test_every_branch_that_is_not_taken_needs_a_reason_and_every_reason_a_branch(self):
        sums = self.coverage(REPORT.format(1, 0))
        for reasons, wrong in (("", 1), ("a: one\n  1: reason\n", 0), ("a: one\n  2: reason\n", 1),
                               ("a: one\n  1: reason\na: two\n  1: reason\n", 1)):
            self.assertEqual(self.problems(sums, reasons), wrong, reasons)

    def test_a_line_that_never_runs_is_wrong(self):
        self.assertEqual(self.problems(self.coverage(REPORT.format(1, 1).replace("       3*:    2", "    #####:    2"))), 1)


class TheSuites(unittest.TestCase):
    def test_figures_that_tests_print_are_summed_up(self):
        figures = suites.Figures()
        figures.read("[ RUN ]\nsequences tried 3\nmessages asserted 1 of 2\nnot sequences tried 5\n")
        figures.read("messages asserted 4 of 4\nsequences tried 2\n")
        self.assertEqual(figures.lines(), ["messages asserted 5 of 6", "sequences tried 5"])
        self.assertEqual(figures.missing(), [])

    def test_a_figure_that_no_test_prints_is_missing(self):
        figures = suites.Figures()
        figures.read("sequences tried 3\n")
        self.assertEqual(figures.missing(), ["messages asserted {} of {}"])


if __name__ == "__main__":
    unittest.main(buffer=True)
