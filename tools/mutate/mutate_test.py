"""Tests of the mutation runner: what it finds to change, and a toy project that it is let loose on."""
import pathlib
import subprocess
import sys
import tempfile
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent))
import building  # noqa: E402
import drawing  # noqa: E402
import equivalents  # noqa: E402
import ledger  # noqa: E402
import reaching  # noqa: E402
import suite  # noqa: E402
from cpp_tokens import tokens_of  # noqa: E402
from mutants import places_of  # noqa: E402


def all_changes(source):
    """Every changed text of a source, by kind of change."""
    return {(place.kind, source[:change.start] + change.new + source[change.end:])
            for place in places_of(source) for change in place.changes}


class Tokens(unittest.TestCase):
    def test_comments_directives_and_texts_are_no_code(self):
        source = '#include <a+b>\n#define X \\\n  1 + 1\n// 1 + 1\n/* 2 */ a = "1 + 1"; b = \'+\'; c = R"(1 "+ 1)";'
        words = [token.text for token in tokens_of(source) if token.kind in ('word', 'number')]
        self.assertEqual(words, ['a', 'b', 'c'])

    def test_a_digit_separator_does_not_begin_a_character(self):
        numbers = [token.text for token in tokens_of("x = 1'000'000'000.0 + 0x1f'ff;") if token.kind == 'number']
        self.assertEqual(numbers, ["1'000'000'000.0", "0x1f'ff"])


class Places(unittest.TestCase):
    def test_operators_of_each_kind_are_changed(self):
        self.assertIn(('relational', 'x = a <= b;'), all_changes('x = a < b;'))
        self.assertIn(('relational', 'x = a != b;'), all_changes('x = a == b;'))
        self.assertIn(('arithmetic', 'x = a - b;'), all_changes('x = a + b;'))
        self.assertIn(('logical', 'x = a || b;'), all_changes('x = a && b;'))
        self.assertIn(('logical', 'x = a;'), all_changes('x = !a;'))
        self.assertIn(('bit', 'x = a | b;'), all_changes('x = a & b;'))
        self.assertIn(('arithmetic', 'a -= b;'), all_changes('a += b;'))

    def test_brackets_references_and_pointers_are_no_operators(self):
        for source in ('std::map<int, std::vector<int>> x;', 'const int& a, T&& b;', 'char* p;', 'auto x = *p;'):
            self.assertEqual({change for change in all_changes(source)}, set(), source)

    def test_a_number_becomes_its_neighbours_and_nothing(self):
        changed = {text for kind, text in all_changes('x = 10u;') if kind == 'constant'}
        self.assertEqual(changed, {'x = 11u;', 'x = 9u;', 'x = 0u;'})
        self.assertEqual({text for kind, text in all_changes('x = 0.5;') if kind == 'constant'}, {'x = 1.5;', 'x = 0.0;'})

    def test_the_mark_of_a_pure_function_stays(self):
        self.assertEqual(all_changes('virtual int f() const = 0;'), set())

    def test_a_condition_is_negated_and_replaced(self):
        changed = {text for kind, text in all_changes('if (f(a)) g = 1;') if kind == 'condition'}
        self.assertEqual(changed, {'if (!(f(a))) g = 1;', 'if (false) g = 1;', 'if (true) g = 1;'})
        self.assertIn(('condition', 'if (int x = f(); false) {}'), all_changes('if (int x = f(); x) {}'))

    def test_calls_assignments_and_bare_returns_go(self):
        self.assertIn(('dropped call', '{ ; }'), all_changes('{ a->b(c).d(); }'))
        self.assertIn(('dropped call', 'if (a) ;'), all_changes('if (a) b();'))
        self.assertIn(('dropped assignment', '{ ; }'), all_changes('{ a.b = c(); }'))
        self.assertIn(('dropped return', '{ ; }'), all_changes('{ return; }'))

    def test_declarations_stay(self):
        for source in ('{ Type name(a); }', '{ std::vector<int> x = y(); }', '{ const auto& x = y(); }', '{ return f(); }',
                       '} A::A(int b) : b_(b) {} void f() { return 1; }', '} catch (...) { return 1; } return a;'):
            kinds = {kind for kind, _ in all_changes(source)}
            self.assertFalse({'dropped call', 'dropped assignment'} & kinds, source)

    def test_neighbouring_arguments_that_look_alike_are_swapped(self):
        self.assertIn(('swapped arguments', 'f(b, a);'), all_changes('f(a, b);'))
        for source in ('f(a, b.c);', 'f(a, 1);', 'f([a, b] { g(); });', 'void f(int a, int b);'):
            self.assertNotIn('swapped arguments', {kind for kind, _ in all_changes(source)}, source)

    def test_static_assertions_stay(self):
        self.assertEqual(all_changes('static_assert(1 + 1 == 2);'), set())


