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
            b'{', b'}', b',', b'*', b'**', b'=', b'f"{x}"', b'# type: int', b'\n', b':=', b'/',
            b'f"{x=!r:>{w}}"', b'match', b'case', b'_', b'type', b'|', b'with (', b'except*', b'[T]']


def RandomFString(rnd, depth=0):
    """An f-string token, often malformed: random fields, stray braces and quotes, nested f-strings."""
    quote = rnd.choice([b"'", b'"', b"'''", b'"""'])
    body = []
    for _ in range(rnd.randrange(1, 5)):
        kind = rnd.randrange(6)
        if kind == 0:
            body.append(rnd.choice([b'a', b' ', b'{{', b'}}', b'\\N{DASH}', b':', b'!', b'\n']))
        elif kind in (1, 2):
            expr = b' '.join(rnd.choice([b'x', b'a.b', b'd[0]', b'f(y)', b'!=', b'+', b'(', b')', b'[', b']',
                                         b'"s"', b"'('", b'=', b'lambda', b';', b'1', b'\n'])
                             for _ in range(rnd.randrange(1, 4)))
            tail = rnd.choice([b'', b'!r', b'!s:>10', b':{w}', b':%H:%M', b':{'])
            body.append(b'{' + expr + tail + rnd.choice([b'}', b'}', b'']))
        elif kind == 3:
            body.append(rnd.choice([b'{', b'}', b"'", b'"', b'\\']))
        elif depth < 8:
            body.append(b'{' + RandomFString(rnd, depth + 1) + b'}')
    return rnd.choice([b'f', b'F', b'rf', b'fR', b'Rf']) + quote + b''.join(body) + rnd.choice([quote, quote, b''])


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
                     tl.CPGenAnalyzerImpl((3, 7, 0), 'Python-Grammar-3.7'),
                     tl.CPGenAnalyzerImpl((3, 8, 0), 'Python-Grammar-3.8'),
                     tl.CPGenAnalyzerImpl((2, 7, 0), tl.kPy2DefaultGrammar, None, False, syntax_checks=True),
                     tl.CPGenAnalyzerImpl((3, 6, 0), syntax_checks=True),
                     tl.CPGenAnalyzerImpl((3, 8, 0), 'Python-Grammar-3.8', syntax_checks=True)]
        # The 3.9 to 3.13 grammars with their keyword lists, with and without the checks.
        from pysource import analysis
        analyzers += [analysis.GetAnalyzer(v, checks).Impl() for v in ('3.9', '3.10', '3.12', '3.13')
                      for checks in (False, True)]
        lines, vocab = [], set(kSpecial)
        for path in (support.CorpusFiles('2.7', limit=25) + support.CorpusFiles('3.6', limit=25)
                     + support.CorpusFiles('3.8', limit=25) + support.CorpusFiles('3.13', limit=25)):
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
        self.CheckFStrings(rnd, analyzers)
        # Nothing handed out twice: two parses of one line share no node.
        logical = utils.GetLogicalsFromText(b'x = f(a, [b for b in c]) + 1\n')[0]
        parser = tl.CPGenParserImpl((3, 6, 0))
        first, second = parser.ParseToNode(logical, False), parser.ParseToNode(logical, False)
        self.assertIsNot(first, second)

    def CheckFStrings(self, rnd, analyzers):
        """Random f-strings: every part lies where it says, and analysis gives None or a located error."""
        sup = tl.CFStringSupport()
        for _ in range(kRounds // 3):
            token = RandomFString(rnd)
            src = rnd.choice([b'x = ', b'f(1,\n  ', b'']) + token + b'\n'
            for logical in utils.GetLogicalsFromText(src):
                for tok, _ in sup._FStringTokenList(logical):
                    for text, pos, _ in sup.GetPartList(tok):
                        self.assertEqual(tok[pos:pos + len(text)], text, repr(tok))
                for analyzer in analyzers:
                    logical.fInspected = False
                    result = analyzer.AnalyzeSingleLogical(logical, False)
                    if result is not None:
                        self.assertIsInstance(result, SyntaxError, repr(src))
                        self.assertEqual(result.filename, '<string>')
                        # The checks give CPython's offsets: 0-based, or None under 2.7.
                        offset = getattr(result, 'column', result.offset)
                        self.assertGreaterEqual(min(result.lineno, offset), 1, repr(src))
                        self.assertEqual((logical.fNamesDefined, logical.fTypeEquivs), ([], []))


if __name__ == '__main__':
    unittest.main()
