"""Text utilities of the host: splitting source text into logical-line records."""

from pysource import _fastaccess


def GetLogicalsFromText(text):
    """Returns the list of logical-line records (CLogicalLine) of a source text.

    `text` is bytes; unicode is encoded as UTF-8 first. Each record carries its
    tokens with (row, col) positions, kind, first line, line text, indentation
    and parent scope. The records' fLineText, concatenated, give back the text
    (less a leading UTF-8 byte-order mark). Empty text gives [].
    """
    if isinstance(text, unicode):
        text = text.encode('utf-8')
    elif not isinstance(text, bytes):
        raise TypeError('Expected bytes, got %.200s' % type(text).__name__)
    return _fastaccess._SplitLogicals(text)


def InAsyncDef(logical):
    """Whether a logical lies in the body of an `async def`, at any depth.

    This is CPython 3.6's rule: its tokenizer makes `async` and `await`
    keywords from an `async def` to the end of that function's body, nested
    scopes (plain defs, classes) included. The `async def` line itself is not
    inside; the parser sees its `async` keyword there on its own.
    """
    scope = logical.fParentScope
    seen = set()
    # A chain set by hand may loop: each record is looked at once.
    while scope is not None and id(scope) not in seen:
        seen.add(id(scope))
        if scope.fKind == 2 and _StartsAsyncDef(scope):
            return True
        scope = scope.fParentScope
    return False


def _StartsAsyncDef(logical):
    """Whether the first two tokens, comments and backslashes aside, are `async def`."""
    seen = 0
    for i in range(logical.fTokenCount):
        text = logical.GetTokenString(i)
        if text.startswith((b'#', b'\\')):
            continue
        if text != (b'async', b'def')[seen]:
            return False
        seen += 1
        if seen == 2:
            return True
    return False
