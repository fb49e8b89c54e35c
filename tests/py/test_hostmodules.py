"""Tests of the small host modules: logicalinspect, parsetools.logicalline and
loomutils.reflect."""

import logging
import StringIO
import sys
import tokenize
import unittest

from loomutils import reflect
from pysource import logicalinspect
from pysource import symbolinfo
from tests.py import support


def _FastAccess():
    try:
        from pysource import _fastaccess
        return _fastaccess
    except ImportError:
        return None


def CheckPositions(test, pairs, text, what):
    """Every token of pairs stands at its (row, col) in text."""
    rows = text.split(b'\n')
    first = pairs[0][1][0]
    for tok, (row, col) in pairs:
        line = b'\n'.join(rows[row - first:])
        test.assertTrue(line[col:].startswith(tok),
                        '%s: %r not at (%d, %d) of %r' % (what, tok, row, col, text))


class TextFromTokensTest(unittest.TestCase):

    def testLayout(self):
        cases = [
            ([], b''),
            ([(b'x', (0, 4)), (b'=', (0, 6)), (b'1', (0, 8))], b'    x = 1'),
            ([(b'f', (3, 0)), (b'(', (3, 1)), (b'a', (3, 2)), (b',', (3, 3)),
              (b'b', (4, 6)), (b')', (4, 7))], b'f(a,\n      b)'),
            ([(b'x', (0, 0)), (b'=', (0, 2)), (b"'''a\nbc'''", (0, 4)),
              (b'+', (1, 6)), (b'y', (1, 8))], b"x = '''a\nbc''' + y"),
            ([(b'x', (0, 0)), (b'\\', (0, 2)), (b'+', (1, 4)), (b'1', (1, 6))],
             b'x \\\n    + 1'),
            ([(b'a', (0, 0)), (b'#c', (0, 3))], b'a  #c'),
            # Overlapping or backward positions keep tokens apart.
            ([(b'ab', (0, 0)), (b'c', (0, 1)), (b'd', (0, 0))], b'ab c d'),
            ([(u'x', (0, 0)), (u'\xe9', (0, 2))], b'x \xc3\xa9'),
        ]
        for pairs, expected in cases:
            self.assertEqual(expected, logicalinspect.TextFromTokens(pairs), pairs)

    def testPlainTexts(self):
        toks = [b'f', b'(', b'x', b',', b'1', b')']
        self.assertEqual(symbolinfo.JoinTokens(toks), logicalinspect.TextFromTokens(toks))
        self.assertEqual(b'f(x, 1)', logicalinspect.TextFromTokens(toks))

    def testBadItems(self):
        for bad in [[(b'x', 0)], [(b'x', (0,), 1)], [1]]:
            self.assertRaises((TypeError, ValueError),
                              logicalinspect.TextFromTokens, bad)

    def testStdlibPositions(self):
        lines = 0
        for path in support.CorpusFiles('2.7', limit=20):
            for pairs in _PositionedLogicals(path):
                lines += 1
                text = logicalinspect.TextFromTokens(pairs)
                CheckPositions(self, pairs, text, path)
        self.assertGreater(lines, 500)

    def testLogicalRecord(self):
        try:
            from pysource import utils
        except ImportError as e:
            self.skipTest('pysource.utils not built: %s' % e)
        source = (b'class A:\n'
                  b'\tdef f(self, a,\n'
                  b'          b):  # c\n'
                  b'\t\treturn """x\n'
                  b'y""" + \\\n'
                  b'\t\t  a\n')
        logicals = utils.GetLogicalsFromText(source)
        texts = [logicalinspect.TextFromTokens(l) for l in logicals]
        self.assertEqual([b'class A:', b' def f(self, a,\n          b):  # c',
                          b'  return """x\ny""" + \\\n    a'], texts)
        for logical, text in zip(logicals, texts):
            CheckPositions(self, logical.fTokens, text, text)


def _PositionedLogicals(path):
    """(text, (row, col)) pairs of each logical line of a 2.7 file."""
    skip = (tokenize.NL, tokenize.NEWLINE, tokenize.INDENT, tokenize.DEDENT,
            tokenize.ENDMARKER)
    cur = []
    readline = StringIO.StringIO(support.ReadBytes(path)).readline
    try:
        for typ, text, (row, col), _, _ in tokenize.generate_tokens(readline):
            if typ == tokenize.NEWLINE:
                if cur:
                    yield cur
                cur = []
            elif typ not in skip:
                cur.append((text, (row, col)))
    except tokenize.TokenError:
        pass


class _Records(logging.Handler):
    def __init__(self):
        logging.Handler.__init__(self)
        self.records = []

    def emit(self, record):
        self.records.append(record)


class _BrokenStream(object):
    def write(self, text):
        raise IOError('broken')


class ReportCurrentExceptionTest(unittest.TestCase):

    def setUp(self):
        self.logger = logging.getLogger('pysource')
        self.saved = (self.logger.handlers[:], self.logger.propagate, sys.stderr)
        self.logger.handlers = []

    def tearDown(self):
        self.logger.handlers, self.logger.propagate, sys.stderr = self.saved

    def _Raise(self):
        try:
            raise ValueError('the message')
        except ValueError:
            reflect.ReportCurrentException(suppress_gui=True)

    def testLogsToPysourceLogger(self):
        handler = _Records()
        self.logger.addHandler(handler)
        self._Raise()
        self.assertEqual(1, len(handler.records))
        record = handler.records[0]
        self.assertEqual(logging.ERROR, record.levelno)
        self.assertIs(ValueError, record.exc_info[0])
        self.assertIn('the message', logging.Formatter().format(record))

    def testStderrWhenNobodyListens(self):
        self.logger.propagate = False
        sys.stderr = StringIO.StringIO()
        self._Raise()
        text = sys.stderr.getvalue()
        self.assertIn('Traceback', text)
        self.assertIn('ValueError: the message', text)

    def testNoExceptionReportsNothing(self):
        handler = _Records()
        self.logger.addHandler(handler)
        sys.exc_clear()
        reflect.ReportCurrentException()
        self.assertEqual([], handler.records)

    def testExplicitExcInfo(self):
        handler = _Records()
        self.logger.addHandler(handler)
        try:
            raise KeyError('k')
        except KeyError:
            info = sys.exc_info()
        sys.exc_clear()
        reflect.ReportCurrentException(exc_info=info)
        self.assertIs(KeyError, handler.records[0].exc_info[0])

    def testNeverRaises(self):
        self.logger.propagate = False
        sys.stderr = _BrokenStream()
        self._Raise()
        reflect.ReportCurrentException(exc_info=(None, None, None))
        reflect.ReportCurrentException(exc_info=42)


class LogicalLineModuleTest(unittest.TestCase):

    def testReexportsTheRecordType(self):
        fastaccess = _FastAccess()
        if fastaccess is None:
            self.skipTest('pysource._fastaccess not built')
        from parsetools import logicalline
        self.assertIs(fastaccess.LogicalLineType, logicalline.LogicalLineType)


if __name__ == '__main__':
    unittest.main()
