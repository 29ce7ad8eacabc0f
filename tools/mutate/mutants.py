"""What can be changed in a source file: places, and at each place the changes that are tried."""
import re
from typing import NamedTuple

from cpp_tokens import closing, is_spaced, tokens_of


class Change(NamedTuple):
    """Characters start to end of the file become `new`."""
    start: int
    end: int
    new: str


class Place(NamedTuple):
    """A place in a file, what kind of change it is, and the changes to choose from."""
    kind: str
    changes: tuple


_RELATIONAL = {'<': ('<=', '>='), '>': ('>=', '<='), '<=': ('<', '>'), '>=': ('>', '<'),
               '==': ('!=',), '!=': ('==',)}
_ARITHMETIC = {'+': ('-',), '-': ('+',), '*': ('/',), '/': ('*',), '%': ('/',),
               '+=': ('-=',), '-=': ('+=',), '*=': ('/=',), '/=': ('*=',)}
_LOGICAL = {'&&': ('||',), '||': ('&&',)}
_BIT = {'&': ('|',), '|': ('&',), '^': ('&',), '<<': ('>>',), '|=': ('&=',), '&=': ('|=',)}
_BINARY = [('relational', _RELATIONAL), ('arithmetic', _ARITHMETIC), ('logical', _LOGICAL), ('bit', _BIT)]
_NO_CALL = {'return', 'if', 'for', 'while', 'switch', 'do', 'else', 'case', 'delete', 'throw', 'using', 'static_assert',
            'namespace', 'template', 'typedef', 'friend', 'auto', 'const', 'constexpr', 'static', 'struct', 'class', 'enum',
            'try', 'catch', 'public', 'private', 'protected', 'explicit', 'virtual', 'new', 'break', 'continue', 'goto', 'operator'}
_AFTER_BRACES = (';', ',', '.', '->', ')', '(', '?', ':', '+', '-', '==', '!=', '<', '>', '&&', '||')
_NUMBER = re.compile(r"(0[xX][0-9a-fA-F']+|[0-9][0-9']*)([uUlLzZ]*)$")
_FRACTION = re.compile(r"([0-9][0-9']*\.[0-9']*(?:[eE][-+]?[0-9]+)?|[0-9][0-9']*[eE][-+]?[0-9]+)([fF]?)$")


def places_of(source):
    """All places of one file in which something can be changed, in order of the file."""
    tokens = tokens_of(source)
    skipped = _static_assertions(tokens)
    places = []
    for index, token in enumerate(tokens):
        if index in skipped:
            continue
        for find in (_operators, _constants, _conditions, _statements, _arguments):
            places += find(source, tokens, index, token)
    return places


def _static_assertions(tokens):
    inside = set()
    for index, token in enumerate(tokens):
        if token.text == 'static_assert':
            inside.update(range(index, (closing(tokens, index + 1) or index) + 1))
    return inside


def _text(tokens, index):
    return tokens[index].text if 0 <= index < len(tokens) else ''


def _operators(source, tokens, index, token):
    if token.kind != 'sign' or _text(tokens, index - 1) == 'operator':
        return []
    places = []
    if is_spaced(source, token):
        for kind, table in _BINARY:
            if token.text in table:
                places.append(Place(kind, tuple(Change(token.start, token.end, new) for new in table[token.text])))
        if token.text == '>' and _text(tokens, index + 1) == '>':
            places = []
    if token.text in ('++', '--'):
        places.append(Place('arithmetic', (Change(token.start, token.end, '--' if token.text == '++' else '++'),)))
    if token.text == '!' and _text(tokens, index + 1) != '=':
        places.append(Place('logical', (Change(token.start, token.end, ''),)))
    return places


def _constants(_source, tokens, index, token):
    if token.text in ('true', 'false'):
        return [Place('constant', (Change(token.start, token.end, 'false' if token.text == 'true' else 'true'),))]
    if token.kind != 'number' or _is_pure(tokens, index):
        return []
    return [Place('constant', tuple(Change(token.start, token.end, new) for new in _other_numbers(token.text)))]


def _is_pure(tokens, index):
    """True for the 0 that makes a member function pure."""
    return (_text(tokens, index) == '0' and _text(tokens, index - 1) == '=' and _text(tokens, index + 1) == ';'
            and _text(tokens, index - 2) in (')', 'const', 'noexcept', 'override'))


