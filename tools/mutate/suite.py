"""Which test programs are asked about a mutant, in which order, and what they answer."""
import os
import pathlib
import re
import signal
import subprocess
import sys
import tempfile

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent.parent / 'coverage'))
from test_programs import command_of  # noqa: E402 (stands beside this folder)

# Far above what a program takes when nothing is wrong: it took the usual time with others beside it.
LIMIT_FACTOR = 5
LIMIT_LEAST_SECONDS = 60

# A program that takes longer, its slow tests not counted, is not asked in a quick run, and neither are
# the slow tests of the others: what they alone would notice waits for them with all other survivors.
QUICK_SECONDS = 20


def room_of(file):
    """The room whose tests stand first for a file: purge, ipc, ..."""
    parts = pathlib.Path(file).parts
    if parts[0] != 'support':
        return parts[0]
    return {'linux': 'platform'}.get(parts[1], parts[1])


def rank(program, room):
    """Own room first, exact ones first: the deterministic runtime, then threads, then Linux."""
    name = pathlib.Path(program).name
    kinds = ('test_simulated_', 'test_both_simulated_', 'spacekeep-sim', 'test_both_threads_', 'test_linux_')
    kind = next((number for number, kind in enumerate(kinds) if name.startswith(kind)), len(kinds))
    return (0 if name.endswith('_' + room) else 1, kind, name)


def is_exact(program):
    """True where the same program gives the same answer each time."""
    name = pathlib.Path(program).name
    return name.startswith(('test_simulated_', 'test_both_simulated_', 'spacekeep-sim'))


def asked_about(file, line, reach, programs):
    """The programs that reach the line, best first.

    `reach` is {program: {file: (lines that are code, lines reached)}}. A line that is no code (a
    constant, say) may matter to any program. Tests of both runtimes ask on threads only where no
    exact program reaches the line.
    """
    code = any(line in reach[program].get(file, ((), ()))[0] for program in programs)
    chosen = [program for program in programs if not code or line in reach[program].get(file, ((), ()))[1]]
    if any(is_exact(program) for program in chosen):
        chosen = [program for program in chosen if 'test_both_threads_' not in program]
    return sorted(chosen, key=lambda program: rank(program, room_of(file)))


def quick_ones(programs, seconds, room):
    """Of `programs` those of the room and those that take no more than QUICK_SECONDS; all where there is none."""
    return [program for program in programs
            if program.endswith('_' + room) or seconds.get(program, 0.0) <= QUICK_SECONDS] or programs


def ask(program, build, usual_seconds, tests=''):
    """Runs a program until its first failure, with the tests of a gtest filter (all).

    Gives None when it passes, else what it found.
    """
    found = _run_once(program, build, usual_seconds, tests)
    if found is None or is_exact(program):
        return found
    # On a busy machine a test on real threads may fail, or be late, by itself. A mutant fails it again.
    again = _run_once(program, build, usual_seconds, tests)
    return found if again is not None else None


def _run_once(program, build, usual_seconds, tests):
    command = command_of(program, build)
    if 'test_' in pathlib.Path(program).name:
        command += ['--gtest_fail_fast', '--gtest_brief=1'] + ([f'--gtest_filter={tests}'] if tests else [])
    limit_seconds = max(LIMIT_LEAST_SECONDS, LIMIT_FACTOR * usual_seconds)
    with tempfile.TemporaryFile('w+', errors='replace') as log:
        # A file, not a pipe: processes that a killed test leaves behind would keep a pipe open.
        with subprocess.Popen(command, cwd=pathlib.Path(build, 'tests'), stdout=log, stderr=subprocess.STDOUT,
                              start_new_session=True) as process:
            try:
                process.wait(timeout=limit_seconds)
            except subprocess.TimeoutExpired:
                os.killpg(process.pid, signal.SIGKILL)
                return 'time limit'
        log.seek(0)
        output = log.read()
    if process.returncode == 0:
        return None
    failed = re.findall(r'^\[  FAILED  \] (\S+)', output, re.MULTILINE)
    if failed:
        return failed[0].rstrip(',')
    return f'status {process.returncode}'
