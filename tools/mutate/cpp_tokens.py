"""Tokens of C++ as far as mutation needs them: comments, text and preprocessor lines are told apart."""
import re
from typing import NamedTuple


class Token(NamedTuple):
    """One token: kind (word, number, text, sign), its characters and where they begin."""
    kind: str
    text: str
    start: int

    @property
    def end(self):
        return self.start + len(self.text)


_PATTERN = re.compile(
    r'(?P<space>\s+|//[^\n]*|/\*.*?\*/)'
    r'|(?P<directive>^[ \t]*\#(?:[^\n]*\\\n)*[^\n]*)'
    r'|(?P<raw>(?:u8|[uUL])?R"(?P<fence>[^()\\\s]{0,16})\(.*?\)(?P=fence)")'
    r"|(?P<text>(?:u8|[uUL])?(?:\"(?:\\.|[^\"\\\n])*\"|'(?:\\.|[^'\\\n])*'))"
    r"|(?P<number>\.?\d(?:[eEpP][+-]|'?[\w.])*)"
    r'|(?P<word>[A-Za-z_]\w*)'
    r'|(?P<sign><<=|>>=|<=>|->\*|\.\.\.|::|->|\+\+|--|<<|<=|>=|==|!=|&&|\|\||[-+*/%&|^]=|.)',
    re.MULTILINE | re.DOTALL)


def tokens_of(source):
    """The tokens of `source` in order, without comments and preprocessor lines.

    `>>` comes as two tokens, since only its surroundings tell a shift from two closing brackets.
    """
    tokens = []
    for match in _PATTERN.finditer(source):
        kind = match.lastgroup if match.lastgroup != 'fence' else 'raw'
        if kind in ('space', 'directive'):
            continue
        tokens.append(Token('text' if kind == 'raw' else kind, match.group(), match.start()))
    return tokens


_OPEN = {'(': ')', '[': ']', '{': '}'}


def closing(tokens, index):
    """The index of the bracket that closes the one at `index`, or None."""
    depth = 0
    for at in range(index, len(tokens)):
        text = tokens[at].text
        if tokens[at].kind != 'sign':
            continue
        if text in _OPEN:
            depth += 1
        elif text in _OPEN.values():
            depth -= 1
            if depth == 0:
                return at
    return None


def is_spaced(source, token):
    """True for a sign with a space before it and after it, as the layout gives to binary operators."""
    return source[token.start - 1:token.start].isspace() and source[token.end:token.end + 1].isspace()
