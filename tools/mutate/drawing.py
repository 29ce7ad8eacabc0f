"""Draws mutants: the same seed and the same sources give the same ones in the same order."""
import collections
import hashlib
import pathlib
from typing import NamedTuple

from mutants import places_of


class Mutant(NamedTuple):
    """One change of one file. Line and column count from 1."""
    file: str
    line: int
    column: int
    kind: str
    old: str
    new: str
    before: str  # The line as it was, to find it again when the file has changed elsewhere.

    def __str__(self):
        old = ' '.join(self.old.split())
        new = ' '.join(self.new.split()) or 'nothing'
        return f'{self.file}:{self.line}: {self.kind}: {_short(old)} -> {_short(new)}'


def _short(text):
    return text if len(text) <= 48 else text[:45] + '...'


def sources_of(tree, folders):
    """Paths below `tree`, in order."""
    found = []
    for folder in folders:
        found += [path for path in pathlib.Path(tree, folder).rglob('*') if path.suffix in ('.cc', '.h')]
    return sorted(str(path.relative_to(tree)) for path in found)


def draw(tree, folders, seed):
    """Yields every mutant once: each place with one of its changes, in an order drawn from `seed`.

    The draw of a place depends on its own line only, so an edit elsewhere leaves the others where they were.
    """
    drawn = []
    for file in sources_of(tree, folders):
        source = pathlib.Path(tree, file).read_text(encoding='utf-8')
        seen = collections.Counter()
        for place in places_of(source):
            first = _mutant(file, source, place.kind, place.changes[0])
            name = (seed, file, place.kind, first.before, first.column)
            seen[name] += 1
            digest = hashlib.sha256(repr((name, seen[name])).encode()).digest()
            change = place.changes[digest[0] % len(place.changes)]
            drawn.append((digest, _mutant(file, source, place.kind, change)))
    return (mutant for _, mutant in sorted(drawn))


def every_change(tree, file):
    """All mutants of one file, not only the drawn one of each place."""
    source = pathlib.Path(tree, file).read_text(encoding='utf-8')
    return [_mutant(file, source, place.kind, change) for place in places_of(source) for change in place.changes]


def _mutant(file, source, kind, change):
    line_start = source.rfind('\n', 0, change.start) + 1
    line_end = source.find('\n', change.start)
    return Mutant(file, source.count('\n', 0, change.start) + 1, change.start - line_start + 1, kind,
                  source[change.start:change.end], change.new, source[line_start:line_end])


def mutated(source, mutant):
    """The text of the file with the change in it, or None when its line is no longer there."""
    lines = source.split('\n')
    same = [number for number, text in enumerate(lines, 1) if text == mutant.before]
    if not same:
        return None
    number = min(same, key=lambda candidate: abs(candidate - mutant.line))
    start = sum(len(text) + 1 for text in lines[:number - 1]) + mutant.column - 1
    if not source.startswith(mutant.old, start):
        return None
    return source[:start] + mutant.new + source[start + len(mutant.old):]