class Drawing(unittest.TestCase):
    def test_a_seed_gives_the_same_mutants_again(self):
        with tempfile.TemporaryDirectory() as tree:
            folder = pathlib.Path(tree, 'purge')
            folder.mkdir()
            (folder / 'a.cc').write_text('int f(int a, int b) { return a + b < 10 ? a : b; }\n', encoding='utf-8')
            first = list(drawing.draw(tree, ('purge',), 7))
            self.assertEqual(first, list(drawing.draw(tree, ('purge',), 7)))
            self.assertEqual({mutant.kind for mutant in first}, {'arithmetic', 'relational', 'constant'})

    def test_an_edit_elsewhere_leaves_the_other_mutants_in_their_order(self):
        with tempfile.TemporaryDirectory() as tree:
            path = pathlib.Path(tree, 'purge', 'a.cc')
            path.parent.mkdir()
            path.write_text(';\na = b + 1;\nc = d < 2;\n', encoding='utf-8')
            first = [(mutant.before, mutant.new) for mutant in drawing.draw(tree, ('purge',), 7)]
            path.write_text(';\ne = f * g;\na = b + 1;\nc = d < 2;\n', encoding='utf-8')
            again = [(mutant.before, mutant.new) for mutant in drawing.draw(tree, ('purge',), 7)]
            self.assertEqual([pair for pair in again if 'e = f' not in pair[0]], first)

    def test_a_mutant_is_found_again_when_the_file_has_grown_above_it(self):
        mutant = drawing.Mutant('a.cc', 2, 8, 'arithmetic', '+', '-', '  a = b + c;')
        self.assertIsNone(drawing.mutated('int a;\n  a = b * c;\n', mutant))
        mutant = mutant._replace(column=9)
        self.assertEqual(drawing.mutated('new\nnew\nint a;\n  a = b + c;\n', mutant), 'new\nnew\nint a;\n  a = b - c;\n')


class Results(unittest.TestCase):
    def test_a_stopped_run_knows_what_it_did_and_the_last_verdict_counts(self):
        with tempfile.TemporaryDirectory() as folder:
            path = pathlib.Path(folder, 'results')
            mutants = [drawing.Mutant('a.cc', 1, column, 'bit', '&', '|', 'a & b') for column in range(3)]
            first = ledger.Ledger(path)
            first.add(mutants[0], ledger.SURVIVED, 'x', 1)
            first.add(mutants[1], ledger.CAUGHT, 'x: time limit', 1)
            first.add(mutants[2], ledger.NOT_A_MUTANT, 'x', 1)
            again = ledger.Ledger(path)
            self.assertEqual((again.tried(), again.caught(), again.out_of_time()), (2, 1, 1))
            self.assertEqual(again.survivors(), [mutants[0]])
            again.add(mutants[0], ledger.CAUGHT, 'x', 1)
            self.assertEqual(ledger.Ledger(path).survivors(), [])


    def test_what_no_test_can_tell_is_neither_caught_nor_survived_as_long_as_the_list_says_so(self):
        with tempfile.TemporaryDirectory() as folder:
            path = pathlib.Path(folder, 'results')
            mutants = [drawing.Mutant('a.cc', 1, column, 'bit', '&', '|', '  a & b') for column in (5, 9)]
            listed = {equivalents.entry_of(mutants[0])}
            results = ledger.Ledger(path, listed)
            for mutant in mutants:
                results.add(mutant, ledger.SURVIVED, 'x', 1)
            self.assertEqual((results.tried(), results.equivalent(), results.survivors()), (1, 1, [mutants[1]]))
            self.assertIsNone(ledger.Ledger(path).verdict(mutants[0]))


