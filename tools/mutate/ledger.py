"""The results so far, one JSON object a line, so that a run can be stopped and gone on with."""
import json
import pathlib

from drawing import Mutant

CAUGHT, SURVIVED, NOT_A_MUTANT = 'caught', 'survived', 'not a mutant'


class Ledger:
    """Verdicts by mutant; the last one counts. Use from one thread."""

    def __init__(self, path):
        self._path = pathlib.Path(path)
        self._rows = {}
        if self._path.exists():
            for text in self._path.read_text(encoding='utf-8').splitlines():
                row = json.loads(text)
                self._rows[_key(Mutant(*row['mutant']))] = row

    def verdict(self, mutant):
        return self._rows.get(_key(mutant), {}).get('verdict')

    def add(self, mutant, verdict, by, seconds):
        row = {'mutant': list(mutant), 'verdict': verdict, 'by': by, 'seconds': round(seconds, 1)}
        self._rows[_key(mutant)] = row
        self._path.parent.mkdir(parents=True, exist_ok=True)
        with open(self._path, 'a', encoding='utf-8') as file:
            file.write(json.dumps(row) + '\n')

    def survivors(self):
        return [Mutant(*row['mutant']) for row in self._rows.values() if row['verdict'] == SURVIVED]

    def tried(self):
        """How many mutants have a verdict; what did not compile was none."""
        return sum(row['verdict'] != NOT_A_MUTANT for row in self._rows.values())

    def caught(self):
        return sum(row['verdict'] == CAUGHT for row in self._rows.values())

    def out_of_time(self):
        """How many of the caught ones were caught by a time limit."""
        return sum(row['verdict'] == CAUGHT and 'time limit' in row['by'] for row in self._rows.values())


def _key(mutant):
    """What stays when lines come or go elsewhere."""
    return mutant._replace(line=0)
