"""Which lines each test program reaches, and how long it takes, from the last coverage run."""
import json
import pathlib
import re
import sys

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parent.parent / 'coverage'))
from counts import FOLDERS, details_of, merge  # noqa: E402,F401 (stands beside this folder)
from test_programs import programs_of  # noqa: E402

# Programs that tests on Linux start.
STARTED = ('daemon/spacekeepd', 'ctl/spacekeepctl', 'services/spacekeep-cachedir', 'tests/test-peer',
           'tests/socket-service', 'sdk/example_thumbnail_cache', 'sdk/example_make_room', 'sdk/example_on_demand')

# A test that takes longer than all the others of most programs together.
SLOW_MS = 3000


class Reach:
    """lines: {program: {file: (lines that are code, lines reached)}}; seconds: {program: seconds}."""

    def __init__(self, build, source):
        self._build = build
        self.seconds = json.loads((build / 'coverage' / 'seconds.json').read_text(encoding='utf-8'))
        self.lines = {program: self._lines_of(program, source) for program in programs_of(build)}

    def parts_of(self, program):
        """The programs to be linked before this one is asked."""
        if 'test_linux_' not in program:
            return [program]
        return [part for part in STARTED if (self._build / part).exists()] + [program]

    def is_sound(self, program):
        """False for a program that did not come to its end in the coverage run: it would catch everything."""
        return pathlib.Path(program).name == 'spacekeep-sim' or '[==========] ' in self._log_of(program).split('[ RUN ')[-1]

    def failed_tests_of(self, program):
        """Tests that failed without a mutant and so say nothing."""
        return sorted(set(re.findall(r'^\[  FAILED  \] ([^\s,]+\.[^\s,]+)', self._log_of(program), re.MULTILINE)))

    def slow_tests_of(self, program):
        """{test: seconds} of a program: asked when the quick ones of all programs have said nothing."""
        took = re.findall(r'^\[ +OK \] (\S+?),? .*?\((\d+) ms\)$', self._log_of(program), re.MULTILINE)
        return {name: int(ms) / 1000 for name, ms in took if int(ms) >= SLOW_MS}

    def _log_of(self, program):
        log = self._build / 'coverage' / pathlib.Path(program).name / 'log'
        return log.read_text(errors='replace') if log.exists() else ''

    def _lines_of(self, program, source):
        folder = self._build / 'coverage' / pathlib.Path(program).name
        kept = folder / 'lines.json'
        raw = sorted(folder.glob('*.profraw'))
        if not raw:
            return {}
        if not kept.exists() or kept.stat().st_mtime < max(path.stat().st_mtime for path in raw):
            profile = folder / 'program.profdata'
            merge(raw, profile)
            objects = [self._build / part for part in reversed(self.parts_of(program))]
            details = details_of(profile, objects, source)
            reached = {file: (sorted(lines), sorted(line for line, count in lines.items() if count))
                       for file, (lines, _) in details.items()}
            kept.write_text(json.dumps(reached), encoding='utf-8')
        reached = json.loads(kept.read_text(encoding='utf-8'))
        return {file: (set(lines), set(hit)) for file, (lines, hit) in reached.items()}
