"""The analyzer on mangled lines: token soup and mutated stdlib lines under every grammar.

Every result is None or a located SyntaxError, nothing is raised or reported,
a failed line keeps no derived info, and the free lists stay sound.
"""

import logging
import random
import unittest

from tests.py import support

try:
    from pysource import treelens as tl
    from pysource import utils
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)

import os

# $TREELENS_FUZZ_ROUNDS and $TREELENS_FUZZ_SEED run it longer or differently.
kRounds = int(os.environ.get('TREELENS_FUZZ_ROUNDS') or (600 if support.kSanitized else 3000))
kSeed = int(os.environ.get('TREELENS_FUZZ_SEED') or 20261206)
kSpecial = [b'\\', b'$', b'?', b'...', b'async', b'await', b'@', b'->', b'else', b'except',
            b'finally', b'elif', b'try', b'def', b'class', b'lambda', b':', b'(', b')', b'[',
            b'{', b'}', b',', b'*', b'**', b'=', b'f"{x}"', b'# type: int', b'\n']


class _Collect(logging.Handler):
    def __init__(self):
        logging.Handler.__init__(self)
        self.records = []

    def emit(self, record):
        self.records.append(record)


class FuzzTest(unittest.TestCase):

    def setUp(self):
        if tl is None:
            raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)
        self.handler = _Collect()
        logging.getLogger('pysource').addHandler(self.handler)

    def tearDown(self):
        logging.getLogger('pysource').removeHandler(self.handler)

    def testMangledLines(self):
        rnd = random.Random(kSeed)
        analyzers = [tl.CPGenAnalyzerImpl((2, 7, 0), tl.kPy2DefaultGrammar, None, False),
                     tl.CPGenAnalyzerImpl((3, 5, 0), 'Python-Grammar-3.5'),
                     tl.CPGenAnalyzerImpl((3, 6, 0)),
                     tl.CPGenAnalyzerImpl((3, 7, 0))]
        lines, vocab = [], set(kSpecial)
        for path in support.CorpusFiles('2.7', limit=25) + support.CorpusFiles('3.6', limit=25):
            for logical in utils.GetLogicalsFromText(support.ReadBytes(path)):
                if logical.fKind != 22:
                    lines.append(logical.fLineText)
                    vocab.update(t for t, _ in logical.fTokens[:20])
        vocab = sorted(vocab)
        results = {None: 0, SyntaxError: 0}
        for _ in range(kRounds):
            src = rnd.choice(lines)
            mode = rnd.randrange(3)
            if mode == 0:
                src = b' '.join(rnd.choice(vocab) for _ in range(rnd.randrange(1, 16)))
            elif mode == 1:
                data = bytearray(src)
                for _ in range(rnd.randrange(1, 4)):
                    i = rnd.randrange(len(data))
                    data[i:i + rnd.randrange(3)] = rnd.choice(vocab)[:3]
                src = bytes(data)
            else:
                src = rnd.choice(vocab) + b' ' + src
            for logical in utils.GetLogicalsFromText(src):
                for analyzer in analyzers:
                    logical.fInspected = False
                    result = analyzer.AnalyzeSingleLogical(logical, rnd.random() < 0.3)
                    if result is None:
                        results[None] += 1
                        continue
                    self.assertIsInstance(result, SyntaxError, repr(src))
                    self.assertEqual(result.filename, '<string>')
                    self.assertGreaterEqual(result.lineno, 1)
                    self.assertEqual((logical.fNamesDefined, logical.fTypeEquivs), ([], []))
                    results[SyntaxError] += 1
        self.assertEqual([r.getMessage() for r in self.handler.records], [])
        self.assertTrue(results[None] and results[SyntaxError], results)
        # Nothing handed out twice: two parses of one line share no node.
        logical = utils.GetLogicalsFromText(b'x = f(a, [b for b in c]) + 1\n')[0]
        parser = tl.CPGenParserImpl((3, 6, 0))
        first, second = parser.ParseToNode(logical, False), parser.ParseToNode(logical, False)
        self.assertIsNot(first, second)


if __name__ == '__main__':
    unittest.main()
