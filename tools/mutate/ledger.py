"""The results so far, one JSON object a line, so that a run can be stopped and gone on with."""
import json
import pathlib

from drawing import Mutant
from equivalents import entry_of

CAUGHT, SURVIVED, NOT_A_MUTANT, EQUIVALENT = 'caught', 'survived', 'not a mutant', 'equivalent'


class Ledger:
    """Verdicts by mutant; the last one counts. What stands in the list of equivalents is that. Use from one thread."""

    def __init__(self, path, equivalents=()):
        self._path = pathlib.Path(path)
        self._equivalents = equivalents
        self._rows = {}
        if self._path.exists():
            for text in self._path.read_text(encoding='utf-8').splitlines():
                row = json.loads(text)
                self._keep(Mutant(*row['mutant']), row)

    def verdict(self, mutant):
        return self._rows.get(_key(mutant), {}).get('verdict')

    def add(self, mutant, verdict, by, seconds):
        row = {'mutant': list(mutant), 'verdict': verdict, 'by': by, 'seconds': round(seconds, 1)}
        self._keep(mutant, row)
        self._path.parent.mkdir(parents=True, exist_ok=True)
        with open(self._path, 'a', encoding='utf-8') as file:
            file.write(json.dumps(row) + '\n')

    def _keep(self, mutant, row):
        if entry_of(mutant) in self._equivalents:
            row['verdict'] = EQUIVALENT
        elif row['verdict'] == EQUIVALENT:
            return  # It no longer stands in the list.
        self._rows[_key(mutant)] = row

    def survivors(self):
        return [Mutant(*row['mutant']) for row in self._rows.values() if row['verdict'] == SURVIVED]

    def tried(self):
        """How many mutants were put to the tests; what did not compile was none, what no test can tell is left out."""
        return sum(row['verdict'] in (CAUGHT, SURVIVED) for row in self._rows.values())

    def equivalent(self):
        return sum(row['verdict'] == EQUIVALENT for row in self._rows.values())

    def caught(self):
        return sum(row['verdict'] == CAUGHT for row in self._rows.values())

    def out_of_time(self):
        """How many of the caught ones were caught by a time limit."""
        return sum(row['verdict'] == CAUGHT and 'time limit' in row['by'] for row in self._rows.values())


def _key(mutant):
    """What stays when lines come or go elsewhere."""
    return mutant._replace(line=0)
