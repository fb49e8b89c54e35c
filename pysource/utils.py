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
