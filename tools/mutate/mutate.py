#!/usr/bin/env python3
"""Changes the daemon's folders in one place at a time and looks whether a test notices.

Usage: mutate.py --source DIRECTORY --build DIRECTORY --counts DIRECTORY --workshop DIRECTORY
                 [--sample N] [--seed S] [--quick] [--again] [--fresh]

Stands on a finished coverage run in BUILD: it tells which test programs reach the changed line, and
only these are asked. A line per mutant tells what was changed and which program noticed. The results
are kept in WORKSHOP; a run that was stopped goes on. --quick leaves out the tests that take
long, --again asks all of them about the survivors, --fresh takes a new copy of sources and build.
A survivor that no test can tell goes into equivalents.txt with its reason, in the lines that the end of a
run prints for it; it is then neither asked about nor counted.
"""
import argparse
import json
import pathlib
import shutil
import sys
import time

import building
import drawing
import equivalents
import ledger
import reaching
import suite
import workshop

TARGET_PERCENT = 95.0


class Trial:
    """Tries mutants one at a time in the workshop. Use from one thread."""

    def __init__(self, arguments, reach):
        self._source = arguments.source
        self._build = building.Build(arguments.build)
        self._objects = arguments.workshop / 'objects'
        self._counts = arguments.counts
        self._reach = reach
        self._quick = arguments.quick
        self._quick_seconds = {program: self._seconds_without_slow_tests(program) for program in reach.lines}
        self._undo = arguments.workshop / 'undo'
        self._restore_source()
        self._build.restore_all()

    def _seconds_without_slow_tests(self, program):
        return max(0.0, self._reach.seconds.get(program, 10.0) - sum(self._reach.slow_tests_of(program).values()))

    def _restore_source(self):
        """Takes the change back; also one that a killed run has left."""
        if self._undo.exists():
            path, original = json.loads(self._undo.read_text(encoding='utf-8'))
            pathlib.Path(path).write_text(original, encoding='utf-8')
            self._undo.unlink()

    def judge(self, mutant):
        """Gives (verdict, by whom)."""
        path = self._source / mutant.file
        original = path.read_text(encoding='utf-8')
        text = drawing.mutated(original, mutant)
        if text is None:
            return ledger.NOT_A_MUTANT, 'the line is no longer there'
        asked = suite.asked_about(mutant.file, mutant.line, self._reach.lines,
                                  [program for program in self._reach.lines if self._reach.is_sound(program)])
        if self._quick:
            asked = suite.quick_ones(asked, self._quick_seconds, suite.room_of(mutant.file))
        self._undo.write_text(json.dumps([str(path), original]), encoding='utf-8')
        path.write_text(text, encoding='utf-8')
        try:
            return self._ask_all(asked, self._build.objects_with(path))
        finally:
            self._restore_source()
            shutil.rmtree(self._objects, ignore_errors=True)
            workshop.forget_counts(self._counts)

    def _ask_all(self, asked, objects):
        compiled, linked = set(), []
        try:
            # Most changes concern one object: when that does not compile, nothing else has to be looked at.
            if len(objects) == 1 and not self._compile(objects, compiled):
                return ledger.NOT_A_MUTANT, 'does not compile'
            for program in asked:
                if not self._link(program, objects, compiled, linked):
                    return ledger.NOT_A_MUTANT, 'does not compile'
                left_out = [*self._reach.slow_tests_of(program), *self._reach.failed_tests_of(program)]
                found = self._ask(program, linked, self._quick_seconds[program], self._all_but(left_out))
                if found is not None:
                    return ledger.CAUGHT, found
            for program in [] if self._quick else asked:
                slow = self._reach.slow_tests_of(program)
                found = self._ask(program, linked, sum(slow.values()), ':'.join(slow)) if slow else None
                if found is not None:
                    return ledger.CAUGHT, found
            return ledger.SURVIVED, ', '.join(pathlib.Path(program).name for program in asked) or 'no test reaches the line'
        finally:
            for part in linked:
                self._build.restore(part)

    def _link(self, program, objects, compiled, linked):
        """Links the program and those that it starts with the change; False when that does not compile."""
        for part in self._reach.parts_of(program):
            mine = [] if part in linked else self._build.objects_of(part, objects)
            if not mine:
                continue
            if not self._compile([name for name in mine if name not in compiled], compiled):
                return False
            self._build.link(part, mine, self._objects)
            linked.append(part)
        return True

    @staticmethod
    def _all_but(tests):
        return '-' + ':'.join(tests) if tests else ''

    def _ask(self, program, linked, usual_seconds, tests):
        if not any(part in linked for part in self._reach.parts_of(program)):
            return None
        found = suite.ask(program, self._build.directory, usual_seconds, tests)
        return None if found is None else f'{pathlib.Path(program).name}: {found}'

    def _compile(self, objects, compiled):
        if self._build.compile(objects, self._objects) is not None:
            return False
        compiled.update(objects)
        return True


def main():
    arguments = _arguments()
    workshop.enter()
    if arguments.fresh:
        (arguments.workshop / 'filled').unlink(missing_ok=True)
    workshop.fill(arguments.workshop, arguments.source, arguments.build)
    workshop.mount(arguments.workshop, arguments.source, arguments.build, arguments.counts)
    known = equivalents.read()
    results = ledger.Ledger(arguments.workshop / f'results-{arguments.seed}.jsonl', known)
    trial = Trial(arguments, reaching.Reach(arguments.build, arguments.source))
    if arguments.again:
        for mutant in results.survivors():
            try_one(trial, results, mutant)
    else:
        for mutant in drawing.draw(arguments.source, reaching.FOLDERS, arguments.seed):
            if results.tried() >= arguments.sample:
                break
            if results.verdict(mutant) is not None:
                continue
            if equivalents.entry_of(mutant) in known:
                results.add(mutant, ledger.EQUIVALENT, 'the list', 0)
            else:
                try_one(trial, results, mutant)
    return report(results)


def _arguments():
    parser = argparse.ArgumentParser(description='Does a test notice when a line is changed?')
    for name in ('source', 'build', 'counts', 'workshop'):
        parser.add_argument(f'--{name}', type=lambda text: pathlib.Path(text).resolve(), required=True)
    parser.add_argument('--sample', type=int, default=300, help='how many mutants (300)')
    parser.add_argument('--seed', type=int, default=1, help='which ones (1)')
    parser.add_argument('--quick', action='store_true', help='leave out the tests that take long')
    parser.add_argument('--again', action='store_true', help='only those that survived, by all programs')
    parser.add_argument('--fresh', action='store_true', help='copy sources and build anew')
    return parser.parse_args()


def try_one(trial, results, mutant):
    began = time.monotonic()
    verdict, by = trial.judge(mutant)
    results.add(mutant, verdict, by, time.monotonic() - began)
    if verdict == ledger.CAUGHT:
        print(f'{mutant}: caught by {by}', flush=True)
    elif verdict == ledger.SURVIVED:
        print(f'{mutant}: SURVIVED ({by})', flush=True)


def report(results):
    tried, caught = results.tried(), results.caught()
    for mutant in results.survivors():
        print(f'survived: {mutant}')
        print(equivalents.text_of(mutant))
    percent = 100.0 * caught / tried if tried else 0.0
    print(f'caught {caught} of {tried} ({percent:.1f} %, target {TARGET_PERCENT:.0f}), {results.out_of_time()} of them by a time limit; '
          f'{results.equivalent()} more that no test can tell (tools/mutate/equivalents.txt)')
    return 0 if percent >= TARGET_PERCENT else 1


if __name__ == '__main__':
    sys.exit(main())
