"""The native JoinTokens against the Python one (symbolinfo._JoinTokensPy).

Both must give the same text for every input and raise the same exception
(type and message) for the same bad input: every logical line of the 2.7 and
3.6 standard libraries, joined at once and in random nested pieces; random
token-ish texts; bad arguments. A long run of calls leaves no references
behind.
"""

import gc
import random
import sys
import unittest

from tests.py import support

try:
    from pysource import _fastaccess
    from pysource import symbolinfo as si
    from pysource.utils import GetLogicalsFromText
except ImportError as _exc:  # native module not built
    _fastaccess = None
    _kImportError = str(_exc)

kCommentType = 202
kBackslashType = 203


def setUpModule():
    if _fastaccess is None:
        raise unittest.SkipTest('pysource._fastaccess not importable: %s' % _kImportError)


def _Outcome(func, arg):
    """('ok', result) or ('raise', exception type, message)."""
    try:
        return ('ok', func(arg))
    except Exception as exc:
        return ('raise', type(exc), str(exc))


def _LogicalTokens(path):
    """Significant token texts of each logical line of a file."""
    for logical in GetLogicalsFromText(support.ReadBytes(path)):
        toks = [text for i, (text, _) in enumerate(logical.fTokens)
                if _fastaccess.GetLogicalTokenType(logical, i)
                not in (kCommentType, kBackslashType)]
        if toks:
            yield toks


def _NestedPieces(rnd, toks, join):
    """toks with random runs replaced by their join, runs nested up to three deep."""
    pieces = list(toks)
    for _ in range(rnd.randint(1, 3)):
        if not pieces:
            break
        i = rnd.randrange(len(pieces) + 1)
        j = rnd.randrange(i, len(pieces) + 1)
        pieces[i:j] = [join(pieces[i:j])]
    return pieces


class NativeIsUsedTest(unittest.TestCase):

    def testSymbolinfoUsesTheNativeFunction(self):
        self.assertIs(_fastaccess.JoinTokens, si.JoinTokens)
        self.assertIs(_fastaccess.EncodeStringLiteral, si.EncodeStringLiteral)


class CorpusTest(unittest.TestCase):

    def _Check(self, version):
        files = support.CorpusFiles(version)
        if not files:
            self.skipTest('no %s standard library' % version)
        rnd = random.Random(11)
        native, ref = _fastaccess.JoinTokens, si._JoinTokensPy
        lines = 0
        for path in files:
            for toks in _LogicalTokens(path):
                lines += 1
                for tok in toks:  # the native EncodeStringLiteral, on every token
                    self.assertEqual(si._EncodeStringLiteralPy(tok), _fastaccess.EncodeStringLiteral(tok), tok)
                expected = ref(toks)
                self.assertEqual(expected, native(toks), '%s: %r' % (path, toks))
                seed = rnd.random()
                self.assertEqual(ref(_NestedPieces(random.Random(seed), toks, ref)),
                                 native(_NestedPieces(random.Random(seed), toks, native)),
                                 '%s: %r nested, seed %r' % (path, toks, seed))
        sys.stderr.write('[%s: %d logical lines] ' % (version, lines))
        self.assertGreater(lines, 1000)

    def testStdlib27(self):
        self._Check('2.7')

    def testStdlib36(self):
        self._Check('3.6')


# Fragments the fuzz texts are made of: the bytes and runs the lexer and the
# spacing rules treat specially.
kFragments = [
    b"'", b'"', b"'''", b'"""', b'\\', b'\n', b'\r', b'\r\n', b' ', b'\t', b'\f', b'\v',
    b'\x00', b'\x80', b'\xe9', b'\xff', b'a', b'x1', b'_', b'b', b'r', b'u', b'f', b'rb', b'Br',
    b'bb', b'0', b'1', b'9', b'0x', b'0b', b'0o', b'e', b'E', b'j', b'L', b'_1', b'1e', b'+', b'-',
    b'.', b'...', b'*', b'**', b'/', b'//', b'<', b'>', b'=', b'!', b'%', b'&', b'|', b'^', b'~',
    b'@', b':', b'->', b'<>', b'(', b')', b'[', b']', b'{', b'}', b'`', b',', b';', b'#', b'$',
    b'?', b'lambda', b'not', b'in', b'if', b'else', b'print', b'and', b'await', b'None',
]


def _RandomText(rnd):
    return b''.join(rnd.choice(kFragments) for _ in range(rnd.randint(0, 5)))


