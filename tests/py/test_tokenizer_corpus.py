"""The splitter and tokenizer over the 2.7 and 3.6 standard libraries, against their own tokenize."""

import marshal
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
kOpCodes['...'] = 52

# Files where the version's own tokenize reads the text differently by design:
# the other language version's source, and non-ASCII bytes that the host
# counts as letters while tokenize splits them off.
kKnownDifferent = {
    'lib2to3/tests/data/py2_test_grammar.py': 'Python 2 source under 3.6',
    'lib2to3/tests/data/py3_test_grammar.py': 'Python 3 source under 2.7',
    'test/badsyntax_3131.py': 'non-ASCII byte outside an identifier',
    'test/test_unicode_identifiers.py': 'non-ASCII identifier character',
}

# Runs under Python 3.6: for each path read from stdin, the NEWLINE rows and
# the (kind, text) tokens, kind 0 for operators; marshalled for Python 2.
kOracle36 = r'''
import io, marshal, sys, token, tokenize
kinds = {tokenize.NAME: 1, tokenize.NUMBER: 2, tokenize.STRING: 3, tokenize.OP: 0,
         tokenize.COMMENT: 202, tokenize.ERRORTOKEN: 201, token.ASYNC: 1, token.AWAIT: 1}
out = []
for path in sys.stdin.read().split('\n'):
    with open(path, 'rb') as f:
        data = f.read()
    rows, toks, err = [], [], None
    try:
        enc = tokenize.detect_encoding(io.BytesIO(data).readline)[0]
        enc = 'utf-8' if enc == 'utf-8-sig' else enc
        for tok in tokenize.tokenize(io.BytesIO(data).readline):
            if tok.type == tokenize.NEWLINE:
                rows.append(tok.start[0] - 1)
            elif tok.type in kinds:
                toks.append((kinds[tok.type], tok.string.encode(enc)))
    except (tokenize.TokenError, SyntaxError, UnicodeError, LookupError) as e:
        err = str(e).encode('utf-8', 'replace')
    out.append((path.encode(), rows, toks, err))
sys.stdout.buffer.write(marshal.dumps(out, 2))
'''


def StatementEndRows(logicals):
    """0-based last physical line of every statement logical (not comment/blank)."""
    return [L.fFirstLine + len(L.fLineText.splitlines(True)) - 1
            for L in logicals if L.fKind not in (21, 22)]


def TypedTokens(logicals):
    """(type, text) of every token except continuation backslashes."""
    out = []
    for L in logicals:
        for i in range(L.fTokenCount):
            kind = fa.GetLogicalTokenType(L, i)
            if kind != 203:
                out.append((kind, L.GetTokenString(i)))
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
        if rel in kKnownDifferent:
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


class Stdlib36Test(CorpusMixin, unittest.TestCase):
    kVersion = '3.6'

    def testAgainstTokenize(self):
        files = support.CorpusFiles('3.6')
        if not files or support.Interpreter('3.6') is None:
            self.skipTest('Python 3.6 is not installed')
        out = support.RunOracle('3.6', kOracle36, '\n'.join(files))
        results = marshal.loads(out)
        self.assertEqual(len(results), len(files))
        stats = {'files': 0, 'tokens': 0, 'known': 0, 'gave_up': 0}
        for path, rows, toks, err in results:
            data = support.ReadBytes(path)
            if err is not None:
                stats['gave_up'] += 1
                CheckInvariants(self, data, GetLogicalsFromText(data), path)
                continue
            toks = [(kOpCodes.get(s, -1) if kind == 0 else kind, s) for kind, s in toks]
            self.Compare(path, data, rows, toks, stats)
        self.assertGreater(stats['files'], len(files) * 0.95, stats)


if __name__ == '__main__':
    unittest.main()
