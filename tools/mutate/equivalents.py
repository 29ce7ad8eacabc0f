"""Mutants that no test can tell from the program as it is, each looked at and with its reason.

Source of the notion: Jia and Harman, "An Analysis and Survey of the Development of Mutation Testing"
(2011), whose score leaves equivalent mutants out of the count.
"""
import pathlib
import re
from typing import NamedTuple

LIST = pathlib.Path(__file__).resolve().parent / 'equivalents.txt'
_HEAD = re.compile(r'(?P<file>\S+) (?P<column>\d+): (?P<kind>[a-z ]+): (?P<old>.+?) -> (?P<new>.+)')


class Entry(NamedTuple):
    """The column counts from 1 at the first letter of the line, so that a line may move inwards."""
    file: str
    column: int
    kind: str
    old: str
    new: str
    before: str


def entry_of(mutant):
    """How the list names a mutant."""
    inwards = len(mutant.before) - len(mutant.before.lstrip())
    return Entry(mutant.file, mutant.column - inwards, mutant.kind, _in_one_line(mutant.old), _in_one_line(mutant.new),
                 mutant.before.strip())


def text_of(mutant):
    """The lines of a mutant for the list; the reason is for whoever looked at it."""
    entry = entry_of(mutant)
    return f'{entry.file} {entry.column}: {entry.kind}: {entry.old} -> {entry.new}\n  {entry.before}\n  why: '


def read(path=LIST):
    """{entry: reason}. Raises ValueError that says where the list is wrong."""
    found = {}
    for number, block in enumerate(re.split(r'\n\s*\n', path.read_text(encoding='utf-8').strip()), 1):
        lines = [line for line in block.splitlines() if not line.startswith('#')]
        if not lines:
            continue
        head = _HEAD.fullmatch(lines[0])
        if head is None or len(lines) < 3 or not re.fullmatch(r'\s+why: \S.*', lines[2]):
            raise ValueError(f'{path}, block {number}: expected "FILE COLUMN: KIND: OLD -> NEW", the line, "why: REASON"')
        reason = ' '.join(line.strip() for line in lines[2:])[len('why: '):]
        entry = Entry(head['file'], int(head['column']), head['kind'], head['old'], head['new'], lines[1].strip())
        found[entry] = reason
    return found


def _in_one_line(text):
    return ' '.join(text.split()) or 'nothing'
