"""The f-strings of the 3.6 standard library, judged by CPython 3.6's own ast.

For every f-string token: the expressions GetPartList finds parse to the same
trees as the FormattedValue nodes CPython builds for the token, and each one
sits at its reported offset; every name CPython reads inside it is recorded as
read on the outer line. Mutated fields that CPython rejects come back as a
SyntaxError located inside the token, and those it accepts as None.
"""

import json
import random
import unittest

from tests.py import support

try:
    from pysource import treelens as tl
    from pysource import symbolinfo, utils
except ImportError as _exc:  # native modules not built
    tl = None
    _kImportError = str(_exc)

# Reads a JSON list of [key, token, [expression texts]] (bytes as latin-1) on
# stdin; prints {key: [dumps of CPython's FormattedValue expressions, dumps
# of the given texts, names read]}, or {key: null} for a token CPython rejects.
kOracleScript = r'''
import ast, json, sys

def parse(src):
    try:
        return ast.parse(src, mode='eval').body
    except SyntaxError:
        try:
            return ast.parse(b'async def _():\n return ' + src).body[0].body[0].value
        except SyntaxError:
            return None

def dump(node):
    return 'error' if node is None else ast.dump(node)

out = {}
for key, token, texts in json.loads(sys.stdin.read()):
    tree = parse(token.encode('latin-1'))
    if tree is None:
        out[key] = None
        continue
    values = [n.value for n in ast.walk(tree) if isinstance(n, ast.FormattedValue)]
    names = set(n.id for v in values for n in ast.walk(v) if isinstance(n, ast.Name) and isinstance(n.ctx, ast.Load))
    out[key] = [sorted(dump(v) for v in values), sorted(dump(parse(b'(' + t.encode('latin-1') + b')')) for t in texts),
                sorted(names)]
sys.stdout.write(json.dumps(out))
'''

# Appended to a field: each breaks the expression, or (the last two) keeps it valid.
kJunk = [b' b', b' 1', b')', b' (', b' +', b' in', b' = 1', b'; b', b' lambda', b'.', b' if', b', b', b'[0]']


def setUpModule():
    if tl is None:
        raise unittest.SkipTest('pysource.treelens not importable: %s' % _kImportError)
    if support.Interpreter('3.6') is None or not support.CorpusFiles('3.6'):
        raise unittest.SkipTest('no Python 3.6 with its standard library')


def Judge(items):
    """CPython 3.6's verdict on (key, token, texts) items."""
    data = json.dumps([[k, t.decode('latin-1'), [x.decode('latin-1') for x in texts]] for k, t, texts in items])
    return json.loads(support.RunOracle('3.6', kOracleScript, data))


class FStringCorpusTest(unittest.TestCase):

    @classmethod
    def setUpClass(cls):
        cls.sup = tl.CFStringSupport()
        cls.analyzer = tl.CPGenAnalyzerImpl((3, 6, 0))
        cls.found = []  # (path, logical, token index, token)
        for path in support.CorpusFiles('3.6'):
            for logical in utils.GetLogicalsFromText(support.ReadBytes(path)):
                fstrings = set(t for t, _ in cls.sup._FStringTokenList(logical))
                for i, (token, _) in enumerate(logical.fTokens if fstrings else ()):
                    if token in fstrings:
                        cls.found.append((path, logical, i, token))

    def testExpressionsAgreeWithCPython(self):
        items, wrong = [], []
        for key, (path, logical, i, token) in enumerate(self.found):
            parts = self.sup.GetExpressionPartList(token)
            items.append((str(key), token, [text for text, _, _ in parts]))
            wrong.extend((path, token, text, pos) for text, pos, _ in parts if token[pos:pos + len(text)] != text)
            for text, pos, _ in self.sup.GetExpressionsInLogical(logical):
                if logical.fLineText[pos:pos + len(text)] != text:
                    wrong.append((path, logical.fLineText, text, pos))
        verdicts = Judge(items)
        judged = [v for v in verdicts.values() if v is not None]
        self.assertGreater(len(judged), len(items) * 3 // 4)
        for key, token, _ in items:
            verdict = verdicts[key]
            if verdict is not None and verdict[0] != verdict[1]:
                wrong.append((self.found[int(key)][0], token, verdict[0], verdict[1]))
        self.assertEqual(wrong[:20], [])

    def testNamesReadAreRecorded(self):
        verdicts = Judge([(str(k), token, []) for k, (_, _, _, token) in enumerate(self.found)])
        missing = []
        for key, (path, logical, i, token) in enumerate(self.found):
            verdict = verdicts[str(key)]
            logical.fInspected = False
            if verdict is None or self.analyzer.AnalyzeSingleLogical(logical, support.InAsyncDef(logical)):
                continue
            reads = set(n for n, info in logical.fTypeEquivs if info == symbolinfo.kGetPrefix)
            missing.extend((path, token, name) for name in verdict[2] if name.encode('utf-8') not in reads)
        self.assertEqual(missing[:20], [])

    def testMutatedFields(self):
        rnd = random.Random(36)
        mutants = []
        for path, logical, i, token in rnd.sample(self.found, min(250, len(self.found))):
            parts = self.sup.GetExpressionPartList(token)
            if parts:
                text, pos, _ = rnd.choice(parts)
                end = pos + len(text)
                mutants.append(token[:end] + rnd.choice(kJunk) + token[end:])
        verdicts = Judge([(str(k), m, []) for k, m in enumerate(mutants)])
        wrong, rejected = [], 0
        for key, mutant in enumerate(mutants):
            source = b'_ = ' + mutant + b'\n'
            logical, result = Analyzed(source, self.analyzer)
            if verdicts[str(key)] is not None:
                if result is not None:
                    wrong.append((mutant, 'accepted by CPython', result))
                continue
            rejected += 1
            if not isinstance(result, SyntaxError):
                wrong.append((mutant, 'rejected by CPython', result))
                continue
            lines = source.splitlines(True)
            at = sum(len(l) for l in lines[:result.lineno - 1]) + result.offset - 1
            if not 4 <= at < 4 + len(mutant) or logical.fTypeEquivs or logical.fNamesDefined:
                wrong.append((mutant, 'located at %d' % at, result))
        self.assertGreater(rejected, len(mutants) // 2)
        self.assertEqual(wrong[:20], [])


def Analyzed(source, analyzer):
    logical = utils.GetLogicalsFromText(source)[0]
    return logical, analyzer.AnalyzeSingleLogical(logical, True)


if __name__ == '__main__':
    unittest.main()