class Equivalents(unittest.TestCase):
    MUTANT = drawing.Mutant('purge/a.cc', 7, 5, 'dropped call', 'b(c,\n  d)', '', '  a b(c,')

    def read(self, text):
        with tempfile.TemporaryDirectory() as folder:
            path = pathlib.Path(folder, 'list')
            path.write_text(text, encoding='utf-8')
            return equivalents.read(path)

    def test_the_lines_that_a_run_prints_can_be_put_into_the_list(self):
        text = '# About the list.\n\n' + equivalents.text_of(self.MUTANT) + 'first\n  second\n'
        self.assertEqual(self.read(text), {equivalents.entry_of(self.MUTANT): 'first second'})

    def test_a_mutant_is_known_by_its_line_wherever_that_stands(self):
        moved = self.MUTANT._replace(line=70, column=9, before='      a b(c,')
        self.assertEqual(equivalents.entry_of(moved), equivalents.entry_of(self.MUTANT))
        self.assertNotEqual(equivalents.entry_of(self.MUTANT._replace(column=6)), equivalents.entry_of(self.MUTANT))

    def test_an_entry_without_a_reason_is_refused(self):
        with self.assertRaisesRegex(ValueError, 'block 1'):
            self.read(equivalents.text_of(self.MUTANT))

    def test_each_entry_of_the_shipped_list_is_a_change_that_could_be_drawn(self):
        tree = pathlib.Path(__file__).resolve().parent.parent.parent
        possible = {equivalents.entry_of(mutant) for file in {entry.file for entry in equivalents.read()}
                    for mutant in drawing.every_change(tree, file)}
        self.assertEqual(set(equivalents.read()) - possible, set())


class Asking(unittest.TestCase):
    PROGRAMS = ['tests/test_linux_purge', 'tests/test_simulated_client', 'tests/test_both_threads_purge',
                'tests/test_both_simulated_purge', 'sim/spacekeep-sim']

    def test_the_own_room_comes_first_and_exact_programs_before_others(self):
        reach = {program: {'purge/a.cc': ({1}, {1})} for program in self.PROGRAMS}
        self.assertEqual(suite.asked_about('purge/a.cc', 1, reach, self.PROGRAMS),
                         ['tests/test_both_simulated_purge', 'tests/test_linux_purge', 'tests/test_simulated_client',
                          'sim/spacekeep-sim'])

    def test_only_programs_that_reach_the_line_are_asked(self):
        reach = {program: {'purge/a.cc': ({1}, set())} for program in self.PROGRAMS}
        reach['tests/test_both_threads_purge'] = {'purge/a.cc': ({1}, {1})}
        self.assertEqual(suite.asked_about('purge/a.cc', 1, reach, self.PROGRAMS), ['tests/test_both_threads_purge'])

    def test_a_quick_run_leaves_out_what_takes_long_unless_it_is_of_the_room_or_nothing_else_reaches_the_line(self):
        seconds = {'test_quick': 3.0, 'test_border': 20.0, 'test_slow': 200.0, 'test_linux_purge': 200.0}
        self.assertEqual(suite.quick_ones(list(seconds), seconds, 'purge'), ['test_quick', 'test_border', 'test_linux_purge'])
        self.assertEqual(suite.quick_ones(['test_slow'], seconds, 'purge'), ['test_slow'])


