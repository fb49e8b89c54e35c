"""Tests of pysource.symbolinfo: the info vocabulary, literal encoding and
token joining."""

import pickle
import random
import StringIO
import tokenize
import unittest

from pysource import symbolinfo as si
from tests.py import support

# Every constant the analyzer imports.
kPrefixNames = [
    'kSetPrefix', 'kGetPrefix', 'kSetTypeHintPrefix', 'kNonlocalPrefix',
    'kGlobalPrefix', 'kWithinExprPrefix', 'kImportPrefix', 'kFromImportPrefix',
    'kImportAsNamePrefix', 'kDecoratorPrefix', 'kSpecificScopePrefix',
    'kSpecificUrlPrefix', 'kBuiltinModulePrefix', 'kTypingModulePrefix',
    'kBuiltinClassPrefix', 'kTypedLiteralPrefix', 'kArgPrefix',
    'kTypeHintPrefix', 'kMethodPrefix', 'kUnboundMethodPrefix',
    'kFunctionPrefix', 'kClassPrefix', 'kSelfPrefix', 'kInstancePrefix',
    'kModulePrefix', 'kInferredTypeHintPrefix', 'kCalledPrefix']
kKindNames = [
    'kSetKind', 'kGetKind', 'kSetTypeHintKind', 'kNonlocalKind', 'kGlobalKind',
    'kWithinExprKind', 'kImportKind', 'kFromImportKind', 'kImportAsNameKind',
    'kDecoratorKind', 'kSpecificScopeKind', 'kSpecificUrlKind',
    'kBuiltinModuleKind', 'kTypingModuleKind', 'kBuiltinClassKind',
    'kTypedLiteralKind', 'kArgKind', 'kTypeHintKind', 'kMethodKind',
    'kUnboundMethodKind', 'kFunctionKind', 'kClassKind', 'kSelfKind',
    'kInstanceKind', 'kModuleKind', 'kInferredTypeHintKind', 'kCalledKind',
    'kPlainEquivKind']
kOtherNames = [
    'kPlainEquivSpec', 'kIterationSubscript', 'kClassInstanceSuffix',
    'kTypingModuleSymbol', 'kTypingModuleSymbolDot',
    'kTypingModuleSymbolDotAny', 'kScopeIndexSep', 'kModuleScopeName']


def KindNameFor(prefix_name):
    special = {'kPlainEquivSpec': 'kPlainEquivKind'}
    return special.get(prefix_name, prefix_name[:-len('Prefix')] + 'Kind')


class ConstantsTest(unittest.TestCase):

    def testAllPresentAndDistinct(self):
        names = kPrefixNames + kKindNames + kOtherNames
        values = {}
        for name in names:
            value = getattr(si, name)
            self.assertIsInstance(value, bytes, name)
            self.assertNotIn(value, values, '%s == %s' % (name, values.get(value)))
            values[value] = name
        self.assertIsInstance(si.kPrefixLen, int)

    def testKindsAreOneByte(self):
        for name in kKindNames:
            self.assertEqual(1, len(getattr(si, name)), name)

    def testPrefixesCarryTheirKind(self):
        for name in kPrefixNames + ['kPlainEquivSpec']:
            prefix = getattr(si, name)
            kind = getattr(si, KindNameFor(name))
            self.assertGreater(len(prefix), 2, name)
            self.assertEqual(b':' + kind, prefix[:2], name)
            self.assertEqual(kind, si.GetInfoKind(prefix + b'x'), name)
            self.assertEqual(si.kPrefixLen, len(prefix), name)

    def testNoPrefixStartsAnother(self):
        prefixes = [getattr(si, n) for n in kPrefixNames]
        for a in prefixes:
            for b in prefixes:
                if a != b:
                    self.assertFalse(b.startswith(a), '%r starts %r' % (a, b))

    def testPlainInfos(self):
        for info in [b'x', b'a.b', b'f(1,x)', b'', b':', b'x:y']:
            self.assertEqual(si.kPlainEquivKind, si.GetInfoKind(info), info)

    def testDerivedLiteralNames(self):
        # The analyzer's own derived names must not collide.
        names = [si.kTypedLiteralPrefix + t + b':' for t in
                 (b'list', b'dict', b'set', b'tuple', b'string', b'unicode')]
        names += [si.kTypedLiteralPrefix + t + si.kClassInstanceSuffix
                  for t in (b'int', b'float')]
        self.assertEqual(len(names), len(set(names)))
        self.assertFalse(si.kClassInstanceSuffix.endswith(b':'))


