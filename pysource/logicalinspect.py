"""Inspection helpers for logical-line records."""

import re

from pysource import symbolinfo

_kLineEnd = re.compile(b'\r\n|\r|\n')


def TextFromTokens(tokens):
    """Source text of a logical line, rebuilt from its tokens.

    tokens is a logical-line record (its fTokens are used), a sequence of
    (text, (row, col)) pairs, or a sequence of token texts. Positioned tokens
    are laid out at their rows and columns, relative to the first token's row,
    so the text keeps the line's indentation and layout (blanks stand in for
    tabs) and a token's (row, col) points at it in the result; tokens whose
    positions overlap are kept one blank apart. Plain texts are joined with
    symbolinfo.JoinTokens.
    """
    pairs = getattr(tokens, 'fTokens', tokens)
    pairs = list(pairs)
    if not pairs:
        return b''
    if all(isinstance(p, (bytes, unicode)) for p in pairs):
        return symbolinfo.JoinTokens(pairs)
    parts = []
    row = col = None
    for item in pairs:
        text, (tok_row, tok_col) = item
        if isinstance(text, unicode):
            text = text.encode('utf-8')
        if row is None:
            row, col = tok_row, 0
        if tok_row > row:
            parts.append(b'\n' * (tok_row - row))
            row, col = tok_row, 0
        if tok_row == row and tok_col > col:
            parts.append(b' ' * (tok_col - col))
            col = tok_col
        elif parts and (tok_row < row or tok_col < col):
            parts.append(b' ')
            col += 1
        parts.append(text)
        ends = list(_kLineEnd.finditer(text))
        if ends:
            row += len(ends)
            col = len(text) - ends[-1].end()
        else:
            col += len(text)
    return b''.join(parts)