class WithoutAMutant(unittest.TestCase):
    def log_says(self, text):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        kept = pathlib.Path(folder.name, 'coverage', 'test_x')
        kept.mkdir(parents=True)
        (kept / 'log').write_text(text, encoding='utf-8')
        reach = reaching.Reach.__new__(reaching.Reach)
        reach._build = pathlib.Path(folder.name)
        return reach

    def test_a_test_that_failed_then_catches_nothing(self):
        reach = self.log_says('[ RUN      ] A.B\n[  FAILED  ] A.B (7 ms)\n[ RUN      ] A.C\n[       OK ] A.C (3500 ms)\n'
                              '[==========] 2 tests\n[  FAILED  ] 1 test, listed below:\n[  FAILED  ] A.B\n')
        self.assertTrue(reach.is_sound('tests/test_x'))
        self.assertEqual(reach.failed_tests_of('tests/test_x'), ['A.B'])
        self.assertEqual(reach.slow_tests_of('tests/test_x'), {'A.C': 3.5})

    def test_a_program_that_did_not_end_is_not_asked(self):
        self.assertFalse(self.log_says('[==========] Running 2 tests\n[ RUN      ] A.B\n').is_sound('tests/test_x'))


TOY_LIBRARY = '''int least(int a, int b);
int limit(int a) {
  int unused = 5 + a;
  (void)unused;
  return a < 3 ? a : least(3, a);
}
'''
TOY_OTHER = 'int least(int a, int b) { return a < b ? a : b; }\n'
TOY_TEST = '''#include <cstdio>
int limit(int a);
int main() {
  if (limit(2) == 2 && limit(9) == 3) return 0;
  std::printf("[  FAILED  ] Toy.Limit\\n");
  return 1;
}
'''
TOY_CMAKE = '''cmake_minimum_required(VERSION 3.25)
project(toy LANGUAGES CXX)
set(CMAKE_EXPORT_COMPILE_COMMANDS ON)
add_library(toy STATIC purge/toy.cc purge/least.cc)
add_executable(test_simulated_toy purge/main.cc)
target_link_libraries(test_simulated_toy PRIVATE toy)
set_target_properties(test_simulated_toy PROPERTIES RUNTIME_OUTPUT_DIRECTORY tests)
'''


class Toy(unittest.TestCase):
    PROGRAM = 'tests/test_simulated_toy'

    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.tree = pathlib.Path(folder.name, 'tree')
        (self.tree / 'purge').mkdir(parents=True)
        self.library = self.tree / 'purge' / 'toy.cc'
        self.library.write_text(TOY_LIBRARY, encoding='utf-8')
        (self.tree / 'purge' / 'least.cc').write_text(TOY_OTHER, encoding='utf-8')
        (self.tree / 'purge' / 'main.cc').write_text(TOY_TEST, encoding='utf-8')
        (self.tree / 'CMakeLists.txt').write_text(TOY_CMAKE, encoding='utf-8')
        self.where = pathlib.Path(folder.name, 'objects')
        output = pathlib.Path(folder.name, 'build')
        for command in (['cmake', '-S', self.tree, '-B', output, '-G', 'Ninja'], ['ninja', '-C', output]):
            subprocess.run(command, check=True, stdout=subprocess.DEVNULL)
        self.build = building.Build(output)

    def ask_with(self, old, new):
        self.library.write_text(TOY_LIBRARY.replace(old, new), encoding='utf-8')
        objects = self.build.objects_with(self.library)
        if self.build.compile(objects, self.where) is not None:
            return 'does not compile'
        self.assertEqual(self.build.objects_of(self.PROGRAM, objects), objects)
        self.build.link(self.PROGRAM, objects, self.where)
        found = suite.ask(self.PROGRAM, self.build.directory, 1.0)
        self.build.restore(self.PROGRAM)
        return found

    def test_what_matters_is_caught_what_does_not_survives_and_the_build_is_whole_afterwards(self):
        self.assertEqual(self.ask_with('a < 3', 'a >= 3'), 'Toy.Limit')
        self.assertIsNone(self.ask_with('5 + a', '5 - a'))
        self.assertEqual(self.ask_with('a < 3', 'a <'), 'does not compile')
        self.assertIsNone(suite.ask(self.PROGRAM, self.build.directory, 1.0))


if __name__ == '__main__':
    unittest.main()