class LiteralInfoTest(unittest.TestCase):

    def testBuildLiteralInfo(self):
        p = si.kTypedLiteralPrefix
        cases = [
            ((b'int', b'42'), p + b'int: 42'),
            ((b'float', b'1.5e3'), p + b'float: 1.5e3'),
            ((b'set', None), p + b'set:'),
            ((b'dict', b'{}'), p + b'dict: {}'),
            ((u'int', u'7'), p + b'int: 7'),
        ]
        for args, expected in cases:
            self.assertEqual(expected, si.BuildLiteralInfo(*args), args)
        for bad in [(None, b'1'), (1, None), (b'int', 5)]:
            self.assertRaises(TypeError, si.BuildLiteralInfo, *bad)

    def testBuildArgInfo(self):
        keys = [si.BuildArgInfo(i, None) for i in range(12)]
        self.assertEqual(len(keys), len(set(keys)))
        for i, key in enumerate(keys):
            self.assertTrue(key.startswith(si.kArgPrefix), key)
            self.assertEqual(si.kArgKind, si.GetInfoKind(key))
            self.assertEqual(b'%d' % i, key[si.kPrefixLen:])
        self.assertNotEqual(si.BuildArgInfo(1, None), si.BuildArgInfo(1, b'x'))
        self.assertRaises(TypeError, si.BuildArgInfo, b'1', None)
        self.assertRaises(TypeError, si.BuildArgInfo, True, None)
        self.assertRaises(ValueError, si.BuildArgInfo, -1, None)


# Literal tokens that must all encode differently, except within a group
# (the same prefix and body written with other quotes).
kLiteralGroups = [
    [b"'abc'", b'"abc"', b"'''abc'''", b'"""abc"""'],
    [b"u'abc'", b'U"abc"'],
    [b"b'abc'", b"B'abc'"],
    [b"r'abc'"],
    [b"br'abc'", b"rb'abc'", b"Rb'abc'", b"bR'abc'"],
    [b"ur'abc'", b"UR'abc'"],
    [b"f'abc'"],
    [b"fr'abc'", b"rf'abc'"],
    [b"''", b'""', b"''''''"],
    [b"'a b'"],
    [b"'a%20b'"],
    [b"'a:b'"],
    [b"'a,b'"],
    [b"'a\\'b'"],
    [b'"a\'b"'],
    [b"'a\\\\'"],
    [b"'a\\n'"],
    [b"r'a\\n'"],
    [b"'\\x41'"],
    [b"'A'"],
    [b"'caf\xc3\xa9'"],
    [b"'caf\xe9'"],
    [b"'a"],
    [b"'a\\'"],
    [b"'''a\nb'''"],
    [b"'%'"],
    [b"'%%'"],
    [b"'(x)[y]{z}'"],
    [b"abc"],
    [b"'abc"],
    [b"xy'abc'"],
]


class EncodeStringLiteralTest(unittest.TestCase):

    def testDistinctAcrossGroupsEqualWithin(self):
        seen = {}
        for group in kLiteralGroups:
            codes = set(si.EncodeStringLiteral(t) for t in group)
            self.assertEqual(1, len(codes), group)
            code = codes.pop()
            self.assertNotIn(code, seen, '%r and %r' % (group, seen.get(code)))
            seen[code] = group

    def testEmbeddable(self):
        for group in kLiteralGroups:
            for text in group:
                code = si.EncodeStringLiteral(text)
                for c in b' \t\r\n:,()[]{}"\\':
                    self.assertNotIn(c, code, '%r -> %r' % (text, code))
                self.assertLessEqual(code.count(b"'"), 2, text)

    def testDecodeInvertsEncode(self):
        cases = [
            (b"'a b:c'", (b'', b'a b:c', True)),
            (b"Rb'''x\ny'''", (b'br', b'x\ny', True)),
            (b'u"it\'s"', (b'u', b"it's", True)),
            (b"'a\\'", (b'', b"a\\'", False)),
            (b"'caf\xc3\xa9'", (b'', b'caf\xc3\xa9', True)),
            (b"'%41'", (b'', b'%41', True)),
        ]
        for text, expected in cases:
            self.assertEqual(expected, si.DecodeStringLiteral(si.EncodeStringLiteral(text)), text)

    def testCompactForPlainText(self):
        self.assertEqual(b"'hello_world.py'", si.EncodeStringLiteral(b'"hello_world.py"'))
        self.assertEqual(b"u'x'", si.EncodeStringLiteral(b"u'x'"))

    def testTypes(self):
        self.assertEqual(si.EncodeStringLiteral(b"'x'"), si.EncodeStringLiteral(u"'x'"))
        for bad in [None, 1, [b"'x'"]]:
            self.assertRaises(TypeError, si.EncodeStringLiteral, bad)


