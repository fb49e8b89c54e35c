"""Inspection helpers for logical-line records."""

import re

from pysource import symbolinfo

_kLineEnd = re.compile(b'\r\n|\r|\n')

# Blank space allowed beyond the line text and tokens: positions given as
# plain pairs have no line text to measure their indentation against.
kSlack = 4096


def TextFromTokens(tokens):
    """Source text of a logical line, rebuilt from its tokens.

    tokens is a logical-line record (its fTokens are used), a sequence of
    (text, (row, col)) pairs, or a sequence of token texts. Positioned tokens
    are laid out at their rows and columns, relative to the first token's row,
    so the text keeps the line's indentation and layout (blanks stand in for
    tabs) and a token's (row, col) points at it in the result; tokens whose
    positions overlap are kept one blank apart. Plain texts are joined with
    symbolinfo.JoinTokens.

    Positions are the caller's, so the blank space is bounded: all the gaps
    together get at most the length of the record's line text plus that of
    the tokens (and kSlack); a gap beyond what is left becomes one separator.
    """
    pairs = getattr(tokens, 'fTokens', tokens)
    pairs = list(pairs)
    if not pairs:
        return b''
    if all(isinstance(p, (bytes, unicode)) for p in pairs):
        return symbolinfo.JoinTokens(pairs)
    line_text = getattr(tokens, 'fLineText', None)
    budget = kSlack + (len(line_text) if isinstance(line_text, bytes) else 0)
    items = []
    for item in pairs:
        text, (tok_row, tok_col) = item
        if isinstance(text, unicode):
            text = text.encode('utf-8')
        if not isinstance(text, bytes):
            raise TypeError('token text must be bytes or unicode, not %s' % type(text).__name__)
        budget += len(text)
        items.append((text, tok_row, tok_col))
    parts = []
    row = col = None
    for text, tok_row, tok_col in items:
        if row is None:
            row, col = tok_row, 0
        if tok_row > row:
            gap = tok_row - row
            if gap > budget:
                gap = 1
            budget -= gap
            parts.append(b'\n' * gap)
            row, col = tok_row, 0
        if tok_row == row and tok_col > col:
            gap = tok_col - col
            if gap > budget:
                gap = 1
            budget -= gap
            parts.append(b' ' * gap)
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
