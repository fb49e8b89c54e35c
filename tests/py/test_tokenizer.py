"""The host tokenizer and splitter: token types, positions, kinds, parents, hostile input."""

import os
import random
import unittest

from tests.py import support
from pysource import _fastaccess as fa
from pysource.utils import GetLogicalsFromText


def TokensWithTypes(logical):
    return [(text, fa.GetLogicalTokenType(logical, i))
            for i, (text, _) in enumerate(logical.fTokens)]


def CheckInvariants(test, text, logicals, label):
    """Concatenation gives back the text; every token stands at its (row, col)."""
    body = text[3:] if text.startswith(b'\xef\xbb\xbf') else text
    test.assertEqual(b''.join(L.fLineText for L in logicals), body, label)
    index = {}
    for n, L in enumerate(logicals):
        index[id(L)] = n
        lines = L.fLineText.splitlines(True)
        starts = [0]
        for line in lines:
            starts.append(starts[-1] + len(line))
        for tok, (row, col) in L.fTokens:
            off = starts[row] + col
            test.assertEqual(L.fLineText[off:off + len(tok)], tok,
                             '%s: token %r at %r' % (label, tok, (row, col)))
        parent = L.fParentScope
        if parent is not None:
            test.assertLess(index.get(id(parent), n), n, label)
            test.assertIn(parent.fKind, (1, 2), label)


class GetTokenTypeTest(unittest.TestCase):

    def testTable(self):
        # The engine's own tests cover the forms; these check the binding end to end.
        cases = [
            (b'', 0), (b'\n', 4), (b'print', 1), (b'\xc3\xa9', 1), (b'0777L', 2), (b'.5', 2),
            (b"fR''", 3), (b"'unterminated", 3), (b'...', 52), (b'$', 201), (b'!', 201),
            (b'# c', 202), (b'\\', 203), (b'..', 23), (b"bu''", 1), (b':=', 55), (b':', 11),
            (b'@=', 56), (b'->', 51), (b'@', 50),
        ]
        for text, want in cases:
            self.assertEqual(fa.GetTokenType(text), want, 'GetTokenType(%r)' % text)

    def testOperatorsMatchTheGrammarTable(self):
        from lib2to3.pgen2 import grammar
        for text, code in grammar.opmap.items():
            want = {'->': 51, '@=': 56}.get(text, code)
            self.assertEqual(fa.GetTokenType(text), want, text)

    def testRejectsNonBytes(self):
        for bad in (None, 1, u'x'):
            with self.assertRaises(TypeError) as cm:
                fa.GetTokenType(bad)
            self.assertEqual(str(cm.exception),
                             'Expected bytes, got %s' % type(bad).__name__)


class TokenizeTest(unittest.TestCase):

    def testTokenTexts(self):
        cases = [
            (b'a<>b', [b'a', b'<>', b'b']),
            (b'x[...]', [b'x', b'[', b'...', b']']),
            (b'(y:=1)', [b'(', b'y', b':=', b'1', b')']),
            (b'x = 1 \\\n  + f"{y}"  # c\n', [b'x', b'=', b'1', b'\\', b'+', b'f"{y}"', b'# c']),
            (b"s = '''a\nb'''", [b's', b'=', b"'''a\nb'''"]),
            (b'\xef\xbb\xbfimport os\r\n', [b'import', b'os']),
            (b'', []),
            (b'\n\n', []),
        ]
        for text, want in cases:
            self.assertEqual(fa.Tokenize(text), want, 'Tokenize(%r)' % text)

    def testBytesTokenizer(self):
        toks = list(fa.CBytesTokenizer(b'if x:\n    y = "a\\\nb" # c\n\\\n'))
        self.assertEqual(toks, [
            (1, b'if', (0, 0)), (1, b'x', (0, 3)), (11, b':', (0, 4)),
            (1, b'y', (1, 4)), (22, b'=', (1, 6)), (3, b'"a\\\nb"', (1, 8)),
            (202, b'# c', (2, 3)), (203, b'\\', (3, 0))])
        self.assertEqual(list(fa.CBytesTokenizer(b'')), [])

    def testFindStringEnd(self):
        cases = [
            (b"x = rb'a\\'b' + 1", 4, 12),
            (b'"""a"b"""!', 0, 9),
            (b"'abc\nx'", 0, 4),
            (b"f'{a}' 'b'", 0, 6),
            (b"'''open", 0, 7),
        ]
        for text, pos, want in cases:
            self.assertEqual(fa._FindStringEndNonNested(text, pos), want, repr(text))
        for text, pos in ((b'x = 1', 0), (b"ub'x'", 0), (b"'x'", 3), (b"'x'", -1)):
            with self.assertRaises(ValueError) as cm:
                fa._FindStringEndNonNested(text, pos)
            self.assertEqual(str(cm.exception),
                             'no string literal starts at position %d' % pos)


