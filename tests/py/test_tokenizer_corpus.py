"""The splitter and tokenizer over the 2.7 standard library, against its own tokenize.

Shared helpers for the 3.6 corpus test live here too.
"""

import os
import StringIO
import tokenize
import unittest

from lib2to3.pgen2 import grammar

from tests.py import support
from tests.py.test_tokenizer import CheckInvariants
from pysource import _fastaccess as fa
from pysource.utils import GetLogicalsFromText

kOpCodes = dict(grammar.opmap)
kOpCodes['->'] = 51
kOpCodes['@='] = 56
kOpCodes['...'] = 52

# Files where the version's own tokenize reads the text differently by design:
# the other language version's source, and non-ASCII bytes that the host
# counts as letters while tokenize splits them off.
kKnownDifferent = {
    ('3.6', 'lib2to3/tests/data/py2_test_grammar.py'): 'Python 2 source',
    ('2.7', 'lib2to3/tests/data/py3_test_grammar.py'): 'Python 3 source',
    ('3.6', 'test/badsyntax_3131.py'): 'non-ASCII byte outside an identifier',
    ('3.6', 'test/test_unicode_identifiers.py'): 'non-ASCII identifier character',
}


def StatementEndRows(logicals):
    """0-based last physical line of every statement logical (not comment/blank)."""
    return [L.fFirstLine + len(L.fLineText.splitlines(True)) - 1
            for L in logicals if L.fKind not in (21, 22)]


def TypedTokens(logicals):
    """(type, text) of every token except continuation backslashes.

    The type is GetTokenType's of the text alone, which must agree with the
    record's own type (only a backslash differs, by its context).
    """
    out = []
    for L in logicals:
        for i in range(L.fTokenCount):
            text = L.GetTokenString(i)
            kind = fa.GetTokenType(text)
            in_context = fa.GetLogicalTokenType(L, i)
            if kind != in_context and not (text == b'\\' and in_context == 201):
                raise AssertionError('%r: GetTokenType %d, in its logical %d'
                                     % (text, kind, in_context))
            if in_context != 203:
                out.append((in_context, text))
    return out


def Oracle27(data):
    """NEWLINE rows and (type, text) tokens of 2.7's tokenize, or None when it gives up."""
    if data.startswith(b'\xef\xbb\xbf'):
        data = data[3:]
    rows, toks = [], []
    try:
        for typ, s, start, _, _ in tokenize.generate_tokens(StringIO.StringIO(data).readline):
            if typ == tokenize.NEWLINE:
                rows.append(start[0] - 1)
            elif typ == tokenize.OP:
                # 2.7 reads `...` as three dots.
                if s == '.' and toks[-2:] == [(23, '.'), (23, '.')]:
                    toks[-2:] = [(52, '...')]
                else:
                    toks.append((kOpCodes.get(s, -1), s))
            elif typ == tokenize.COMMENT:
                toks.append((202, s))
            elif typ == tokenize.ERRORTOKEN:
                toks.append((201, s))
            elif typ in (tokenize.NAME, tokenize.NUMBER, tokenize.STRING):
                toks.append((typ, s))
    except tokenize.TokenError:
        return None
    return rows, toks


class CorpusMixin(object):

    def Compare(self, path, data, rows, toks, stats):
        label = path
        logicals = GetLogicalsFromText(data)
        CheckInvariants(self, data, logicals, label)
        ours = StatementEndRows(logicals)
        if data and data[-1:] not in (b'\n', b'\r') and len(ours) == len(rows) + 1:
            ours.pop()  # tokenize gives no NEWLINE when the text has no final line end
        self.assertEqual(ours, rows, '%s: logical-line boundaries differ' % label)
        rel = os.path.relpath(path, support.StdlibDir(self.kVersion))
        if (self.kVersion, rel) in kKnownDifferent:
            stats['known'] += 1
            return
        mine = TypedTokens(logicals)
        if mine != toks:
            first = next(i for i, (a, b) in enumerate(zip(mine + [None], toks + [None])) if a != b)
            self.fail('%s: token %d is %r, tokenize gives %r' % (
                label, first, (mine + [None])[first], (toks + [None])[first]))
        stats['files'] += 1
        stats['tokens'] += len(toks)


class Stdlib27Test(CorpusMixin, unittest.TestCase):
    kVersion = '2.7'

    def testAgainstTokenize(self):
        files = support.CorpusFiles('2.7')
        self.assertTrue(files, 'no 2.7 standard library found')
        stats = {'files': 0, 'tokens': 0, 'known': 0, 'gave_up': 0}
        for path in files:
            data = support.ReadBytes(path)
            oracle = Oracle27(data)
            if oracle is None:
                stats['gave_up'] += 1
                CheckInvariants(self, data, GetLogicalsFromText(data), path)
                continue
            self.Compare(path, data, oracle[0], oracle[1], stats)
        self.assertGreater(stats['files'], len(files) * 0.95, stats)


if __name__ == '__main__':
    unittest.main()
