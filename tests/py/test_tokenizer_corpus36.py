"""The splitter and tokenizer over the 3.6 standard library, against 3.6's own tokenize."""

import marshal
import unittest

from tests.py import support
from tests.py.test_tokenizer import CheckInvariants
from tests.py.test_tokenizer_corpus import CorpusMixin, kOpCodes
from pysource.utils import GetLogicalsFromText

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