class SplitTest(unittest.TestCase):

    def testEmpty(self):
        self.assertEqual(GetLogicalsFromText(b''), [])
        self.assertEqual(GetLogicalsFromText(u''), [])
        self.assertEqual(GetLogicalsFromText(b'\xef\xbb\xbf'), [])

    def testUnicodeIsEncoded(self):
        logicals = GetLogicalsFromText(u'\xe9t\xe9 = 1\n')
        self.assertEqual(logicals[0].fTokens[0], (b'\xc3\xa9t\xc3\xa9', (0, 0)))
        self.assertEqual(logicals[0].fTokens[1], (b'=', (0, 6)))
        with self.assertRaises(TypeError):
            GetLogicalsFromText(None)

    def testKindsAndFields(self):
        text = (b'import os\n'
                b'\n'
                b'  # note\n'
                b'@dec\n'
                b'class A(B):\n'
                b'    def f(self, x=(1,\n'
                b'            2)):\n'
                b'        return x  # tail\n'
                b'    async def g(): pass\n'
                b'    try:\n'
                b'        pass\n'
                b'    except: pass\n')
        logicals = GetLogicalsFromText(text)
        CheckInvariants(self, text, logicals, 'sample')
        got = [(L.fKind, L.fFirstLine, L.fIndent, L.fTokenCount) for L in logicals]
        self.assertEqual(got, [(0, 0, 0, 2), (22, 1, 0, 0), (21, 2, 2, 1), (0, 3, 0, 2),
                               (1, 4, 0, 6), (2, 5, 4, 14), (0, 7, 8, 3), (2, 8, 4, 7),
                               (11, 9, 4, 2), (0, 10, 8, 1), (0, 11, 4, 3)])
        names = [L.fParentScope and L.fParentScope.GetTokenString(1) for L in logicals]
        self.assertEqual(names, [None, None, None, None, None, b'A', b'f', b'A', b'A', b'A',
                                 b'A'])
        f = logicals[5]
        self.assertEqual(f.fTokens[10], (b'2', (1, 12)))
        self.assertEqual(TokensWithTypes(logicals[6]),
                         [(b'return', 1), (b'x', 1), (b'# tail', 202)])

    def testLineEnds(self):
        text = b'a = 1\r\nb = (2,\r3)\rc\n\t\f \n  # x\r\nd'
        logicals = GetLogicalsFromText(text)
        CheckInvariants(self, text, logicals, 'line ends')
        self.assertEqual([L.fLineText for L in logicals],
                         [b'a = 1\r\n', b'b = (2,\r3)\r', b'c\n', b'\t\f \n', b'  # x\r\n', b'd'])
        self.assertEqual([L.fKind for L in logicals], [0, 0, 0, 22, 21, 0])

    def testStrayBackslashIsAnErrorToken(self):
        logicals = GetLogicalsFromText(b'x = 1 \\ + 2\ny = \\\n 3\n')
        self.assertEqual(len(logicals), 2)
        self.assertEqual(TokensWithTypes(logicals[0])[3], (b'\\', 201))
        self.assertEqual(TokensWithTypes(logicals[1])[2], (b'\\', 203))

    def testDedentedCommentStaysInItsScope(self):
        text = (b'def f():\n'
                b'    x = 1\n'
                b'# dedented\n'
                b'    y = 2\n'
                b'    # last of f\n'
                b'\n'
                b'z = 1\n')
        logicals = GetLogicalsFromText(text)
        parents = [L.fParentScope is logicals[0] for L in logicals]
        self.assertEqual(parents, [False, True, True, True, True, False, False])

    def testUnclosedBracketRecovers(self):
        text = b'x = f(1,\n\ndef g():\n    return 2\n'
        logicals = GetLogicalsFromText(text)
        self.assertEqual([L.fKind for L in logicals], [0, 2, 0])
        self.assertIs(logicals[2].fParentScope, logicals[1])
        # Near miss: a keyword that can sit in an expression continues it.
        logicals = GetLogicalsFromText(b'x = (a\n  if b\n  else c)\n')
        self.assertEqual(len(logicals), 1)

    def testUnterminatedTripleString(self):
        text = b's = """abc\ndef f():\n    pass\n'
        logicals = GetLogicalsFromText(text)
        self.assertEqual(len(logicals), 1)
        self.assertEqual(TokensWithTypes(logicals[0])[-1], (text[4:], 3))

    def testHostileInput(self):
        deep = b''.join(b' ' * i + b'def f():\n' for i in range(500))
        cases = [
            ('NUL bytes', b'a = "\x00"\n\x00\nb\x00c\n'),
            ('invalid UTF-8', b'\xff\xfe = 1\n\x80\x81(\xc3\n'),
            ('unterminated string', b"x = 'abc\ny = 2\n"),
            ('unterminated triple', b"x = '''abc\ny = 2\n"),
            ('unclosed bracket', b'x = (1,\n2,\n'),
            ('1 MB line', b'x = ' + b'a + ' * (1 << 18) + b'1\n'),
            ('1 MB string', b"'" + b'a' * (1 << 20)),
            ('10000 brackets', b'(' * 10000 + b'\n' + b')' * 10000 + b'\n'),
            ('10000 open', b'[' * 10000),
            ('lone CR', b'a\rb\r\rc = (\r1)\r'),
            ('no final newline', b'def f():\n    return 1'),
            ('backslash at end', b'x = \\'),
            ('deep nesting', deep),
        ]
        for label, text in cases:
            logicals = GetLogicalsFromText(text)
            CheckInvariants(self, text, logicals, label)
        logicals = GetLogicalsFromText(deep)
        self.assertIs(logicals[-1].fParentScope, logicals[-2])

    def testRandomInputKeepsTheInvariant(self):
        rnd = random.Random(42)
        alphabet = b'ab1 \t\f\r\n#\\\'"([{}])=:.\x00\xff\xc3rbfu'
        rounds = 100 if support.kSanitized else 400
        for n in range(rounds):
            text = b''.join(rnd.choice(alphabet) for _ in range(rnd.randint(0, 200)))
            CheckInvariants(self, text, GetLogicalsFromText(text), 'random %d: %r' % (n, text))
        files = support.CorpusFiles('2.7', limit=20, seed=7)
        for path in files:
            data = support.ReadBytes(path)
            for n in range(10):
                chunk = bytearray(data)
                for _ in range(rnd.randint(1, 20)):
                    if not chunk:
                        break
                    i = rnd.randrange(len(chunk))
                    op = rnd.randint(0, 2)
                    if op == 0:
                        chunk[i] = rnd.choice(alphabet)
                    elif op == 1:
                        del chunk[i:i + rnd.randint(1, 50)]
                    else:
                        chunk[i:i] = rnd.choice([b"'''", b'(', b'\\', b'\r', b'"', b'#'])
                text = bytes(chunk)
                CheckInvariants(self, text, GetLogicalsFromText(text),
                                'mutation %d of %s' % (n, os.path.basename(path)))


if __name__ == '__main__':
    unittest.main()