# (tokens, joined text)
kJoinCases = [
    ('f ( x , 1 )', 'f(x, 1)'),
    ('a . b [ i ]', 'a.b[i]'),
    ('x + 1', 'x + 1'),
    ('- x', '-x'),
    ('** kw', '**kw'),
    ('f ( * a , ** kw )', 'f(*a, **kw)'),
    ('lambda x : x', 'lambda x: x'),
    ('lambda : 0', 'lambda: 0'),
    ('lambda * a , ** k : a', 'lambda *a, **k: a'),
    ('lambda x = 1 : x', 'lambda x=1: x'),
    ('a [ 1 : 2 ]', 'a[1:2]'),
    ('a [ : : - 1 ]', 'a[::-1]'),
    ('a [ x : ] , b [ : y ]', 'a[x:], b[:y]'),
    ('a [ lambda x : x ]', 'a[lambda x: x]'),
    ('{ a : b , c : d }', '{a: b, c: d}'),
    ('{ a : [ 1 : 2 ] }', '{a: [1:2]}'),
    ('not x', 'not x'),
    ('not - x', 'not -x'),
    ('x if y else z', 'x if y else z'),
    ('x - 1', 'x - 1'),
    ('x = - 1', 'x = -1'),
    ('f ( - 1 , - x )', 'f(-1, -x)'),
    ('( a ) - b', '(a) - b'),
    ('a [ 0 ] - b', 'a[0] - b'),
    ('return - 1', 'return -1'),
    ('x ** - y', 'x ** -y'),
    ('a * b', 'a * b'),
    ('f ( a = 1 , b = 2 )', 'f(a=1, b=2)'),
    ('x = y = 0', 'x = y = 0'),
    ('x += 1', 'x += 1'),
    ('def f ( a , b = 1 , * args ) :', 'def f(a, b=1, *args):'),
    ('def f ( a : int , * , b ) -> str :', 'def f(a: int, *, b) -> str:'),
    ('class A ( B ) :', 'class A(B):'),
    ('if ( x ) :', 'if (x):'),
    ('x in [ 1 , 2 ]', 'x in [1, 2]'),
    ('( x , )', '(x,)'),
    ('f ( ) ( ) [ 0 ]', 'f()()[0]'),
    ('@ property', '@property'),
    ('@ a . b ( c )', '@a.b(c)'),
    ('a @ b', 'a @ b'),
    ('from . import x', 'from . import x'),
    ('from .. a import b', 'from ..a import b'),
    ('from . . . import x', 'from ... import x'),
    ('x [ . . . ]', 'x[...]'),
    ('x = ...', 'x = ...'),
    ('Tuple [ int , ... ]', 'Tuple[int, ...]'),
    ('... == x', '... == x'),
    ('print >> f , x', 'print >> f, x'),
    ('print ( x )', 'print(x)'),
    ('exec code in ns', 'exec code in ns'),
    ('` x `', '`x`'),
    ('x = ` y ` + ` z `', 'x = `y` + `z`'),
    ('a = 1 ; b = 2', 'a = 1; b = 2'),
    ('x : int = 1', 'x: int = 1'),
    ('yield x', 'yield x'),
    ('( yield )', '(yield)'),
    ('[ i for i in x if i ]', '[i for i in x if i]'),
    ('1 . real', '1 .real'),
    ("'a' . join ( x )", "'a'.join(x)"),
    ("u'a b' \"c\"", "u'a b' \"c\""),
    ('a < - b', 'a < -b'),
    ('- - x', '--x'),
    ('* * x', '* *x'),
    ('- > x', '- > x'),
    ('x . 5', 'x. 5'),
    ('await f ( )', 'await f()'),
    ('None - 1', 'None - 1'),
]


class JoinTokensTest(unittest.TestCase):

    def testSpacing(self):
        for tokens, expected in kJoinCases:
            self.assertEqual(expected, si.JoinTokens(tokens.split(' ')), tokens)

    def testJoinedPiecesJoinTheSame(self):
        for tokens, expected in kJoinCases:
            toks = tokens.split(' ')
            for i in range(len(toks) + 1):
                joined = si.JoinTokens([si.JoinTokens(toks[:i])] + toks[i:])
                self.assertEqual(expected, joined, '%s split at %d' % (tokens, i))

    def testTypes(self):
        self.assertEqual(b'', si.JoinTokens([]))
        self.assertEqual(b'f(x)', si.JoinTokens([u'f', b'(', u'x', b')']))
        self.assertRaises(TypeError, si.JoinTokens, [b'x', None])
        self.assertRaises(TypeError, si.JoinTokens, None)

    def testStdlibLines(self):
        # Joining keeps the tokens (the text tokenizes back to them), and
        # joining in pieces, split anywhere, gives the same text.
        rnd = random.Random(7)
        lines = 0
        for path in support.CorpusFiles('2.7', limit=40):
            for toks in _LogicalTokens(path):
                lines += 1
                joined = si.JoinTokens(toks)
                self.assertEqual(toks, _Tokenize(joined), '%s: %r' % (path, joined))
                for _ in range(3):
                    i = rnd.randrange(len(toks) + 1)
                    j = rnd.randrange(i, len(toks) + 1)
                    pieces = ([si.JoinTokens(toks[:i]), si.JoinTokens(toks[i:j])]
                              + toks[j:])
                    self.assertEqual(joined, si.JoinTokens(pieces),
                                     '%s: %r split at %d, %d' % (path, joined, i, j))
        self.assertGreater(lines, 1000)


