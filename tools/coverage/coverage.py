#!/usr/bin/env python3
"""Runs every test program and tells which lines and branches of the daemon's folders they reach.

Usage: coverage.py --source DIRECTORY --build DIRECTORY --counts DIRECTORY [--report-only] [--missed FILE]

Each program of tests/ runs whole, one after another, and so does the simulation of the whole system.
Their counts stay in BUILD/coverage/PROGRAM, where the mutation runner finds which program reaches
which line. --missed writes the lines and branches that nothing reached.
"""
import argparse
import concurrent.futures
import json
import pathlib
import sys

from counts import FOLDERS, details_of, merge, summary_of
from test_programs import collect, programs_of, run_counted

TARGET_LINES_PERCENT = 95.0
TARGET_BRANCHES_PERCENT = 85.0
WORST_FILES = 20


def main():
    arguments = _arguments()
    build, counts = arguments.build.resolve(), arguments.counts
    programs = programs_of(build)
    failed = [] if arguments.report_only else run_all(programs, build, counts)
    profile = build / 'coverage' / 'all.profdata'
    merge(sorted((build / 'coverage').glob('*/*.profraw')), profile)
    objects = [build / program for program in programs + ['daemon/spacekeepd']]
    source = arguments.source.resolve()
    summary = summary_of(profile, objects, source)
    if arguments.missed:
        write_missed(arguments.missed, details_of(profile, objects, source))
    uncounted = files_without_counts(source, summary)
    return report(summary, uncounted, failed)


def _arguments():
    parser = argparse.ArgumentParser(description='Line and branch coverage of the folders of the daemon')
    parser.add_argument('--source', type=pathlib.Path, required=True)
    parser.add_argument('--build', type=pathlib.Path, required=True)
    parser.add_argument('--counts', type=pathlib.Path, required=True, help='the folder compiled into the programs')
    parser.add_argument('--report-only', action='store_true', help='tell about the last run')
    parser.add_argument('--missed', type=pathlib.Path, help='write there what nothing reached')
    return parser.parse_args()


def run_all(programs, build, counts):
    """Runs the programs; those on the deterministic runtime start nothing, so two of them at a time."""
    counts.mkdir(mode=0o1777, exist_ok=True)
    counts.chmod(0o1777)
    for leftover in counts.rglob('*.profraw'):
        leftover.unlink()
    apart = [program for program in programs if 'test_linux_' in program]
    failed, took = [], {}

    def run(program):
        kept = build / 'coverage' / pathlib.Path(program).name
        status, seconds = run_counted(program, build, counts, kept)
        collect(counts / kept.name, kept, 'own')
        if program in apart:
            collect(counts, kept, 'started')
        print(f'{program:48s} {seconds:7.1f} s  {"passed" if status == 0 else f"FAILED ({status})"}', flush=True)
        took[program] = round(seconds, 1)
        if status != 0:
            failed.append(program)

    with concurrent.futures.ThreadPoolExecutor(max_workers=2) as pool:
        list(pool.map(run, [program for program in programs if program not in apart]))
    for program in apart:
        run(program)
    (build / 'coverage' / 'seconds.json').write_text(json.dumps(took), encoding='utf-8')
    return failed


def files_without_counts(source, summary):
    """Source files that no program contains: they would be missing from the figures without a word."""
    return [str(path.relative_to(source)) for folder in FOLDERS for path in sorted((source / folder).rglob('*.cc'))
            if str(path.relative_to(source)) not in summary]


def write_missed(path, details):
    rows = []
    for file, (lines, branches) in sorted(details.items()):
        rows += [f'{file}:{line}: line' for line, count in sorted(lines.items()) if count == 0]
        for line, block, branch, count in branches:
            # A branch on a line that is not reached at all is told by the line.
            if count == 0 and lines.get(line, 0) > 0:
                rows.append(f'{file}:{line}: branch {block} never {"true" if branch % 2 == 0 else "false"}')
    path.write_text('\n'.join(rows) + '\n', encoding='utf-8')


def percent(covered, total):
    return 100.0 * covered / total if total else 100.0


def _row(name, numbers):
    lines, lines_covered, branches, branches_covered = numbers
    return (f'{name:52s} {lines_covered:6d} of {lines:6d}  {percent(lines_covered, lines):5.1f} %  '
            f'{branches_covered:6d} of {branches:6d}  {percent(branches_covered, branches):5.1f} %')


def total_of(rows):
    return tuple(sum(column) for column in zip(*rows)) if rows else (0, 0, 0, 0)


def report(summary, uncounted, failed):
    print(f'\n{"folder":52s} {"lines":>25s}  {"branches":>25s}')
    for folder in FOLDERS:
        print(_row(folder + '/', total_of([numbers for file, numbers in summary.items() if file.split('/')[0] == folder])))
    print(f'\n{"files that miss most":52s}')
    missing = sorted(summary.items(), key=lambda item: (item[1][1] - item[1][0]) + (item[1][3] - item[1][2]))
    for file, numbers in missing[:WORST_FILES]:
        print(_row(file, numbers))
    for file in uncounted:
        print(f'{file}: in no program, or without a statement')
    for program in failed:
        print(f'{program}: failed, see its log; its counts may be too small')
    lines, lines_covered, branches, branches_covered = total_of(list(summary.values()))
    reached_lines, reached_branches = percent(lines_covered, lines), percent(branches_covered, branches)
    print(f'\nlines {reached_lines:.1f} % (target {TARGET_LINES_PERCENT:.0f}), '
          f'branches {reached_branches:.1f} % (target {TARGET_BRANCHES_PERCENT:.0f})')
    good = reached_lines >= TARGET_LINES_PERCENT and reached_branches >= TARGET_BRANCHES_PERCENT
    return 0 if good and not failed else 1


if __name__ == '__main__':
    sys.exit(main())