class FuzzTest(unittest.TestCase):

    def testRandomTexts(self):
        rnd = random.Random(5)
        native, ref = _fastaccess.JoinTokens, si._JoinTokensPy
        rounds = 4000 if support.kSanitized else 40000
        for n in range(rounds):
            texts = [_RandomText(rnd) for _ in range(rnd.randint(0, 8))]
            literal = b''.join(texts)
            self.assertEqual(si._EncodeStringLiteralPy(literal), _fastaccess.EncodeStringLiteral(literal), literal)
            expected = ref(texts)
            self.assertEqual(expected, native(texts), '#%d %r' % (n, texts))
            seed = rnd.random()
            self.assertEqual(ref(_NestedPieces(random.Random(seed), texts, ref)),
                             native(_NestedPieces(random.Random(seed), texts, native)),
                             '#%d %r nested, seed %r' % (n, texts, seed))

    def testRandomItemsOfOtherTypes(self):
        rnd = random.Random(6)
        others = [None, 1, 2.5, u'x', u'\xe9 + 1', u'\ud800', bytearray(b'x'), [b'x'], (b'x',)]
        for n in range(2000):
            texts = [_RandomText(rnd) if rnd.random() < 0.8 else rnd.choice(others)
                     for _ in range(rnd.randint(0, 6))]
            item = texts[0] if texts else None
            self.assertEqual(_Outcome(si._EncodeStringLiteralPy, item), _Outcome(_fastaccess.EncodeStringLiteral, item))
            self.assertEqual(_Outcome(si._JoinTokensPy, texts),
                             _Outcome(_fastaccess.JoinTokens, texts), '#%d %r' % (n, texts))


class _Bytes(bytes):
    pass


class _Unicode(unicode):
    pass


class _OldStyle:
    pass


def _Failing():
    yield b'x'
    raise ValueError('stop here')


class ArgumentsTest(unittest.TestCase):

    def testSameResultOrException(self):
        cases = [
            ('None', lambda: None),
            ('int', lambda: 1),
            ('bytes argument', lambda: b'a+b'),
            ('unicode argument', lambda: u'a+b'),
            ('tuple', lambda: (b'f', b'(', b')')),
            ('generator', lambda: (t for t in [b'x', b'+', b'1'])),
            ('dict keys', lambda: {b'x': 1}),
            ('None item', lambda: [b'x', None]),
            ('int item', lambda: [1]),
            ('bytearray item', lambda: [bytearray(b'x')]),
            ('old-style instance item', lambda: [_OldStyle()]),
            ('native type item', lambda: [_fastaccess.CBytesTokenizer]),
            ('bytes subclass items', lambda: [_Bytes(b'f'), _Bytes(b'(x)')]),
            ('unicode subclass item', lambda: [_Unicode(u'\xe9'), b'.', b'x']),
            ('non-ASCII unicode', lambda: [u'\u20ac', u'=', u'1']),
            ('iteration fails', _Failing),
        ]
        for name, make in cases:
            expected = _Outcome(si._JoinTokensPy, make())
            got = _Outcome(_fastaccess.JoinTokens, make())
            self.assertEqual(expected, got, name)
            if got[0] == 'ok':
                self.assertIs(bytes, type(got[1]), name)

    def testArgumentCount(self):
        join = _fastaccess.JoinTokens
        self.assertEqual(b'x + 1', join(texts=[b'x', b'+', b'1']))
        cases = [
            ('no argument', lambda: join(), 'takes exactly 1 argument (0 given)'),
            ('two arguments', lambda: join([], []), 'takes exactly 1 argument (2 given)'),
            ('unknown keyword', lambda: join(text=[]), "got an unexpected keyword argument 'text'"),
            ('twice', lambda: join([], texts=[]), "got multiple values for keyword argument 'texts'"),
        ]
        for name, call, message in cases:
            with self.assertRaises(TypeError) as ctx:
                call()
            self.assertEqual('JoinTokens() ' + message, str(ctx.exception), name)


class ReferencesTest(unittest.TestCase):

    def testNoReferencesLeft(self):
        item, uitem = b'item', u'uitem'
        texts = [item, b'(', uitem, b'...', b'+', b'1', b')']
        bad = [item, uitem, None]

        def Run():
            for _ in range(2000):
                _fastaccess.JoinTokens(texts)
                _fastaccess.JoinTokens(iter(texts))
                try:
                    _fastaccess.JoinTokens(bad)
                except TypeError:
                    pass
                try:
                    _fastaccess.JoinTokens(_Failing())
                except ValueError:
                    pass

        Run()
        gc.collect()
        counts = [sys.getrefcount(o) for o in (item, uitem, texts, bad)]
        objects = len(gc.get_objects())
        Run()
        gc.collect()
        self.assertEqual(counts, [sys.getrefcount(o) for o in (item, uitem, texts, bad)])
        self.assertLessEqual(len(gc.get_objects()), objects + 10)


if __name__ == '__main__':
    unittest.main()