def _LogicalTokens(path):
    """Token texts of each logical line of a 2.7 file without error tokens."""
    skip = (tokenize.NL, tokenize.COMMENT, tokenize.INDENT, tokenize.DEDENT,
            tokenize.ENDMARKER)
    cur, bad = [], False
    source = support.ReadBytes(path)
    if source.startswith(b'\xef\xbb\xbf'):
        source = source[3:]
    readline = StringIO.StringIO(source).readline
    try:
        for typ, text, _, _, _ in tokenize.generate_tokens(readline):
            if typ == tokenize.NEWLINE:
                if cur and not bad:
                    yield cur
                cur, bad = [], False
            elif typ == tokenize.ERRORTOKEN:
                bad = True
            elif typ not in skip:
                cur.append(text)
    except tokenize.TokenError:
        pass


def _Tokenize(text):
    toks = []
    readline = StringIO.StringIO(text).readline
    for typ, tok, _, _, _ in tokenize.generate_tokens(readline):
        if typ not in (tokenize.NL, tokenize.NEWLINE, tokenize.ENDMARKER,
                       tokenize.COMMENT, tokenize.INDENT, tokenize.DEDENT):
            toks.append(tok)
    return toks


class ValueClassesTest(unittest.TestCase):

    def testFullyScopedName(self):
        a = si.CFullyScopedName(b'C.f', b'x')
        self.assertEqual(b'C.f.x', a.GetFullName())
        self.assertEqual(b'x', si.CFullyScopedName(b'', b'x').GetFullName())
        self.assertEqual(a, si.CFullyScopedName(u'C.f', u'x'))
        self.assertNotEqual(a, si.CFullyScopedName(b'C', b'f.x'))
        self.assertEqual(hash(a), hash(si.CFullyScopedName(b'C.f', b'x')))
        self.assertEqual("CFullyScopedName('C.f', 'x')", repr(a))
        self.assertRaises(TypeError, si.CFullyScopedName, None, b'x')

    def testResolvedInfo(self):
        target = si.CFullyScopedName(b'', b'f')
        info = si.CSingleResolvedInfo.FromInfo(si.kCalledPrefix + b'(1)', target)
        self.assertEqual(si.kCalledKind, info.fKind)
        self.assertEqual(target, info.fTarget)
        self.assertEqual(si.kPlainEquivKind, si.CSingleResolvedInfo.FromInfo(b'a.b').fKind)
        self.assertNotEqual(info, si.CSingleResolvedInfo.FromInfo(si.kCalledPrefix + b'(1)'))
        self.assertRaises(ValueError, si.CSingleResolvedInfo, b'ab', b'x')
        self.assertRaises(TypeError, si.CSingleResolvedInfo, b'a', b'x', b'f')

    def testDefInfo(self):
        name = si.CFullyScopedName(b'C', b'm')
        d = si.CDefInfo(si.kMethodKind, name, [b'self', u'x'], 3)
        self.assertEqual((b'self', b'x'), d.fArgNames)
        self.assertTrue(d.IsDef())
        self.assertFalse(si.CDefInfo(si.kClassKind, name).IsDef())
        self.assertEqual(d, si.CDefInfo(si.kMethodKind, name, (b'self', b'x'), 3))
        self.assertNotEqual(d, si.CDefInfo(si.kMethodKind, name, (b'self',), 3))
        self.assertRaises(TypeError, si.CDefInfo, si.kMethodKind, b'C.m')

    def testPickle(self):
        name = si.CFullyScopedName(b'C', b'm')
        for value in [name, si.CSingleResolvedInfo(b'g', b':g:', name),
                      si.CDefInfo(si.kFunctionKind, name, (b'a',), 9)]:
            for proto in range(3):
                self.assertEqual(value, pickle.loads(pickle.dumps(value, proto)),
                                 '%r, protocol %d' % (value, proto))


if __name__ == '__main__':
    unittest.main()