def _other_numbers(text):
    whole = _NUMBER.match(text)
    if whole:
        number = int(whole.group(1).replace("'", ''), 0 if whole.group(1)[:2] in ('0x', '0X') else 10)
        others = [number + 1, number - 1, 0]
        return [f'{other}{whole.group(2)}' for other in dict.fromkeys(others) if other >= 0 and other != number]
    fraction = _FRACTION.match(text)
    if fraction:
        number = float(fraction.group(1).replace("'", ''))
        others = [number + 1, number - 1, 0.0]
        return [f'{other}{fraction.group(2)}' for other in dict.fromkeys(others) if other >= 0 and other != number]
    return []


def _conditions(source, tokens, index, token):
    if token.text not in ('if', 'while') or _text(tokens, index + 1) != '(':
        return []
    last = closing(tokens, index + 1)
    if last is None:
        return []
    first = index + 2
    for at in range(first, last):  # What stands before a semicolon is a declaration.
        if tokens[at].text == ';':
            first = at + 1
    if first >= last or any(tokens[at].text == '=' for at in range(first, last)):
        return []
    start, end = tokens[first].start, tokens[last].start
    condition = source[start:end]
    news = [f'!({condition})', 'false'] + (['true'] if token.text == 'if' else [])
    return [Place('condition', tuple(Change(start, end, new) for new in news if new != condition))]


def _begins_statement(tokens, index):
    before = _text(tokens, index - 1)
    if before in (';', '{', '}', 'else'):
        return True
    if before != ')':
        return False
    depth = 0
    for at in range(index - 1, -1, -1):
        depth += {')': 1, '(': -1}.get(tokens[at].text, 0)
        if depth == 0:
            return _text(tokens, at - 1) in ('if', 'for', 'while')
    return False


def _statement_end(tokens, index):
    """The index of the semicolon of the expression that begins at `index`, or None."""
    at = index
    while at < len(tokens):
        text = tokens[at].text
        if text in ('(', '[', '{'):
            after = closing(tokens, at)
            if after is None or (text == '{' and _text(tokens, after + 1) not in _AFTER_BRACES):
                return None  # The body of a function or of a block, not a value in braces.
            at = after
        elif text in (')', ']', '}'):
            return None
        elif text == ';':
            return at
        at += 1
    return None


def _statements(_source, tokens, index, token):
    """Statements that can go: calls whose result nobody takes, assignments, a bare return."""
    if not _begins_statement(tokens, index):
        return []
    if token.text == 'return' and _text(tokens, index + 1) == ';':
        return [Place('dropped return', (Change(token.start, token.end, ''),))]
    if token.text in _NO_CALL or (token.kind != 'word' and token.text not in ('(', '*', '::')):
        return []
    end = _statement_end(tokens, index)
    if end is None or _is_declaration(tokens, index, end):
        return []
    top = _top_level(tokens, index, end)
    change = (Change(token.start, tokens[end - 1].end, ''),)
    if any(text in ('=', '+=', '-=', '|=', '&=', '*=', '/=', '<<=') for text in top):
        return [Place('dropped assignment', change)]
    if tokens[end - 1].text == ')':
        return [Place('dropped call', change)]
    return []


def _top_level(tokens, start, end):
    texts, at = [], start
    while at < end:
        texts.append(tokens[at].text)
        at = closing(tokens, at) if tokens[at].text in ('(', '[', '{') else at
        at += 1
    return texts


def _is_declaration(tokens, start, end):
    """True where a name follows another or a closing angle bracket: `Type name`, `Type<X> name`, `Type& name`."""
    for at in range(start, end):
        if tokens[at].text in ('(', '=', '['):
            return False
        if tokens[at].kind == 'word' and at > start and (
                tokens[at - 1].kind == 'word' or tokens[at - 1].text in ('>', '&', '*') and at - 1 > start):
            return True
    return False


def _enclosing(tokens, index):
    """The bracket that is open at `index`; names between square ones are captures, which have no order."""
    depth = 0
    for at in range(index - 1, -1, -1):
        if tokens[at].text in (')', ']', '}'):
            depth += 1
        elif tokens[at].text in ('(', '[', '{'):
            if depth == 0:
                return tokens[at].text
            depth -= 1
    return ''


def _arguments(source, tokens, index, token):
    """Neighbouring arguments that look alike: two names, or two numbers."""
    if token.text != ',' or index < 2 or _enclosing(tokens, index) != '(':
        return []
    left, right = tokens[index - 1], _text(tokens, index + 1) and tokens[index + 1]
    alone = _text(tokens, index - 2) in ('(', ',') and _text(tokens, index + 2) in (')', ',')
    if not right or not alone or left.kind != right.kind or left.kind not in ('word', 'number') or left.text == right.text:
        return []
    swapped = right.text + source[left.end:right.start] + left.text
    return [Place('swapped arguments', (Change(left.start, right.end, swapped),))]
